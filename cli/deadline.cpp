#include "deadline.h"

#include <json/value.h>
#include <pthread.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <cstddef>
#include <exception>
#include <mutex>
#include <new>
#include <sstream>
#include <string_view>
#include <thread>
#include <utility>

#include "fixed_text.h"
#include "json.h"
#include "output.h"
#include "printable.h"
#include "report.h"
#include "waiting.h"

namespace qrmctl {
namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kLongestCleanup(500);
constexpr std::chrono::milliseconds kLongestTelling(250);
constexpr const char *kRemedy = "mend what it waited for, or give it more time with --deadline";

struct Stage {
    std::string strName;
    Clock::duration time;
};

// Its members take no memory before they are set: output needs it when memory is short.
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
    std::string strRemedy;  // "" for kRemedy
    std::function<void()> cleanup;
    std::mutex cleanupMutex;
    std::condition_variable cleanupWake;
    bool blCleanupAsked = false;
    bool blCleaned = false;
};

// Never destroyed: the thread that keeps the time waits on it while the process ends.
Watch &TheWatch() {
    alignas(Watch) static std::array<std::byte, sizeof(Watch)> place;
    static Watch *const pWatch = new (place.data()) Watch;
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

// A text for a message that is to fit into a pipe at once; cut between characters.
std::string Short(const std::string &strText) {
    constexpr std::size_t kMost = 300;
    if (strText.size() <= kMost) {
        return strText;
    }
    std::size_t cb = kMost;
    while (cb > 0 && (static_cast<unsigned char>(strText[cb]) & 0xC0U) == 0x80U) {
        --cb;
    }
    return strText.substr(0, cb) + "...";
}

// --- The strike ---------------------------------------------------------------------------------

// The stage in force, with what the platform waits for in it.
std::string StageNow(const Watch &watch) {
    FixedText<1024> waiting;
    return ZELOWaitingFor(waiting.Buffer(), FixedText<1024>::Size()) > 0
               ? Short(watch.strStage) + ", " + Short(waiting.sz())
               : Short(watch.strStage);
}

// A thread that was there before, since starting one may fail.
void RunCleanup() {
    Watch &watch = TheWatch();
    std::unique_lock<std::mutex> lock(watch.cleanupMutex);
    watch.cleanupWake.wait(lock, [&watch] { return watch.blCleanupAsked; });
    try {
        watch.cleanup();
    } catch (const std::exception &) {
        // What is left over stays; there is nobody to tell.
    }
    watch.blCleaned = true;
    watch.cleanupWake.notify_all();
}

void CleanUp(Watch &watch) {
    if (!watch.cleanup) {
        return;
    }
    std::unique_lock<std::mutex> lock(watch.cleanupMutex);
    watch.blCleanupAsked = true;
    watch.cleanupWake.notify_all();
    watch.cleanupWake.wait_for(lock, kLongestCleanup, [&watch] { return watch.blCleaned; });
}

// A reader that has stopped reading must not keep the program from ending.
void WriteSoon(int fd, std::string_view text) {
    const Clock::time_point end = Clock::now() + kLongestTelling;
    while (!text.empty()) {
        const ssize_t cb = WriteNow(fd, text);
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - Clock::now());
        if (cb < 0 || (cb == 0 && (left.count() <= 0 || !AwaitRoom(fd, left)))) {
            return;
        }
        text.remove_prefix(static_cast<std::size_t>(cb));
    }
}

void Tell(const Watch &watch, const std::string &strStage, Clock::duration time) {
    const bool blEarlier = watch.longest.time > time;
    const std::string strLongest = Short(watch.longest.strName);
    std::string strError = "the deadline of " + Seconds(watch.limit_s) + " struck while '" +
                           strStage + "' (" + Seconds(time) + ')';
    if (blEarlier) {
        strError += ", after '" + strLongest + "' had taken " + Seconds(watch.longest.time);
    }
    strError += "; " + (watch.strRemedy.empty() ? kRemedy : watch.strRemedy);
    if (watch.blJson && !watch.blOutput) {
        Json::Value result;
        result["schema"] = kSchema;
        result["success"] = false;
        result["error"] = strError;
        result["error_id"] = ErrorOf(ErrorId::kDeadline).szId;
        result["deadline_s"] = watch.limit_s;
        result["stage"] = strStage;
        result["longest_stage"] = blEarlier ? strLongest : strStage;
        WriteSoon(STDOUT_FILENO, json::ToLogText(result) + '\n');
    }
    WriteSoon(STDERR_FILENO, "qrmctl: " + printable::Line(strError) + '\n');
}

// The mutex is held to the end: the main thread enters no other stage and prints nothing more.
[[noreturn]] void Strike(Watch &watch) {
    try {
        const Clock::duration time = Clock::now() - watch.begin;
        const std::string strStage = StageNow(watch);
        ZELOWaitingGiveUp();
        CleanUp(watch);
        Tell(watch, strStage, time);
    } catch (const std::exception &) {
        // Without memory there is no message; the exit status tells enough.
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
    std::thread(RunCleanup).detach();
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

// Each piece is written under the mutex: the deadline strikes before the last one or not at all.
bool Deliver(int fd, std::string_view text, bool blLast) {
    Watch &watch = TheWatch();
    for (;;) {
        {
            const std::lock_guard<std::mutex> lock(watch.mutex);
            const ssize_t cb = WriteNow(fd, text);
            if (cb < 0) {
                return false;
            }
            watch.blOutput = watch.blOutput || (fd == STDOUT_FILENO && cb > 0);
            text.remove_prefix(static_cast<std::size_t>(cb));
            if (text.empty()) {
                watch.blStopped = watch.blStopped || blLast;
                return true;
            }
        }
        AwaitRoom(fd, std::chrono::milliseconds(-1));
    }
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
