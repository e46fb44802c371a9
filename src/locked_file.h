// A file by which processes take turns, in a folder where others may put files too.

#ifndef ZELO_LOCKED_FILE_H
#define ZELO_LOCKED_FILE_H

#include <sys/types.h>

#include <chrono>
#include <optional>

#include "descriptor.h"

// The open file under the kernel's lock, which it loses with the process that holds it: what a
// killed process leaves behind keeps nobody waiting. Threads of one process exclude each other too.
class LockedFile {
  public:
    // Opens the file, never through a link, and waits for its lock. While the lock is held, the
    // name leads to this file, which is the caller's own (own_file.h): a link, a socket or another
    // file that stands there is removed first, and a folder is a failure.
    //
    // mode: of a file that is created; without one, the file has to be there.
    LockedFile(const char *szPath, std::optional<mode_t> mode, std::chrono::milliseconds wait);
    ~LockedFile();
    LockedFile(const LockedFile &) = delete;
    LockedFile &operator=(const LockedFile &) = delete;

    bool IsHeld() const { return m_file.Get() >= 0; }

    // For reading and writing; negative when it is not held.
    int Get() const { return m_file.Get(); }

  private:
    using Clock = std::chrono::steady_clock;
    enum class Try { kHeld, kAgain, kFailed };

    Try Open(const char *szPath, std::optional<mode_t> mode, Clock::time_point end);

    Descriptor m_file;
};

#endif
