// Filling a caller's buffer: the one place of the host platform where text is cut to fit.

#ifndef ZELO_HOST_TEXT_BUFFER_H
#define ZELO_HOST_TEXT_BUFFER_H

#include <algorithm>
#include <cstddef>
#include <string>

namespace host {

// Copies the text into a buffer of cbBuffer bytes (1 or more), cut to fit and zero-terminated.
// Returns the number of bytes copied.
inline int CopyText(const std::string &strText, char *szBuffer, int cbBuffer) {
    const std::size_t cb = std::min(strText.size(), static_cast<std::size_t>(cbBuffer) - 1);
    szBuffer[strText.copy(szBuffer, cb)] = '\0';
    return static_cast<int>(cb);
}

// The same for UTF-8 text, which is not cut inside a character.
inline int CopyWholeCharacters(const std::string &strText, char *szBuffer, int cbBuffer) {
    constexpr std::size_t kLongestCharacter = 4;
    const auto goesOn = [&](std::size_t at) {
        return (static_cast<unsigned char>(strText[at]) & 0xC0U) == 0x80U;
    };
    const std::size_t cbRoom = static_cast<std::size_t>(cbBuffer) - 1;
    std::size_t cb = std::min(strText.size(), cbRoom);
    while (cb < strText.size() && cb > 0 && cbRoom - cb < kLongestCharacter && goesOn(cb)) {
        --cb;
    }
    szBuffer[strText.copy(szBuffer, cb)] = '\0';
    return static_cast<int>(cb);
}

}  // namespace host

#endif
