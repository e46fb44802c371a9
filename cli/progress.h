// The progress of a transfer on a terminal: size, speed, and the time that is left.

#ifndef QRMCTL_PROGRESS_H
#define QRMCTL_PROGRESS_H

#include <chrono>

namespace qrmctl {

class Progress {
  public:
    // blShow: draw a line on standard error, when that is a terminal.
    explicit Progress(bool blShow);
    ~Progress() { Clear(); }
    Progress(const Progress &) = delete;
    Progress &operator=(const Progress &) = delete;

    // Takes the line away, before anything else is printed.
    void Clear();

    // Takes the bytes so far and the bytes to expect, -1 when nobody knows. Draws when it is time.
    void Update(long long cbDone, long long cbExpected);

    long long Bytes() const { return m_cbDone; }

  private:
    using Clock = std::chrono::steady_clock;

    void Draw(long long cbExpected, double elapsed_s) const;

    bool m_blShow;
    long long m_cbDone = 0;
    Clock::time_point m_start = Clock::now();
    Clock::time_point m_drawn;
};

}  // namespace qrmctl

#endif
