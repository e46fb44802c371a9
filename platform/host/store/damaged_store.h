// Telling a damaged store from everything else that can go wrong with it, and setting its file
// aside under a name that says when: "<path>.damaged-20261124T235500Z".

#ifndef ZELO_HOST_DAMAGED_STORE_H
#define ZELO_HOST_DAMAGED_STORE_H

#include <string>
#include <vector>

#include "sqlite_database.h"

namespace host {

// Looks through the whole store, and renames its file when that is damaged or of another format,
// and before it what belongs to it (-journal, -wal, -shm): a journal that stayed would be played
// into the next database at the path. Never replaces a file, whoever makes one meanwhile.
//
// For an operation with C linkage: returns 1 when it was set aside, 0 when nothing is damaged, -1
// with the last error for a store that cannot be judged, such as a busy one, or not be moved; what
// was moved is back then, or listed below. szPath tells where the file is.
int SetAsideIfDamaged(Database &database, char *szPath, int cbPath);

// All files that were set aside from the store, the oldest first: databases, and what belonged to
// one that was not moved with it. A folder that is not there has none.
Status ListSetAside(const Store &store, std::vector<std::string> &paths);

}  // namespace host

#endif
