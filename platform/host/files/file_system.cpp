// Files and directories by the system's own calls.

#include "file_system.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <string>

#include "descriptor.h"
#include "directories.h"

namespace {

using host::Owner;
using host::Status;

// An ordinary user may not give directories away, and root of a user namespace only to the users
// that there are in it.
bool SetOwnerAndMode(int fd, const Owner &owner, mode_t mode) {
    if (owner.blSet && fchown(fd, owner.uid, owner.gid) != 0 && errno != EPERM && errno != EINVAL) {
        return false;
    }
    return fchmod(fd, mode) == 0;
}

// Whether it is a link that may be followed. One that somebody else has put into a folder that
// everybody can write to may lead into a folder of the caller's. What is no link now may be one of
// theirs in the next moment.
bool IsTrustedLink(int parent, const char *szName) {
    struct stat folder = {};
    struct stat entry = {};
    return fstatat(parent, szName, &entry, AT_SYMLINK_NOFOLLOW) == 0 && S_ISLNK(entry.st_mode) &&
           fstat(parent, &folder) == 0 &&
           ((folder.st_mode & S_IWOTH) == 0 || entry.st_uid == geteuid() ||
            entry.st_uid == folder.st_uid);
}

// Opens a directory in the parent, creating it when there is nothing of that name.
Descriptor OpenDirectory(int parent, const char *szName, const Owner &owner, mode_t mode) {
    constexpr int kLook = O_PATH | O_DIRECTORY | O_CLOEXEC;
    constexpr int kChange = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    Descriptor entry(openat(parent, szName, kLook | O_NOFOLLOW));
    if (entry.IsOpen()) {
        return entry;
    }
    if (errno == ENOTDIR) {
        return Descriptor(IsTrustedLink(parent, szName) ? openat(parent, szName, kLook) : -1);
    }
    if (errno != ENOENT) {
        return entry;
    }
    if (mkdirat(parent, szName, mode) != 0) {
        // Another process may have been quicker.
        return Descriptor(errno == EEXIST ? openat(parent, szName, kLook | O_NOFOLLOW) : -1);
    }
    Descriptor created(openat(parent, szName, kChange));
    if (created.IsOpen() && !SetOwnerAndMode(created.Get(), owner, mode)) {
        return Descriptor();
    }
    return created;
}

}  // namespace

Status host::MakeDirectories(const std::string &strPath, const Owner &owner, mode_t mode) {
    Descriptor parent(open(strPath.front() == '/' ? "/" : ".", O_PATH | O_DIRECTORY | O_CLOEXEC));
    std::size_t begin = strPath.find_first_not_of('/');
    std::size_t end = 0;
    while (parent.IsOpen() && begin != std::string::npos) {
        end = std::min(strPath.find('/', begin), strPath.size());
        const std::string strName = strPath.substr(begin, end - begin);
        parent = OpenDirectory(parent.Get(), strName.c_str(), owner, mode);
        begin = strPath.find_first_not_of('/', end);
    }
    return parent.IsOpen() ? Status()
                           : HOST_ERROR(YLIBC_ERR_FILE, "cannot open or create the directory '" +
                                                            strPath.substr(0, end) +
                                                            "': " + std::strerror(errno));
}

int YLIBCFileStat(const char *szPath, int blNoFollow, struct stat *pStatus) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szPath != nullptr);
        HOST_REQUIRE(pStatus != nullptr);
        struct stat status = {};
        if (fstatat(AT_FDCWD, szPath, &status, blNoFollow != 0 ? AT_SYMLINK_NOFOLLOW : 0) != 0) {
            return HOST_ERROR(
                errno == ENOENT || errno == ENOTDIR ? YLIBC_ERR_NOT_FOUND : YLIBC_ERR_FILE,
                std::string("cannot look at '") + szPath + "': " + std::strerror(errno));
        }
        *pStatus = status;
        return {};
    });
}

int ZELOFSMkdirP(const char *szPath, int /*flags*/, int blOwner, int uid, int gid, mode_t mode) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szPath != nullptr && szPath[0] != '\0');
        const Owner owner = {blOwner != 0, static_cast<uid_t>(uid), static_cast<gid_t>(gid)};
        return host::MakeDirectories(szPath, owner, mode);
    });
}
