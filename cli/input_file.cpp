#include "input_file.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iostream>
#include <sstream>

#include "json_text.h"

namespace qrmctl {
namespace {

bool ReadAll(const char *szWhat, const std::string &strFile, std::string &strText,
             std::string &strError) {
    std::ostringstream text;
    if (strFile == "-") {
        text << std::cin.rdbuf();
    } else {
        errno = 0;
        std::ifstream file(strFile, std::ios::binary);
        if (file && file.peek() != std::ifstream::traits_type::eof()) {
            text << file.rdbuf();
        }
        if (!file.is_open() || file.bad() || errno == EISDIR) {
            strError = std::string("cannot read ") + szWhat + " '" + strFile +
                       "': " + std::strerror(errno == 0 ? EIO : errno) +
                       "; name a file that can be read, or - for standard input";
            return false;
        }
    }
    strText = text.str();
    return true;
}

}  // namespace

bool ReadJsonFile(const char *szWhat, const std::string &strFile, Json::Value &value,
                  std::string &strError) {
    std::string strText;
    if (!ReadAll(szWhat, strFile, strText, strError)) {
        return false;
    }
    std::string strReason;
    if (!json_text::FromString(strText, value, &strReason)) {
        strError = std::string("cannot read ") + szWhat + " '" + strFile + "': " + strReason;
        return false;
    }
    return true;
}

bool ReadParams(const std::string &strText, Json::Value &params, std::string &strError) {
    std::string strReason;
    if (strText.empty()) {
        return true;
    }
    if (strText.front() == '@') {
        if (!ReadJsonFile("parameters", strText.substr(1), params, strError)) {
            return false;
        }
    } else if (!json_text::FromString(strText, params, &strReason)) {
        strError = "cannot read the parameters '" + strText + "': " + strReason;
        return false;
    }
    if (!params.isObject()) {
        strError = "cannot use the parameters '" + strText + "': they have to be a JSON object";
        return false;
    }
    return true;
}

bool ReadTokenFile(const std::string &strFile, std::string &strToken, std::string &strError) {
    std::string strText;
    if (!ReadAll("token file", strFile, strText, strError)) {
        return false;
    }
    for (char c : {'\n', '\r'}) {
        if (!strText.empty() && strText.back() == c) {
            strText.pop_back();
        }
    }
    const char *szReason = nullptr;
    if (strText.empty()) {
        szReason = "it is empty; write the access token into it";
    } else if (strText.size() > kMaxStoredText) {
        szReason = "a token has at most 1023 bytes; check that the file holds nothing else";
    }
    for (char c : strText) {
        if (static_cast<unsigned char>(c) <= 0x20 || c == 0x7F) {
            szReason = "it has to hold the token alone, on one line and without blanks";
        }
    }
    if (szReason != nullptr) {
        strError = "cannot use token file '" + strFile + "': " + szReason;
        return false;
    }
    strToken = strText;
    return true;
}

}  // namespace qrmctl
