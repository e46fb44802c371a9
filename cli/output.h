// Standard output and standard error, written so that a reader who has stopped reading cannot keep
// the deadline from ending the program.

#ifndef QRMCTL_OUTPUT_H
#define QRMCTL_OUTPUT_H

#include <sys/types.h>

#include <chrono>
#include <streambuf>
#include <string>
#include <string_view>

namespace qrmctl {

// Writes what there is room for, without waiting: at most PIPE_BUF bytes, a text of no more than
// that wholly or not at all where a pipe is written to. Returns the number of bytes, 0 where there
// is no room, -1 with errno. Called by one thread at a time.
ssize_t WriteNow(int fd, std::string_view text);

// Waits for room, for at most the time; a negative one has no end. False when it is over.
bool AwaitRoom(int fd, std::chrono::milliseconds limit);

// While it lives, std::cout and std::cerr go through the deadline (deadline.h).
class GuardedOutput {
  public:
    GuardedOutput();
    // Puts out what is left.
    ~GuardedOutput();
    GuardedOutput(const GuardedOutput &) = delete;
    GuardedOutput &operator=(const GuardedOutput &) = delete;

  private:
    std::streambuf *m_pOut;
    std::streambuf *m_pErr;
};

// Puts out what the stream has, as the program's last bytes: the deadline strikes until they are
// out, and no more afterwards. A stream that goes elsewhere, such as into a text, is no end of the
// program. False when they cannot be written; the deadline then goes on.
bool PutOutLast(std::ostream &stream);

}  // namespace qrmctl

#endif
