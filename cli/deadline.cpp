#include "deadline.h"

#include <json/value.h>
#include <poll.h>
#include <pthread.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <sstream>
#include <thread>
#include <utility>
#include <vector>

#include "json_text.h"
#include "report.h"

namespace qrmctl {
namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kLongestCleanup(500);

struct Stage {
    std::string strName;
    Clock::duration time;
};

// Never destroyed: the thread that keeps the time waits on it while the process ends.
struct Watch {
    std::mutex mutex;
    std::condition_variable wake;
    bool blStopped = false;
    bool blJson = false;
    bool blOutput = false;
    double limit_s = 0;
    Stage longest = {"", Clock::duration::zero()};  // of those that are over
    std::string strStage = "starting";
    Clock::time_point begin = Clock::now();
    Clock::time_point end = Clock::time_point::max();
    std::string strRemedy = "mend what it waited for, or give it more time with --deadline";
    std::function<void()> cleanup;
    std::mutex cleanupMutex;
    std::condition_variable cleaned;
    bool blCleaned = false;
};

Watch &TheWatch() {
    static auto *const pWatch = new Watch;
    return *pWatch;
}

std::string Seconds(double seconds) {
    std::ostringstream text;
    text << seconds << " s";
    return text.str();
}

std::string Seconds(Clock::duration time) {
    return Seconds(
        static_cast<double>(std::chrono::duration_cast<std::chrono::milliseconds>(time).count()) /
        1000);
}

// A reader that has stopped reading must not keep the program from ending.
void Write(int fd, const std::string &strText) {
    pollfd output = {fd, POLLOUT, 0};
    if (poll(&output, 1, 0) == 1) {
        static_cast<void>(write(fd, strText.data(), strText.size()) < 0);
    }
}

// --- What was started ---------------------------------------------------------------------------

std::vector<pid_t> ChildrenOf(const std::string &strProcess) {
    std::vector<pid_t> children;
    std::error_code error;
    for (fs::directory_iterator task("/proc/" + strProcess + "/task", error);
         !error && task != fs::directory_iterator(); task.increment(error)) {
        std::ifstream list(task->path() / "children");
        for (pid_t pid = 0; list >> pid;) {
            children.push_back(pid);
        }
    }
    return children;
}

// Ends the process group that this process leads, with what its processes have started.
void EndBelow(pid_t leader) {
    for (const pid_t started : ChildrenOf(std::to_string(leader))) {
        EndBelow(started);
    }
    kill(-leader, SIGKILL);
    kill(leader, SIGKILL);
}

// Ends what the program waits for: its children, the platform's wardens, and the process groups of
// the programs that those watch. The wardens only stop at first: one that ended would let the main
// thread go on to its next step. Returns them.
std::vector<pid_t> EndStarted() {
    std::vector<pid_t> wardens = ChildrenOf("self");
    for (const pid_t warden : wardens) {
        kill(warden, SIGSTOP);
        for (const pid_t program : ChildrenOf(std::to_string(warden))) {
            EndBelow(program);
        }
    }
    return wardens;
}

// --- The strike ---------------------------------------------------------------------------------

void CleanUp(Watch &watch) {
    if (!watch.cleanup) {
        return;
    }
    std::thread([&watch] {
        watch.cleanup();
        const std::lock_guard<std::mutex> lock(watch.cleanupMutex);
        watch.blCleaned = true;
        watch.cleaned.notify_one();
    }).detach();
    std::unique_lock<std::mutex> lock(watch.cleanupMutex);
    watch.cleaned.wait_for(lock, kLongestCleanup, [&watch] { return watch.blCleaned; });
}

void Tell(const Watch &watch) {
    const Clock::duration time = Clock::now() - watch.begin;
    const bool blEarlier = watch.longest.time > time;
    std::string strError = "the deadline of " + Seconds(watch.limit_s) + " struck while '" +
                           watch.strStage + "' (" + Seconds(time) + ')';
    if (blEarlier) {
        strError +=
            ", after '" + watch.longest.strName + "' had taken " + Seconds(watch.longest.time);
    }
    strError += "; " + watch.strRemedy;
    if (watch.blJson && !watch.blOutput) {
        Json::Value result;
        result["schema"] = kSchema;
        result["success"] = false;
        result["error"] = strError;
        result["error_id"] = ErrorOf(ErrorId::kDeadline).szId;
        result["deadline_s"] = watch.limit_s;
        result["stage"] = watch.strStage;
        result["longest_stage"] = blEarlier ? watch.longest.strName : watch.strStage;
        Write(STDOUT_FILENO, json_text::ToLogText(result) + '\n');
    }
    Write(STDERR_FILENO, "qrmctl: " + Printable(strError) + '\n');
}

// The mutex is held to the end: the main thread enters no other stage and prints nothing more.
[[noreturn]] void Strike(Watch &watch) {
    const std::vector<pid_t> wardens = EndStarted();
    Tell(watch);
    CleanUp(watch);
    for (const pid_t warden : wardens) {
        kill(warden, SIGKILL);
    }
    _exit(ErrorOf(ErrorId::kDeadline).exitCode);
}

void KeepTime(Clock::time_point end) {
    Watch &watch = TheWatch();
    std::unique_lock<std::mutex> lock(watch.mutex);
    if (!watch.wake.wait_until(lock, end, [&watch] { return watch.blStopped; })) {
        Strike(watch);
    }
}

}  // namespace

void StartDeadline(double limit_s, bool blJson) {
    Watch &watch = TheWatch();
    watch.limit_s = limit_s;
    watch.blJson = blJson;
    const Clock::time_point end = watch.begin + std::chrono::duration_cast<Clock::duration>(
                                                    std::chrono::duration<double>(limit_s));
    watch.end = end;
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    std::thread(KeepTime, end).detach();
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

void EnterStage(const std::string &strName) {
    Watch &watch = TheWatch();
    const std::lock_guard<std::mutex> lock(watch.mutex);
    const Clock::time_point now = Clock::now();
    if (now - watch.begin > watch.longest.time) {
        watch.longest = {watch.strStage, now - watch.begin};
    }
    watch.strStage = strName;
    watch.begin = now;
}

void SetDeadlineRemedy(const std::string &strRemedy) {
    Watch &watch = TheWatch();
    const std::lock_guard<std::mutex> lock(watch.mutex);
    watch.strRemedy = strRemedy;
}

void BeginOutput() {
    EnterStage("writing the result");
    const std::lock_guard<std::mutex> lock(TheWatch().mutex);
    TheWatch().blOutput = true;
}

void StopDeadline() {
    Watch &watch = TheWatch();
    const std::lock_guard<std::mutex> lock(watch.mutex);
    watch.blStopped = true;
    watch.wake.notify_all();
}

double DeadlineLeft_s() {
    const Clock::time_point end = TheWatch().end;
    return end == Clock::time_point::max()
               ? kMaxDeadline_s
               : std::chrono::duration<double>(end - Clock::now()).count();
}

DeadlineCleanup::DeadlineCleanup(const std::function<void()> &make, std::function<void()> cleanup) {
    const std::lock_guard<std::mutex> lock(TheWatch().mutex);
    make();
    TheWatch().cleanup = std::move(cleanup);
}

DeadlineCleanup::DeadlineCleanup(std::function<void()> cleanup) {
    const std::lock_guard<std::mutex> lock(TheWatch().mutex);
    TheWatch().cleanup = std::move(cleanup);
}

DeadlineCleanup::~DeadlineCleanup() {
    const std::lock_guard<std::mutex> lock(TheWatch().mutex);
    TheWatch().cleanup = nullptr;
}

}  // namespace qrmctl
