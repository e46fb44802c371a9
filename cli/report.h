// What a command tells its user: text for people, or one JSON object for programs, never mixed.

#ifndef QRMCTL_REPORT_H
#define QRMCTL_REPORT_H

#include <json/value.h>

#include <string>

namespace qrmctl {

enum ExitCode { kDone = 0, kFailed = 1, kUsage = 2, kNotJoined = 3, kInconsistent = 4 };

class Report {
  public:
    explicit Report(bool blJson) : m_blJson(blJson) {}

    // Whether the result is for a program.
    bool IsJson() const { return m_blJson; }

    // A fact of the result: a line "name: value" for people, a member for programs.
    void Fact(const std::string &strName, const Json::Value &value);

    // The same for a value of several lines, shown alone.
    void Document(const std::string &strName, const Json::Value &value);

    // A member for programs alone.
    void Member(const std::string &strName, const Json::Value &value) { m_result[strName] = value; }

    // A sentence for people; programs do not see it.
    void Say(const std::string &strSentence) const;

    // Something odd that does not end the command.
    void Warn(const std::string &strSentence);

    // Ends the command: prints the JSON object, when one is asked for, and gives the exit code.
    ExitCode Done(ExitCode code = kDone);
    ExitCode Fail(const std::string &strError);

  private:
    void PrintJson();

    bool m_blJson;
    Json::Value m_result{Json::objectValue};
};

// Text from a file or a server for a terminal: control characters are shown as \xNN.
std::string Printable(const std::string &strText);

}  // namespace qrmctl

#endif
