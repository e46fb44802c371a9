#include "output.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <iostream>

#include "deadline.h"

namespace qrmctl {
namespace {

// Gathered text goes out when it has this length; to a terminal line by line.
constexpr std::size_t kGathered = 4096;

// How a standard stream is written to. Setting O_NONBLOCK on it would set it for everybody who has
// it; a pipe or a terminal can be opened once more, with a flag of its own.
struct Way {
    int fd;
    bool blSocket = false;

    explicit Way(int standard) : fd(standard) {
        struct stat status = {};
        if (fstat(standard, &status) != 0) {
            return;
        }
        blSocket = S_ISSOCK(status.st_mode);
        if (S_ISFIFO(status.st_mode) || isatty(standard) == 1) {
            const std::string strPath = "/proc/self/fd/" + std::to_string(standard);
            const int own = open(strPath.c_str(), O_WRONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
            fd = own >= 0 ? own : standard;
        }
    }
};

// Never destroyed: the deadline may strike while the process ends.
const Way &WayOf(int fd) {
    static const auto *const pOut = new Way(STDOUT_FILENO);
    static const auto *const pErr = new Way(STDERR_FILENO);
    return fd == STDOUT_FILENO ? *pOut : *pErr;
}

class GuardedBuffer : public std::streambuf {
  public:
    explicit GuardedBuffer(int fd) : m_fd(fd), m_blTerminal(isatty(WayOf(fd).fd) == 1) {}

    bool PutOut(bool blLast) {
        const bool blOut = Deliver(m_fd, m_strText, blLast);
        m_strText.clear();
        return blOut;
    }

  protected:
    int_type overflow(int_type c) override {
        const char byte = traits_type::to_char_type(c);
        return traits_type::eq_int_type(c, traits_type::eof()) || xsputn(&byte, 1) == 1
                   ? traits_type::not_eof(c)
                   : traits_type::eof();
    }
    std::streamsize xsputn(const char *pText, std::streamsize cb) override {
        m_strText.append(pText, static_cast<std::size_t>(cb));
        const bool blFull = m_strText.size() >= kGathered ||
                            (m_blTerminal && m_strText.find('\n') != std::string::npos);
        return blFull && !PutOut(false) ? 0 : cb;
    }
    int sync() override { return PutOut(false) ? 0 : -1; }

  private:
    int m_fd;
    bool m_blTerminal;
    std::string m_strText;
};

}  // namespace

ssize_t WriteNow(int fd, std::string_view text) {
    const Way &way = WayOf(fd);
    const std::size_t cb = std::min<std::size_t>(text.size(), PIPE_BUF);
    if (cb == 0 || !AwaitRoom(fd, std::chrono::milliseconds(0))) {
        return 0;
    }
    const ssize_t cbWritten =
        way.blSocket ? send(way.fd, text.data(), cb, MSG_DONTWAIT) : write(way.fd, text.data(), cb);
    const bool blLater =
        cbWritten < 0 && (errno == EAGAIN || errno == EWOULDBLOCK || errno == EINTR);
    return blLater ? 0 : cbWritten;
}

bool AwaitRoom(int fd, std::chrono::milliseconds limit) {
    pollfd output = {WayOf(fd).fd, POLLOUT, 0};
    return poll(&output, 1, static_cast<int>(limit.count())) == 1;
}

GuardedOutput::GuardedOutput()
    : m_pOut(std::cout.rdbuf(new GuardedBuffer(STDOUT_FILENO))),
      m_pErr(std::cerr.rdbuf(new GuardedBuffer(STDERR_FILENO))) {}

GuardedOutput::~GuardedOutput() {
    std::cout.flush();
    delete std::cerr.rdbuf(m_pErr);
    delete std::cout.rdbuf(m_pOut);
}

bool PutOutLast(std::ostream &stream) {
    auto *const pBuffer = dynamic_cast<GuardedBuffer *>(stream.rdbuf());
    if (pBuffer == nullptr) {
        return static_cast<bool>(stream.flush());
    }
    if (!pBuffer->PutOut(true)) {
        stream.setstate(std::ios::badbit);
    }
    return static_cast<bool>(stream);
}

}  // namespace qrmctl
