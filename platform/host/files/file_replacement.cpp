// Replacing a file: a temporary file beside it, renamed.
//
// A writer that is killed leaves its temporary file behind. So that such leftovers do not pile up,
// the temporary file has one usual name, which the next writer clears. It must not clear the file
// of a writer that is alive: each holds a kernel lock on its temporary file, which goes when its
// process does. Where the usual name cannot be had, because another writer is at work or somebody
// else's file stands there, a random name serves this once.

#include "file_replacement.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>
#include <cstring>
#include <string_view>

#include "own_file.h"
#include "shared_folder.h"

namespace host {
namespace {

constexpr mode_t kModeOfNew = 0644;
constexpr int kCreate = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;

// Goes when it was not put in place.
struct TemporaryFile {
    std::string strPath;
    Descriptor file;
    struct stat status = {};
    bool blPlaced = false;

    TemporaryFile() = default;
    TemporaryFile(const TemporaryFile &) = delete;
    TemporaryFile &operator=(const TemporaryFile &) = delete;
    ~TemporaryFile() {
        if (file.IsOpen() && !blPlaced) {
            unlink(strPath.c_str());
        }
    }
};

// --- Creating the temporary file ----------------------------------------------------------------

// Between its creation and its lock another writer may take the file for a leftover; it is then
// that writer's to remove.
bool CreateUnderUsualName(const std::string &strPath, mode_t mode, TemporaryFile &temporary) {
    Descriptor file(open(strPath.c_str(), kCreate, mode));
    if (!file.IsOpen()) {
        return false;
    }
    if (flock(file.Get(), LOCK_EX | LOCK_NB) != 0 || fstat(file.Get(), &temporary.status) != 0 ||
        temporary.status.st_nlink == 0) {
        errno = EEXIST;
        return false;
    }
    temporary.strPath = strPath;
    temporary.file = std::move(file);
    return true;
}

// Only the writer who has the file's lock renames or removes it, so under the lock a name that
// leads to the file goes on doing so.
bool RemoveLeftover(const char *szPath) {
    const Descriptor file(open(szPath, O_RDONLY | own_file::kFlags));
    struct stat opened = {};
    return file.IsOpen() && fstat(file.Get(), &opened) == 0 && own_file::IsOwn(opened) &&
           flock(file.Get(), LOCK_EX | LOCK_NB) == 0 && own_file::IsNamed(szPath, opened) &&
           unlink(szPath) == 0;
}

bool Create(const std::string &strBeside, mode_t mode, TemporaryFile &temporary) {
    const std::string strFolder = FolderOf(strBeside);
    const std::string strUsual = strFolder + '.' + strBeside.substr(strFolder.size()) + ".zelo-new";
    if (CreateUnderUsualName(strUsual, mode, temporary)) {
        return true;
    }
    if (errno != EEXIST) {
        return false;
    }
    if (RemoveLeftover(strUsual.c_str()) && CreateUnderUsualName(strUsual, mode, temporary)) {
        return true;
    }
    temporary.strPath = UnusedName(strUsual);
    temporary.file = Descriptor(open(temporary.strPath.c_str(), kCreate, mode));
    return temporary.file.IsOpen() && fstat(temporary.file.Get(), &temporary.status) == 0;
}

// --- Filling it ---------------------------------------------------------------------------------

// The owner goes first: a change of owner takes rights away from the mode.
bool SetOwnerAndMode(const FoundFile &found, mode_t mode, TemporaryFile &temporary) {
    const int fd = temporary.file.Get();
    const bool blSameOwner = !found.blThere || (found.status.st_uid == temporary.status.st_uid &&
                                                found.status.st_gid == temporary.status.st_gid);
    if (!blSameOwner && fchown(fd, found.status.st_uid, found.status.st_gid) != 0) {
        return false;
    }
    return (blSameOwner && (temporary.status.st_mode & 07777U) == mode) || fchmod(fd, mode) == 0;
}

bool WriteAll(int fd, std::string_view content) {
    while (!content.empty()) {
        const ssize_t cb = write(fd, content.data(), content.size());
        if (cb < 0 && errno != EINTR) {
            return false;
        }
        content.remove_prefix(cb < 0 ? 0 : static_cast<std::size_t>(cb));
    }
    return true;
}

bool SyncFolder(const std::string &strFolder) {
    const Descriptor folder(
        open(strFolder.empty() ? "." : strFolder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return folder.IsOpen() && fsync(folder.Get()) == 0;
}

}  // namespace

Status ReplaceFile(const FoundFile &found, const std::string &strContent) {
    const std::string strFolder = FolderOf(found.strPath);
    bool blShared = false;
    HOST_TRY(ReadShared(strFolder, blShared));
    const mode_t mode = found.blThere ? found.status.st_mode & 07777U : kModeOfNew;
    // Until it has its owner, nobody else may change the file or read what is not for everybody.
    const mode_t modeAtFirst = mode & ((mode & S_IROTH) != 0 ? 0755U : 0700U);
    TemporaryFile temporary;
    if (!Create(found.strPath, modeAtFirst, temporary) ||
        !SetOwnerAndMode(found, mode, temporary) || !WriteAll(temporary.file.Get(), strContent) ||
        (!blShared && fsync(temporary.file.Get()) != 0) ||
        rename(temporary.strPath.c_str(), found.strPath.c_str()) != 0) {
        return HOST_ERROR(YLIBC_ERR_FILE,
                          "cannot write '" + found.strPath + "': " + std::strerror(errno));
    }
    temporary.blPlaced = true;
    if (!blShared && !SyncFolder(strFolder)) {
        return HOST_ERROR(YLIBC_ERR_FILE, "'" + found.strPath + "' is written, but not durable: " +
                                              std::strerror(errno));
    }
    return {};
}

}  // namespace host
