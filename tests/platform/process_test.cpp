// Running programs, whatever the caller does with signals, children and descriptors.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/syscall.h>
#include <sys/time.h>

#include <atomic>
#include <chrono>
#include <sstream>
#include <thread>

#include "children.h"
#include "diagnosis.h"
#include "failures.h"
#include "files.h"
#include "process.h"

namespace {

using namespace files;

constexpr const char *kOut = "/tmp/out";
constexpr const char *kPrograms = "/tmp/programs";

void Write(const char *szPath, const std::string &strText, int mode = 0755) {
    std::ofstream(szPath) << strText;
    chmod(szPath, static_cast<mode_t>(mode));
}

int Shell(const char *szScript) {
    return YLIBCExec("/bin/sh", "-c", szScript, nullptr, nullptr);
}

// Waits until a process has ended, for a bounded time.
bool Ends(int pid) {
    pollfd end = {static_cast<int>(syscall(SYS_pidfd_open, pid, 0)), POLLIN, 0};
    const bool blEnds = end.fd < 0 ? errno == ESRCH : poll(&end, 1, 60000) == 1;
    close(end.fd);
    return blEnds;
}

void Handle(int signal, void (*pfnHandler)(int)) {
    struct sigaction action = {};
    action.sa_handler = pfnHandler;
    sigaction(signal, &action, nullptr);
}

// Whether the calling thread holds a signal back.
bool IsBlocked(int signal) {
    sigset_t mask;
    pthread_sigmask(SIG_SETMASK, nullptr, &mask);
    return sigismember(&mask, signal) == 1;
}

// Runs programs in several threads at once; true when each gave its result, and the caller is as it
// was: with its own signal mask and without a child, be it an ended one.
bool EveryProgramGivesItsEnd() {
    const std::pair<const char *, int> rows[] = {
        {"exit 0", 0},       {"exit 1", 1},       {"exit 3", 3},
        {"exit 255", 255},   {"kill -9 $$", 137}, {"kill -TERM $$; exit 7", 143},
        {"sleep 0.05; :", 0}};
    const bool blBlocked = IsBlocked(SIGTERM);
    std::atomic<bool> blAll = true;
    const auto runAll = [&] {
        for (const auto &[szScript, result] : rows) {
            if (Shell(szScript) != result) {
                blAll = false;
            }
        }
    };
    std::thread second(runAll);
    std::thread third(runAll);
    runAll();
    second.join();
    third.join();
    return blAll && IsBlocked(SIGTERM) == blBlocked && waitpid(-1, nullptr, __WALL) == -1 &&
           errno == ECHILD;
}

class Exec : public testing::Test {
  protected:
    void SetUp() override {
        std::remove(kOut);
        fs::create_directory(kPrograms);
        Write("/etc/zeloinfo.conf", "exec_timeout=\"60\"\n");
    }
};

TEST_F(Exec, GivesTheProgramsEndWhateverTheCallerDoes) {
    const std::pair<const char *, void (*)()> callers[] = {
        {"plain", [] {}},
        {"ignores SIGCHLD", [] { Handle(SIGCHLD, SIG_IGN); }},
        {"reaps every child",
         [] {
             Handle(SIGCHLD, [](int) {
                 while (waitpid(-1, nullptr, WNOHANG) > 0) {
                 }
             });
         }},
        {"blocks and ignores signals",
         [] {
             sigset_t all;
             sigfillset(&all);
             sigprocmask(SIG_SETMASK, &all, nullptr);
             Handle(SIGTERM, SIG_IGN);
         }},
        {"has no standard streams",
         [] {
             for (const int fd : {0, 1, 2}) {
                 close(fd);
             }
         }},
        {"is interrupted often",
         [] {
             Handle(SIGALRM, [](int) {});
             const itimerval often = {{0, 2000}, {0, 2000}};
             setitimer(ITIMER_REAL, &often, nullptr);
         }},
    };
    for (const auto &caller : callers) {
        EXPECT_TRUE(children::InOne([&] {
            caller.second();
            return EveryProgramGivesItsEnd();
        })) << caller.first;
    }
}

TEST_F(Exec, PassesArgumentsOnAsTheyAre) {
    Write("/tmp/programs/show", "#!/bin/sh\nfor a; do printf '<%s>' \"$a\"; done >/tmp/out\n");
    EXPECT_EQ(YLIBCExec("/tmp/programs/show", " a b", "it's \"c\"", "", "$(exit) `exit` *;&|\n"),
              0);
    EXPECT_EQ(FileText(kOut), "< a b><it's \"c\"><><$(exit) `exit` *;&|\n>");
    EXPECT_EQ(YLIBCExec("/tmp/programs/show", "a", nullptr, "b", nullptr), 0);
    EXPECT_EQ(FileText(kOut), "<a>");
}

TEST_F(Exec, GivesTheProgramTheNullDeviceAndNoOtherFiles) {
    const int leaked = open("/etc/zeloinfo.conf", O_RDONLY);
    ASSERT_EQ(dup2(leaked, 400), 400);
    EXPECT_EQ(Shell("(ls /proc/$$/fd; readlink /proc/$$/fd/[012]) >/tmp/out; :"), 0);
    close(leaked);
    close(400);
    EXPECT_EQ(FileText(kOut), "0\n1\n2\n/dev/null\n/dev/null\n/dev/null\n");
}

TEST_F(Exec, SaysWhenAProgramCannotBeRun) {
    Write("/tmp/programs/plain", "#!/bin/sh\n", 0644);
    Write("/tmp/programs/interpreter", "#!/tmp/none\n");
    Write("/tmp/programs/text", "exit 0\n");
    for (const char *szProgram :
         {"/tmp/programs/none", "/tmp", "/tmp/programs/plain", "/tmp/programs/interpreter",
          "/tmp/programs/text", "/tmp/programs/text/below", "sh", ""}) {
        EXPECT_EQ(FailureOf(YLIBCExec(szProgram, nullptr, nullptr, nullptr, nullptr)),
                  YLIBC_ERR_EXEC)
            << szProgram;
    }
    EXPECT_EQ(FailureOf(YLIBCExec(nullptr, nullptr, nullptr, nullptr, nullptr)),
              YLIBC_ERR_INVALID_ARGUMENT);
    EXPECT_EQ(Shell("exit 1"), 1);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_INVALID_ARGUMENT));
}

TEST_F(Exec, RunsOnlyWhatNobodyElseCanChange) {
    fs::create_directory("/tmp/programs/open");
    fs::create_directories("/tmp/programs/group/sub");
    for (const char *szProgram : {"good", "changeable", "open/program", "group/sub/program"}) {
        Write((std::string(kPrograms) + '/' + szProgram).c_str(), "#!/bin/sh\n");
    }
    chmod("/tmp/programs/changeable", 0775);
    chmod("/tmp/programs/open", 0777);
    chmod("/tmp/programs/group", 0775);
    fs::create_symlink("good", "/tmp/programs/link");
    fs::create_symlink("../good", "/tmp/programs/open/link");
    const std::pair<const char *, int> rows[] = {{"good", YLIBC_ERR_NONE},
                                                 {"link", YLIBC_ERR_NONE},
                                                 {"changeable", YLIBC_ERR_UNSAFE_FILE},
                                                 {"open/program", YLIBC_ERR_UNSAFE_FILE},
                                                 {"group/sub/program", YLIBC_ERR_UNSAFE_FILE},
                                                 {"open/link", YLIBC_ERR_UNSAFE_FILE}};
    for (const auto &[szName, error] : rows) {
        const std::string strProgram = std::string(kPrograms) + '/' + szName;
        EXPECT_EQ(FailureOf(YLIBCExec(strProgram.c_str(), nullptr, nullptr, nullptr, nullptr)),
                  error)
            << szName;
    }
}

TEST_F(Exec, EndsAHungProgramWithItsProcessGroup) {
    const std::tuple<const char *, long long, YLIBC_ERROR> rows[] = {
        {"exec_timeout=2\n", -1, YLIBC_ERR_EXEC_TIME}, {"", 1200, YLIBC_ERR_DEADLINE}};
    double told_s = 0;
    ZELOWaitObserverSet(
        [](void *pTold, const char *szWaitsFor, double waited_s) {
            EXPECT_STREQ(szWaitsFor, "the program '/bin/sh -c'");
            *static_cast<double *>(pTold) = waited_s;
        },
        &told_s);
    for (const auto &[szLimit, deadline_ms, error] : rows) {
        Write("/etc/zeloinfo.conf", szLimit);
        ZELODeadlineSet(deadline_ms);
        const auto begin = std::chrono::steady_clock::now();
        EXPECT_EQ(FailureOf(Shell("trap '' TERM; sleep 300 & echo $$ $! >/tmp/out; sleep 300; :")),
                  error);
        const auto duration = std::chrono::steady_clock::now() - begin;
        EXPECT_GE(duration, std::chrono::milliseconds(1200));
        EXPECT_LT(duration, std::chrono::seconds(100));
        EXPECT_GE(told_s, 1);
        int program = 0;
        int child = 0;
        std::istringstream(FileText(kOut)) >> program >> child;
        EXPECT_TRUE(program > 0 && Ends(program) && child > 0 && Ends(child));
        told_s = 0;
    }
    ZELOWaitObserverSet(nullptr, nullptr);
    std::remove(kOut);
    EXPECT_EQ(FailureOf(Shell("echo >/tmp/out")), YLIBC_ERR_DEADLINE);
    EXPECT_FALSE(fs::exists(kOut)) << "what is started past the deadline could change things";
    ZELODeadlineSet(-1);
}

TEST_F(Exec, TakesAnInvalidLimitForTheDefault) {
    for (const char *szLimit : {"0", "-1", "1s", "0.1", "99999999999999999999", ""}) {
        Write("/etc/zeloinfo.conf", std::string("exec_timeout=\"") + szLimit + "\"\n");
        EXPECT_EQ(Shell(szLimit[0] == '1' ? "sleep 1.1; :" : "sleep 0.05; :"), 0) << szLimit;
    }
}

TEST_F(Exec, LeavesADaemonAlone) {
    EXPECT_EQ(Shell("sleep 300 & echo $! >/tmp/out"), 0);
    const int daemon = std::atoi(FileText(kOut).c_str());
    EXPECT_EQ(YLIBCProcAlive(daemon), 1);
    kill(daemon, SIGKILL);
    EXPECT_TRUE(Ends(daemon));
}

TEST(ProcAlive, KnowsTheLivingFromTheDead) {
    const pid_t zombie = children::Start([] { return true; });
    siginfo_t info = {};
    waitid(P_PID, static_cast<id_t>(zombie), &info, WEXITED | WNOWAIT);
    EXPECT_EQ(kill(zombie, 0), 0);
    EXPECT_EQ(YLIBCProcAlive(zombie), 0);
    waitpid(zombie, nullptr, 0);
    const std::pair<int, int> rows[] = {{getpid(), 1}, {1, 1},  {zombie, 0},
                                        {0, 0},        {-1, 0}, {-getpid(), 0}};
    for (const auto &[pid, result] : rows) {
        EXPECT_EQ(YLIBCProcAlive(pid), result) << pid;
    }
    // The id of a thread is no process's.
    std::thread([] { EXPECT_EQ(YLIBCProcAlive(gettid()), 0); }).join();
}

}  // namespace
