// A program's option table as plain rows: what its help, its manual pages and its completions show.
// They are all made of these rows, so none of them can fall behind the program.

#ifndef ZELO_OPTION_TABLE_H
#define ZELO_OPTION_TABLE_H

#include <string>
#include <vector>

namespace CLI {
class App;
}  // namespace CLI

namespace option_table {

struct Option {
    std::vector<std::string> names;    // "-h", "--help"; of a positional argument its one name
    std::string strValue;              // what the value is called; empty for a flag
    std::vector<std::string> choices;  // the values, where there are only these
    std::string strDescription;        // with the default and the limits of the value
    bool blRequired = false;
    bool blRepeats = false;

    // "-h, --help", "--server HOST".
    std::string Label() const;
};

struct Command {
    std::string strName;  // after the names of those it belongs to: "qrmctl credential show"
    std::string strSummary;
    std::string strText;      // what else there is to say; may be empty
    std::string strExamples;  // lines for a shell; may be empty
    std::vector<Option> arguments;
    std::vector<Option> options;
    std::vector<Command> commands;

    bool IsProgram() const { return strName.find(' ') == std::string::npos; }
    std::string LastName() const { return strName.substr(strName.rfind(' ') + 1); }

    // The words of a call behind the name: what has to be there, what may be.
    std::vector<std::string> Usage() const;
};

// Reads the table of a program or of one of its commands. The first line of a description is the
// summary, what follows it the text; the footer holds the examples.
Command Read(const CLI::App &app);

// What an exit status means, for one command ("qrmctl status") or for each.
struct ExitStatus {
    int status;
    const char *szCommand;  // null: each
    const char *szMeaning;
};

}  // namespace option_table

#endif
