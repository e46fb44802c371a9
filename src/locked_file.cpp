#include "locked_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <thread>

namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kPause{1};

// The kernel's own wait cannot be given a limit without signals, which are the program's.
bool Lock(int fd, Clock::time_point end) {
    while (flock(fd, LOCK_EX | LOCK_NB) != 0) {
        if ((errno != EWOULDBLOCK && errno != EINTR) || Clock::now() >= end) {
            return false;
        }
        std::this_thread::sleep_for(kPause);
    }
    return true;
}

bool LeadsTo(const char *szPath, const struct stat &opened) {
    struct stat named = {};
    return lstat(szPath, &named) == 0 && named.st_ino == opened.st_ino &&
           named.st_dev == opened.st_dev;
}

// Whether it is a regular file of the caller's own with no other name.
bool IsOwnFile(const struct stat &status) {
    return S_ISREG(status.st_mode) && status.st_nlink == 1 && status.st_uid == geteuid();
}

}  // namespace

LockedFile::LockedFile(const char *szPath, std::optional<mode_t> mode,
                       std::chrono::milliseconds wait) {
    const Clock::time_point end = Clock::now() + wait;
    Try result = Try::kAgain;
    do {
        result = Open(szPath, mode, end);
    } while (result == Try::kAgain && Clock::now() < end);
    if (result != Try::kHeld) {
        m_file = Descriptor();
    }
}

LockedFile::~LockedFile() {
    // A child process that was forked meanwhile has a copy of the descriptor.
    flock(m_file.Get(), LOCK_UN);
}

LockedFile::Try LockedFile::Open(const char *szPath, std::optional<mode_t> mode,
                                 Clock::time_point end) {
    constexpr int kFlags = O_RDWR | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
    m_file = Descriptor(open(szPath, kFlags));
    if (Get() < 0 && errno == ENOENT && mode) {
        // With O_CREAT alone, the kernel may refuse what somebody else has put there.
        m_file = Descriptor(open(szPath, kFlags | O_CREAT | O_EXCL, *mode));
        if (Get() < 0 && errno == EEXIST) {
            return Try::kAgain;
        }
    }
    if (Get() < 0) {
        // A link or a socket.
        const bool blInTheWay = errno == ELOOP || errno == ENXIO;
        return blInTheWay && unlink(szPath) == 0 ? Try::kAgain : Try::kFailed;
    }
    struct stat status = {};
    if (!Lock(Get(), end) || fstat(Get(), &status) != 0) {
        return Try::kFailed;
    }
    if (!LeadsTo(szPath, status)) {
        return Try::kAgain;
    }
    // Another user's file goes: its lock is held here, so nobody is at work with it.
    return IsOwnFile(status) ? Try::kHeld : unlink(szPath) == 0 ? Try::kAgain : Try::kFailed;
}
