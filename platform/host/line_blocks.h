// Reading a part of a file in blocks of whole lines.
//
// Reads with pread and never through a mapping: a file that somebody cuts short meanwhile only ends
// early.

#ifndef ZELO_HOST_LINE_BLOCKS_H
#define ZELO_HOST_LINE_BLOCKS_H

#include <sys/types.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <memory>
#include <optional>
#include <string_view>
#include <utility>

namespace host {

class LineBlocks {
  public:
    // The part of the file from begin, where a line begins, to end. The file stays the caller's.
    LineBlocks(int fd, off_t begin, off_t end)
        : m_fd(fd),
          m_offset(begin),
          m_next(begin),
          m_end(end),
          m_cbBuffer(static_cast<std::size_t>(std::clamp<off_t>(end - begin, 1, kBlock))),
          m_pBuffer(new char[m_cbBuffer]) {}

    // The next block, which is valid until the next call; nothing after the last one, and where
    // reading ends early.
    std::optional<std::string_view> Next() {
        DropBlock();
        while (m_next < m_end) {
            if (!MakeRoom() || !Fill()) {
                m_next = m_end;
                m_cbHeld = 0;
                m_blCut = true;
                break;
            }
            if (m_next < m_end) {
                m_cbBlock = Held().rfind('\n') + 1;  // 0 when there is none
            }
            if (m_cbBlock > 0) {
                return Held().substr(0, m_cbBlock);
            }
        }
        m_cbBlock = m_cbHeld;
        return m_cbBlock > 0 ? std::optional(Held()) : std::nullopt;
    }

    // Where the block begins in the file.
    off_t Offset() const { return m_offset; }

    // Whether reading ended early: the file is shorter, cannot be read, or has a line that is too
    // long to be one.
    bool Cut() const { return m_blCut; }

  private:
    // A block stays in the processor's cache while it is looked through.
    static constexpr off_t kBlock = off_t{64} * 1024;
    static constexpr std::size_t kLongestLine = std::size_t{16} * 1024 * 1024;

    std::string_view Held() const { return {m_pBuffer.get(), m_cbHeld}; }

    void DropBlock() {
        const std::string_view rest = Held().substr(m_cbBlock);
        std::copy(rest.begin(), rest.end(), m_pBuffer.get());
        m_offset += static_cast<off_t>(m_cbBlock);
        m_cbHeld -= m_cbBlock;
        m_cbBlock = 0;
    }

    bool MakeRoom() {
        if (m_cbHeld == m_cbBuffer) {
            std::unique_ptr<char[]> pLarger(new char[2 * m_cbBuffer]);
            Held().copy(pLarger.get(), m_cbHeld);
            m_pBuffer = std::move(pLarger);
            m_cbBuffer *= 2;
        }
        return m_cbBuffer <= kLongestLine;
    }

    bool Fill() {
        const std::size_t cbRoom =
            std::min(m_cbBuffer - m_cbHeld, static_cast<std::size_t>(m_end - m_next));
        ssize_t cb = 0;
        do {
            cb = pread(m_fd, &m_pBuffer[m_cbHeld], cbRoom, m_next);
        } while (cb < 0 && errno == EINTR);
        if (cb <= 0) {
            return false;
        }
        m_next += cb;
        m_cbHeld += static_cast<std::size_t>(cb);
        return true;
    }

    int m_fd;
    off_t m_offset;
    off_t m_next;  // where to read on
    off_t m_end;
    bool m_blCut = false;
    std::size_t m_cbBlock = 0;  // of the block that was handed out
    std::size_t m_cbHeld = 0;   // the block and what has been read behind it
    std::size_t m_cbBuffer;
    std::unique_ptr<char[]> m_pBuffer;  // not zeroed, which would cost a part of the reading
};

}  // namespace host

#endif
