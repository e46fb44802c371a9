#include "wait.h"

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <limits>
#include <utility>

#include "diagnosis.h"

namespace {

// In nanoseconds of the steady clock. A signal handler may set it, so it must need no lock.
constexpr std::int64_t kNever = std::numeric_limits<std::int64_t>::max();
std::atomic<std::int64_t> g_deadline_ns{kNever};
static_assert(std::atomic<std::int64_t>::is_always_lock_free);

constexpr std::int64_t kNsPerMs = 1'000'000;

struct Observer {
    ZELO_WAIT_OBSERVER pfn = nullptr;
    void *pContext = nullptr;
};
Observer g_observer;

std::int64_t Now_ns() {
    return std::chrono::duration_cast<std::chrono::nanoseconds>(
               host::Wait::Clock::now().time_since_epoch())
        .count();
}

}  // namespace

void ZELODeadlineSet(long long left_ms) {
    const std::int64_t now = Now_ns();
    const bool blNever = left_ms < 0 || left_ms > (kNever - now) / kNsPerMs;
    g_deadline_ns.store(blNever ? kNever : now + left_ms * kNsPerMs);
}

long long ZELODeadlineLeft() {
    const std::int64_t deadline = g_deadline_ns.load();
    return deadline == kNever ? -1 : std::max<std::int64_t>(0, (deadline - Now_ns()) / kNsPerMs);
}

void ZELOWaitObserverSet(ZELO_WAIT_OBSERVER pfnObserver, void *pContext) {
    g_observer = {pfnObserver, pContext};
}

namespace host {

Wait::Wait(std::string strWaitsFor, Clock::duration limit)
    : m_strWaitsFor(std::move(strWaitsFor)),
      m_end(limit < Clock::time_point::max() - m_begin ? m_begin + limit
                                                       : Clock::time_point::max()) {}

bool Wait::IsPastDeadline() {
    return g_deadline_ns.load() <= Now_ns();
}

Wait::Clock::duration Wait::Left() const {
    const std::int64_t deadline = g_deadline_ns.load();
    const Clock::time_point now = Clock::now();
    Clock::duration left = m_end - now;
    if (deadline != kNever) {
        left = std::min<Clock::duration>(
            left, std::chrono::nanoseconds(deadline) - now.time_since_epoch());
    }
    return std::max(left, Clock::duration::zero());
}

Wait::Clock::duration Wait::Slice() {
    const Clock::duration left = Left();
    const Clock::time_point now = Clock::now();
    if (g_observer.pfn != nullptr && left > Clock::duration::zero() &&
        now - m_told >= std::chrono::seconds(1)) {
        m_told = now;
        g_observer.pfn(g_observer.pContext, m_strWaitsFor.c_str(),
                       std::chrono::duration<double>(now - m_begin).count());
    }
    return std::min<Clock::duration>(left, kSlice);
}

Status Wait::TimeUp(unsigned int code) const {
    if (IsPastDeadline()) {
        if (g_observer.pfn != nullptr) {
            g_observer.pfn(g_observer.pContext, m_strWaitsFor.c_str(),
                           std::chrono::duration<double>(Clock::now() - m_begin).count());
        }
        return HOST_ERROR(YLIBC_ERR_DEADLINE,
                          "the deadline came while waiting for " + m_strWaitsFor);
    }
    const auto limit = std::chrono::duration_cast<std::chrono::milliseconds>(m_end - m_begin);
    constexpr long kPerSecond = 1000;
    const std::string strLimit = limit.count() % kPerSecond == 0
                                     ? std::to_string(limit.count() / kPerSecond) + " s"
                                     : std::to_string(limit.count()) + " ms";
    return HOST_ERROR(code, limit.count() <= 0
                                ? m_strWaitsFor + " is not free"
                                : "waited " + strLimit + " for " + m_strWaitsFor + ", in vain");
}

}  // namespace host
