// Fixed-size text buffers: the one place where text is cut to fit.

#ifndef ZELO_FIXED_TEXT_H
#define ZELO_FIXED_TEXT_H

#include <algorithm>
#include <cstdarg>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <initializer_list>
#include <string_view>

// Takes away a UTF-8 character of which only the beginning is left at the end of a text of cb
// bytes that was cut. Returns the length that is left.
inline std::size_t DropPartialCharacter(char *szText, std::size_t cb) {
    std::size_t begin = cb;
    while (begin > 0 && cb - begin < 3 && (szText[begin - 1] & 0xC0) == 0x80) {
        --begin;
    }
    if (begin == 0 || (szText[begin - 1] & 0x80) == 0) {
        return cb;
    }
    const auto lead = static_cast<unsigned char>(szText[--begin]);
    const std::size_t whole = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : lead >= 0xC0 ? 2 : 1;
    if (cb - begin >= whole) {
        return cb;
    }
    szText[begin] = '\0';
    return begin;
}

// Copies a text into a caller's buffer of cbOut bytes, cut to fit and never inside a UTF-8
// character, and zero-terminated. Returns the number of bytes copied; a buffer without room stays
// as it is.
inline int CopyToFit(char *szOut, int cbOut, std::string_view text) {
    if (cbOut <= 0) {
        return 0;
    }
    std::size_t cb = std::min(text.size(), static_cast<std::size_t>(cbOut) - 1);
    szOut[text.copy(szOut, cb)] = '\0';
    if (cb < text.size()) {
        cb = DropPartialCharacter(szOut, cb);
    }
    return static_cast<int>(cb);
}

inline int CopyToFit(char *szOut, int cbOut, const char *szText) {
    const std::size_t cbMost = cbOut <= 0 ? 0 : static_cast<std::size_t>(cbOut);
    return CopyToFit(szOut, cbOut, std::string_view(szText, strnlen(szText, cbMost)));
}

// A buffer of N bytes that holds zero-terminated text of at most N - 1 bytes, at first empty. All
// of it is zero then, since a platform getter may write a text without its end.
template <std::size_t N>
class FixedText {
  public:
    // For a platform getter, which takes the buffer's size.
    char *Buffer() {
        End();
        return m_sz;
    }
    static constexpr int Size() { return static_cast<int>(N); }

    const char *sz() const {
        End();
        return m_sz;
    }
    bool Empty() const { return m_sz[0] == '\0'; }

    // Joins the pieces in the buffer. Returns false, with an empty buffer, when they do not fit.
    bool Join(std::initializer_list<std::string_view> pieces) {
        std::size_t cb = 0;
        for (const std::string_view piece : pieces) {
            if (piece.size() >= N - cb) {
                m_sz[0] = '\0';
                return false;
            }
            cb += piece.copy(m_sz + cb, piece.size());
        }
        m_sz[cb] = '\0';
        return true;
    }

    // Formats into the buffer, cut to fit. Returns the length that the whole text has.
    std::size_t Format(const char *szFormat, ...) __attribute__((format(printf, 2, 3))) {
        va_list args;
        va_start(args, szFormat);
        const std::size_t cbWhole = FormatV(szFormat, args);
        va_end(args);
        return cbWhole;
    }

    std::size_t FormatV(const char *szFormat, va_list args) __attribute__((format(printf, 2, 0))) {
        const int cb = std::vsnprintf(m_sz, N, szFormat, args);
        if (cb >= Size()) {
            DropPartialCharacter(m_sz, N - 1);
        }
        return cb < 0 ? 0 : static_cast<std::size_t>(cb);
    }

  private:
    // Cuts a text that a platform getter has filled the whole buffer with.
    void End() const {
        if (m_sz[N - 1] != '\0') {
            m_sz[N - 1] = '\0';
            DropPartialCharacter(m_sz, N - 1);
        }
    }

    mutable char m_sz[N] = {};
};

#endif
