#include "report.h"

#include <json/writer.h>

#include <algorithm>
#include <cstdio>
#include <iostream>

#include "json_text.h"

namespace qrmctl {

std::string Printable(const std::string &strText) {
    std::string strSafe;
    for (char c : strText) {
        const auto byte = static_cast<unsigned char>(c);
        if (byte >= 0x20 && byte != 0x7F) {
            strSafe += c;
            continue;
        }
        constexpr char kHex[] = "0123456789ABCDEF";
        strSafe += {'\\', 'x', kHex[byte >> 4U], kHex[byte & 15U]};
    }
    return strSafe;
}

void Report::Fact(const std::string &strName, const Json::Value &value) {
    m_result[strName] = value;
    if (!m_blJson) {
        const std::string strText =
            value.isString() ? value.asString() : json_text::ToLogText(value);
        std::cout << strName << ": " << Printable(strText) << '\n';
    }
}

void Report::Document(const std::string &strName, const Json::Value &value) {
    m_result[strName] = value;
    if (!m_blJson) {
        Json::StreamWriterBuilder builder;
        builder["indentation"] = "  ";
        builder["emitUTF8"] = true;
        builder["enableYAMLCompatibility"] = true;  // no blank before a colon
        std::string strText = Json::writeString(builder, value);
        std::replace(strText.begin(), strText.end(), '\x7F', '?');
        std::cout << strText << '\n';
    }
}

void Report::Say(const std::string &strSentence) const {
    if (!m_blJson) {
        std::cout << Printable(strSentence) << '\n';
    }
}

void Report::Warn(const std::string &strSentence) {
    m_result["warnings"].append(strSentence);
    std::cerr << "qrmctl: warning: " << Printable(strSentence) << '\n';
}

ExitCode Report::Done(ExitCode code) {
    m_result["success"] = true;
    PrintJson();
    std::cout.flush();
    if (!std::cout) {
        std::cerr << "qrmctl: cannot write to standard output\n";
        return kFailed;
    }
    return code;
}

ExitCode Report::Fail(const std::string &strError) {
    m_result["success"] = false;
    m_result["error"] = strError;
    PrintJson();
    std::cout.flush();
    std::cerr << "qrmctl: " << Printable(strError) << '\n';
    return kFailed;
}

void Report::PrintJson() {
    if (m_blJson) {
        std::cout << json_text::ToLogText(m_result) << '\n';
    }
}

}  // namespace qrmctl
