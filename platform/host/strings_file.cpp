// Strings files: looking a key up with the help of the file's directory.

#include "../strings_file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <new>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "last_error.h"
#include "line_blocks.h"
#include "strings_directory.h"
#include "strings_text.h"
#include "text_buffer.h"

namespace {

constexpr const char *kFile = "strings_file";

// How often a file is looked at anew that changes while it is read.
constexpr int kAttempts = 5;

namespace directory = host::strings_directory;
namespace text = host::strings_text;

enum class Result {
    kFound,
    kAbsent,
    kUnread,  // the file cannot be read
    kBeyond,  // the directory does not reach so far yet
    kChanged  // the file is not what the directory describes
};

struct Question {
    int fd;
    std::string_view section;
    std::string_view key;
};

Result SearchLines(std::string_view lines, const Question &question, std::size_t &latest,
                   std::string &strValue) {
    auto value = text::FindKey(lines, question.key, latest);
    if (!value) {
        return Result::kAbsent;
    }
    strValue = std::move(*value);
    return Result::kFound;
}

// Whether the text is what the directory says: a section of the question's name, or of another one
// with the same hash.
Result CheckSection(std::string_view lines, const Question &question) {
    const auto name = text::SectionName(text::LineAt(lines, 0));
    if (name == question.section) {
        return Result::kFound;
    }
    return name && directory::Hash(*name) == directory::Hash(question.section) ? Result::kAbsent
                                                                               : Result::kChanged;
}

// Reads and searches the section in a part of the file. keep(text) gets a section that is read in
// one piece.
template <typename Keep>
Result SearchPart(const Question &question, off_t begin, off_t end, Keep &&keep,
                  std::string &strValue) {
    host::LineBlocks blocks(question.fd, begin, end);
    auto lines = blocks.Next();
    Result result = CheckSection(lines.value_or(""), question);
    if (result != Result::kFound) {
        return result;
    }
    if (static_cast<off_t>(lines->size()) == end - begin) {
        keep(*lines);
    }
    for (; lines; lines = blocks.Next()) {
        std::size_t latest = 0;
        result = SearchLines(*lines, question, latest, strValue);
        if (result == Result::kFound) {
            return result;
        }
    }
    return blocks.Cut() ? Result::kChanged : Result::kAbsent;
}

// Searches one section of the directory.
Result SearchSection(const Question &question, const directory::Directory &directory,
                     std::size_t index, std::string &strValue) {
    const auto &entries = directory.entries;
    if (const auto pText = directory::FindText(directory, index)) {
        Result result = CheckSection(pText->strLines, question);
        if (result == Result::kFound) {
            std::size_t latest = pText->latest.load(std::memory_order_relaxed);
            result = SearchLines(pText->strLines, question, latest, strValue);
            pText->latest.store(latest, std::memory_order_relaxed);
        }
        return result;
    }
    const off_t end = index + 1 < entries.size() ? entries[index + 1].begin : directory.end;
    const auto keep = [&](std::string_view lines) { directory::KeepText(directory, index, lines); };
    return SearchPart(question, entries[index].begin, end, keep, strValue);
}

// Searches the sections that did not fit into the directory.
Result SearchRest(const Question &question, off_t begin, off_t end, std::string &strValue) {
    constexpr off_t kNone = -1;
    off_t ours = kNone;  // a section of the name, whose end is not known yet
    Result result = Result::kAbsent;
    const auto keepNothing = [](std::string_view /*lines*/) {};
    const auto visit = [&](off_t next, std::string_view name) {
        if (ours != kNone) {
            result = SearchPart(question, ours, next, keepNothing, strValue);
        }
        ours = name == question.section ? next : kNone;
        return result == Result::kAbsent;
    };
    if (!directory::WalkSections(question.fd, begin, end, visit)) {
        return Result::kChanged;
    }
    return result == Result::kAbsent && ours != kNone
               ? SearchPart(question, ours, end, keepNothing, strValue)
               : result;
}

Result Search(const Question &question, const directory::Directory &directory,
              std::string &strValue) {
    const std::uint32_t hash = directory::Hash(question.section);
    const auto &entries = directory.entries;
    for (std::size_t i = directory.buckets[hash % directory::kBuckets]; i != directory::kNoEntry;
         i = entries[i].next) {
        if (entries[i].hash != hash) {
            continue;
        }
        const Result result = SearchSection(question, directory, i, strValue);
        if (result != Result::kAbsent) {
            return result;
        }
    }
    if (directory.end == directory.file.st_size) {
        return Result::kAbsent;
    }
    return directory.blFull ? SearchRest(question, directory.end, directory.file.st_size, strValue)
                            : Result::kBeyond;
}

Result Read(const char *szPath, std::string_view section, std::string_view key,
            std::string &strValue) {
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        auto file = directory::Open(szPath);
        if (!file) {
            return Result::kUnread;
        }
        const Question question = {file->pDescriptor->Get(), section, key};
        Result result = Search(question, *file->pDirectory, strValue);
        while (result == Result::kBeyond) {
            result = directory::Extend(szPath, section, *file)
                         ? Search(question, *file->pDirectory, strValue)
                         : Result::kChanged;
        }
        if (result != Result::kChanged) {
            return result;
        }
        directory::Forget(szPath);
    }
    return Result::kUnread;
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
                return host::CopyWholeCharacters(strValue, szValue, cbValue);
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
