// The system log: one line per failure, "<source file>:<line> <message>".

#ifndef ZELO_SYSTEM_LOG_H
#define ZELO_SYSTEM_LOG_H

#include <cstddef>
#include <string_view>

namespace system_log {

// What the usual log daemons take in one message.
constexpr std::size_t kMaxMessage = 8000;

// Writes one line at a level such as LOG_ERR, with the text made printable (printable.h). szEnd
// goes behind it as it is. A text of which only the first part fits, or is given (cbWhole is the
// length of the whole one, 0 for that of `text` and szEnd), goes out cut, with its whole length
// named.
//
// Never throws and allocates nothing, so it works when memory is short; and in a child process,
// whatever other threads were logging when the process forked.
void Write(int level, const char *szStem, int line, std::string_view text, std::size_t cbWhole = 0,
           const char *szEnd = "") noexcept;

}  // namespace system_log

#endif
