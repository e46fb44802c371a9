#include "deadline.h"

#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <iterator>
#include <sstream>
#include <string_view>
#include <system_error>

#include "diagnosis.h"
#include "error_ids.h"

namespace qrmctl {
namespace {

using Clock = std::chrono::steady_clock;

constexpr const char *kRemedy = "mend what it waited for, or give it more time with --deadline";

struct Stage {
    std::string strName;
    Clock::duration time = Clock::duration::zero();
};

struct Run {
    double limit_s = kMaxDeadline_s;
    Clock::time_point end = Clock::time_point::max();
    Stage longest;  // of those that are over
    std::string strStage = "starting";
    Clock::time_point begin = Clock::now();
    std::string strRemedy = kRemedy;
    std::string strWaitsFor;  // when the deadline came; "" for nothing that the platform knows
    timer_t timer = {};
    bool blTimer = false;
};
Run g_run;

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

void NoteWait(void * /*pContext*/, const char *szWaitsFor, double /*waited_s*/) {
    if (IsDeadlineOver() && g_run.strWaitsFor.empty()) {
        try {
            g_run.strWaitsFor = szWaitsFor;
        } catch (const std::bad_alloc &) {
            // The stage alone is named.
        }
    }
}

// Writes its line only where there is room: a reader who has stopped reading must not keep it.
void EndAtOnce(int /*signal*/) {
    constexpr std::string_view kLine =
        "qrmctl: the deadline struck a second ago, and what the program is blocked in does not "
        "end\n";
    pollfd output = {STDERR_FILENO, POLLOUT, 0};
    if (poll(&output, 1, 0) == 1) {
        static_cast<void>(write(STDERR_FILENO, kLine.data(), kLine.size()) == 0);
    }
    _exit(kDeadline);
}

// A second after the deadline, and again each second: somebody else may have taken the signal.
void StartTimer(double limit_s) {
    struct sigaction action = {};
    action.sa_handler = EndAtOnce;
    sigaction(SIGALRM, &action, nullptr);
    sigset_t alarm;
    sigemptyset(&alarm);
    sigaddset(&alarm, SIGALRM);
    pthread_sigmask(SIG_UNBLOCK, &alarm, nullptr);
    const auto whole_s = static_cast<time_t>(limit_s);
    constexpr double kNsPerS = 1e9;
    struct itimerspec times = {};
    times.it_value.tv_sec = whole_s + 1;
    times.it_value.tv_nsec = static_cast<long>((limit_s - static_cast<double>(whole_s)) * kNsPerS);
    times.it_interval.tv_sec = 1;
    struct sigevent event = {};
    event.sigev_notify = SIGEV_SIGNAL;
    event.sigev_signo = SIGALRM;
    g_run.blTimer = timer_create(CLOCK_MONOTONIC, &event, &g_run.timer) == 0 &&
                    timer_settime(g_run.timer, 0, &times, nullptr) == 0;
    if (!g_run.blTimer) {
        throw std::system_error(errno, std::generic_category(), "timer_create");
    }
}

}  // namespace

void StartDeadline(double limit_s) {
    constexpr double kMsPerS = 1000;
    const auto limit_ms = static_cast<long long>(limit_s * kMsPerS);
    StartTimer(limit_s);
    g_run.limit_s = limit_s;
    // Before the platform's own: what gives up there must find the deadline over here too.
    g_run.end = Clock::now() + std::chrono::milliseconds(limit_ms);
    if (ZELODeadlineSet != nullptr) {
        ZELODeadlineSet(limit_ms);
    }
    if (ZELOWaitObserverSet != nullptr) {
        ZELOWaitObserverSet(NoteWait, nullptr);
    }
}

void EnterStage(const std::string &strName) {
    if (IsDeadlineOver()) {
        return;
    }
    const Clock::time_point now = Clock::now();
    if (now - g_run.begin > g_run.longest.time) {
        g_run.longest = {g_run.strStage, now - g_run.begin};
    }
    g_run.strStage = strName;
    g_run.begin = now;
}

void SetDeadlineRemedy(const std::string &strRemedy) {
    if (!IsDeadlineOver()) {
        g_run.strRemedy = strRemedy;
    }
}

bool IsDeadlineOver() {
    return Clock::now() >= g_run.end;
}

double DeadlineLeft_s() {
    return g_run.end == Clock::time_point::max()
               ? kMaxDeadline_s
               : std::max(0.0, std::chrono::duration<double>(g_run.end - Clock::now()).count());
}

Strike DescribeStrike() {
    const Clock::duration time = Clock::now() - g_run.begin;
    const bool blEarlier = g_run.longest.time > time;
    Strike strike;
    strike.limit_s = g_run.limit_s;
    strike.strStage =
        g_run.strStage + (g_run.strWaitsFor.empty() ? "" : ", waiting for " + g_run.strWaitsFor);
    strike.strLongest = blEarlier ? g_run.longest.strName : strike.strStage;
    strike.strError = "the deadline of " + Seconds(g_run.limit_s) + " struck while '" +
                      strike.strStage + "' (" + Seconds(time) + ')';
    if (blEarlier) {
        strike.strError +=
            ", after '" + strike.strLongest + "' had taken " + Seconds(g_run.longest.time);
    }
    strike.strError += "; " + g_run.strRemedy;
    return strike;
}

void EndDeadline() {
    if (g_run.blTimer) {
        timer_delete(g_run.timer);
        g_run.blTimer = false;
    }
}

// --- Interruption -------------------------------------------------------------------------------

namespace {

volatile std::sig_atomic_t g_blInterrupted = 0;

void Interrupt(int /*signal*/) {
    g_blInterrupted = 1;
    if (ZELODeadlineSet != nullptr) {
        ZELODeadlineSet(0);
    }
}

}  // namespace

InterruptGuard::InterruptGuard() {
    struct sigaction action = {};
    action.sa_handler = Interrupt;
    for (std::size_t i = 0; i < std::size(kSignals); ++i) {
        sigaction(kSignals[i], &action, &m_before[i]);
    }
}

InterruptGuard::~InterruptGuard() {
    for (std::size_t i = 0; i < std::size(kSignals); ++i) {
        sigaction(kSignals[i], &m_before[i], nullptr);
    }
}

bool InterruptGuard::IsInterrupted() {
    return g_blInterrupted != 0;
}

}  // namespace qrmctl
