#include "report.h"

#include <json/writer.h>

#include <algorithm>
#include <cstdio>
#include <iostream>

#include "deadline.h"
#include "json.h"
#include "printable.h"

namespace qrmctl {

static constexpr const char *kOutputStage = "writing the result";

void Report::Fact(const std::string &strName, const Json::Value &value) {
    m_result[strName] = value;
    if (!m_blJson) {
        const std::string strText = value.isString() ? value.asString() : json::ToLogText(value);
        std::cout << strName << ": " << printable::Line(strText) << '\n';
    }
}

void Report::Document(const std::string &strName, const Json::Value &value) {
    m_result[strName] = value;
    if (!m_blJson) {
        Json::StreamWriterBuilder builder;
        builder["indentation"] = "  ";
        builder["emitUTF8"] = true;
        builder["enableYAMLCompatibility"] = true;  // no blank before a colon
        std::cout << printable::Json(Json::writeString(builder, value)) << '\n';
    }
}

void Report::Say(const std::string &strSentence) const {
    if (!m_blJson) {
        std::cout << printable::Line(strSentence) << '\n';
    }
}

void Report::Warn(const std::string &strSentence) {
    m_result["warnings"].append(strSentence);
    std::cerr << ("qrmctl: warning: " + printable::Line(strSentence) + '\n');
}

void Report::Stage(const std::string &strName) {
    EnterStage(strName);
}

void Report::Remedy(const std::string &strRemedy) {
    SetDeadlineRemedy(strRemedy);
}

ExitCode Report::Done(ExitCode code) {
    if (IsDeadlineOver()) {
        return FailAtDeadline();
    }
    m_result["success"] = true;
    Stage(kOutputStage);
    if (!PutOutResult()) {
        std::cerr << "qrmctl: cannot write to standard output\n";
        return ErrorOf(ErrorId::kOutput).exitCode;
    }
    return code;
}

ExitCode Report::Fail(ErrorId id, const std::string &strError) {
    return IsDeadlineOver() && id != ErrorId::kInterrupted ? FailAtDeadline()
                                                           : PutOutFailure(id, strError);
}

// What else the command had for programs would be half of a result.
ExitCode Report::FailAtDeadline() {
    const Strike strike = DescribeStrike();
    m_result = Json::Value(Json::objectValue);
    m_result["schema"] = kSchema;
    m_result["deadline_s"] = strike.limit_s;
    m_result["stage"] = strike.strStage;
    m_result["longest_stage"] = strike.strLongest;
    return PutOutFailure(ErrorId::kDeadline, strike.strError);
}

ExitCode Report::PutOutFailure(ErrorId id, const std::string &strError) {
    m_result["success"] = false;
    m_result["error"] = strError;
    m_result["error_id"] = ErrorOf(id).szId;
    Stage(kOutputStage);
    std::cout.flush();
    std::cerr << "qrmctl: " + printable::Line(strError) + '\n';
    static_cast<void>(PutOutResult());
    return ErrorOf(id).exitCode;
}

ExitCode FailShortOfMemory(bool blJson) noexcept {
    std::cout.flush();
    std::cerr << "qrmctl: memory is short\n";
    if (blJson) {
        std::cout << R"({"error":"memory is short","error_id":"out-of-memory",)"
                     R"("schema":"qrmctl/1","success":false})"
                     "\n";
        std::cout.flush();
    }
    return kFailed;
}

// Puts everything out that is meant for standard output. A reader who takes it has all the time
// that is left.
bool Report::PutOutResult() {
    if (m_blJson) {
        std::cout << json::ToLogText(m_result) + '\n';
    }
    const bool blOut = static_cast<bool>(std::cout.flush());
    EndDeadline();
    return blOut;
}

}  // namespace qrmctl
