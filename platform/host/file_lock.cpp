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
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "file_state.h"
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

// Of the lock files whose locks are released, these many stay open to be locked again, which takes
// a quarter of the time of opening them anew.
constexpr std::size_t kMaxIdle = 8;

// Whoever takes a lock over and over looks this often whether somebody waits.
constexpr std::chrono::milliseconds kLookInterval{1};

// An open lock file.
struct OpenFile {
    std::string strPath;
    int fd = -1;
    struct stat status = {};  // when it was opened
    Clock::time_point looked;
};

// All lock files that the process has open; a handle is a descriptor. Opening, closing and forking
// exclude each other, so that a child process knows what it has to close. Never destroyed: other
// threads may still hold locks while the process ends.
struct OpenLocks {
    std::mutex mutex;
    std::vector<OpenFile> used;
    std::vector<OpenFile> idle;
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
    OpenLocks &locks = TheLocks();
    for (std::vector<OpenFile> *pFiles : {&locks.used, &locks.idle}) {
        for (const OpenFile &file : *pFiles) {
            close(file.fd);
        }
        pFiles->clear();
    }
    locks.mutex.unlock();
}

bool FollowForks() {
    static const bool blFollows =
        pthread_atfork(BeforeFork, AfterForkInParent, AfterForkInChild) == 0;
    return blFollows;
}

template <typename IsWanted>
std::vector<OpenFile>::iterator FindFile(std::vector<OpenFile> &files, IsWanted isWanted) {
    return std::find_if(files.begin(), files.end(), isWanted);
}

// A lock file that is opened, or has stayed open since the process held its lock before. What is
// not handed out as a handle is closed.
class LockFile {
  public:
    explicit LockFile(const char *szPath) : m_szPath(szPath) {
        if (!FollowForks()) {
            throw std::bad_alloc();
        }
        OpenLocks &locks = TheLocks();
        const std::lock_guard<std::mutex> guard(locks.mutex);
        locks.used.reserve(locks.used.size() + 1);
        locks.idle.reserve(kMaxIdle);
        const auto idle =
            FindFile(locks.idle, [&](const OpenFile &file) { return file.strPath == szPath; });
        m_blWasOpen = idle != locks.idle.end();
        OpenFile file = m_blWasOpen ? std::move(*idle) : Open(szPath);
        if (m_blWasOpen) {
            locks.idle.erase(idle);
        }
        m_fd = file.fd;
        m_statusAtOpen = file.status;
        const Clock::time_point now = Clock::now();
        m_blLooks = now - file.looked >= kLookInterval;
        file.looked = m_blLooks ? now : file.looked;
        if (m_fd >= 0) {
            locks.used.push_back(std::move(file));
        }
    }
    LockFile(const LockFile &) = delete;
    LockFile &operator=(const LockFile &) = delete;
    ~LockFile() { Release(m_fd, false); }

    int Get() const { return m_fd; }
    const char *Path() const { return m_szPath; }
    bool WasOpen() const { return m_blWasOpen; }
    bool Looks() const { return m_blLooks; }
    const struct stat &StatusAtOpen() const { return m_statusAtOpen; }
    int HandOut() { return std::exchange(m_fd, -1); }

    // Ends the use of the descriptor, and with it the lock. False when it is no lock file's.
    static bool Release(int fd, bool blStayOpen) {
        OpenLocks &locks = TheLocks();
        const std::lock_guard<std::mutex> guard(locks.mutex);
        const auto used = FindFile(locks.used, [&](const OpenFile &file) { return file.fd == fd; });
        if (used == locks.used.end()) {
            return false;
        }
        OpenFile file = std::move(*used);
        locks.used.erase(used);
        const bool blHasRoom =
            locks.idle.size() < kMaxIdle && FindFile(locks.idle, [&](const OpenFile &other) {
                                                return other.strPath == file.strPath;
                                            }) == locks.idle.end();
        if (blStayOpen && blHasRoom && flock(fd, LOCK_UN) == 0) {
            locks.idle.push_back(std::move(file));
        } else {
            close(fd);
        }
        return true;
    }

  private:
    static OpenFile Open(const char *szPath) {
        OpenFile file;
        file.strPath = szPath;
        file.fd =
            open(szPath, O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC, 0600);
        if (file.fd >= 0 && fstat(file.fd, &file.status) != 0) {
            close(std::exchange(file.fd, -1));
        }
        return file;
    }

    const char *m_szPath;
    int m_fd = -1;
    bool m_blWasOpen = false;
    bool m_blLooks = true;
    struct stat m_statusAtOpen = {};
};

// What a try to lock an open lock file came to.
enum class Try { kHeld, kHeldElsewhere, kRemoved, kUnsafe, kFailed };

// Reads the status of the file as it is now. False when its name has gone, or leads to another
// file: a name may have been given to another one since the file was opened, and one without a
// folder depends on where the process is.
bool ReadStatus(const LockFile &file, struct stat &status) {
    if (file.WasOpen()) {
        return lstat(file.Path(), &status) == 0 && host::IsSameFile(status, file.StatusAtOpen());
    }
    return fstat(file.Get(), &status) == 0 && status.st_nlink > 0;
}

Try TryLock(const LockFile &file) {
    const bool blHeld = flock(file.Get(), LOCK_EX | LOCK_NB) == 0;
    if (!blHeld && errno != EWOULDBLOCK) {
        return Try::kFailed;
    }
    // A cleaner of old files may have been there. Whoever comes next creates a new lock file.
    struct stat status = {};
    if (!ReadStatus(file, status)) {
        return Try::kRemoved;
    }
    if (!host::IsOwnFile(status)) {
        return Try::kUnsafe;
    }
    // Whoever may open the file can lock it: nobody else may.
    if (blHeld && (status.st_mode & 07777U) != 0600 && fchmod(file.Get(), 0600) != 0) {
        return Try::kFailed;
    }
    return blHeld ? Try::kHeld : Try::kHeldElsewhere;
}

// Only who is next in turn tries the lock itself. Without turns a process that takes the lock over
// and over would get it each time before those who wait, and they would wait for ever. A turn goes
// with the open lock file.
struct flock Turn(short type) {
    struct flock turn = {};
    turn.l_type = type;
    turn.l_whence = SEEK_SET;
    turn.l_len = 1;
    return turn;
}

bool TakeTurn(int fd, short type) {
    struct flock turn = Turn(type);
    return fcntl(fd, F_OFD_SETLK, &turn) == 0;
}

// Whether nobody waits.
bool IsTurnFree(int fd) {
    struct flock turn = Turn(F_WRLCK);
    return fcntl(fd, F_OFD_GETLK, &turn) == 0 && turn.l_type == F_UNLCK;
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
Try WaitForLock(const LockFile &file, Clock::time_point end) {
    const host::Waiting waiting({"waiting for the lock '", file.Path(), "'"});
    for (std::chrono::microseconds wait = kFirstWait; !TakeTurn(file.Get(), F_WRLCK);
         wait = std::min(2 * wait, kLastWait)) {
        if (errno != EAGAIN && errno != EACCES) {
            return Try::kFailed;
        }
        if (!Wait(end, wait)) {
            return Try::kHeldElsewhere;
        }
    }
    Try result = TryLock(file);
    while (result == Try::kHeldElsewhere && Wait(end, kFirstWait)) {
        result = TryLock(file);
    }
    static_cast<void>(TakeTurn(file.Get(), F_UNLCK));
    return result;
}

// Takes the lock, at once where nobody waits for it.
Try TakeLock(const LockFile &file, Clock::time_point end) {
    // What is refused is not waited for.
    if (!host::IsOwnFile(file.StatusAtOpen())) {
        return Try::kUnsafe;
    }
    if (!file.Looks() || IsTurnFree(file.Get())) {
        const Try result = TryLock(file);
        if (result != Try::kHeldElsewhere) {
            return result;
        }
    }
    return WaitForLock(file, end);
}

int Lock(const char *szPath, int timeout_s, int &handle) {
    const Clock::time_point end = Clock::now() + std::chrono::seconds(timeout_s);
    for (;;) {
        LockFile file(szPath);
        if (file.Get() < 0) {
            return HOST_FAIL(errno == ELOOP ? YLIBC_ERR_UNSAFE_FILE : YLIBC_ERR_FILE);
        }
        const Try result = TakeLock(file, end);
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
    return LockFile::Release(handle, true) ? 0 : HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
}
