// Files of damaged stores, set aside under a name that says when:
// "<path>.damaged-20261124T235500Z".

#ifndef ZELO_HOST_SET_ASIDE_H
#define ZELO_HOST_SET_ASIDE_H

#include <string>
#include <vector>

namespace host {

// Renames a database file, and before it what belongs to it (-journal, -wal, -shm): a journal that
// stayed would be played into the next database at the path. Never replaces a file, whoever makes
// one meanwhile. Returns false with errno; what was moved is back then, or listed below. strAside
// is where the file is now.
bool SetAside(const std::string &strPath, std::string &strAside);

// All files that were set aside from the path, the oldest first: databases, and what belonged to
// one that was not moved with it. False when the folder cannot be read; one that is not there has
// none.
bool ListSetAside(const std::string &strPath, std::vector<std::string> &paths);

}  // namespace host

#endif
