// The file of a store, and the folder that it has to itself: what is looked at before each use.

#ifndef ZELO_HOST_STORE_FILE_H
#define ZELO_HOST_STORE_FILE_H

#include <sys/stat.h>

#include <string>

#include "status.h"

namespace host {

// What makes a store. The texts are constant and stay.
struct Store {
    const char *szName;    // such as "credential store"
    const char *szFolder;  // made together with the file, mode 0700
    const char *szPath;    // mode 0600
    int applicationId;     // tells the file from any other SQLite database
    int format;            // one that another version of this code wrote is not ours
    const char *szSchema;  // creates what is not there of tables and indexes

    // Such as "credential store '/usr/zelo/etc/credentials/credentials.db'".
    std::string Named() const { return std::string(szName) + " '" + szPath + '\''; }
};

// Why the store refused an operation, with a log line.
Status StoreError(const Store &store, const std::string &strWhy);

// The same with the system's reason (errno).
Status StoreSystemError(const Store &store);

// Looks at the folder and then, when nobody else can put another one there, at the file. Takes away
// the rights that others have over them; fails where they are somebody else's, and where the file
// is a link or no file at all.
Status FindStoreFile(const Store &store, struct stat &file, bool &blThere);

// Makes sure that there are folder and file.
Status CreateStoreFile(const Store &store);

}  // namespace host

#endif
