#include "output.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <iostream>
#include <utility>

#include "deadline.h"

namespace qrmctl {
namespace {

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
            const char *const szPath =
                standard == STDOUT_FILENO ? "/proc/self/fd/1" : "/proc/self/fd/2";
            const int own = open(szPath, O_WRONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
            fd = own >= 0 ? own : standard;
        }
    }
};

// Nothing to destroy: the deadline may strike while the process ends.
const Way &WayOf(int fd) {
    static const Way out(STDOUT_FILENO);
    static const Way err(STDERR_FILENO);
    return fd == STDOUT_FILENO ? out : err;
}

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

GuardedBuffer::GuardedBuffer(int fd) : m_fd(fd), m_blTerminal(isatty(WayOf(fd).fd) == 1) {}

bool GuardedBuffer::PutOut(bool blLast) {
    return Deliver(m_fd, {m_text.data(), std::exchange(m_cb, 0)}, blLast);
}

GuardedBuffer::int_type GuardedBuffer::overflow(int_type c) {
    const char byte = traits_type::to_char_type(c);
    return traits_type::eq_int_type(c, traits_type::eof()) || xsputn(&byte, 1) == 1
               ? traits_type::not_eof(c)
               : traits_type::eof();
}

// To a terminal text goes out line by line.
std::streamsize GuardedBuffer::xsputn(const char *pText, std::streamsize cb) {
    const std::string_view text(pText, static_cast<std::size_t>(cb));
    if (text.size() > m_text.size() - m_cb && !PutOut(false)) {
        return 0;
    }
    if (text.size() > m_text.size()) {
        return Deliver(m_fd, text, false) ? cb : 0;
    }
    m_cb += text.copy(m_text.data() + m_cb, text.size());
    const bool blLine = m_blTerminal && text.find('\n') != std::string_view::npos;
    return blLine && !PutOut(false) ? 0 : cb;
}

int GuardedBuffer::sync() {
    return PutOut(false) ? 0 : -1;
}

GuardedOutput::GuardedOutput()
    : m_out(STDOUT_FILENO),
      m_err(STDERR_FILENO),
      m_pFormerOut(std::cout.rdbuf(&m_out)),
      m_pFormerErr(std::cerr.rdbuf(&m_err)) {}

GuardedOutput::~GuardedOutput() {
    std::cout.flush();
    std::cerr.rdbuf(m_pFormerErr);
    std::cout.rdbuf(m_pFormerOut);
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
