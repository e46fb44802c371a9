#include "report.h"

#include <json/writer.h>

#include <algorithm>
#include <cstdio>
#include <iostream>

#include "deadline.h"
#include "json.h"
#include "output.h"
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
    m_result["success"] = true;
    Stage(kOutputStage);
    if (!PutOutResult()) {
        std::cerr << "qrmctl: cannot write to standard output\n";
        static_cast<void>(PutOutLast(std::cerr));
        return ErrorOf(ErrorId::kOutput).exitCode;
    }
    return code;
}

ExitCode Report::Fail(ErrorId id, const std::string &strError) {
    m_result["success"] = false;
    m_result["error"] = strError;
    m_result["error_id"] = ErrorOf(id).szId;
    Stage(kOutputStage);
    const std::string strLine = "qrmctl: " + printable::Line(strError) + '\n';
    // What comes last decides: until it is out the deadline may strike.
    if (m_blJson) {
        std::cerr << strLine;
        static_cast<void>(PutOutResult());
    } else {
        std::cout.flush();
        std::cerr << std::nounitbuf << strLine;
        static_cast<void>(PutOutLast(std::cerr));
    }
    return ErrorOf(id).exitCode;
}

ExitCode FailShortOfMemory(bool blJson) noexcept {
    constexpr const char *kLine = "qrmctl: memory is short\n";
    if (blJson) {
        std::cerr << kLine;
        std::cout << R"({"error":"memory is short","error_id":"out-of-memory",)"
                  << R"("schema":"qrmctl/1","success":false})" << '\n';
        static_cast<void>(PutOutLast(std::cout));
    } else {
        std::cout.flush();
        std::cerr << std::nounitbuf << kLine;
        static_cast<void>(PutOutLast(std::cerr));
    }
    return kFailed;
}

// Puts everything out that is meant for standard output; the deadline is over when it is.
bool Report::PutOutResult() {
    if (m_blJson) {
        std::cout << json::ToLogText(m_result) + '\n';
    }
    return PutOutLast(std::cout);
}

}  // namespace qrmctl
