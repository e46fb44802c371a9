// Running programs, with a process in between: the warden.
//
// A caller that ignores SIGCHLD, or that waits for any child in a handler or in another thread,
// takes away what is known of the end of its children. So a child process, the warden, starts the
// program, waits for it and ends it when its time is over. The warden has no exit signal: its own
// end sends no SIGCHLD, an ignored SIGCHLD does not lose it, and a wait for any child passes it
// over. What it saw of the program stands in a page that it shares with the caller, which may ask
// it there to end the program at once.
//
// The warden is a copy of a process that may have other threads, and their locks stay locked in the
// copy for ever: it calls only functions that take no lock, and everything that needs memory is
// prepared before it exists.

#include "program.h"

#include <fcntl.h>
#include <pthread.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <ctime>
#include <memory>
#include <new>
#include <string_view>

#include "wait.h"
#include "waiting.h"

namespace {

using host::ProgramEnd;
using Clock = std::chrono::steady_clock;

// How long a killed program may take to disappear. One that hangs inside the kernel takes longer;
// it is left to end by itself.
constexpr std::chrono::seconds kLongestDying(2);

// The functions that prepare a start fail for want of memory only.
void Prepared(int error) {
    if (error != 0) {
        throw std::bad_alloc();
    }
}

struct Attributes {
    posix_spawnattr_t value = {};
    Attributes() { Prepared(posix_spawnattr_init(&value)); }
    Attributes(const Attributes &) = delete;
    Attributes &operator=(const Attributes &) = delete;
    ~Attributes() { posix_spawnattr_destroy(&value); }
};

struct FileActions {
    posix_spawn_file_actions_t value = {};
    FileActions() { Prepared(posix_spawn_file_actions_init(&value)); }
    FileActions(const FileActions &) = delete;
    FileActions &operator=(const FileActions &) = delete;
    ~FileActions() { posix_spawn_file_actions_destroy(&value); }
};

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

// Everything that starting a program takes, ready to be used without memory or locks.
class Start {
  public:
    Start(const std::vector<std::string> &arguments, const std::vector<std::string> &environment)
        : m_arguments(Pointers(arguments)), m_environment(Environment(environment)) {
        sigset_t all;
        sigfillset(&all);
        sigset_t none;
        sigemptyset(&none);
        posix_spawnattr_setsigdefault(&m_attributes.value, &all);
        posix_spawnattr_setsigmask(&m_attributes.value, &none);
        posix_spawnattr_setpgroup(&m_attributes.value, 0);
        posix_spawnattr_setflags(&m_attributes.value, POSIX_SPAWN_SETSIGDEF |
                                                          POSIX_SPAWN_SETSIGMASK |
                                                          POSIX_SPAWN_SETPGROUP);
        for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
            Prepared(posix_spawn_file_actions_addopen(&m_actions.value, fd, "/dev/null",
                                                      fd == STDIN_FILENO ? O_RDONLY : O_WRONLY, 0));
        }
    }

    // Returns 0 or an errno.
    int operator()(pid_t &pid) const {
        return posix_spawn(&pid, m_arguments[0], &m_actions.value, &m_attributes.value,
                           m_arguments.data(), m_environment.data());
    }

  private:
    std::vector<char *> m_arguments;
    std::vector<char *> m_environment;
    Attributes m_attributes;
    FileActions m_actions;
};

// What the caller and the warden share.
struct Page {
    ProgramEnd end;
    pid_t warden = -1;  // the caller's alone
    std::atomic<bool> blEndAsked{false};
    std::atomic<bool> blEnded{false};
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

timespec Until(Clock::time_point deadline) {
    const std::chrono::nanoseconds left = std::max(deadline - Clock::now(), Clock::duration(0));
    const auto left_s = std::chrono::duration_cast<std::chrono::seconds>(left);
    return {static_cast<time_t>(left_s.count()), static_cast<long>((left - left_s).count())};
}

// Waits for the child's end; false when it has not come by the deadline, or is asked for. SIGCHLD
// is blocked, so one that comes between the look and the wait is not missed; the caller sends it
// too.
bool AwaitEnd(pid_t pid, Clock::time_point deadline, const std::atomic<bool> &blAsked,
              int &status) {
    sigset_t childSignal;
    sigemptyset(&childSignal);
    sigaddset(&childSignal, SIGCHLD);
    while (waitpid(pid, &status, WNOHANG) != pid) {
        const timespec left = Until(deadline);
        if (blAsked || (left.tv_sec == 0 && left.tv_nsec == 0)) {
            return false;
        }
        sigtimedwait(&childSignal, nullptr, &left);
    }
    return true;
}

ProgramEnd Describe(int status) {
    return WIFEXITED(status) ? ProgramEnd{ProgramEnd::Kind::kExited, WEXITSTATUS(status)}
                             : ProgramEnd{ProgramEnd::Kind::kSignalled, WTERMSIG(status)};
}

ProgramEnd Watch(const Start &start, std::chrono::milliseconds limit,
                 const std::atomic<bool> &blEndAsked) {
    const Clock::time_point deadline = Clock::now() + limit;
    pid_t pid = -1;
    if (const int error = start(pid); error != 0) {
        return {ProgramEnd::Kind::kNotRun, error};
    }
    int status = 0;
    if (AwaitEnd(pid, deadline, blEndAsked, status)) {
        return Describe(status);
    }
    // The program itself may have moved to another group.
    kill(-pid, SIGKILL);
    kill(pid, SIGKILL);
    AwaitEnd(pid, Clock::now() + kLongestDying, false, status);
    return {ProgramEnd::Kind::kTimedOut, 0};
}

[[noreturn]] void BeWarden(const Start &start, std::chrono::milliseconds limit, Page &page) {
    closefrom(0);
    struct sigaction byDefault = {};
    byDefault.sa_handler = SIG_DFL;
    sigaction(SIGCHLD, &byDefault, nullptr);
    page.end = Watch(start, limit, page.blEndAsked);
    page.blEnded = true;
    // Not _exit: before it, the runtime of a sanitizer waits for locks of the other threads.
    for (;;) {
        syscall(SYS_exit_group, 0);
    }
}

// --- In the caller ------------------------------------------------------------------------------

// Makes the warden: a fork without exit signal, and without the handlers that a fork runs. It must
// run nothing of the caller's, so it starts, and stays, with all signals blocked. Returns its id,
// or -1 with errno.
pid_t StartWarden(const Start &start, std::chrono::milliseconds limit, Page &page) {
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    const long pid = syscall(SYS_clone, 0UL, 0UL, 0UL, 0UL, 0UL);
    if (pid == 0) {
        BeWarden(start, limit, page);
    }
    const int error = errno;
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    errno = error;
    return static_cast<pid_t>(pid);
}

// The pages of the programs that run. Whoever takes a page out of its place owns it: the one who
// ran the program, or the one who ends it. Of more programs than places the last are not ended.
constexpr std::size_t kMaxRunning = 32;
std::array<std::atomic<Page *>, kMaxRunning> g_running = {};
std::atomic<bool> g_blGivenUp{false};

// A child process has the pages of its parent's programs, which are none of its business.
void ForgetInChild() {
    for (std::atomic<Page *> &place : g_running) {
        place = nullptr;
    }
}

const int g_forkHandlers = pthread_atfork(nullptr, nullptr, ForgetInChild);

[[noreturn]] void WaitForTheEnd() {
    for (;;) {
        pause();
    }
}

bool PutInPlace(Page *pPage, std::size_t &place) {
    for (place = 0; place < kMaxRunning; ++place) {
        Page *pNone = nullptr;
        if (g_running[place].compare_exchange_strong(pNone, pPage)) {
            return true;
        }
    }
    return false;
}

void AskForEnd(Page &page) {
    page.blEndAsked = true;
    kill(page.warden, SIGCHLD);
}

ProgramEnd RunWithWarden(const Start &start, std::chrono::milliseconds limit) {
    SharedPage pPage = NewSharedPage();
    const pid_t pid = pPage == nullptr ? -1 : StartWarden(start, limit, *pPage);
    if (pid < 0) {
        return {ProgramEnd::Kind::kNotRun, errno};
    }
    pPage->warden = pid;
    std::size_t place = 0;
    const bool blPlaced = PutInPlace(pPage.get(), place);
    // Who gives up looks through the places after saying so: the page is found there, or this is.
    if (g_blGivenUp) {
        AskForEnd(*pPage);
    }
    while (waitpid(pid, nullptr, __WALL) < 0 && errno == EINTR) {
    }
    const bool blMine = !blPlaced || g_running[place].exchange(nullptr) != nullptr;
    if (!blMine || g_blGivenUp) {
        static_cast<void>(pPage.release());
        WaitForTheEnd();
    }
    return pPage->end;
}

constexpr timespec kLookPause = {0, 1'000'000};
constexpr std::chrono::milliseconds kLongestGivingUp(500);

}  // namespace

ProgramEnd host::RunProgram(const std::vector<std::string> &arguments,
                            const std::vector<std::string> &environment,
                            std::chrono::milliseconds limit) {
    const Start start(arguments, environment);
    const bool blBare = arguments.size() == 1;
    const Waiting waiting(
        {"running '", arguments[0], blBare ? "" : " ", blBare ? "" : arguments[1], "'"});
    // A cancelled thread ends after the program: an unwinding here would lose the warden, and one
    // in the warden would run the caller's handlers.
    int cancelState = 0;
    pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &cancelState);
    if (g_blGivenUp) {
        WaitForTheEnd();
    }
    const ProgramEnd end = RunWithWarden(start, limit);
    pthread_setcancelstate(cancelState, nullptr);
    return end;
}

void ZELOWaitingGiveUp() {
    g_blGivenUp = true;
    std::array<Page *, kMaxRunning> asked = {};
    for (std::size_t i = 0; i < kMaxRunning; ++i) {
        asked[i] = g_running[i].exchange(nullptr);
        if (asked[i] != nullptr) {
            AskForEnd(*asked[i]);
        }
    }
    const auto isOver = [](const Page *pPage) { return pPage == nullptr || pPage->blEnded; };
    const Clock::time_point end = Clock::now() + kLongestGivingUp;
    while (!std::all_of(asked.begin(), asked.end(), isOver) && Clock::now() < end) {
        nanosleep(&kLookPause, nullptr);
    }
}
