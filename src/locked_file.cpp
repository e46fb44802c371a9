#include "locked_file.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <thread>

#include "own_file.h"

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
    constexpr int kFlags = O_RDWR | own_file::kFlags;
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
    if (!own_file::IsNamed(szPath, status)) {
        return Try::kAgain;
    }
    // Another user's file goes: its lock is held here, so nobody is at work with it.
    return own_file::IsOwn(status) ? Try::kHeld : unlink(szPath) == 0 ? Try::kAgain : Try::kFailed;
}
