// Files of our own in folders that others can write to.
//
// Any name there may be a trap: a link to a file of ours, a second name of it, a FIFO that makes a
// reader wait, a file that its owner goes on changing. So a file is opened with these flags, and
// used only when what was opened is our own; the kernel's settings that guard such folders are not
// counted on.

#ifndef ZELO_OWN_FILE_H
#define ZELO_OWN_FILE_H

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace own_file {

// Never through a link, and never waiting.
constexpr int kFlags = O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;

// Whether it is root or the caller. The owner of "/usr/bin" is root, under another name where a
// user has a box of his own.
inline bool IsRootOrCaller(uid_t uid) {
    struct stat system = {};
    return uid == 0 || uid == geteuid() || (stat("/usr/bin", &system) == 0 && uid == system.st_uid);
}

// Whether it is a regular file of the caller's own, or root's, with no other name. One that lost
// its name after it was opened is one too.
inline bool IsOwn(const struct stat &opened) {
    return S_ISREG(opened.st_mode) && opened.st_nlink <= 1 &&
           (opened.st_uid == 0 || opened.st_uid == geteuid());
}

// Whether the path still leads to what was opened.
inline bool IsNamed(const char *szPath, const struct stat &opened) {
    struct stat named = {};
    return lstat(szPath, &named) == 0 && named.st_ino == opened.st_ino &&
           named.st_dev == opened.st_dev;
}

}  // namespace own_file

#endif
