#include "page.h"

#include <algorithm>

#include "../words.h"

namespace manual {
namespace {

using option_table::Command;
using option_table::ExitStatus;
using option_table::Option;

// Text as it has to be written for troff to show it: letters that are commands or typographic signs
// there, and a dot or a quote that would make a line a request.
std::string Escaped(const std::string &strText) {
    std::string strSafe;
    bool blLineStart = true;
    for (char c : strText) {
        if (blLineStart && (c == '.' || c == '\'')) {
            strSafe += "\\&";
        }
        switch (c) {
            case '\\':
                strSafe += "\\e";
                break;
            case '-':
                strSafe += "\\-";
                break;
            case '\'':
                strSafe += "\\(aq";
                break;
            case '"':
                strSafe += "\\(dq";
                break;
            case '`':
                strSafe += "\\(ga";
                break;
            case '^':
                strSafe += "\\(ha";
                break;
            case '~':
                strSafe += "\\(ti";
                break;
            default:
                strSafe += c;
        }
        blLineStart = c == '\n';
    }
    return strSafe;
}

std::string Bold(const std::string &strText) {
    return "\\fB" + Escaped(strText) + "\\fR";
}

std::string Italic(const std::string &strText) {
    return "\\fI" + Escaped(strText) + "\\fR";
}

std::string Section(const char *szTitle, const std::string &strText) {
    return strText.empty() ? "" : std::string(".SH ") + szTitle + "\n" + strText;
}

// A line of text; each sentence of prose is left to troff to fill.
std::string Line(const std::string &strText) {
    return Escaped(strText) + "\n";
}

std::string PageName(const Command &command) {
    std::string strName = command.strName;
    std::replace(strName.begin(), strName.end(), ' ', '-');
    return strName;
}

std::string LowerFirst(std::string strText) {
    // A word such as HTTP stays.
    if (strText.size() > 1 && strText[1] >= 'A' && strText[1] <= 'Z') {
        return strText;
    }
    if (strText[0] >= 'A' && strText[0] <= 'Z') {
        strText[0] = static_cast<char>(strText[0] - 'A' + 'a');
    }
    return strText;
}

// A word of a call: what is to be typed is bold, what is to be replaced is in capitals and italic.
std::string UsageWord(const std::string &strWord) {
    std::string strLine;
    for (const std::string &strPart : words::Split(strWord, ' ')) {
        const bool blTyped = strPart.front() == '-';
        strLine += (strLine.empty() ? "" : " ") + (blTyped ? Bold(strPart) : Italic(strPart));
    }
    return strLine;
}

std::string Synopsis(const Command &command) {
    std::string strLine = Bold(command.strName);
    for (const std::string &strWord : command.Usage()) {
        strLine += " " + UsageWord(strWord);
    }
    return strLine + "\n";
}

std::string Options(const std::vector<Option> &options) {
    std::string strText;
    for (const Option &option : options) {
        std::string strLabel;
        for (const std::string &strName : option.names) {
            const bool blTyped = strName.front() == '-';
            strLabel +=
                (strLabel.empty() ? "" : ", ") + (blTyped ? Bold(strName) : Italic(strName));
        }
        if (option.names.front().front() == '-' && !option.strValue.empty()) {
            strLabel += " " + Italic(option.strValue);
        }
        strText += ".TP\n" + strLabel + "\n" + Escaped(option.strDescription);
        if (!option.choices.empty()) {
            strText += ": " + Escaped(words::Joined(option.choices, ", "));
        }
        strText +=
            option.blRequired && option.names.front().front() == '-' ? "; required.\n" : ".\n";
    }
    return strText;
}

std::string Description(const Command &command) {
    return Line(command.strSummary + ".") +
           (command.strText.empty() ? "" : ".PP\n" + Line(command.strText));
}

// The commands of a command of the program: each with all its own.
std::string NestedCommands(const Command &command) {
    std::string strText;
    for (const Command &each : command.commands) {
        strText += ".SS " + Escaped(each.LastName()) + "\n" + Synopsis(each) + ".PP\n" +
                   Description(each) + Options(each.arguments) + Options(each.options);
    }
    return strText;
}

std::string CommandPages(const Command &program) {
    std::string strText;
    for (const Command &each : program.commands) {
        strText += ".TP\n.BR " + Escaped(PageName(each)) + " (1)\n" + Line(each.strSummary + ".");
    }
    return strText;
}

std::string Statuses(const std::vector<ExitStatus> &statuses, const Command &command) {
    const bool blProgram = command.IsProgram();
    std::string strText;
    for (const ExitStatus &status : statuses) {
        const bool blOwn = status.szCommand != nullptr && command.strName == status.szCommand;
        // A meaning of the command's own goes before that of the same status for each command.
        const bool blReplaced =
            status.szCommand == nullptr &&
            std::any_of(statuses.begin(), statuses.end(), [&](const ExitStatus &other) {
                return other.szCommand != nullptr && command.strName == other.szCommand &&
                       other.status == status.status;
            });
        if (blReplaced || !(blProgram || blOwn || status.szCommand == nullptr)) {
            continue;
        }
        const std::string strOf = status.szCommand != nullptr && !blOwn
                                      ? "Of " + Bold(status.szCommand) + ": "
                                      : std::string();
        strText +=
            ".TP\n" + Bold(std::to_string(status.status)) + "\n" + strOf + Line(status.szMeaning);
    }
    return strText;
}

std::string Examples(const Command &command) {
    return command.strExamples.empty() ? "" : ".EX\n" + Line(command.strExamples) + ".EE\n";
}

std::string AlsoSee(std::vector<std::string> names, const std::string &strOwn) {
    names.erase(std::remove(names.begin(), names.end(), strOwn), names.end());
    std::string strText;
    for (std::size_t i = 0; i < names.size(); ++i) {
        strText += ".BR " + Escaped(names[i]) + (i + 1 < names.size() ? " (1),\n" : " (1)\n");
    }
    return strText;
}

Page MakePage(const Program &program, const Command &command) {
    const bool blProgram = &program.command == &command;
    const std::string strName = PageName(command);
    std::string strTitle = strName;
    std::transform(strTitle.begin(), strTitle.end(), strTitle.begin(), [](char c) {
        return c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c;
    });
    std::string strText = ".\\\" Made from the option table of " + program.command.strName + ".\n";
    strText += ".TH " + Escaped(strTitle) +
               " 1 " ZELO_RELEASE_DATE " \"zeloqrmclient " ZELO_VERSION "\" \"User commands\"\n";
    strText += Section("NAME", Escaped(strName) + " \\- " + Line(LowerFirst(command.strSummary)));
    strText += Section("SYNOPSIS", Synopsis(command));
    strText += Section("DESCRIPTION", Description(command));
    strText += Section("COMMANDS", blProgram ? CommandPages(command) : NestedCommands(command));
    strText += Section("ARGUMENTS", Options(command.arguments));
    strText += Section("OPTIONS", Options(command.options));
    strText += Section("EXIT STATUS", Statuses(program.statuses, command));
    strText += Section("EXAMPLES", Examples(command));
    strText += Section("SEE ALSO", AlsoSee(program.alsoSee, strName));
    return {strName, strText};
}

}  // namespace

std::vector<Page> Pages(const Program &program) {
    std::vector<Page> pages = {MakePage(program, program.command)};
    for (const Command &command : program.command.commands) {
        pages.push_back(MakePage(program, command));
    }
    return pages;
}

}  // namespace manual
