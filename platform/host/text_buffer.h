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

}  // namespace host

#endif
