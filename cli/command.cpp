#include "command.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <sstream>
#include <utility>

#include "help.h"
#include "suggestion.h"
#include "words.h"

namespace command {
namespace {

// The command whose words the parse had no use for, the outermost first; null when there is none.
const CLI::App *WhereUnknown(const CLI::App &app) {
    if (app.remaining_size() > 0) {
        return &app;
    }
    for (const CLI::App *pCommand : app.get_subcommands()) {
        if (const CLI::App *pFound = WhereUnknown(*pCommand)) {
            return pFound;
        }
    }
    return nullptr;
}

// The chosen command that lacks one of its own.
const CLI::App &Innermost(const CLI::App &app) {
    const std::vector<CLI::App *> chosen = app.get_subcommands();
    return chosen.empty() ? app : Innermost(*chosen.front());
}

// The program's own commands are too many for a line.
std::string CommandMissing(const CLI::App &app) {
    const option_table::Command command = option_table::Read(app);
    std::vector<std::string> names;
    for (const option_table::Command &each : command.commands) {
        names.push_back(each.LastName());
    }
    return "'" + command.strName + "' needs a command" +
           (command.IsProgram() ? "" : ": " + words::Joined(names, ", "));
}

// A misspelt command or option is what the user has to know, not what is missing because of it.
Stop Wrong(const CLI::App &app, const CLI::ParseError &error) {
    if (const CLI::App *const pWhere = WhereUnknown(app)) {
        return {true, suggestion::UnknownWord(pWhere->remaining(false).front(),
                                              option_table::Read(*pWhere))};
    }
    const CLI::App &innermost = Innermost(app);
    const bool blRequired =
        error.get_exit_code() == static_cast<int>(CLI::ExitCodes::RequiredError);
    if (blRequired && innermost.get_require_subcommand_min() > 0) {
        return {true, CommandMissing(innermost)};
    }
    return {true, error.what()};
}

constexpr const char *kNotEmpty = "not empty";

// An empty text would be taken for one that is not given.
OptionHandle NotEmpty(CLI::Option &option) {
    const auto flaw = [](const std::string &strValue) {
        return std::string(strValue.empty() ? "it is empty: give a value, or leave it out" : "");
    };
    option.check(CLI::Validator(flaw, "", kNotEmpty));
    return OptionHandle(option);
}

}  // namespace

OptionHandle OptionHandle::Required() const {
    m_pOption->required();
    return *this;
}

OptionHandle OptionHandle::Hidden() const {
    m_pOption->group("");
    return *this;
}

OptionHandle OptionHandle::ValueName(const char *szName) const {
    m_pOption->type_name(szName);
    return *this;
}

OptionHandle OptionHandle::Suggests(const std::string &strName,
                                    const std::vector<std::string> &values) const {
    m_pOption->type_name(strName + ":{" + words::Joined(values, ",") + "}");
    return *this;
}

OptionHandle OptionHandle::MayBeEmpty() const {
    m_pOption->get_validator(kNotEmpty)->active(false);
    return *this;
}

OptionHandle OptionHandle::Between(int least, int most) const {
    m_pOption->check(CLI::Range(least, most));
    return *this;
}

OptionHandle OptionHandle::OneOf(const std::vector<std::string> &values) const {
    m_pOption->check(CLI::IsMember(values));
    return *this;
}

OptionHandle OptionHandle::Checked(
    const std::function<std::string(const std::string &)> &flaw) const {
    m_pOption->check(flaw);
    return *this;
}

OptionHandle OptionHandle::Needs(OptionHandle other) const {
    m_pOption->needs(other.m_pOption);
    return *this;
}

OptionHandle OptionHandle::Excludes(OptionHandle other) const {
    m_pOption->excludes(other.m_pOption);
    return *this;
}

OptionHandle OptionHandle::ShowsDefault() const {
    m_pOption->capture_default_str();
    return *this;
}

bool OptionHandle::IsGiven() const {
    return m_pOption->count() > 0;
}

CommandHandle CommandHandle::Add(const std::string &strName, const std::string &strSummary) const {
    return CommandHandle(*m_pApp->add_subcommand(strName, strSummary));
}

CommandHandle CommandHandle::Command(const std::string &strName) const {
    return CommandHandle(*m_pApp->get_subcommand(strName));
}

std::vector<CommandHandle> CommandHandle::Commands() const {
    std::vector<CommandHandle> commands;
    for (CLI::App *pCommand : m_pApp->get_subcommands(nullptr)) {
        commands.emplace_back(*pCommand);
    }
    return commands;
}

void CommandHandle::RequireCommand() const {
    m_pApp->require_subcommand(1);
}

void CommandHandle::RunsWhenChosen(const std::function<void()> &run) const {
    m_pApp->callback(run);
}

bool CommandHandle::IsChosen() const {
    return m_pApp->parsed();
}

void CommandHandle::Explain(const std::string &strText, const std::string &strExamples) const {
    m_pApp->description(m_pApp->get_description() + "\n" + strText);
    m_pApp->footer(strExamples);
}

OptionHandle CommandHandle::Flag(const std::string &strName, bool &blGiven,
                                 const std::string &strDescription) const {
    return OptionHandle(*m_pApp->add_flag(strName, blGiven, strDescription));
}

OptionHandle CommandHandle::Text(const std::string &strName, std::string &strValue,
                                 const std::string &strDescription) const {
    return NotEmpty(*m_pApp->add_option(strName, strValue, strDescription));
}

OptionHandle CommandHandle::Text(const std::string &strName,
                                 const std::function<void(const std::string &)> &take,
                                 const std::string &strDescription) const {
    return NotEmpty(*m_pApp->add_option_function<std::string>(strName, take, strDescription));
}

OptionHandle CommandHandle::Texts(const std::string &strName, std::vector<std::string> &values,
                                  const std::string &strDescription) const {
    return OptionHandle(*m_pApp->add_option(strName, values, strDescription));
}

OptionHandle CommandHandle::Number(const std::string &strName, int &value,
                                   const std::string &strDescription) const {
    return OptionHandle(*m_pApp->add_option(strName, value, strDescription));
}

OptionHandle CommandHandle::Real(const std::string &strName, double &value,
                                 const std::string &strDescription) const {
    return OptionHandle(*m_pApp->add_option(strName, value, strDescription));
}

Program::Program(const std::string &strName, const std::string &strSummary,
                 const std::string &strVersion)
    : m_pApp(std::make_unique<CLI::App>(strSummary, strName)) {
    // Before the commands are added: they take it over.
    m_pApp->formatter_fn(
        [](const CLI::App *pApp, const std::string & /*strName*/, CLI::AppFormatMode /*mode*/) {
            return help::Text(option_table::Read(*pApp));
        });
    m_pApp->set_version_flag("--version", strVersion, "Show the version");
}

Program::~Program() = default;

std::optional<Stop> Program::Read(std::vector<std::string> words) {
    // The parser takes them from the end.
    std::reverse(words.begin(), words.end());
    try {
        m_pApp->parse(std::move(words));
        return std::nullopt;
    } catch (const CLI::ParseError &error) {
        if (error.get_exit_code() != static_cast<int>(CLI::ExitCodes::Success)) {
            return Wrong(*m_pApp, error);
        }
        std::ostringstream shown;
        shown.exceptions(std::ios::badbit);  // or short memory would cut the help
        m_pApp->exit(error, shown, shown);
        return Stop{false, shown.str()};
    }
}

std::optional<Stop> Program::Read(int argc, const char *const *argv) {
    return Read({argv + std::min(argc, 1), argv + argc});
}

}  // namespace command
