// Directories of strings files: where the sections of a file begin.
//
// A process keeps the directories of the files that it reads, and in each the text of the sections
// read last, so that looking a key up reads one section, or asks only whether the file is still the
// same. A directory grows with what is looked up: a file is read only as far as it has to be. It
// takes 64 KiB at most; sections behind those that fit into it are searched for each time.

#ifndef ZELO_HOST_STRINGS_DIRECTORY_H
#define ZELO_HOST_STRINGS_DIRECTORY_H

#include <sys/stat.h>

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "file_descriptor.h"
#include "line_blocks.h"
#include "strings_text.h"

namespace host::strings_directory {

constexpr std::size_t kBuckets = 512;
constexpr std::uint16_t kNoEntry = 0xFFFF;

struct Entry {
    std::uint32_t hash;   // of the section's name
    std::uint32_t begin;  // of the section's line
    std::uint16_t next;   // entry of the same bucket
};

// The text of a section, its own line included.
struct SectionText {
    std::string strLines;
    mutable std::atomic<std::size_t> latest{0};  // where the key was found that was looked up last

    explicit SectionText(std::string_view lines) : strLines(lines) {}
};

struct KeptText {
    std::size_t index;  // of the section's entry
    std::shared_ptr<const SectionText> pText;
};

struct Directory {
    struct stat file = {};       // the state of the file that the directory describes
    std::vector<Entry> entries;  // in the file's order
    off_t end = 0;               // sections that begin here or later are not in the directory
    bool blFull = false;         // and do not fit into it

    // The first entry of each bucket; a hash belongs to the bucket of its remainder.
    std::array<std::uint16_t, kBuckets> buckets = {};

    mutable std::vector<KeptText> texts;  // only KeepText and FindText touch it
};

using DirectoryHandle = std::shared_ptr<const Directory>;

std::uint32_t Hash(std::string_view name);

// A regular file that is open for reading, with the directory of the state that it is in: the kept
// one, or one that is still empty.
struct OpenFile {
    std::shared_ptr<const FileDescriptor> pDescriptor;
    DirectoryHandle pDirectory;
};

// Opens the file at the path, or takes what is kept of it. Of a file that is asked for again within
// a millisecond the state is read without looking for its name: that one of the folders above it
// was replaced shows a millisecond late, all else at once. Nothing when there is no regular file
// that can be read.
std::optional<OpenFile> Open(const char *szPath);

// Grows the file's directory by the next section of the name, and those before it; by all sections,
// or as many as fit, when there is none. False when the file changed meanwhile or cannot be read so
// far.
bool Extend(const char *szPath, std::string_view section, OpenFile &file);

// Forgets the kept directory of the file at the path, which was found wrong.
void Forget(const char *szPath);

// Keeps the text of a section, in place of older ones where room is short.
void KeepText(const Directory &directory, std::size_t index, std::string_view text);

// The kept text of a section; null when there is none.
std::shared_ptr<const SectionText> FindText(const Directory &directory, std::size_t index);

// Calls visit(begin, name) for each section of a part of the file, in order, until it returns
// false. Returns false when the part could not be read to its end.
template <typename Visit>
bool WalkSections(int fd, off_t begin, off_t end, Visit &&visit) {
    LineBlocks blocks(fd, begin, end);
    while (const auto block = blocks.Next()) {
        auto section = strings_text::NextSection(*block, 0);
        for (; section; section = strings_text::NextSection(*block, section->end)) {
            if (!visit(blocks.Offset() + static_cast<off_t>(section->begin), section->name)) {
                return true;
            }
        }
    }
    return !blocks.Cut();
}

}  // namespace host::strings_directory

#endif
