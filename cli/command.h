// A program's commands and options, and reading its command line. The parser behind them is one
// header that takes seconds to compile, so nothing of it is seen from here.

#ifndef ZELO_COMMAND_H
#define ZELO_COMMAND_H

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "option_table.h"

namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace command {

// An option or a positional argument of a command. A handle looks only: the program owns what it
// stands for, and has to outlive it.
class OptionHandle {
  public:
    explicit OptionHandle(CLI::Option &option) : m_pOption(&option) {}

    OptionHandle Required() const;
    OptionHandle Hidden() const;
    // What help and manual call the value.
    OptionHandle ValueName(const char *szName) const;
    OptionHandle Between(int least, int most) const;
    OptionHandle OneOf(const std::vector<std::string> &values) const;
    // The value's name, and values to choose from where others are taken too.
    OptionHandle Suggests(const std::string &strName, const std::vector<std::string> &values) const;
    // A text that is given and empty is refused otherwise.
    OptionHandle MayBeEmpty() const;
    // The function says what is wrong with a value; nothing when it can be used.
    OptionHandle Checked(const std::function<std::string(const std::string &)> &flaw) const;
    OptionHandle Needs(OptionHandle other) const;
    OptionHandle Excludes(OptionHandle other) const;
    // Shows the variable's value of this moment as the default.
    OptionHandle ShowsDefault() const;

    // Whether the command line had it.
    bool IsGiven() const;

  private:
    CLI::Option *m_pOption;
};

// A command, or the program itself. The variables of its options are set when the command line is
// read; they have to outlive the program. A name that begins without '-' is a positional argument.
class CommandHandle {
  public:
    explicit CommandHandle(CLI::App &app) : m_pApp(&app) {}

    CommandHandle Add(const std::string &strName, const std::string &strSummary) const;
    // One of those that were added; throws when there is none of that name.
    CommandHandle Command(const std::string &strName) const;
    std::vector<CommandHandle> Commands() const;
    // The command line has to choose one of them.
    void RequireCommand() const;
    void RunsWhenChosen(const std::function<void()> &run) const;
    bool IsChosen() const;

    // What the manual says beside the summary.
    void Explain(const std::string &strText, const std::string &strExamples) const;

    OptionHandle Flag(const std::string &strName, bool &blGiven,
                      const std::string &strDescription) const;
    OptionHandle Text(const std::string &strName, std::string &strValue,
                      const std::string &strDescription) const;
    OptionHandle Text(const std::string &strName,
                      const std::function<void(const std::string &)> &take,
                      const std::string &strDescription) const;
    OptionHandle Texts(const std::string &strName, std::vector<std::string> &values,
                       const std::string &strDescription) const;
    OptionHandle Number(const std::string &strName, int &value,
                        const std::string &strDescription) const;
    OptionHandle Real(const std::string &strName, double &value,
                      const std::string &strDescription) const;

  private:
    CLI::App *m_pApp;
};

// Why there is nothing to run: help or the version is asked for, or the command line is wrong.
struct Stop {
    bool blWrong;
    std::string strText;  // to be shown, with its line's end; when wrong, one message without it
};

class Program {
  public:
    // strVersion is what --version shows.
    Program(const std::string &strName, const std::string &strSummary,
            const std::string &strVersion);
    ~Program();
    Program(const Program &) = delete;
    Program &operator=(const Program &) = delete;

    CommandHandle Root() const { return CommandHandle(*m_pApp); }
    option_table::Command Table() const { return option_table::Read(*m_pApp); }

    // Reads the words behind the program's name; the other form is for what main() is given.
    std::optional<Stop> Read(std::vector<std::string> words);
    std::optional<Stop> Read(int argc, const char *const *argv);

  private:
    std::unique_ptr<CLI::App> m_pApp;
};

}  // namespace command

#endif
