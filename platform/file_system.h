// Files and directories: what the library asks of the file system beyond the C library.
//
// A failure sets the last error (last_error.h); the operations may be called in any thread.

#ifndef ZELO_PLATFORM_FILE_SYSTEM_H
#define ZELO_PLATFORM_FILE_SYSTEM_H

#include <sys/stat.h>

#include "api.h"

extern "C" {

// Reads the status of what stands at the path into *pStatus. blNoFollow not 0: of a symbolic link
// the link's own status, not that of the file it leads to.
//
// Returns 0 when something stands there, a negative value otherwise, with *pStatus as it was.
ZELO_PLATFORM_API int YLIBCFileStat(const char *szPath, int blNoFollow, struct stat *pStatus);

// Creates a directory with its missing parents. Each one that it creates gets the mode, whatever
// the process's umask, and, when blOwner is not 0, the owner uid and the group gid, as far as the
// process may give directories away. One that is there already is left as it is, and what leads to
// a directory is one, except for a link that belongs neither to the caller nor to the folder's
// owner in a folder that everybody can write to. flags is reserved: callers pass 0, a port ignores
// it.
//
// Returns 0 or more when the directory is there, a negative value otherwise; parents that were
// created by then stay.
ZELO_PLATFORM_API int ZELOFSMkdirP(const char *szPath, int flags, int blOwner, int uid, int gid,
                                   mode_t mode);
}

#endif
