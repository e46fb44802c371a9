#include "foreign_file.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>

#include "descriptor.h"
#include "file_lock.h"
#include "status.h"

namespace host {
namespace {

// In a folder of root's, so that nobody else can hold it.
constexpr const char *kNamesLock = "/etc/.zelo-shared-names.lock";

// Held while root removes or creates a lock file in a shared folder: a process that has found
// another user's file must not remove the one that root has made there since.
class NamesLock {
  public:
    NamesLock() {
        const LastError before;
        YLIBCFileLockByFile(kNamesLock, 0, &m_handle);
        m_blHeldElsewhere = !IsHeld() && YLIBCErrGet() == YLIBC_ERR_BUSY;
        before.Restore();
    }
    NamesLock(const NamesLock &) = delete;
    NamesLock &operator=(const NamesLock &) = delete;
    ~NamesLock() {
        if (IsHeld()) {
            YLIBCFileUnlockByFile(m_handle);
        }
    }

    bool IsHeld() const { return m_handle >= 0; }
    bool IsHeldElsewhere() const { return m_blHeldElsewhere; }

  private:
    int m_handle = -1;
    bool m_blHeldElsewhere = false;
};

bool IsRootInSharedFolder(const std::string &strPath) {
    struct stat folder = {};
    const std::string strFolder = strPath.substr(0, strPath.rfind('/') + 1);  // npos + 1 is 0
    return geteuid() == 0 && stat(strFolder.empty() ? "." : strFolder.c_str(), &folder) == 0 &&
           (folder.st_mode & S_IWOTH) != 0;
}

bool IsForeign(const struct stat &status) {
    return status.st_uid != 0;
}

// A folder may hold things, so the name is freed first.
bool FreeName(const std::string &strPath) {
    std::uint64_t number = 0;
    if (getrandom(&number, sizeof(number), 0) != sizeof(number)) {
        return false;
    }
    char szNumber[24];
    std::snprintf(szNumber, sizeof(szNumber), ".%016llx", static_cast<unsigned long long>(number));
    const std::string strAway = strPath + szNumber;
    struct stat moved = {};
    if (rename(strPath.c_str(), strAway.c_str()) != 0 || lstat(strAway.c_str(), &moved) != 0) {
        return false;
    }
    if (!IsForeign(moved)) {
        // A program has put its own file there between the look and the renaming.
        return renameat2(AT_FDCWD, strAway.c_str(), AT_FDCWD, strPath.c_str(), RENAME_NOREPLACE) ==
                   0 ||
               unlink(strAway.c_str()) == 0;
    }
    // A folder that holds something stays under the name that nobody uses.
    static_cast<void>(S_ISDIR(moved.st_mode) ? rmdir(strAway.c_str()) : unlink(strAway.c_str()));
    return true;
}

}  // namespace

void RemoveForeignFile(const std::string &strPath) {
    struct stat status = {};
    if (!IsRootInSharedFolder(strPath) || lstat(strPath.c_str(), &status) != 0 ||
        !IsForeign(status)) {
        return;
    }
    const NamesLock lock;
    if (lock.IsHeld() && lstat(strPath.c_str(), &status) == 0 && IsForeign(status)) {
        static_cast<void>(FreeName(strPath));
    }
}

bool PrepareLockFile(const char *szPath) {
    // Taking the lock of the names does not lead to taking it, whoever may write to its folder.
    if (std::strcmp(szPath, kNamesLock) == 0 || !IsRootInSharedFolder(szPath)) {
        return true;
    }
    RemoveForeignFile(szPath);
    if (access(szPath, F_OK) == 0 || errno != ENOENT) {
        return false;
    }
    const NamesLock lock;
    if (!lock.IsHeld()) {
        // Where nobody can hold it, nobody removes what is created meanwhile.
        return !lock.IsHeldElsewhere();
    }
    const Descriptor file(open(szPath, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    return !file.IsOpen() && errno != EEXIST;
}

}  // namespace host
