// The deadline of a run. Every wait of the platform ends there, so the operation comes back with a
// failure; the report then says which stage used the time and what it waited for. What is blocked
// inside the kernel is ended by a signal one second later, with a line on standard error alone.

#ifndef QRMCTL_DEADLINE_H
#define QRMCTL_DEADLINE_H

#include <csignal>
#include <string>

namespace qrmctl {

// The longest deadline that may be asked for, about 31 years.
constexpr double kMaxDeadline_s = 1e9;

// Starts the clock, once in a process. limit_s is above 0 and at most kMaxDeadline_s.
void StartDeadline(double limit_s);

// From here on the time counts for the stage with this name, such as "reading the token file". What
// comes after the deadline is part of the stage in which it struck.
void EnterStage(const std::string &strName);

// What the operator is told to do when the deadline strikes from here on.
void SetDeadlineRemedy(const std::string &strRemedy);

bool IsDeadlineOver();

// The seconds until the deadline strikes, 0 afterwards; kMaxDeadline_s when none was started.
double DeadlineLeft_s();

// How the deadline struck.
struct Strike {
    double limit_s;
    std::string strStage;    // in force then, with what it waited for
    std::string strLongest;  // the stage that took longest
    std::string strError;    // all of it in words, with the remedy
};
Strike DescribeStrike();

// For when the result is out: nothing ends the program any more.
void EndDeadline();

// While it lives, a signal that would end the program ends the platform's waits instead.
class InterruptGuard {
  public:
    InterruptGuard();
    ~InterruptGuard();
    InterruptGuard(const InterruptGuard &) = delete;
    InterruptGuard &operator=(const InterruptGuard &) = delete;

    static bool IsInterrupted();

  private:
    static constexpr int kSignals[] = {SIGINT, SIGTERM, SIGHUP};
    struct sigaction m_before[3] = {};
};

}  // namespace qrmctl

#endif
