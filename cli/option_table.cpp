#include "option_table.h"

#include <CLI/CLI.hpp>
#include <algorithm>

#include "words.h"

namespace option_table {
namespace {

std::string FullName(const CLI::App &app) {
    const CLI::App *pParent = app.get_parent();
    return pParent == nullptr ? app.get_name() : FullName(*pParent) + " " + app.get_name();
}

// CLI11 keeps a value's name, choices and limits in one text: "NAME:{one,two}", "N:INT in [0 - 9]".
void ReadValue(const std::string &strType, Option &option) {
    const std::size_t colon = strType.find(':');
    option.strValue = strType.substr(0, colon);
    const std::string strLimit = colon == std::string::npos ? "" : strType.substr(colon + 1);
    const std::size_t range = strLimit.find(" in [");
    if (range != std::string::npos) {
        std::string strRange = strLimit.substr(range + 5);
        strRange = strRange.substr(0, strRange.find(']'));
        option.strDescription += " (" + strRange.replace(strRange.find(" - "), 3, " to ") + ")";
    } else if (!strLimit.empty() && strLimit.front() == '{') {
        option.choices = words::Split(strLimit.substr(1, strLimit.find('}') - 1), ',');
    }
}

Option ReadOption(const CLI::Option &source) {
    Option option;
    option.strDescription = source.get_description();
    option.blRequired = source.get_required();
    option.blRepeats = source.get_expected_max() >= CLI::detail::expected_max_vector_size;
    if (source.get_type_size() != 0) {
        ReadValue(source.get_type_name(), option);
    }
    if (source.get_positional()) {
        option.names = {source.get_name(true, false)};
    } else {
        for (const std::string &strName : source.get_snames()) {
            option.names.push_back("-" + strName);
        }
        for (const std::string &strName : source.get_lnames()) {
            option.names.push_back("--" + strName);
        }
    }
    if (!source.get_default_str().empty() && !option.blRequired) {
        option.strDescription += " (default: " + source.get_default_str() + ")";
    }
    return option;
}

}  // namespace

std::string Option::Label() const {
    const std::string strNames = words::Joined(names, ", ");
    const bool blPositional = names.front().front() != '-';
    return blPositional || strValue.empty() ? strNames : strNames + " " + strValue;
}

std::vector<std::string> Command::Usage() const {
    std::vector<std::string> words;
    bool blMore = false;
    for (const Option &option : options) {
        if (option.blRequired) {
            words.push_back(option.Label());
        } else {
            blMore = true;
        }
    }
    if (blMore) {
        words.emplace_back("[OPTION]...");
    }
    for (const Option &argument : arguments) {
        const std::string &strWord = argument.names.front();
        words.push_back((argument.blRequired ? strWord : "[" + strWord + "]") +
                        (argument.blRepeats ? "..." : ""));
    }
    if (!commands.empty()) {
        words.emplace_back("COMMAND");
        words.emplace_back("[ARGUMENT]...");
    }
    return words;
}

Command Read(const CLI::App &app) {
    Command command;
    command.strName = FullName(app);
    const std::string strDescription = app.get_description();
    const std::size_t end = strDescription.find('\n');
    command.strSummary = strDescription.substr(0, end);
    command.strText = end == std::string::npos ? "" : strDescription.substr(end + 1);
    command.strExamples = app.get_footer();
    for (const CLI::Option *pOption : app.get_options()) {
        std::vector<Option> &rows = pOption->get_positional() ? command.arguments : command.options;
        if (!pOption->get_group().empty()) {
            rows.push_back(ReadOption(*pOption));
        } else if (pOption->get_positional() && !rows.empty()) {
            // Hidden ones behind an argument are its repetitions.
            rows.back().blRepeats = true;
        }
    }
    // The options of the command first, then those that every command has.
    const CLI::Option *pHelp = app.get_help_ptr();
    if (pHelp != nullptr && !command.options.empty()) {
        std::rotate(command.options.begin(), command.options.begin() + 1, command.options.end());
    }
    for (const CLI::App *pCommand :
         app.get_subcommands([](const CLI::App * /*pApp*/) { return true; })) {
        command.commands.push_back(Read(*pCommand));
    }
    return command;
}

}  // namespace option_table
