// Locks by lock file: the kernel's lock on an open file, which it drops with the last descriptor.

#include "../file_lock.h"

#include <fcntl.h>
#include <pthread.h>
#include <sys/file.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstddef>
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
constexpr std::ptrdiff_t kMaxIdle = 8;

// Whoever takes a lock over and over looks this often whether the file still has its name, and
// whether somebody waits; always, when it has not left the lock alone for as long as those pause
// who wait.
constexpr std::chrono::milliseconds kLookInterval{1};

// An open lock file.
struct OpenFile {
    std::string strPath;
    int fd = -1;
    struct stat status = {};  // when it was opened
    bool blUsed = true;       // or idle
    Clock::time_point looked;
    Clock::time_point released;
};

// All lock files that the process has open; a handle is a descriptor. Opening, closing and forking
// exclude each other, so that a child process knows what it has to close. Never destroyed: other
// threads may still hold locks while the process ends.
struct OpenLocks {
    std::mutex mutex;
    std::vector<OpenFile> files;
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
    for (const OpenFile &file : locks.files) {
        close(file.fd);
    }
    locks.files.clear();
    locks.mutex.unlock();
}

bool FollowForks() {
    static const bool blFollows =
        pthread_atfork(BeforeFork, AfterForkInParent, AfterForkInChild) == 0;
    return blFollows;
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
        auto file = FindIdle(szPath);
        m_blWasOpen = file != locks.files.end();
        if (!m_blWasOpen) {
            locks.files.reserve(locks.files.size() + 1);
            OpenFile opened = Open(szPath);
            if (opened.fd < 0) {
                return;
            }
            file = locks.files.insert(locks.files.end(), std::move(opened));
        }
        file->blUsed = true;
        m_fd = file->fd;
        m_statusAtOpen = file->status;
        const Clock::time_point now = Clock::now();
        // A name without a folder depends on where the process is.
        m_blLooks = szPath[0] != '/' || now - file->looked >= kLookInterval;
        m_blGivesWay = m_blLooks || now - file->released < kFirstWait;
        file->looked = m_blLooks ? now : file->looked;
    }
    LockFile(const LockFile &) = delete;
    LockFile &operator=(const LockFile &) = delete;
    ~LockFile() { Release(m_fd, false); }

    int Get() const { return m_fd; }
    const char *Path() const { return m_szPath; }
    bool WasOpen() const { return m_blWasOpen; }
    bool Looks() const { return m_blLooks; }
    bool GivesWay() const { return m_blGivesWay; }
    const struct stat &StatusAtOpen() const { return m_statusAtOpen; }
    int HandOut() { return std::exchange(m_fd, -1); }

    // Ends the use of the descriptor, and with it the lock. False when it is no lock file's.
    static bool Release(int fd, bool blStayOpen) {
        OpenLocks &locks = TheLocks();
        const std::lock_guard<std::mutex> guard(locks.mutex);
        const auto file =
            std::find_if(locks.files.begin(), locks.files.end(),
                         [fd](const OpenFile &other) { return other.fd == fd && other.blUsed; });
        if (file == locks.files.end()) {
            return false;
        }
        const auto idle = std::count_if(locks.files.begin(), locks.files.end(),
                                        [](const OpenFile &other) { return !other.blUsed; });
        const bool blStays =
            blStayOpen && idle < kMaxIdle && FindIdle(file->strPath.c_str()) == locks.files.end();
        if (blStays && flock(fd, LOCK_UN) == 0) {
            file->blUsed = false;
            file->released = Clock::now();
        } else {
            close(fd);
            locks.files.erase(file);
        }
        return true;
    }

  private:
    static std::vector<OpenFile>::iterator FindIdle(const char *szPath) {
        auto &files = TheLocks().files;
        return std::find_if(files.begin(), files.end(), [szPath](const OpenFile &file) {
            return !file.blUsed && file.strPath == szPath;
        });
    }

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
    bool m_blGivesWay = true;
    struct stat m_statusAtOpen = {};
};

// What a try to lock an open lock file came to.
enum class Try { kHeld, kHeldElsewhere, kRemoved, kUnsafe, kFailed };

// Reads the status of the file as it is now. False when its name has gone, or leads to another
// file. Between two looks at the name an unchanged status tells as much: to be renamed or removed
// changes it.
bool ReadStatus(const LockFile &file, struct stat &status) {
    const bool blRead = fstat(file.Get(), &status) == 0;
    if (!file.WasOpen()) {
        return blRead && status.st_nlink > 0;
    }
    return (blRead && !file.Looks() && host::IsUnchanged(status, file.StatusAtOpen())) ||
           (lstat(file.Path(), &status) == 0 && host::IsSameFile(status, file.StatusAtOpen()));
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
    if (!file.GivesWay() || IsTurnFree(file.Get())) {
        const Try result = TryLock(file);
        if (result != Try::kHeldElsewhere) {
            return result;
        }
    }
    return WaitForLock(file, end);
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
        LockFile file(szPath);
        if (file.Get() < 0) {
            return FailToOpen(szPath);
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
