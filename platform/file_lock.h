// Locks between processes, by lock file.
//
// A lock is exclusive. It is held from the operation that takes it until it is released or its
// process ends, however that ends; a lock file is created as needed (mode 0600) and never removed.
// Two threads of one process exclude each other like two processes, and a thread its own second
// try. A lock is its process's alone: a child process does not hold it, whether it executes a
// program or not, and cannot release it.
//
// Result of taking a lock, the same for every caller: 1 when the lock is held, and *pHandle is then
// 0 or more; negative when it is not, and *pHandle is then -1. It is never 0, so a caller may ask
// for "not 0 and handle 0 or more", for "greater than 0" or for "not negative" with one answer.
//
// Lock files may stand in a folder that everybody can write to. Wherever it stands, a lock file
// that is a link, no regular file, a second name of a file, or somebody else's (root's excepted) is
// refused. Other users do not keep root from its lock in such a folder: what one of them has put at
// the path is removed first.
//
// A failure sets the last error (last_error.h): YLIBC_ERR_BUSY when the time was up,
// YLIBC_ERR_UNSAFE_FILE when the lock file was refused, YLIBC_ERR_FILE when it could not be opened
// or created.

#ifndef ZELO_PLATFORM_FILE_LOCK_H
#define ZELO_PLATFORM_FILE_LOCK_H

#include "api.h"

extern "C" {

// Takes the lock; a lock that is held elsewhere is waited for, 30 s at most. flags is reserved:
// callers pass 0 or 1, a port ignores it.
ZELO_PLATFORM_API int YLIBCFileLockByFile(const char *szLockFile, int flags, int *pHandle);

// The same with a limit of the caller's own, in seconds; 0 and below try once.
ZELO_PLATFORM_API int YLIBCFileLockTimeByFile(const char *szLockFile, int flags, int timeout_s,
                                              int *pHandle);

// Releases the lock of a handle. Returns 0, or a negative value when the handle is no lock's.
ZELO_PLATFORM_API int YLIBCFileUnlockByFile(int handle);
}

#endif
