// Building directories, and the table of those that the process keeps.

#include "strings_directory.h"

#include <fcntl.h>
#include <pthread.h>

#include <algorithm>
#include <cstddef>
#include <limits>
#include <mutex>
#include <unordered_map>
#include <utility>

#include "file_state.h"
#include "kept_file.h"

namespace host::strings_directory {
namespace {

constexpr std::size_t kMaxDirectories = 64;
constexpr std::size_t kMaxBytes = std::size_t{64} * 1024;
constexpr std::size_t kMaxEntries = (kMaxBytes - sizeof(Directory)) / sizeof(Entry);
static_assert(kMaxEntries < kNoEntry, "an entry is named by its index");

// What a section's text takes besides its bytes, generously.
constexpr std::size_t kTextOverhead = 128;

// Larger sections are not kept: one of them would drive out all others.
constexpr std::size_t kMaxText = std::size_t{16} * 1024;

// What is kept of the file at a path.
struct Kept {
    unsigned long lastUse = 0;
    KeptFile file;
    DirectoryHandle pDirectory;
};

// Never destroyed, so that it serves until the very end of a process. The lock is never held while
// a file is read.
struct Table {
    std::mutex mutex;
    unsigned long uses = 0;
    std::unordered_map<std::string, Kept> files;
};

Table &TheTable() {
    static auto *const pTable = new Table;
    return *pTable;
}

void LockBeforeFork() {
    TheTable().mutex.lock();
}

void UnlockAfterFork() {
    TheTable().mutex.unlock();
}

const int g_forkHandlers = pthread_atfork(LockBeforeFork, UnlockAfterFork, UnlockAfterFork);

// What is kept for the path, or a new place for it, in place of the one used least recently.
Kept &PlaceFor(const char *szPath, Table &table) {
    auto &files = table.files;
    auto kept = files.find(szPath);
    if (kept == files.end()) {
        if (files.size() >= kMaxDirectories) {
            files.erase(std::min_element(files.begin(), files.end(), [](auto &a, auto &b) {
                return a.second.lastUse < b.second.lastUse;
            }));
        }
        kept = files.emplace(szPath, Kept()).first;
    }
    kept->second.lastUse = ++table.uses;
    return kept->second;
}

// Back to front, so that each bucket has its entries in the file's order.
void FillBuckets(Directory &directory) {
    directory.buckets.fill(kNoEntry);
    for (std::size_t i = directory.entries.size(); i-- > 0;) {
        Entry &entry = directory.entries[i];
        auto &first = directory.buckets[entry.hash % kBuckets];
        entry.next = std::exchange(first, static_cast<std::uint16_t>(i));
    }
}

// Adds the sections from the directory's end on, up to one with the hash and no further.
bool ReadOn(int fd, std::uint32_t hash, Directory &directory) {
    auto &entries = directory.entries;
    const std::size_t known = entries.size();
    const off_t begin = std::exchange(directory.end, directory.file.st_size);
    const auto add = [&](off_t at, std::string_view name) {
        directory.blFull =
            entries.size() == kMaxEntries || at > std::numeric_limits<std::uint32_t>::max();
        // Where the wanted section ends is known when the next one begins.
        if (directory.blFull || (entries.size() > known && entries.back().hash == hash)) {
            directory.end = at;
            return false;
        }
        entries.push_back({Hash(name), static_cast<std::uint32_t>(at), kNoEntry});
        return true;
    };
    return WalkSections(fd, begin, directory.file.st_size, add);
}

std::shared_ptr<const SectionText> FindTextLocked(const Directory &directory, std::size_t index) {
    for (const KeptText &kept : directory.texts) {
        if (kept.index == index) {
            return kept.pText;
        }
    }
    return nullptr;
}

std::size_t Size(const KeptText &kept) {
    return kept.pText->strLines.size() + kTextOverhead;
}

// Drops the oldest texts that a directory, and what is to be added to it, leave no room for.
void DropTexts(const Directory &directory, std::size_t cbAdded) {
    auto &texts = directory.texts;
    std::size_t cb = sizeof(Directory) + directory.entries.size() * sizeof(Entry) + cbAdded;
    for (const KeptText &kept : texts) {
        cb += Size(kept);
    }
    auto keepFrom = texts.begin();
    for (; keepFrom != texts.end() && cb > kMaxBytes; ++keepFrom) {
        cb -= Size(*keepFrom);
    }
    texts.erase(texts.begin(), keepFrom);
}

// What is known of the file already.
std::shared_ptr<Directory> Copy(const Directory &directory) {
    const std::lock_guard<std::mutex> lock(TheTable().mutex);
    return std::make_shared<Directory>(directory);
}

}  // namespace

// FNV-1a.
std::uint32_t Hash(std::string_view name) {
    std::uint32_t hash = 2166136261U;
    for (const char c : name) {
        hash = (hash ^ static_cast<unsigned char>(c)) * 16777619U;
    }
    return hash;
}

std::optional<OpenFile> Open(const char *szPath) {
    Table &table = TheTable();
    const std::lock_guard<std::mutex> lock(table.mutex);
    Kept &kept = PlaceFor(szPath, table);
    struct stat state = {};
    if (!kept.file.Holds(szPath, 0, state)) {
        kept.file.Drop();
        // Should a FIFO stand at the path, its writer is not waited for.
        FileDescriptor file(open(szPath, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
        if (fstat(file.Get(), &state) != 0 || !S_ISREG(state.st_mode)) {
            return std::nullopt;
        }
        kept.file.Keep(std::move(file), state);
    }
    if (kept.pDirectory != nullptr && IsUnchanged(kept.pDirectory->file, state)) {
        return OpenFile{kept.file.Descriptor(), kept.pDirectory};
    }
    const auto pEmpty = std::make_shared<Directory>();
    pEmpty->file = state;
    FillBuckets(*pEmpty);
    return OpenFile{kept.file.Descriptor(), pEmpty};
}

bool Extend(const char *szPath, std::string_view section, OpenFile &file) {
    struct stat state = {};
    const int fd = file.pDescriptor->Get();
    const auto pDirectory = Copy(*file.pDirectory);
    if (fstat(fd, &state) != 0 || !IsUnchanged(state, pDirectory->file)) {
        return false;
    }
    const bool blSettled = IsSettled(state);
    if (!ReadOn(fd, Hash(section), *pDirectory)) {
        return false;
    }
    pDirectory->entries.shrink_to_fit();
    FillBuckets(*pDirectory);
    DropTexts(*pDirectory, 0);
    file.pDirectory = pDirectory;
    if (blSettled) {
        Table &table = TheTable();
        const std::lock_guard<std::mutex> lock(table.mutex);
        PlaceFor(szPath, table).pDirectory = pDirectory;
    }
    return true;
}

void Forget(const char *szPath) {
    Table &table = TheTable();
    const std::lock_guard<std::mutex> lock(table.mutex);
    PlaceFor(szPath, table).pDirectory.reset();
}

void KeepText(const Directory &directory, std::size_t index, std::string_view text) {
    if (text.size() > kMaxText) {
        return;
    }
    KeptText kept = {index, std::make_shared<const SectionText>(text)};
    const std::lock_guard<std::mutex> lock(TheTable().mutex);
    if (FindTextLocked(directory, index) != nullptr) {
        return;  // another thread was faster
    }
    DropTexts(directory, Size(kept));
    if (sizeof(Directory) + directory.entries.size() * sizeof(Entry) + Size(kept) <= kMaxBytes) {
        directory.texts.push_back(std::move(kept));
    }
}

std::shared_ptr<const SectionText> FindText(const Directory &directory, std::size_t index) {
    const std::lock_guard<std::mutex> lock(TheTable().mutex);
    return FindTextLocked(directory, index);
}

}  // namespace host::strings_directory
