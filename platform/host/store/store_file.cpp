#include "store_file.h"

#include <fcntl.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "descriptor.h"

namespace host {
namespace {

// The rights that others must not have.
constexpr mode_t kOthersOfFolder = 0077;
constexpr mode_t kOthersOfFile = 0177;

// A store that was copied back, or made by hand, may be open to others, or theirs. What it holds is
// not for them, and what they may have put there is not for us.
Status TakeFromOthers(const Store &store, const char *szPath, const struct stat &status,
                      mode_t others) {
    const bool blOurs = status.st_uid == 0 || status.st_uid == geteuid();
    if (blOurs &&
        ((status.st_mode & others) == 0 || chmod(szPath, 07777U & status.st_mode & ~others) == 0)) {
        return {};
    }
    const char *const szWhy =
        blOurs ? "others have rights over it, which cannot be taken back"
               : "it belongs to another user: look what it holds, and make it root's";
    return HOST_ERROR(YLIBC_ERR_UNSAFE_FILE,
                      std::string(store.szName) + " '" + szPath + "' is not used: " + szWhy)
        .Logged(LOG_ERR);
}

}  // namespace

Status StoreError(const Store &store, const std::string &strWhy) {
    return HOST_ERROR(YLIBC_ERR_STORE, store.Named() + ": " + strWhy).Logged(LOG_ERR);
}

Status StoreSystemError(const Store &store) {
    return StoreError(store, std::strerror(errno));
}

Status FindStoreFile(const Store &store, struct stat &file, bool &blThere) {
    blThere = false;
    struct stat folder = {};
    if (stat(store.szFolder, &folder) != 0) {
        return errno == ENOENT ? Status() : StoreSystemError(store);
    }
    HOST_TRY(TakeFromOthers(store, store.szFolder, folder, kOthersOfFolder));
    if (lstat(store.szPath, &file) != 0) {
        return errno == ENOENT ? Status() : StoreSystemError(store);
    }
    if (!S_ISREG(file.st_mode)) {
        return StoreError(store, "it is no regular file");
    }
    HOST_TRY(TakeFromOthers(store, store.szPath, file, kOthersOfFile));
    blThere = true;
    return {};
}

Status CreateStoreFile(const Store &store) {
    if (mkdir(store.szFolder, 0700) != 0 && errno != EEXIST) {
        return StoreSystemError(store);
    }
    // SQLite's journal takes over the mode.
    const Descriptor file(open(store.szPath, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    return file.IsOpen() ? Status() : StoreSystemError(store);
}

}  // namespace host
