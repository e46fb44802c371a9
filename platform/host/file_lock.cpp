// Locks by lock file: the kernel's lock on an open file, which it drops with the last descriptor.

#include "../file_lock.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/file.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <mutex>
#include <new>
#include <thread>
#include <utility>
#include <vector>

#include "last_error.h"
#include "trusted_file.h"
#include "waiting.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr const char *kFile = "file_lock";
constexpr int kTimeout_s = 30;

// A lock that is held elsewhere is tried again after a wait that grows from the first to the last;
// by the one who is next in turn after the first each time.
constexpr std::chrono::microseconds kFirstWait{100};
constexpr std::chrono::microseconds kLastWait{2000};

// All lock files that the process has open; a handle is a descriptor. Opening, closing and forking
// exclude each other, so that a child process knows what it has to close. Never destroyed: other
// threads may still hold locks while the process ends.
struct OpenLocks {
    std::mutex mutex;
    std::vector<int> descriptors;
};

OpenLocks &TheLocks() {
    static auto *const pLocks = new OpenLocks;
    return *pLocks;
}

void BeforeFork() {
    TheLocks().mutex.lock();
}

void AfterForkInParent() {
    TheLocks().mutex.unlock();
}

void AfterForkInChild() {
    for (int fd : TheLocks().descriptors) {
        close(fd);
    }
    TheLocks().descriptors.clear();
    TheLocks().mutex.unlock();
}

bool FollowForks() {
    static const bool blFollows =
        pthread_atfork(BeforeFork, AfterForkInParent, AfterForkInChild) == 0;
    return blFollows;
}

// An open lock file. What is not handed out as a handle is closed.
class LockFile {
  public:
    explicit LockFile(const char *szPath) {
        if (!FollowForks()) {
            throw std::bad_alloc();
        }
        OpenLocks &locks = TheLocks();
        const std::lock_guard<std::mutex> guard(locks.mutex);
        locks.descriptors.reserve(locks.descriptors.size() + 1);
        m_fd =
            open(szPath, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC, 0600);
        if (m_fd >= 0) {
            locks.descriptors.push_back(m_fd);
        }
    }
    LockFile(const LockFile &) = delete;
    LockFile &operator=(const LockFile &) = delete;
    ~LockFile() { Close(m_fd); }

    int Get() const { return m_fd; }
    int HandOut() { return std::exchange(m_fd, -1); }

    static bool Close(int fd) {
        OpenLocks &locks = TheLocks();
        const std::lock_guard<std::mutex> guard(locks.mutex);
        const auto it = std::find(locks.descriptors.begin(), locks.descriptors.end(), fd);
        if (it == locks.descriptors.end()) {
            return false;
        }
        locks.descriptors.erase(it);
        close(fd);
        return true;
    }

  private:
    int m_fd = -1;
};

// What a try to lock an open lock file came to.
enum class Try { kHeld, kHeldElsewhere, kRemoved, kUnsafe, kFailed };

Try TryLock(int fd) {
    const bool blHeld = flock(fd, LOCK_EX | LOCK_NB) == 0;
    if (!blHeld && errno != EWOULDBLOCK) {
        return Try::kFailed;
    }
    struct stat status = {};
    if (fstat(fd, &status) != 0) {
        return Try::kFailed;
    }
    if (!host::IsOwnFile(status)) {
        return Try::kUnsafe;
    }
    // A cleaner of old files may have been there. Whoever comes next creates a new lock file.
    if (status.st_nlink == 0) {
        return Try::kRemoved;
    }
    // Whoever may open the file can lock it: nobody else may.
    if (blHeld && (status.st_mode & 07777U) != 0600 && fchmod(fd, 0600) != 0) {
        return Try::kFailed;
    }
    return blHeld ? Try::kHeld : Try::kHeldElsewhere;
}

// Only who is next in turn tries the lock itself. Without turns a process that takes the lock over
// and over would get it each time before those who wait, and they would wait for ever. A turn goes
// with the open lock file.
bool TakeTurn(int fd, short type) {
    struct flock turn = {};
    turn.l_type = type;
    turn.l_whence = SEEK_SET;
    turn.l_len = 1;
    return fcntl(fd, F_OFD_SETLK, &turn) == 0;
}

// Waits a while, not beyond the end. False when the end has come.
bool Wait(Clock::time_point end, std::chrono::microseconds wait) {
    const Clock::duration left = end - Clock::now();
    if (left <= Clock::duration::zero()) {
        return false;
    }
    std::this_thread::sleep_for(std::min<Clock::duration>(wait, left));
    return true;
}

// Waits for the turn and then for the lock.
Try WaitForLock(int fd, Clock::time_point end) {
    // What is refused is not waited for.
    struct stat status = {};
    if (fstat(fd, &status) != 0) {
        return Try::kFailed;
    }
    if (!host::IsOwnFile(status)) {
        return Try::kUnsafe;
    }
    for (std::chrono::microseconds wait = kFirstWait; !TakeTurn(fd, F_WRLCK);
         wait = std::min(2 * wait, kLastWait)) {
        if (errno != EAGAIN && errno != EACCES) {
            return Try::kFailed;
        }
        if (!Wait(end, wait)) {
            return Try::kHeldElsewhere;
        }
    }
    Try result = TryLock(fd);
    while (result == Try::kHeldElsewhere && Wait(end, kFirstWait)) {
        result = TryLock(fd);
    }
    static_cast<void>(TakeTurn(fd, F_UNLCK));
    return result;
}

int Lock(const char *szPath, int timeout_s, int &handle) {
    const Clock::time_point end = Clock::now() + std::chrono::seconds(timeout_s);
    for (;;) {
        const host::Waiting waiting({"waiting for the lock '", szPath, "'"});
        LockFile file(szPath);
        if (file.Get() < 0) {
            return HOST_FAIL(errno == ELOOP ? YLIBC_ERR_UNSAFE_FILE : YLIBC_ERR_FILE);
        }
        const Try result = WaitForLock(file.Get(), end);
        switch (result) {
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
