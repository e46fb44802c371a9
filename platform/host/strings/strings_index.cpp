#include "strings_index.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <functional>
#include <map>
#include <mutex>

#include "files/file_state.h"
#include "fork_safe.h"
#include "never_destroyed.h"
#include "strings_text.h"

namespace host {
namespace {

using IndexHandle = std::shared_ptr<const StringsIndex>;

// More than there are languages. When it is full, all are dropped.
constexpr std::size_t kMaxIndexes = 64;

constexpr off_t kBlock = off_t{64} * 1024;
constexpr off_t kLongestLine = off_t{16} * 1024 * 1024;

std::mutex g_mutex;
const int g_forkHandlers = HoldAroundForks<g_mutex>();

NeverDestroyed<std::map<std::string, IndexHandle>> g_indexByPath;

bool IsBefore(const StringsIndex::Section &a, const StringsIndex::Section &b) {
    return a.hash < b.hash;
}

std::size_t Hash(std::string_view name) {
    return std::hash<std::string_view>()(name);
}

void AddSections(std::string_view lines, off_t place,
                 std::vector<StringsIndex::Section> &sections) {
    for (auto section = strings_text::NextSection(lines, 0); section;
         section = strings_text::NextSection(lines, section->end)) {
        const off_t begin = place + static_cast<off_t>(section->begin);
        if (!sections.empty()) {
            sections.back().end = begin;
        }
        sections.push_back({Hash(section->name), begin, 0});
    }
}

// Reads the file in blocks of whole lines, which stay in the processor's cache.
IndexHandle MakeIndex(int fd, const struct stat &state) {
    auto pIndex = std::make_shared<StringsIndex>();
    pIndex->file = state;
    auto &sections = pIndex->sections;
    std::string strBlock;
    off_t cbMost = kBlock;
    for (off_t at = 0; at < state.st_size;) {
        const off_t end = std::min(at + cbMost, state.st_size);
        if (cbMost > kLongestLine || !ReadPart(fd, at, end, strBlock)) {
            return nullptr;
        }
        const std::size_t cb =
            end == state.st_size ? strBlock.size() : strBlock.rfind('\n') + 1;  // npos + 1 is 0
        cbMost = cb == 0 ? 2 * cbMost : kBlock;
        AddSections(std::string_view(strBlock).substr(0, cb), at, sections);
        at += static_cast<off_t>(cb);
    }
    if (!sections.empty()) {
        sections.back().end = state.st_size;
    }
    std::stable_sort(sections.begin(), sections.end(), IsBefore);
    return pIndex;
}

}  // namespace

std::vector<StringsIndex::Section> StringsIndex::Find(std::string_view name) const {
    const auto range =
        std::equal_range(sections.begin(), sections.end(), Section{Hash(name), 0, 0}, IsBefore);
    return {range.first, range.second};
}

IndexHandle IndexOf(const char *szPath, int fd, const struct stat &state) {
    {
        const std::lock_guard<std::mutex> lock(g_mutex);
        const auto kept = g_indexByPath->find(szPath);
        if (kept != g_indexByPath->end() && IsUnchanged(kept->second->file, state)) {
            return kept->second;
        }
    }
    // Before the file is read: what changes from here on has to show.
    const bool blSettled = IsSettled(state);
    IndexHandle pIndex = MakeIndex(fd, state);
    if (pIndex != nullptr && blSettled) {
        const std::lock_guard<std::mutex> lock(g_mutex);
        if (g_indexByPath->size() >= kMaxIndexes) {
            g_indexByPath->clear();
        }
        (*g_indexByPath)[szPath] = pIndex;
    }
    return pIndex;
}

bool ReadPart(int fd, off_t begin, off_t end, std::string &strText) {
    strText.resize(static_cast<std::size_t>(end - begin));
    for (std::size_t at = 0; at < strText.size();) {
        const ssize_t cb =
            pread(fd, &strText[at], strText.size() - at, begin + static_cast<off_t>(at));
        if (cb < 0 && errno == EINTR) {
            continue;
        }
        if (cb <= 0) {
            return false;
        }
        at += static_cast<std::size_t>(cb);
    }
    return true;
}

}  // namespace host
