// Strings files: a look-up opens the file, reads one section and closes it.

#include "strings_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <new>
#include <string>
#include <string_view>
#include <utility>

#include "descriptor.h"
#include "files/file_state.h"
#include "fixed_text.h"
#include "status.h"
#include "strings_index.h"
#include "strings_text.h"

namespace {

constexpr const char *kFile = "strings_file";

// How often a file is looked at anew that changes while it is read.
constexpr int kAttempts = 5;

enum class Result { kFound, kAbsent, kUnread, kChanged };

// Searches the sections of the name in the file's order.
Result Search(int fd, const host::StringsIndex &index, std::string_view section,
              std::string_view key, std::string &strValue) {
    std::string strLines;
    for (const auto &part : index.Find(section)) {
        if (!host::ReadPart(fd, part.begin, part.end, strLines)) {
            return Result::kChanged;
        }
        if (host::strings_text::SectionName(host::strings_text::LineAt(strLines, 0)) != section) {
            continue;
        }
        if (auto value = host::strings_text::FindKey(strLines, key)) {
            strValue = std::move(*value);
            return Result::kFound;
        }
    }
    return Result::kAbsent;
}

Result ReadOnce(const char *szPath, std::string_view section, std::string_view key,
                std::string &strValue) {
    // Should a FIFO stand at the path, its writer is not waited for.
    const Descriptor file(open(szPath, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat state = {};
    if (!file.IsOpen() || fstat(file.Get(), &state) != 0 || !S_ISREG(state.st_mode)) {
        return Result::kUnread;
    }
    const auto pIndex = host::IndexOf(szPath, file.Get(), state);
    const Result result =
        pIndex == nullptr ? Result::kUnread : Search(file.Get(), *pIndex, section, key, strValue);
    struct stat after = {};
    const bool blSame = fstat(file.Get(), &after) == 0 && host::IsUnchanged(after, state);
    return blSame ? result : Result::kChanged;
}

Result Read(const char *szPath, std::string_view section, std::string_view key,
            std::string &strValue) {
    Result result = Result::kChanged;
    for (int attempt = 0; result == Result::kChanged && attempt < kAttempts; ++attempt) {
        result = ReadOnce(szPath, section, key, strValue);
    }
    return result;
}

}  // namespace

int YLIBCFileGetSectionValue(const char *szPath, const char *szSection, const char *szKey,
                             char *szValue, int cbValue) {
    if (szPath == nullptr || szSection == nullptr || szKey == nullptr || szValue == nullptr ||
        cbValue <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        std::string strValue;
        switch (Read(szPath, szSection, szKey, strValue)) {
            case Result::kFound:
                return CopyToFit(szValue, cbValue, strValue);
            case Result::kAbsent:
                return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
            default:
                return HOST_FAIL(access(szPath, F_OK) != 0 && errno == ENOENT ? YLIBC_ERR_NOT_FOUND
                                                                              : YLIBC_ERR_FILE);
        }
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
