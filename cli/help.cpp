#include "help.h"

#include <algorithm>
#include <vector>

#include "words.h"

namespace help {
namespace {

using option_table::Command;
using option_table::Option;

constexpr std::size_t kWidth = 80;
constexpr std::size_t kWidestLabel = 24;
constexpr std::size_t kGap = 2;

// Words that follow a text which ends at the column; further lines begin at the indent.
std::string Wrapped(const std::vector<std::string> &words, std::size_t column, std::size_t indent) {
    std::string strText;
    bool blFirst = true;
    for (const std::string &strWord : words) {
        if (!blFirst && column + 1 + strWord.size() > kWidth) {
            strText += "\n" + std::string(indent, ' ');
            column = indent;
        } else if (!blFirst) {
            strText += ' ';
            ++column;
        }
        strText += strWord;
        column += strWord.size();
        blFirst = false;
    }
    return strText + "\n";
}

std::string Wrapped(const std::string &strText, std::size_t column, std::size_t indent) {
    return Wrapped(words::Split(strText, ' '), column, indent);
}

struct Row {
    std::string strLabel;
    std::string strText;
};

// Two columns, the first as wide as it has to be; a label that is wider still gets a line of its
// own.
std::string Table(const std::vector<Row> &rows) {
    std::size_t width = 0;
    for (const Row &row : rows) {
        width = std::max(width, std::min(row.strLabel.size(), kWidestLabel));
    }
    const std::size_t column = kGap + width + kGap;
    std::string strTable;
    for (const Row &row : rows) {
        strTable += std::string(kGap, ' ') + row.strLabel;
        strTable += row.strLabel.size() > width
                        ? "\n" + std::string(column, ' ')
                        : std::string(column - kGap - row.strLabel.size(), ' ');
        strTable += Wrapped(row.strText, column, column);
    }
    return strTable;
}

std::string Rows(const char *szTitle, const std::vector<Option> &options) {
    std::vector<Row> rows;
    for (const Option &option : options) {
        std::string strText = option.strDescription;
        if (!option.choices.empty()) {
            strText += ": " + words::Joined(option.choices, ", ");
        }
        rows.push_back({option.Label(), strText});
    }
    return rows.empty() ? "" : std::string("\n") + szTitle + "\n" + Table(rows);
}

std::string Commands(const Command &command) {
    std::vector<Row> rows;
    for (const Command &each : command.commands) {
        rows.push_back({each.LastName(), each.strSummary});
    }
    return rows.empty() ? "" : "\n" + Table(rows);
}

// A program with many commands names its options only: so the whole fits a screen.
std::string OptionNames(const Command &command) {
    std::vector<std::string> labels;
    for (const Option &option : command.options) {
        labels.push_back(option.names.back());
    }
    return Wrapped("Options: " + words::Joined(labels, ", ") + ". '" + command.strName +
                       " COMMAND --help' says more of each command.",
                   0, 0);
}

}  // namespace

std::string Text(const Command &command) {
    const std::string strUsage = "Usage: " + command.strName + " ";
    const std::string strTop = strUsage +
                               Wrapped(command.Usage(), strUsage.size(), strUsage.size()) +
                               Wrapped(command.strSummary + ".", 0, 0);
    if (command.IsProgram() && !command.commands.empty()) {
        return strTop + Commands(command) + OptionNames(command);
    }
    const std::string strText = command.strText.empty() ? "" : Wrapped(command.strText, 0, 0);
    const std::string strExamples =
        command.strExamples.empty() ? "" : "\nExamples:\n" + command.strExamples + "\n";
    return strTop + strText + Commands(command) + Rows("Arguments:", command.arguments) +
           Rows("Options:", command.options) + strExamples;
}

}  // namespace help
