// The checks of a diagnosis: what was looked at, how it went, and what mends it.

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

// The checks so far. Each of the ways to add one tells whether the checks behind it are to be made.
class CheckList {
  public:
    bool Ok(const char *szName, long duration_ms, const std::string &strSeen) {
        m_checks.push_back({szName, Outcome::kOk, duration_ms, strSeen, ""});
        return true;
    }
    bool Warn(const char *szName, long duration_ms, const std::string &strSeen,
              const std::string &strRemedy) {
        m_checks.push_back({szName, Outcome::kWarning, duration_ms, strSeen, strRemedy});
        return true;
    }
    bool Fail(const char *szName, long duration_ms, const std::string &strSeen,
              const std::string &strRemedy) {
        if (!m_blFailed) {
            m_blFailed = true;
            SkipOthers(std::string("not tried: '") + szName + "' failed",
                       std::string("mend '") + szName + "' first");
        }
        m_checks.push_back({szName, Outcome::kFailed, duration_ms, strSeen, strRemedy});
        return false;
    }
    void Skip(const char *szName, const std::string &strSeen, const std::string &strRemedy) {
        m_checks.push_back({szName, Outcome::kSkipped, 0, strSeen, strRemedy});
    }
    // Says why the checks are skipped that are not added.
    void SkipOthers(const std::string &strSeen, const std::string &strRemedy) {
        m_strSkipped = strSeen;
        m_strSkippedRemedy = strRemedy;
    }

    // A check for each of the names.
    Checks InOrder(const std::vector<const char *> &names) const {
        Checks ordered;
        for (const char *szName : names) {
            const auto at = std::find_if(m_checks.begin(), m_checks.end(), [&](const Check &check) {
                return check.strName == szName;
            });
            ordered.push_back(at != m_checks.end() ? *at
                                                   : Check{szName, Outcome::kSkipped, 0,
                                                           m_strSkipped, m_strSkippedRemedy});
        }
        return ordered;
    }

  private:
    Checks m_checks;
    bool m_blFailed = false;
    std::string m_strSkipped = "not tried: the ways before took all the time";
    std::string m_strSkippedRemedy = "name fewer candidates";
};

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
