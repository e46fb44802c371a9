// The index of a strings file: where each of its sections begins and ends.

#ifndef ZELO_HOST_STRINGS_INDEX_H
#define ZELO_HOST_STRINGS_INDEX_H

#include <sys/stat.h>

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace host {

struct StringsIndex {
    struct Section {
        std::size_t hash;  // of the name
        off_t begin;       // of the section's own line
        off_t end;
    };

    struct stat file = {};          // the state of the file that the index describes
    std::vector<Section> sections;  // by hash, and of one hash in the file's order

    // The sections that may have the name; others of the same hash are among them.
    std::vector<Section> Find(std::string_view name) const;
};

// The index of an open file in this state: the one kept for the path, or a new one, which is kept
// where later changes show in the file's state. Null when the file cannot be read.
std::shared_ptr<const StringsIndex> IndexOf(const char *szPath, int fd, const struct stat &state);

// Reads the part of the file. False when it is not all there.
bool ReadPart(int fd, off_t begin, off_t end, std::string &strText);

}  // namespace host

#endif
