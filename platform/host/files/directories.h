// Directories with their parents, for the rooms of the host platform.

#ifndef ZELO_HOST_DIRECTORIES_H
#define ZELO_HOST_DIRECTORIES_H

#include <sys/types.h>

#include <string>

#include "status.h"

namespace host {

// Of a directory that is created, where blSet.
struct Owner {
    bool blSet = false;
    uid_t uid = 0;
    gid_t gid = 0;
};

// What ZELOFSMkdirP (file_system.h) does. The path is not empty.
Status MakeDirectories(const std::string &strPath, const Owner &owner, mode_t mode);

}  // namespace host

#endif
