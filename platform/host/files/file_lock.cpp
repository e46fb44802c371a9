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
#include <mutex>
#include <new>
#include <thread>
#include <utility>
#include <vector>

#include "file_state.h"
#include "foreign_file.h"
#include "never_destroyed.h"
#include "status.h"
#include "trusted_file.h"
#include "wait.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr const char *kFile = "file_lock";
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
    LockFile(const char *szPath, bool blCreate) {
        const std::lock_guard<std::mutex> guard(g_mutex);
        g_open->reserve(g_open->size() + 1);
        m_fd =
            open(szPath,
                 O_RDWR | (blCreate ? O_CREAT : 0) | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC,
                 0600);
        if (m_fd >= 0) {
            g_open->push_back(m_fd);
        }
    }
    LockFile(const LockFile &) = delete;
    LockFile &operator=(const LockFile &) = delete;
    ~LockFile() { Close(m_fd); }

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

enum class Try { kHeld, kHeldElsewhere, kRemoved, kUnsafe, kFailed };

Try Await(int fd, off_t byte, Clock::time_point end) {
    std::chrono::microseconds wait = kFirstWait;
    while (!Set(fd, byte, F_WRLCK)) {
        if (errno != EAGAIN && errno != EACCES) {
            return Try::kFailed;
        }
        const Clock::duration left = end - Clock::now();
        if (left <= Clock::duration::zero()) {
            return Try::kHeldElsewhere;
        }
        std::this_thread::sleep_for(std::min<Clock::duration>(wait, left));
        wait = std::min(2 * wait, kLastWait);
    }
    return Try::kHeld;
}

// What holding the file's lock is worth: nothing when a cleaner of old files, say, has taken its
// name away, since whoever comes next makes a new lock file.
Try CheckHeld(int fd, const char *szPath) {
    struct stat held = {};
    struct stat named = {};
    if (fstat(fd, &held) != 0) {
        return Try::kFailed;
    }
    if (lstat(szPath, &named) != 0 || !host::IsSameFile(held, named)) {
        return Try::kRemoved;
    }
    // Whoever may open the file can lock it: nobody else may.
    if ((held.st_mode & 07777U) != 0600 && fchmod(fd, 0600) != 0) {
        return Try::kFailed;
    }
    return Try::kHeld;
}

Try TakeLock(int fd, const char *szPath, Clock::time_point end) {
    struct stat status = {};
    if (fstat(fd, &status) != 0) {
        return Try::kFailed;
    }
    if (status.st_nlink == 0) {
        return Try::kRemoved;
    }
    // What is refused is not waited for.
    if (!host::IsOwnFile(status)) {
        return Try::kUnsafe;
    }
    const host::Waiting waiting({"waiting for the lock '", szPath, "'"});
    Try result = Await(fd, kHead, end);
    if (result == Try::kHeld) {
        result = Await(fd, kLock, end);
        static_cast<void>(Set(fd, kHead, F_UNLCK));
    }
    return result == Try::kHeld ? CheckHeld(fd, szPath) : result;
}

// Why the lock file could not be opened. The kernel refuses some of what may not stand there, such
// as a folder, before it can be looked at.
int FailToOpen(const char *szPath) {
    struct stat status = {};
    const bool blUnsafe = lstat(szPath, &status) == 0 && !host::IsOwnFile(status);
    return HOST_FAIL(blUnsafe ? YLIBC_ERR_UNSAFE_FILE : YLIBC_ERR_FILE);
}

int Lock(const char *szPath, int timeout_s, int &handle) {
    const Clock::time_point end = Clock::now() + std::chrono::seconds(timeout_s);
    for (;;) {
        const bool blCreate = host::PrepareLockFile(szPath);
        LockFile file(szPath, blCreate);
        if (file.Get() < 0 && errno == ENOENT && !blCreate && Clock::now() < end) {
            continue;  // a cleaner of old files has removed it since it was prepared
        }
        if (file.Get() < 0) {
            return FailToOpen(szPath);
        }
        switch (TakeLock(file.Get(), szPath, end)) {
            case Try::kHeld:
                handle = file.HandOut();
                return 1;
            case Try::kRemoved:
                continue;
            case Try::kHeldElsewhere:
                return HOST_FAIL(YLIBC_ERR_BUSY);
            case Try::kUnsafe:
                return HOST_FAIL(YLIBC_ERR_UNSAFE_FILE);
            default:
                return HOST_FAIL(YLIBC_ERR_FILE);
        }
    }
}

}  // namespace

int YLIBCFileLockByFile(const char *szLockFile, int flags, int *pHandle) {
    return YLIBCFileLockTimeByFile(szLockFile, flags, kTimeout_s, pHandle);
}

int YLIBCFileLockTimeByFile(const char *szLockFile, int /*flags*/, int timeout_s, int *pHandle) {
    if (pHandle == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    *pHandle = -1;
    if (szLockFile == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        return Lock(szLockFile, timeout_s, *pHandle);
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

int YLIBCFileUnlockByFile(int handle) {
    return LockFile::Close(handle) ? 0 : HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
}
