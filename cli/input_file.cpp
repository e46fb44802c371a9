#include "input_file.h"

#include <fcntl.h>
#include <json/reader.h>
#include <poll.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <limits>
#include <memory>

#include "deadline.h"
#include "descriptor.h"
#include "json.h"
#include "words.h"

namespace qrmctl {
namespace {

// Waits for input until the deadline. False, with errno, when none has come.
bool AwaitInput(int fd) {
    constexpr double kMsPerS = 1000;
    pollfd input = {fd, POLLIN, 0};
    int ready = -1;
    do {
        const double left_ms = DeadlineLeft_s() * kMsPerS;
        ready =
            poll(&input, 1,
                 left_ms < std::numeric_limits<int>::max() ? static_cast<int>(left_ms) + 1 : -1);
    } while (ready < 0 && errno == EINTR);
    errno = ready == 0 ? ETIME : errno;
    return ready > 0;
}

// False with errno.
bool ReadAll(const std::string &strFile, std::string &strText) {
    const Descriptor file(strFile == "-"
                              ? dup(STDIN_FILENO)
                              : open(strFile.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    std::array<char, 4096> piece;
    ssize_t cb = file.IsOpen() ? 1 : -1;
    while (cb > 0) {
        cb = AwaitInput(file.Get()) ? read(file.Get(), piece.data(), piece.size()) : -1;
        strText.append(piece.data(), cb > 0 ? static_cast<std::size_t>(cb) : 0);
    }
    return cb == 0;
}

bool ReadInput(const char *szWhat, const std::string &strFile, std::string &strText,
               std::string &strError, const char *szStandardInput = "-") {
    const bool blRead = ReadAll(strFile, strText);
    if (!blRead) {
        strError = std::string("cannot read ") + szWhat + " '" + strFile +
                   "': " + std::strerror(errno) + "; name a file that can be read, or " +
                   szStandardInput + " for standard input";
    }
    return blRead;
}

// The library's reader leaves what follows the value alone. Here it is part of a slip, such as a
// quote at the wrong place. Other values than objects and arrays are no use to a command anyway.
bool EndsWithValue(const std::string &strText, const Json::Value &value) {
    if (!value.isObject() && !value.isArray()) {
        return true;
    }
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    builder["failIfExtra"] = true;
    builder["strictRoot"] = true;  // without it, following text that is no JSON passes
    const std::unique_ptr<Json::CharReader> pReader(builder.newCharReader());
    Json::Value ignored;
    return pReader->parse(strText.data(), strText.data() + strText.size(), &ignored, nullptr);
}

bool ReadJson(const std::string &strText, Json::Value &value, std::string &strReason) {
    Json::Value read;
    if (!json::FromString(strText, read, &strReason)) {
        return false;
    }
    if (!EndsWithValue(strText, read)) {
        strReason = "something follows the end of the value";
        return false;
    }
    value.swap(read);
    return true;
}

}  // namespace

bool ReadJsonFile(const char *szWhat, const std::string &strFile, Json::Value &value,
                  std::string &strError, const char *szStandardInput) {
    std::string strText;
    if (!ReadInput(szWhat, strFile, strText, strError, szStandardInput)) {
        return false;
    }
    std::string strReason;
    if (!ReadJson(strText, value, strReason)) {
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
        if (!ReadJsonFile("parameters", strText.substr(1), params, strError, "@-")) {
            return false;
        }
    } else if (!ReadJson(strText, params, strReason)) {
        strError = "cannot read the parameters '" + words::Shortened(strText) + "': " + strReason;
        return false;
    }
    if (!params.isObject()) {
        strError = "cannot use the parameters '" + words::Shortened(strText) +
                   "': they have to be a JSON object";
        return false;
    }
    return true;
}

bool ReadTokenFile(const std::string &strFile, std::string &strToken, std::string &strError) {
    std::string strText;
    if (!ReadInput("token file", strFile, strText, strError)) {
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
