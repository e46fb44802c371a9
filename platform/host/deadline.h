// Waiting inside the host platform: every wait ends at its own limit or at the process's deadline
// (diagnosis.h), whichever comes first.

#ifndef ZELO_HOST_DEADLINE_H
#define ZELO_HOST_DEADLINE_H

#include <chrono>
#include <string>

#include "status.h"

namespace host {

// One wait. It is made when the wait begins, and asked again and again how long to sleep:
//
//     Wait wait("the lock '/tmp/userlock'", limit);
//     while (!TryIt()) {
//         if (wait.Slice() <= Wait::Clock::duration::zero()) {
//             return wait.TimeUp(YLIBC_ERR_BUSY);
//         }
//         sleep for at most that
//     }
class Wait {
  public:
    using Clock = std::chrono::steady_clock;

    // The longest slice: how soon a deadline that is moved to now is noticed.
    static constexpr std::chrono::milliseconds kSlice{100};

    // strWaitsFor completes "waiting for". A limit of Clock::duration::max() is none.
    Wait(std::string strWaitsFor, Clock::duration limit);

    // How long to sleep before the next look, kSlice at most; 0 when time is up. Calls the observer
    // about once a second.
    Clock::duration Slice();

    // The time that is left, however long; 0 when time is up.
    Clock::duration Left() const;

    // Whether the process's deadline is what ended, or would end, the wait now.
    static bool IsPastDeadline();

    // Why the wait ended: YLIBC_ERR_DEADLINE for the process's deadline, the code for its own
    // limit.
    Status TimeUp(unsigned int code) const;

  private:
    std::string m_strWaitsFor;
    Clock::time_point m_begin = Clock::now();
    Clock::time_point m_end;
    Clock::time_point m_told = m_begin;
};

}  // namespace host

#endif
