// One check of a diagnosis: what was looked at, how it went, and what mends it.

#ifndef QRMCTL_CHECK_H
#define QRMCTL_CHECK_H

#include <algorithm>
#include <chrono>
#include <string>
#include <vector>

#include "deadline.h"

namespace qrmctl {

enum class Outcome { kOk, kWarning, kFailed, kSkipped };

// Texts may come from a server: they are made printable where they are shown.
struct Check {
    std::string strName;  // in snake_case
    Outcome outcome = Outcome::kOk;
    long duration_ms = 0;
    std::string strSeen;    // one line
    std::string strRemedy;  // one line; empty when the outcome is kOk
};

using Checks = std::vector<Check>;

inline const char *OutcomeName(Outcome outcome) {
    switch (outcome) {
        case Outcome::kOk:
            return "ok";
        case Outcome::kWarning:
            return "warning";
        case Outcome::kFailed:
            return "failed";
        case Outcome::kSkipped:
            break;
    }
    return "skipped";
}

// The moment at which checking gives up, whatever is still to do; the run's deadline at the latest.
class TimeLimit {
  public:
    // A step that the deadline cuts ends a little after it, so that it is told as struck.
    explicit TimeLimit(std::chrono::milliseconds limit)
        : m_end(Clock::now() +
                std::min(limit, kAfter + std::chrono::milliseconds(
                                             static_cast<long long>(DeadlineLeft_s() * 1000)))) {}

    // What is left for one step, and never more than the step's own limit. 0: nothing.
    long Left_ms(long step_ms) const {
        const auto left =
            std::chrono::duration_cast<std::chrono::milliseconds>(m_end - Clock::now()).count();
        return left <= 0 ? 0 : left < step_ms ? static_cast<long>(left) : step_ms;
    }
    bool IsOver() const { return Left_ms(1) == 0; }

  private:
    using Clock = std::chrono::steady_clock;
    static constexpr std::chrono::milliseconds kAfter{5};
    Clock::time_point m_end;
};

class Stopwatch {
  public:
    long Elapsed_ms() const {
        return static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                     std::chrono::steady_clock::now() - m_start)
                                     .count());
    }

  private:
    std::chrono::steady_clock::time_point m_start = std::chrono::steady_clock::now();
};

}  // namespace qrmctl

#endif
