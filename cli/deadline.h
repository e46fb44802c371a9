// The deadline of a run: when it strikes, the program ends at once, whatever it is blocked in, and
// says which stage used the time and what it waited for. A program that it runs meanwhile, such as
// a plug-in, is ended with it.
//
// A thread of its own keeps the time. It blocks all signals, so that none that is meant to
// interrupt a wait of the main thread is lost to it.

#ifndef QRMCTL_DEADLINE_H
#define QRMCTL_DEADLINE_H

#include <functional>
#include <string>
#include <string_view>

namespace qrmctl {

// The longest deadline that may be asked for, about 31 years.
constexpr double kMaxDeadline_s = 1e9;

// Starts the clock, once in a process. limit_s is above 0 and at most kMaxDeadline_s. blJson: the
// end is told on standard output too, as a JSON object.
void StartDeadline(double limit_s, bool blJson);

// From here on the time counts for the stage with this name, such as "reading the token file".
void EnterStage(const std::string &strName);

// What the operator is told to do when the deadline strikes from here on.
void SetDeadlineRemedy(const std::string &strRemedy);

// Writes the text to the standard stream. The deadline strikes while it waits for the reader; it is
// told on standard error alone once standard output has begun. blLast: with the text's last byte,
// or at once when it has none, the deadline is over. False when the stream cannot be written.
bool Deliver(int fd, std::string_view text, bool blLast);

// The seconds until the deadline strikes; kMaxDeadline_s when none was started.
double DeadlineLeft_s();

// Something to clear away when the deadline strikes during its life, within half a second; what
// takes longer is left.
class DeadlineCleanup {
  public:
    explicit DeadlineCleanup(std::function<void()> cleanup);
    // The same for what `make` makes, which is to be short: the deadline strikes before or after
    // it.
    DeadlineCleanup(const std::function<void()> &make, std::function<void()> cleanup);
    ~DeadlineCleanup();
    DeadlineCleanup(const DeadlineCleanup &) = delete;
    DeadlineCleanup &operator=(const DeadlineCleanup &) = delete;
};

}  // namespace qrmctl

#endif
