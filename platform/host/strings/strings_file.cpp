// Strings files: a look-up opens the file, reads one section and closes it. What is kept of a file
// is its index: where each of its sections begins and ends.

#include "strings_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

#include "descriptor.h"
#include "files/file_state.h"
#include "fixed_text.h"
#include "fork_safe.h"
#include "never_destroyed.h"
#include "strings_lookup.h"
#include "strings_text.h"

namespace {

using host::Status;
namespace text = host::strings_text;

constexpr off_t kBlock = off_t{64} * 1024;

// What a file may take of the memory, whoever has written it.
constexpr off_t kLargestPart = off_t{16} * 1024 * 1024;
constexpr std::size_t kMostSections = 100'000;

// More than there are languages. When so many are kept, all are dropped.
constexpr std::size_t kMostIndexes = 64;

// How often a file is looked at anew that changes while it is read.
constexpr int kAttempts = 5;

struct File {
    std::string strPath;
    Descriptor opened;
    struct stat state = {};
};

struct Section {
    std::size_t hash;  // of the name
    off_t begin;       // of the section's own line
    off_t end;
};

struct Index {
    struct stat file = {};          // the state of the file that the index describes
    std::vector<Section> sections;  // by hash, and of one hash in the file's order
};

std::mutex g_mutex;
const int g_forkHandlers = HoldAroundForks<g_mutex>();
host::NeverDestroyed<std::map<std::string, std::shared_ptr<const Index>>> g_indexByPath;

bool IsBefore(const Section &a, const Section &b) {
    return a.hash < b.hash;
}

std::size_t Hash(std::string_view name) {
    return std::hash<std::string_view>()(name);
}

Status Failure(const std::string &strPath, const char *szReason) {
    return HOST_ERROR(YLIBC_ERR_FILE, "cannot read '" + strPath + "': " + szReason);
}

Status Open(File &file) {
    // Should a FIFO stand at the path, its writer is not waited for.
    file.opened =
        Descriptor(open(file.strPath.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    if (!file.opened.IsOpen() && errno == ENOENT) {
        return HOST_ERROR(YLIBC_ERR_NOT_FOUND, "there is no '" + file.strPath + '\'');
    }
    if (!file.opened.IsOpen() || fstat(file.opened.Get(), &file.state) != 0) {
        return Failure(file.strPath, std::strerror(errno));
    }
    return S_ISREG(file.state.st_mode) ? Status() : Failure(file.strPath, "it is no file");
}

Status ReadPart(const File &file, off_t begin, off_t end, std::string &strText) {
    if (end - begin > kLargestPart) {
        return Failure(file.strPath, "a line or section of it is larger than 16 MiB");
    }
    strText.resize(static_cast<std::size_t>(end - begin));
    for (std::size_t at = 0; at < strText.size();) {
        const ssize_t cb = pread(file.opened.Get(), &strText[at], strText.size() - at,
                                 begin + static_cast<off_t>(at));
        if (cb == 0 || (cb < 0 && errno != EINTR)) {
            return Failure(file.strPath, cb == 0 ? "it ends early" : std::strerror(errno));
        }
        at += static_cast<std::size_t>(std::max<ssize_t>(cb, 0));
    }
    return {};
}

// --- The index ----------------------------------------------------------------------------------

Status AddSections(const File &file, std::string_view lines, off_t place,
                   std::vector<Section> &sections) {
    for (auto section = text::NextSection(lines, 0); section;
         section = text::NextSection(lines, section->end)) {
        const off_t begin = place + static_cast<off_t>(section->begin);
        if (sections.size() == kMostSections) {
            return Failure(file.strPath, "it has too many sections");
        }
        if (!sections.empty()) {
            sections.back().end = begin;
        }
        sections.push_back({Hash(section->name), begin, file.state.st_size});
    }
    return {};
}

// Reads the file in blocks of whole lines, which stay in the processor's cache.
Status MakeIndex(const File &file, Index &index) {
    index.file = file.state;
    std::string strBlock;
    off_t cbMost = kBlock;
    for (off_t at = 0; at < file.state.st_size;) {
        const off_t end = std::min(at + cbMost, file.state.st_size);
        HOST_TRY(ReadPart(file, at, end, strBlock));
        const std::size_t cb =
            end == file.state.st_size ? strBlock.size() : strBlock.rfind('\n') + 1;  // npos + 1: 0
        cbMost = cb == 0 ? 2 * cbMost : kBlock;
        HOST_TRY(AddSections(file, std::string_view(strBlock).substr(0, cb), at, index.sections));
        at += static_cast<off_t>(cb);
    }
    std::stable_sort(index.sections.begin(), index.sections.end(), IsBefore);
    return {};
}

// The index kept for the path when it describes the file, or a new one, which is kept where later
// changes show in the file's state.
Status GetIndex(const File &file, std::shared_ptr<const Index> &pIndex) {
    {
        const std::lock_guard<std::mutex> lock(g_mutex);
        const auto kept = g_indexByPath->find(file.strPath);
        if (kept != g_indexByPath->end() && host::IsUnchanged(kept->second->file, file.state)) {
            pIndex = kept->second;
            return {};
        }
    }
    // Before the file is read: what changes from here on has to show.
    const bool blSettled = host::IsSettled(file.state);
    const auto pNew = std::make_shared<Index>();
    HOST_TRY(MakeIndex(file, *pNew));
    pIndex = pNew;
    if (blSettled) {
        const std::lock_guard<std::mutex> lock(g_mutex);
        if (g_indexByPath->size() >= kMostIndexes) {
            g_indexByPath->clear();
        }
        (*g_indexByPath)[file.strPath] = pIndex;
    }
    return {};
}

// --- Looking up ---------------------------------------------------------------------------------

// Searches the sections of the name in the file's order.
Status Search(const File &file, std::string_view section, std::string_view key,
              std::string &strValue) {
    std::shared_ptr<const Index> pIndex;
    HOST_TRY(GetIndex(file, pIndex));
    const auto [begin, end] = std::equal_range(pIndex->sections.begin(), pIndex->sections.end(),
                                               Section{Hash(section), 0, 0}, IsBefore);
    std::string strLines;
    for (auto part = begin; part != end; ++part) {
        HOST_TRY(ReadPart(file, part->begin, part->end, strLines));
        if (text::SectionName(text::LineAt(strLines, 0)) != section) {
            continue;
        }
        if (auto value = text::FindKey(strLines, key)) {
            strValue = std::move(*value);
            return {};
        }
    }
    return HOST_ERROR(YLIBC_ERR_NOT_FOUND, "there is no '" + std::string(key) +
                                               "' in the section '" + std::string(section) +
                                               "' of '" + file.strPath + '\'');
}

}  // namespace

Status host::ReadSectionValue(const std::string &strPath, std::string_view section,
                              std::string_view key, std::string &strValue) {
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        File file;
        file.strPath = strPath;
        HOST_TRY(Open(file));
        Status status = Search(file, section, key, strValue);
        struct stat after = {};
        if (fstat(file.opened.Get(), &after) == 0 && IsUnchanged(after, file.state)) {
            return status;
        }
    }
    return Failure(strPath, "it changes all the time");
}

int YLIBCFileGetSectionValue(const char *szPath, const char *szSection, const char *szKey,
                             char *szValue, int cbValue) {
    int cb = 0;
    return HOST_OPERATION(-1, cb, [&]() -> Status {
        HOST_REQUIRE(szPath != nullptr && szSection != nullptr && szKey != nullptr);
        HOST_REQUIRE(szValue != nullptr && cbValue > 0);
        std::string strValue;
        HOST_TRY(host::ReadSectionValue(szPath, szSection, szKey, strValue));
        cb = CopyToFit(szValue, cbValue, strValue);
        return {};
    });
}
