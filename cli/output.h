// Standard output and standard error, written so that a reader who has stopped reading cannot keep
// the deadline from ending the program.

#ifndef QRMCTL_OUTPUT_H
#define QRMCTL_OUTPUT_H

#include <sys/types.h>

#include <array>
#include <chrono>
#include <streambuf>
#include <string_view>

namespace qrmctl {

// Writes what there is room for, without waiting: at most PIPE_BUF bytes, a text of no more than
// that wholly or not at all where a pipe is written to. Returns the number of bytes, 0 where there
// is no room, -1 with errno. Called by one thread at a time.
ssize_t WriteNow(int fd, std::string_view text);

// Waits for room, for at most the time; a negative one has no end. False when it is over.
bool AwaitRoom(int fd, std::chrono::milliseconds limit);

// Gathers text for a standard stream and puts it out through the deadline (deadline.h). It has all
// the memory that it needs.
class GuardedBuffer : public std::streambuf {
  public:
    explicit GuardedBuffer(int fd);

    // blLast: as Deliver() of deadline.h has it.
    bool PutOut(bool blLast);

  protected:
    int_type overflow(int_type c) override;
    std::streamsize xsputn(const char *pText, std::streamsize cb) override;
    int sync() override;

  private:
    int m_fd;
    bool m_blTerminal;
    std::size_t m_cb = 0;
    std::array<char, 4096> m_text;
};

// While it lives, std::cout and std::cerr go through the deadline.
class GuardedOutput {
  public:
    GuardedOutput();
    // Puts out what is left.
    ~GuardedOutput();
    GuardedOutput(const GuardedOutput &) = delete;
    GuardedOutput &operator=(const GuardedOutput &) = delete;

  private:
    GuardedBuffer m_out;
    GuardedBuffer m_err;
    std::streambuf *m_pFormerOut;
    std::streambuf *m_pFormerErr;
};

// Puts out what the stream has, as the program's last bytes: the deadline strikes until they are
// out, and no more afterwards. A stream that goes elsewhere, such as into a text, is no end of the
// program. False when they cannot be written; the deadline then goes on.
bool PutOutLast(std::ostream &stream);

}  // namespace qrmctl

#endif
