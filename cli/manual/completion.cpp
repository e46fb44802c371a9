#include "completion.h"

#include <algorithm>

#include "../words.h"

namespace manual {
namespace {

using option_table::Command;
using option_table::Option;

constexpr const char *kNote = " Made from the program's option table.\n";

// A name that is a word to every shell: letters, digits and underlines.
std::string FunctionName(const std::string &strName) {
    std::string strFunction = "_" + strName;
    std::replace_if(
        strFunction.begin(), strFunction.end(), [](char c) { return c == ' ' || c == '-'; }, '_');
    return strFunction;
}

// Text between single quotes, for bash and zsh.
std::string Quoted(const std::string &strText) {
    std::string strQuoted = "'";
    for (char c : strText) {
        strQuoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
    }
    return strQuoted + "'";
}

bool IsFile(const Option &option) {
    return option.strValue == "FILE";
}

std::vector<Command> Flat(const Command &command) {
    std::vector<Command> commands = {command};
    for (const Command &each : command.commands) {
        const std::vector<Command> deeper = Flat(each);
        commands.insert(commands.end(), deeper.begin(), deeper.end());
    }
    return commands;
}

std::string Names(const std::vector<Option> &options) {
    std::vector<std::string> names;
    for (const Option &option : options) {
        names.insert(names.end(), option.names.begin(), option.names.end());
    }
    return words::Joined(names, " ");
}

std::string CommandNames(const Command &command) {
    std::vector<std::string> names;
    for (const Command &each : command.commands) {
        names.push_back(each.LastName());
    }
    return words::Joined(names, " ");
}

// --- bash ---------------------------------------------------------------------------------------

// The words that may stand where no option does, and whether a file may.
std::string BashWords(const Command &command) {
    std::string strWords = CommandNames(command);
    std::string strFiles;
    for (const Option &argument : command.arguments) {
        if (!argument.choices.empty()) {
            strWords += (strWords.empty() ? "" : " ") + words::Joined(argument.choices, " ");
        }
        strFiles = IsFile(argument) ? " files=yes" : strFiles;
    }
    return " words=" + Quoted(strWords) + strFiles;
}

std::string BashValues(const Command &command) {
    std::string strCases;
    for (const Option &option : command.options) {
        for (const std::string &strName : option.names) {
            if (!option.strValue.empty()) {
                strCases += "    " + Quoted(command.strName + " " + strName) +
                            ") options= words=" + Quoted(words::Joined(option.choices, " ")) +
                            " files=" + (IsFile(option) ? "yes" : "") + " ;;\n";
            }
        }
    }
    return strCases;
}

// --- zsh ----------------------------------------------------------------------------------------

// What is shown of a value, and where it comes from.
std::string ZshValue(const std::string &strName, const Option &option) {
    std::string strAction;
    if (IsFile(option)) {
        strAction = "_files";
    } else if (!option.choices.empty()) {
        strAction = "(" + words::Joined(option.choices, " ") + ")";
    }
    return ":" + strName + ":" + strAction;
}

// An option's names exclude each other.
std::string ZshOption(const Option &option) {
    const std::string strExcluded = option.names.size() > 1 ? "(" + Names({option}) + ")" : "";
    std::string strRest = "[";
    for (char c : option.strDescription) {
        strRest += c == '[' || c == ']' || c == ':' ? std::string("\\") + c : std::string(1, c);
    }
    strRest += "]";
    if (!option.strValue.empty()) {
        strRest += ZshValue(option.strValue, option);
    }
    std::string strSpecs;
    for (const std::string &strName : option.names) {
        std::string strSpec = strExcluded;
        strSpec.append(strName).append(strRest);
        strSpecs.append(" \\\n        ").append(Quoted(strSpec));
    }
    return strSpecs;
}

std::string ZshFunction(const Command &command) {
    const std::string strFunction = FunctionName(command.strName);
    std::string strSpecs;
    for (const Option &option : command.options) {
        strSpecs += ZshOption(option);
    }
    if (command.commands.empty()) {
        for (std::size_t i = 0; i < command.arguments.size(); ++i) {
            const Option &argument = command.arguments[i];
            const std::string strValue = ZshValue(argument.names.front(), argument);
            strSpecs += " \\\n        " +
                        Quoted((argument.blRepeats ? "*" : std::to_string(i + 1)) + strValue);
        }
        return strFunction + "() {\n    _arguments" + strSpecs + "\n}\n\n";
    }
    std::string strCommands;
    std::string strCases;
    for (const Command &each : command.commands) {
        strCommands += "        " + Quoted(each.LastName() + ":" + each.strSummary) + "\n";
        strCases += "        " + each.LastName() + ") " + FunctionName(each.strName) + " ;;\n";
    }
    return strFunction +
           "() {\n    local context state state_descr line\n    typeset -A opt_args\n" +
           "    local -a commands=(\n" + strCommands + "    )\n    _arguments -C" + strSpecs +
           " \\\n        '1: :->command' '*:: :->argument'\n" +
           "    case $state in\n    command) _describe command commands ;;\n" +
           "    argument)\n        case $words[1] in\n" + strCases +
           "        esac ;;\n    esac\n}\n\n";
}

// --- fish ---------------------------------------------------------------------------------------

// What may be typed once the words before have named the command.
std::string FishLine(const std::string &strProgram, const Command &command,
                     const std::string &strRest) {
    return "complete -c " + strProgram + " -n " +
           Quoted("_" + FunctionName(strProgram) + "_at " + Quoted(command.strName)) + " " +
           strRest + "\n";
}

std::string FishQuoted(const std::string &strText) {
    std::string strQuoted = "'";
    for (char c : strText) {
        strQuoted += c == '\'' || c == '\\' ? std::string("\\") + c : std::string(1, c);
    }
    return strQuoted + "'";
}

std::string FishOption(const Option &option) {
    std::string strRest;
    for (const std::string &strName : option.names) {
        const bool blLong = strName.rfind("--", 0) == 0;
        strRest += (blLong ? "-l " : "-s ") + strName.substr(blLong ? 2 : 1) + " ";
    }
    if (!option.strValue.empty()) {
        strRest += IsFile(option) ? "-r -F " : "-x ";
    }
    if (!option.choices.empty()) {
        strRest += "-a " + FishQuoted(words::Joined(option.choices, " ")) + " ";
    }
    return strRest + "-d " + FishQuoted(option.strDescription);
}

}  // namespace

std::string BashCompletion(const Command &program) {
    const std::string strFunction = FunctionName(program.strName);
    std::string strPaths;
    std::string strWords;
    std::string strValues;
    for (const Command &command : Flat(program)) {
        if (command.strName != program.strName) {
            strPaths += (strPaths.empty() ? "" : " | ") + Quoted(command.strName);
        }
        strWords += "    " + Quoted(command.strName) +
                    ") options=" + Quoted(Names(command.options)) + BashWords(command) + " ;;\n";
        strValues += BashValues(command);
    }
    // Without a command there is nothing to walk to.
    const std::string strWalk =
        strPaths.empty() ? ""
                         : "    for ((i = 1; i < COMP_CWORD; ++i)); do\n"
                           "        case \"$path ${COMP_WORDS[i]}\" in\n        " +
                               strPaths +
                               ")\n            path+=\" ${COMP_WORDS[i]}\" ;;\n        esac\n"
                               "    done\n";
    return std::string("#") + kNote + strFunction +
           "() {\n"
           "    local word=${COMP_WORDS[COMP_CWORD]} path=" +
           Quoted(program.strName) +
           " options= words= files= i\n"
           "    COMPREPLY=()\n" +
           strWalk + "    case $path in\n" + strWords +
           "    esac\n"
           "    case \"$path ${COMP_WORDS[COMP_CWORD - 1]}\" in\n" +
           strValues +
           "    esac\n"
           "    if [[ $word == -* ]]; then\n"
           "        mapfile -t COMPREPLY < <(compgen -W \"$options\" -- \"$word\")\n"
           "        return\n"
           "    fi\n"
           "    mapfile -t COMPREPLY < <(compgen -W \"$words\" -- \"$word\")\n"
           "    if [[ -n $files ]]; then\n"
           "        compopt -o filenames 2>/dev/null\n"
           "        mapfile -t -O ${#COMPREPLY[@]} COMPREPLY < <(compgen -f -- \"$word\")\n"
           "    fi\n"
           "}\n"
           "complete -F " +
           strFunction + " " + program.strName + "\n";
}

std::string ZshCompletion(const Command &program) {
    std::string strText = "#compdef " + program.strName + "\n#" + kNote + "\n";
    for (const Command &command : Flat(program)) {
        strText += ZshFunction(command);
    }
    return strText + FunctionName(program.strName) + " \"$@\"\n";
}

std::string FishCompletion(const Command &program) {
    std::string strPaths;
    std::string strLines;
    for (const Command &command : Flat(program)) {
        strPaths += " " + FishQuoted(command.strName);
        for (const Command &each : command.commands) {
            strLines += FishLine(program.strName, command,
                                 "-a " + each.LastName() + " -d " + FishQuoted(each.strSummary));
        }
        for (const Option &argument : command.arguments) {
            if (!argument.choices.empty()) {
                strLines += FishLine(program.strName, command,
                                     "-a " + FishQuoted(words::Joined(argument.choices, " ")));
            }
            if (IsFile(argument)) {
                strLines += FishLine(program.strName, command, "-F");
            }
        }
        for (const Option &option : command.options) {
            strLines += FishLine(program.strName, command, FishOption(option));
        }
    }
    return std::string("#") + kNote + "function _" + FunctionName(program.strName) +
           "_at --description 'Whether the words before name this command'\n"
           "    set -l path\n"
           "    for word in (commandline -opc)\n"
           "        set -l longer (string join -- ' ' $path (string replace -r '.*/' '' -- "
           "$word))\n"
           "        if contains -- $longer" +
           strPaths +
           "\n"
           "            set path $longer\n"
           "        end\n"
           "    end\n"
           "    test \"$path\" = \"$argv\"\n"
           "end\n"
           "complete -c " +
           program.strName + " -f\n" + strLines;
}

}  // namespace manual
