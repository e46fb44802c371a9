// The system log: one line per failure, written where the failure is noticed.
//
// A line is "<source file>:<line> <message>" at level LOG_ERR; file and line come from the place
// that logs. A line too long for a log daemon goes out cut, with its whole length named.

#ifndef ZELO_LOG_H
#define ZELO_LOG_H

#include <cstddef>
#include <string>
#include <vector>

#include "last_error.h"
#include "source_stem.h"

namespace qrm_log {

// Writes one line, made printable (printable.h). Never throws and allocates nothing, so it works
// when memory is short.
void Write(const char *szStem, int line, const char *szFormat, ...)
    __attribute__((format(printf, 3, 4)));

// Text from outside for a log line: each of the secrets blanked out, however its characters are
// escaped (secret_search.h), and the rest made printable (printable.h). What would not fit into a
// line is left out, and the whole length named.
std::string SafeText(const std::string &strText, const std::vector<std::string> &secrets);

}  // namespace qrm_log

// The arguments for a message that ends in "[0x%04X %s:%d]": why a platform operation failed.
#define ZELO_LAST_ERROR YLIBCErrGet(), YLIBCErrorGetFile(), YLIBCErrorGetLine()

#define ZELO_LOG(...) ::qrm_log::Write(ZELO_SOURCE_STEM, __LINE__, __VA_ARGS__)

// A required pointer is null: szCondition is the text of the condition that failed.
#define ZELO_LOG_NULL_ARGUMENT(szCondition)                    \
    (ZELO_LOG("Invaild Argument (%s)=[%d]\n", szCondition, 0), \
     YLIBCErrSetEx(YLIBC_ERR_INVALID_ARGUMENT, ZELO_SOURCE_STEM, __LINE__))

#endif
