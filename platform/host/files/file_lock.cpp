// Locks by lock file: the kernel's locks on two bytes of an open file, which go when it is closed.
//
// Byte 0 is the lock, byte 1 the head of the queue: only who holds the head waits for the lock. So
// a process that takes the lock over and over waits like the others.

#include "file_lock.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

#include "held_lock.h"
#include "never_destroyed.h"
#include "own_file.h"
#include "shared_folder.h"
#include "wait.h"

namespace {

using host::Status;
using host::Wait;

constexpr int kTimeout_s = 30;
constexpr off_t kLock = 0;
constexpr off_t kHead = 1;

// A byte that is held elsewhere is tried again after a wait that grows from the first to the last.
constexpr std::chrono::microseconds kFirstWait{100};
constexpr std::chrono::microseconds kLastWait{2000};

// The lock files that the process has open; a handle is a descriptor. Opening and forking exclude
// each other, so that a child process knows what it has to close.
std::mutex g_mutex;
host::NeverDestroyed<std::vector<int>> g_open;

void CloseInChild() {
    for (const int fd : *g_open) {
        close(fd);
    }
    g_open->clear();
    g_mutex.unlock();
}

const int g_forkHandlers =
    pthread_atfork([] { g_mutex.lock(); }, [] { g_mutex.unlock(); }, CloseInChild);

bool Set(int fd, off_t byte, short type) {
    struct flock lock = {};
    lock.l_type = type;
    lock.l_whence = SEEK_SET;
    lock.l_start = byte;
    lock.l_len = 1;
    return fcntl(fd, F_OFD_SETLK, &lock) == 0;
}

// A lock file, opened anew for each lock. What is not handed out as a handle is closed.
class LockFile {
  public:
    LockFile() = default;
    LockFile(const LockFile &) = delete;
    LockFile &operator=(const LockFile &) = delete;
    ~LockFile() { Close(m_fd); }

    // False with errno.
    bool Open(const char *szPath, int flags) {
        const std::lock_guard<std::mutex> guard(g_mutex);
        g_open->reserve(g_open->size() + 1);
        m_fd = open(szPath, O_RDWR | flags | own_file::kFlags, 0600);
        if (m_fd >= 0) {
            g_open->push_back(m_fd);
        }
        return m_fd >= 0;
    }

    int Get() const { return m_fd; }
    int HandOut() { return std::exchange(m_fd, -1); }

    // Releases the locks and closes the file. False when it is no lock file's descriptor. Closing
    // alone would not let go while a process that is being started still has a copy.
    static bool Close(int fd) {
        const std::lock_guard<std::mutex> guard(g_mutex);
        const auto open = std::find(g_open->begin(), g_open->end(), fd);
        if (open == g_open->end()) {
            return false;
        }
        g_open->erase(open);
        static_cast<void>(Set(fd, kHead, F_UNLCK));
        static_cast<void>(Set(fd, kLock, F_UNLCK));
        return close(fd) == 0;
    }

  private:
    int m_fd = -1;
};

Status Failure(const char *szWhat, const std::string &strPath) {
    return HOST_ERROR(YLIBC_ERR_FILE, std::string(szWhat) + " the lock file '" + strPath +
                                          "': " + std::strerror(errno));
}

// For root: puts a lock file in the place of what another user has put at the path. It is locked
// meanwhile, so nobody holds it when it turns out that another program of root's has been quicker:
// that one's file then gets its name back.
void TakeNameBack(const std::string &strPath) {
    const std::string strOwn = host::UnusedName(strPath);
    LockFile own;
    if (strOwn.empty() || !own.Open(strOwn.c_str(), O_CREAT | O_EXCL)) {
        return;
    }
    const auto exchange = [&] {
        return renameat2(AT_FDCWD, strOwn.c_str(), AT_FDCWD, strPath.c_str(), RENAME_EXCHANGE) == 0;
    };
    struct stat away = {};
    if (Set(own.Get(), kLock, F_WRLCK) && exchange() && lstat(strOwn.c_str(), &away) == 0 &&
        away.st_uid == 0) {
        static_cast<void>(exchange());
    }
    host::RemoveAny(strOwn);
}

// Opens the lock file, or creates it. blAgain: somebody was quicker, or root has taken the name
// back.
Status OpenOrCreate(const std::string &strPath, LockFile &file, bool &blAgain) {
    const char *const szPath = strPath.c_str();
    struct stat there = {};
    // With O_CREAT alone, the kernel may refuse what somebody else has put there.
    const bool blOpen =
        file.Open(szPath, 0) || (errno == ENOENT && file.Open(szPath, O_CREAT | O_EXCL));
    const int error = errno;
    if ((blOpen ? fstat(file.Get(), &there) : lstat(szPath, &there)) != 0) {
        blAgain = !blOpen && errno == ENOENT && error != ENOENT;  // gone meanwhile
        errno = error;
        return blAgain ? Status() : Failure("cannot open", strPath);
    }
    if (blOpen && own_file::IsOwn(there)) {
        blAgain = there.st_nlink == 0;
        return {};
    }
    if (host::IsForeignToRoot(strPath, there)) {
        TakeNameBack(strPath);
        blAgain = true;
        return {};
    }
    if (host::IsRefused(there, error)) {
        return host::Refusal(strPath, there);
    }
    errno = error;
    blAgain = error == EEXIST;
    return blAgain ? Status() : Failure("cannot open", strPath);
}

Status Await(int fd, off_t byte, const std::string &strPath, Wait &wait) {
    std::chrono::microseconds pause = kFirstWait;
    while (!Set(fd, byte, F_WRLCK)) {
        if (errno != EAGAIN && errno != EACCES) {
            return Failure("cannot lock", strPath);
        }
        const Wait::Clock::duration slice = wait.Slice();
        if (slice <= Wait::Clock::duration::zero()) {
            return wait.TimeUp(YLIBC_ERR_BUSY);
        }
        std::this_thread::sleep_for(std::min<Wait::Clock::duration>(pause, slice));
        pause = std::min(2 * pause, kLastWait);
    }
    return {};
}

Status AwaitLock(int fd, const std::string &strPath, Wait &wait) {
    HOST_TRY(Await(fd, kHead, strPath, wait));
    Status status = Await(fd, kLock, strPath, wait);
    static_cast<void>(Set(fd, kHead, F_UNLCK));
    return status;
}

// What holding the file's lock is worth: nothing (blAgain) when a cleaner of old files, say, has
// taken its name away, since whoever comes next makes a new lock file.
Status CheckHeld(int fd, const std::string &strPath, bool &blAgain) {
    struct stat held = {};
    if (fstat(fd, &held) != 0) {
        return Failure("cannot look at", strPath);
    }
    blAgain = !own_file::IsNamed(strPath.c_str(), held);
    // Whoever may open the file can lock it: nobody else may.
    return blAgain || (held.st_mode & 07777U) == 0600 || fchmod(fd, 0600) == 0
               ? Status()
               : Failure("cannot set the mode of", strPath);
}

}  // namespace

Status host::TakeLock(const char *szPath, int timeout_s, int &handle) {
    // Another user may make a lock file at the path again and again.
    constexpr int kMostTries = 1000;
    const std::string strPath = szPath;
    Wait wait("the lock '" + strPath + '\'', std::chrono::seconds(std::max(timeout_s, 0)));
    for (int tries = 0; tries < kMostTries; ++tries) {
        LockFile file;
        bool blAgain = false;
        HOST_TRY(OpenOrCreate(strPath, file, blAgain));
        if (!blAgain) {
            HOST_TRY(AwaitLock(file.Get(), strPath, wait));
            HOST_TRY(CheckHeld(file.Get(), strPath, blAgain));
        }
        if (!blAgain) {
            handle = file.HandOut();
            return {};
        }
    }
    return HOST_ERROR(YLIBC_ERR_UNSAFE_FILE,
                      "somebody else puts files at '" + strPath + "' again and again");
}

int YLIBCFileLockByFile(const char *szLockFile, int flags, int *pHandle) {
    return YLIBCFileLockTimeByFile(szLockFile, flags, kTimeout_s, pHandle);
}

int YLIBCFileLockTimeByFile(const char *szLockFile, int /*flags*/, int timeout_s, int *pHandle) {
    int held = 1;
    return HOST_OPERATION(-1, held, [&]() -> Status {
        HOST_REQUIRE(pHandle != nullptr);
        *pHandle = -1;
        HOST_REQUIRE(szLockFile != nullptr);
        return host::TakeLock(szLockFile, timeout_s, *pHandle);
    });
}

int YLIBCFileUnlockByFile(int handle) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(LockFile::Close(handle));
        return {};
    });
}
