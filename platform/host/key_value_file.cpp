// Key-value files: a line reader without state.

#include "../key_value_file.h"

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <new>
#include <string_view>

#include "key_value_lookup.h"
#include "last_error.h"
#include "text_buffer.h"

namespace {

constexpr const char *kFile = "key_value_file";

using FileHandle = std::unique_ptr<std::FILE, int (*)(std::FILE *)>;

struct LineBuffer {
    char *sz = nullptr;
    std::size_t cb = 0;
    LineBuffer() = default;
    LineBuffer(const LineBuffer &) = delete;
    LineBuffer &operator=(const LineBuffer &) = delete;
    ~LineBuffer() { std::free(sz); }
};

std::string_view Trim(std::string_view text) {
    constexpr std::string_view kBlanks = " \t\r\n";
    const std::size_t begin = text.find_first_not_of(kBlanks);
    if (begin == std::string_view::npos) {
        return {};
    }
    return text.substr(begin, text.find_last_not_of(kBlanks) - begin + 1);
}

// The text up to the closing quote. What follows that quote does not count; without one the value
// ends with the line.
std::string Unquote(std::string_view quoted) {
    std::string strValue;
    for (std::size_t i = 1; i < quoted.size() && quoted[i] != '"'; ++i) {
        if (quoted[i] == '\\' && i + 1 < quoted.size()) {
            ++i;
        }
        strValue += quoted[i];
    }
    return strValue;
}

bool ParseLine(std::string_view line, std::string_view key, std::string &strValue) {
    line = Trim(line);
    const std::size_t equals = line.find('=');
    if (line.empty() || line.front() == '#' || equals == std::string_view::npos ||
        Trim(line.substr(0, equals)) != key) {
        return false;
    }
    const std::string_view value = Trim(line.substr(equals + 1));
    strValue = !value.empty() && value.front() == '"' ? Unquote(value) : std::string(value);
    return true;
}

host::LookUp Read(const char *szPath, const char *szKey, std::string &strValue) {
    try {
        return host::LookUpKey(szPath, szKey, strValue);
    } catch (const std::bad_alloc &) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
        return host::LookUp::kUnreadable;
    }
}

}  // namespace

host::LookUp host::LookUpKey(const char *szPath, const char *szKey, std::string &strValue) {
    const FileHandle pFile(std::fopen(szPath, "re"), std::fclose);
    if (pFile == nullptr) {
        HOST_FAIL(YLIBC_ERR_FILE);
        return LookUp::kUnreadable;
    }
    LineBuffer line;
    ssize_t cb = 0;
    while ((cb = getline(&line.sz, &line.cb, pFile.get())) >= 0) {
        if (ParseLine({line.sz, static_cast<std::size_t>(cb)}, szKey, strValue)) {
            return LookUp::kFound;
        }
    }
    if (std::ferror(pFile.get()) != 0) {
        HOST_FAIL(YLIBC_ERR_FILE);
        return LookUp::kUnreadable;
    }
    HOST_FAIL(YLIBC_ERR_NOT_FOUND);
    return LookUp::kAbsent;
}

int YLIBCFileGetKeyValue(const char *szPath, const char *szKey, char *szValue, int cbValue,
                         int /*flags*/) {
    if (szValue == nullptr || cbValue <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    szValue[0] = '\0';
    if (szPath == nullptr || szKey == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    std::string strValue;
    switch (Read(szPath, szKey, strValue)) {
        case host::LookUp::kFound:
            return host::CopyText(strValue, szValue, cbValue);
        case host::LookUp::kAbsent:
            return 0;
        default:
            return -1;
    }
}

int YLIBCFileCheckKeyValue(const char *szPath, const char *szKey, const char *szExpected,
                           int /*flags*/) {
    if (szPath == nullptr || szKey == nullptr || szExpected == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    std::string strValue;
    switch (Read(szPath, szKey, strValue)) {
        case host::LookUp::kFound:
            return strValue == szExpected ? 1 : 0;
        case host::LookUp::kAbsent:
            return 0;
        default:
            return -1;
    }
}
