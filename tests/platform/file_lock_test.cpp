// Locks by lock file: who excludes whom, when a lock is free again, and what is no lock file.

#include "file_lock.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/syscall.h>

#include <algorithm>
#include <chrono>
#include <thread>

#include "children.h"
#include "diagnosis.h"
#include "failures.h"
#include "files.h"

namespace {

using namespace files;
using Clock = std::chrono::steady_clock;

constexpr const char *kLock = "/tmp/a.lock";
constexpr const char *kVictim = "/tmp/victim";

// Whether the lock could be had in the time; it is released again.
bool IsFree(int timeout_s = 0) {
    int handle = 5;
    const int result = YLIBCFileLockTimeByFile(kLock, 1, timeout_s, &handle);
    EXPECT_TRUE(result == 1 ? handle >= 0 : result < 0 && handle == -1) << result << ' ' << handle;
    return result == 1 && YLIBCFileUnlockByFile(handle) == 0;
}

int Take(const char *szLock = kLock) {
    int handle = -1;
    EXPECT_EQ(YLIBCFileLockByFile(szLock, 0, &handle), 1);
    return handle;
}

TEST(FileLock, IsHeldFromTakingToRelease) {
    // Whoever may open a lock file could hold it.
    std::ofstream(kLock).flush();
    chmod(kLock, 0666);
    const int handle = Take();
    EXPECT_EQ(FileMode(kLock), 0600U);
    EXPECT_FALSE(IsFree());
    EXPECT_TRUE(children::InOne([] { return !IsFree(); }));
    // A process that is being started has a copy of the open file, and no fork handler knows of it.
    const children::Signal end;
    const auto pid = static_cast<pid_t>(syscall(SYS_clone, SIGCHLD, 0UL, 0UL, 0UL, 0UL));
    if (pid == 0) {
        end.Await();
        syscall(SYS_exit_group, 0);
    }
    EXPECT_EQ(YLIBCFileUnlockByFile(handle), 0);
    EXPECT_TRUE(IsFree());
    EXPECT_TRUE(end.Give() && children::Ended(pid));
    for (int none : {handle, -1, STDERR_FILENO, 123456}) {
        EXPECT_EQ(FailureOf(YLIBCFileUnlockByFile(none)), YLIBC_ERR_INVALID_ARGUMENT);
    }
    EXPECT_NE(fcntl(STDERR_FILENO, F_GETFD), -1);
}

TEST(FileLock, ThreadsAndProcessesWaitForEachOther) {
    constexpr const char *kCounter = "/tmp/counter";
    std::ofstream(kCounter) << 0;
    const auto countUp = [] {
        for (int i = 0; i < 100; ++i) {
            const int handle = Take();
            WriteFile(kCounter, std::to_string(std::stoi(FileText(kCounter)) + 1));
            YLIBCFileUnlockByFile(handle);
        }
    };
    EXPECT_TRUE(children::InEach(2, [&](int /*process*/) {
        std::thread other(countUp);
        countUp();
        other.join();
        return true;
    }));
    EXPECT_EQ(FileText(kCounter), "400");
}

TEST(FileLock, WaitsNoLongerThanItsTime) {
    const int handle = Take();
    for (int timeout_s : {1, 0, -1}) {
        const auto begin = Clock::now();
        EXPECT_FALSE(IsFree(timeout_s));
        EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_BUSY));
        const auto waited = Clock::now() - begin;
        EXPECT_GE(waited, std::chrono::seconds(timeout_s));
        EXPECT_LT(waited, std::chrono::seconds(60)) << timeout_s;
    }
    EXPECT_EQ(YLIBCFileUnlockByFile(handle), 0);
}

TEST(FileLock, IsNoChildsAndNoProgrammes) {
    using children::Signal;
    const std::pair<const char *, std::function<bool(int handle, const Signal &end)>> rows[] = {
        {"killed, with a child that lives on",
         [](int handle, const Signal &end) {
             children::Start([&] { return YLIBCFileUnlockByFile(handle) < 0 && end.Await(); });
             return raise(SIGKILL) == 0;
         }},
        {"replaced by a program",
         [](int, const Signal &end) {
             return end.BecomeInput() && execl("/bin/cat", "cat", nullptr) == 0;
         }},
    };
    for (const auto &row : rows) {
        SCOPED_TRACE(row.first);
        // Each row's own: the child that lives on may be slow, and the next row must not take its
        // end.
        const children::Signal end;
        const children::Signal held;
        const children::Signal goOn;
        const pid_t pid = children::Start([&] {
            const int handle = Take();
            return held.Give() && goOn.Await() && row.second(handle, end);
        });
        ASSERT_TRUE(held.Await());
        EXPECT_FALSE(IsFree());
        EXPECT_TRUE(goOn.Give());
        EXPECT_TRUE(IsFree(60));
        EXPECT_TRUE(end.Give());
        children::Kill(pid);
    }
}

TEST(FileLock, IsOneLockAlsoWhenItsFileIsRemoved) {
    const int handle = Take();
    const children::Signal begun;
    const pid_t waiter = children::Start([&] {
        begun.Give();
        const int own = Take();
        return !IsFree() && YLIBCFileUnlockByFile(own) == 0;
    });
    ASSERT_TRUE(begun.Await());
    const auto end = Clock::now() + std::chrono::seconds(60);
    while (!HasOpen(std::to_string(waiter), kLock)) {
        ASSERT_LT(Clock::now(), end);
    }
    fs::remove(kLock);
    EXPECT_EQ(YLIBCFileUnlockByFile(handle), 0);
    EXPECT_TRUE(children::Ended(waiter));
    // What the process has held before is worth nothing once another file has the name.
    constexpr const char *kOther = "/tmp/other";
    const children::Signal held;
    const children::Signal done;
    const pid_t holder = children::Start([&] {
        const int own = Take(kOther);
        return held.Give() && done.Await() && YLIBCFileUnlockByFile(own) == 0;
    });
    ASSERT_TRUE(held.Await());
    EXPECT_TRUE(IsFree());
    fs::rename(kLock, "/tmp/former");
    fs::rename(kOther, kLock);
    EXPECT_FALSE(IsFree());
    EXPECT_TRUE(done.Give());
    EXPECT_TRUE(children::Ended(holder));
}

TEST(FileLock, TrapsAreRefused) {
    std::ofstream(kVictim).flush();
    chmod(kVictim, 0644);
    const std::function<void()> traps[] = {
        [] { fs::create_symlink(kVictim, kLock); }, [] { fs::create_symlink("/tmp/lured", kLock); },
        [] { fs::create_hard_link(kVictim, kLock); }, [] { mkfifo(kLock, 0600); },
        [] { fs::create_directory(kLock); }};
    for (const auto &set : traps) {
        fs::remove(kLock);
        set();
        EXPECT_FALSE(IsFree(20));
        EXPECT_EQ(FailureOf(-1), YLIBC_ERR_UNSAFE_FILE);
    }
    fs::remove(kLock);
    EXPECT_EQ(FileMode(kVictim), 0644U);
    EXPECT_FALSE(fs::exists("/tmp/lured"));
    int handle = -1;
    EXPECT_LT(YLIBCFileLockByFile(nullptr, 0, &handle), 0);
    EXPECT_EQ(FailureOf(YLIBCFileLockByFile(kLock, 0, nullptr)), YLIBC_ERR_INVALID_ARGUMENT);
}

// Whoever comes first in a folder that everybody can write to must not stop root's programs.
TEST(FileLock, RootTakesItsNameBack) {
    // Whatever locks its maker holds on it.
    fs::remove(kLock);
    if (!PutStrangers("file", kLock)) {
        GTEST_SKIP() << "there are no files of another user's";
    }
    const int fd = open(kLock, O_RDWR | O_CLOEXEC);
    struct flock lock = {};
    lock.l_type = F_WRLCK;
    EXPECT_EQ(fcntl(fd, F_OFD_SETLK, &lock), 0);
    EXPECT_TRUE(IsFree());
    close(fd);
}

// Also by several programs at once: one of them makes the lock file that all of them use.
TEST(FileLock, RootTakesItsNameBackOnce) {
    constexpr const char *kCounter = "/tmp/counter";
    for (int i = 0; i < 3; ++i) {
        std::ofstream(kCounter) << 0;
        fs::remove(kLock);
        if (!PutStrangers(i == 0 ? "link" : "file", kLock)) {
            GTEST_SKIP() << "there are no files of another user's";
        }
        EXPECT_TRUE(children::InEach(8, [&](int /*process*/) {
            const int handle = Take();
            WriteFile(kCounter, std::to_string(std::stoi(FileText(kCounter)) + 1));
            return YLIBCFileUnlockByFile(handle) == 0;
        }));
        EXPECT_EQ(FileText(kCounter), "8");
        EXPECT_TRUE(S_ISREG(Status(kLock).st_mode) && Status(kLock).st_uid == 0);
    }
    for (const auto &entry : fs::directory_iterator("/tmp")) {
        EXPECT_FALSE(Holds(entry.path(), "a.lock.")) << entry.path();
    }
}

TEST(FileLock, ARefusalNamesTheFileAndItsOwner) {
    fs::create_directory("/tmp/private");
    const std::string strLock = "/tmp/private/b.lock";
    int handle = -1;
    fs::create_symlink(kVictim, strLock);
    EXPECT_EQ(FailureOf(YLIBCFileLockByFile(strLock.c_str(), 0, &handle)), YLIBC_ERR_UNSAFE_FILE);
    EXPECT_EQ(failures::Reason(), "'" + strLock + "' is a link");
    fs::remove(strLock);
    if (!PutStrangers("file", strLock)) {
        GTEST_SKIP() << "there are no files of another user's";
    }
    EXPECT_EQ(FailureOf(YLIBCFileLockByFile(strLock.c_str(), 0, &handle)), YLIBC_ERR_UNSAFE_FILE);
    EXPECT_EQ(failures::Reason(), "'" + strLock + "' belongs to the user " +
                                      std::to_string(Status(strLock).st_uid) + " (nobody)");
}

TEST(FileLock, ADeadlineEndsTheWaitAndAFreeLockIsTakenAfterIt) {
    const int handle = Take();
    std::vector<std::string> seen;
    ZELOWaitObserverSet(
        [](void *pSeen, const char *szWaitsFor, double) {
            static_cast<std::vector<std::string> *>(pSeen)->emplace_back(szWaitsFor);
        },
        &seen);
    const auto begin = Clock::now();
    ZELODeadlineSet(2500);
    EXPECT_FALSE(IsFree(60));
    EXPECT_EQ(FailureOf(-1), YLIBC_ERR_DEADLINE);
    EXPECT_EQ(failures::Reason(), "the deadline came while waiting for the lock '/tmp/a.lock'");
    EXPECT_GE(Clock::now() - begin, std::chrono::milliseconds(2500));
    EXPECT_LT(Clock::now() - begin, std::chrono::seconds(20));
    ASSERT_FALSE(seen.empty());
    EXPECT_LE(seen.size(), 20U) << "about once a second";
    EXPECT_EQ(seen.front(), "the lock '/tmp/a.lock'");
    ZELOWaitObserverSet(nullptr, nullptr);
    EXPECT_EQ(YLIBCFileUnlockByFile(handle), 0);
    EXPECT_EQ(ZELODeadlineLeft(), 0);
    EXPECT_TRUE(IsFree(60));
    ZELODeadlineSet(-1);
}

TEST(FileLock, SixteenProcessesGetTheirTurns) {
    constexpr int kProcesses = 16;
    struct Share {
        int turns;
        double longest_s;
    };
    auto *const pShares =
        static_cast<Share *>(mmap(nullptr, kProcesses * sizeof(Share), PROT_READ | PROT_WRITE,
                                  MAP_SHARED | MAP_ANONYMOUS, -1, 0));
    ASSERT_NE(static_cast<void *>(pShares), MAP_FAILED);
    const auto end = Clock::now() + std::chrono::seconds(20);
    EXPECT_TRUE(children::InEach(kProcesses, [&](int process) {
        for (auto begin = Clock::now(); begin < end; begin = Clock::now()) {
            const int handle = Take();
            const std::chrono::duration<double> waited = Clock::now() - begin;
            Share &share = pShares[process];
            ++share.turns;
            share.longest_s = std::max(share.longest_s, waited.count());
            // As long as a small file takes: who comes back at once meets those that wait.
            std::this_thread::sleep_for(std::chrono::milliseconds(2));
            YLIBCFileUnlockByFile(handle);
        }
        return true;
    }));
    const auto [pLeast, pMost] = std::minmax_element(
        pShares, pShares + kProcesses,
        [](const Share &one, const Share &other) { return one.turns < other.turns; });
    double longest_s = 0;
    for (int i = 0; i < kProcesses; ++i) {
        longest_s = std::max(longest_s, pShares[i].longest_s);
    }
    EXPECT_GE(2 * pLeast->turns, pMost->turns);
    EXPECT_LT(longest_s, 2);
    std::printf("%d to %d turns, the longest wait %g s\n", pLeast->turns, pMost->turns, longest_s);
    munmap(pShares, kProcesses * sizeof(Share));
}

}  // namespace
