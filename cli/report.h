// What a command tells its user: text for people, or one JSON object for programs, never mixed.

#ifndef QRMCTL_REPORT_H
#define QRMCTL_REPORT_H

#include <json/value.h>

#include <string>

#include "error_ids.h"

namespace qrmctl {

// "schema" of every JSON object. The number goes up when a member goes or changes its meaning, not
// when one is added.
constexpr const char *kSchema = "qrmctl/1";

class Report {
  public:
    explicit Report(bool blJson) : m_blJson(blJson) { m_result["schema"] = kSchema; }

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

    // From here on the time counts for the stage with this name; a deadline that strikes names it.
    static void Stage(const std::string &strName);

    // What the operator is told to do when the deadline strikes from here on.
    static void Remedy(const std::string &strRemedy);

    // Ends the command: prints the JSON object, when one is asked for, and gives the exit code.
    // After the deadline both say that it struck; only an interruption is told as one.
    ExitCode Done(ExitCode code = kDone);
    ExitCode Fail(ErrorId id, const std::string &strError);

  private:
    ExitCode FailAtDeadline();
    ExitCode PutOutFailure(ErrorId id, const std::string &strError);
    bool PutOutResult();

    bool m_blJson;
    Json::Value m_result{Json::objectValue};
};

// Ends a command that memory was too short for, with ErrorId::kOutOfMemory; takes no memory itself.
ExitCode FailShortOfMemory(bool blJson) noexcept;

}  // namespace qrmctl

#endif
