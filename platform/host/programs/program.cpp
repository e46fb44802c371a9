// Running programs, with a process in between: the warden.
//
// A caller that ignores SIGCHLD, or that waits for any child in a handler or in another thread,
// takes away what is known of the end of its children. So a child process, the warden, starts the
// program, waits for it and ends it when its time is over. The warden has no exit signal: its own
// end sends no SIGCHLD, an ignored SIGCHLD does not lose it, and a wait for any child passes it
// over. What it saw of the program stands in a page that it shares with the caller, which asks it
// there to end the program when the process's deadline comes.
//
// The warden is a copy of a process that may have other threads, and their locks stay locked in the
// copy for ever: it calls only functions that take no lock, and everything that needs memory is
// prepared before it exists.

#include "program.h"

#include <fcntl.h>
#include <linux/futex.h>
#include <pthread.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <ctime>
#include <memory>
#include <new>
#include <string_view>

#include "wait.h"

namespace {

using Clock = host::Wait::Clock;

constexpr int kTimedOutStatus = 124;
constexpr int kNotRunStatus = 126;
constexpr int kSignalledBase = 128;

// How long a killed program may take to disappear. One that hangs inside the kernel takes longer;
// it is left to end by itself.
constexpr std::chrono::seconds kLongestDying(2);

std::string_view NameOf(std::string_view variable) {
    return variable.substr(0, variable.find('='));
}

std::vector<char *> Pointers(const std::vector<std::string> &texts) {
    std::vector<char *> pointers;
    pointers.reserve(texts.size() + 1);
    for (const std::string &strText : texts) {
        pointers.push_back(const_cast<char *>(strText.c_str()));
    }
    pointers.push_back(nullptr);
    return pointers;
}

// The caller's variables but those that are named again, after the added ones.
std::vector<char *> Environment(const std::vector<std::string> &added) {
    std::vector<char *> variables = Pointers(added);
    variables.pop_back();
    for (char **pVariable = environ; pVariable != nullptr && *pVariable != nullptr; ++pVariable) {
        const std::string_view name = NameOf(*pVariable);
        if (std::none_of(added.begin(), added.end(),
                         [name](std::string_view other) { return NameOf(other) == name; })) {
            variables.push_back(*pVariable);
        }
    }
    variables.push_back(nullptr);
    return variables;
}

// What the program is started with, made before the warden exists.
struct Start {
    std::vector<char *> arguments;
    std::vector<char *> environment;
    std::chrono::seconds limit;
};

// What the caller and the warden share.
struct Page {
    enum class End { kUnknown, kTimedOut, kHasStatus };
    End end = End::kUnknown;
    int status = 0;
    int startError = 0;  // the errno of a start that failed
    std::atomic<bool> blEndAsked{false};
    std::atomic<std::uint32_t> ended{0};
};

struct Unmap {
    void operator()(Page *pPage) const { munmap(pPage, sizeof(*pPage)); }
};

using SharedPage = std::unique_ptr<Page, Unmap>;

// Null with errno when there is none.
SharedPage NewSharedPage() {
    void *const pPage =
        mmap(nullptr, sizeof(Page), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    return SharedPage(pPage == MAP_FAILED ? nullptr : new (pPage) Page());
}

// --- In the warden ------------------------------------------------------------------------------

timespec Timespec(Clock::duration time) {
    const auto time_s = std::chrono::duration_cast<std::chrono::seconds>(time);
    return {static_cast<time_t>(time_s.count()),
            static_cast<long>(std::chrono::nanoseconds(time - time_s).count())};
}

// A fork that runs none of the caller's handlers. Returns as fork does.
pid_t Fork(int exitSignal) {
    return static_cast<pid_t>(syscall(SYS_clone, exitSignal, 0UL, 0UL, 0UL, 0UL));
}

// Not _exit: before it, the runtime of a sanitizer waits for locks of the other threads.
[[noreturn]] void End() {
    for (;;) {
        syscall(SYS_exit_group, 0);
    }
}

// In the warden's child, where nothing is open.
[[noreturn]] void BeProgram(const Start &start, Page &page) {
    setpgid(0, 0);
    for (const int flags : {O_RDONLY, O_WRONLY, O_WRONLY}) {
        static_cast<void>(open("/dev/null", flags));
    }
    struct sigaction byDefault = {};
    byDefault.sa_handler = SIG_DFL;
    for (int signal = 1; signal < NSIG; ++signal) {
        sigaction(signal, &byDefault, nullptr);
    }
    sigset_t none;
    sigemptyset(&none);
    sigprocmask(SIG_SETMASK, &none, nullptr);
    execve(start.arguments[0], start.arguments.data(), start.environment.data());
    page.startError = errno;
    End();
}

// Waits for the child's end; false when it has not come in time, or is asked for. SIGCHLD is
// blocked, so one that comes between the look and the wait is not missed; the caller sends it too.
bool AwaitEnd(pid_t pid, Clock::time_point end, const std::atomic<bool> &blAsked, int &status) {
    sigset_t childSignal;
    sigemptyset(&childSignal);
    sigaddset(&childSignal, SIGCHLD);
    while (waitpid(pid, &status, WNOHANG) != pid) {
        const Clock::duration left = end - Clock::now();
        if (blAsked || left <= Clock::duration::zero()) {
            return false;
        }
        const timespec time = Timespec(left);
        sigtimedwait(&childSignal, nullptr, &time);
    }
    return true;
}

// Starts the program and waits for it.
void Watch(const Start &start, Page &page) {
    const Clock::time_point end = Clock::now() + start.limit;
    const pid_t pid = Fork(SIGCHLD);
    if (pid == 0) {
        BeProgram(start, page);
    }
    if (pid < 0) {
        page.startError = errno;
        return;
    }
    // Here as well: the group has to be there when it is to be ended.
    setpgid(pid, pid);
    int status = 0;
    if (AwaitEnd(pid, end, page.blEndAsked, status)) {
        page.end = Page::End::kHasStatus;
        page.status = WIFEXITED(status) ? WEXITSTATUS(status) : kSignalledBase + WTERMSIG(status);
        return;
    }
    page.end = Page::End::kTimedOut;
    // The program itself may have moved to another group.
    kill(-pid, SIGKILL);
    kill(pid, SIGKILL);
    AwaitEnd(pid, Clock::now() + kLongestDying, false, status);
}

[[noreturn]] void BeWarden(const Start &start, Page &page) {
    closefrom(0);
    struct sigaction byDefault = {};
    byDefault.sa_handler = SIG_DFL;
    sigaction(SIGCHLD, &byDefault, nullptr);
    Watch(start, page);
    page.ended = 1;
    syscall(SYS_futex, &page.ended, FUTEX_WAKE, 1, nullptr, nullptr, 0);
    End();
}

// --- In the caller ------------------------------------------------------------------------------

// Makes the warden: a fork without exit signal. It must run nothing of the caller's, so it starts,
// and stays, with all signals blocked. Returns its id, or -1 with errno.
pid_t StartWarden(const Start &start, Page &page) {
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    const pid_t pid = Fork(0);
    if (pid == 0) {
        BeWarden(start, page);
    }
    const int error = errno;
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    errno = error;
    return pid;
}

// Waits for the warden's end, and asks for it when time is up. One that was killed wakes nobody,
// which the next look shows.
void AwaitWarden(pid_t warden, host::Wait &wait, Page &page) {
    pid_t gone = 0;
    while (page.ended == 0 && (gone = waitpid(warden, nullptr, __WALL | WNOHANG)) == 0) {
        const Clock::duration slice = wait.Slice();
        if (slice <= Clock::duration::zero()) {
            page.blEndAsked = true;
            kill(warden, SIGCHLD);
            break;
        }
        const timespec time = Timespec(slice);
        syscall(SYS_futex, &page.ended, FUTEX_WAIT, 0, &time, nullptr, 0);
    }
    while (gone == 0 && waitpid(warden, nullptr, __WALL) < 0 && errno == EINTR) {
    }
}

}  // namespace

host::Status host::RunProgram(const std::vector<std::string> &arguments,
                              const std::vector<std::string> &environment,
                              std::chrono::seconds limit, int &status) {
    status = kNotRunStatus;
    const std::string strCommand =
        '\'' + arguments[0] + (arguments.size() > 1 ? ' ' + arguments[1] : "") + '\'';
    Wait wait("the program " + strCommand, limit);
    if (Wait::IsPastDeadline()) {
        return wait.TimeUp(YLIBC_ERR_DEADLINE);
    }
    const Start start = {Pointers(arguments), Environment(environment), limit};
    const SharedPage pPage = NewSharedPage();
    // A cancelled thread ends after the program: an unwinding here would lose the warden, and one
    // in the warden would run the caller's handlers.
    int cancelState = 0;
    pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &cancelState);
    const pid_t warden = pPage == nullptr ? -1 : StartWarden(start, *pPage);
    const int error = errno;
    if (warden >= 0) {
        AwaitWarden(warden, wait, *pPage);
    }
    pthread_setcancelstate(cancelState, nullptr);
    if (const int startError = warden < 0 ? error : pPage->startError; startError != 0) {
        return HOST_ERROR(YLIBC_ERR_EXEC,
                          "cannot run " + strCommand + ": " + std::strerror(startError));
    }
    if (pPage->end == Page::End::kUnknown) {
        return HOST_ERROR(YLIBC_ERR_EXEC, "nothing is known of the end of " + strCommand);
    }
    const bool blTimedOut = pPage->end == Page::End::kTimedOut;
    status = blTimedOut ? kTimedOutStatus : pPage->status;
    return blTimedOut ? wait.TimeUp(YLIBC_ERR_EXEC_TIME) : Status();
}
