// Strings on their way to a platform operation that takes zero-terminated text.

#ifndef ZELO_TERMINATED_TEXT_H
#define ZELO_TERMINATED_TEXT_H

#include <string>

#include "last_error.h"

// Whether c_str() is the whole text. A NUL inside would make it a shorter one, and so another key
// or another file; that is an invalid argument.
inline bool IsTerminatedText(const std::string &strText) {
    if (strText.find('\0') == std::string::npos) {
        return true;
    }
    YLIBCErrSetEx(YLIBC_ERR_INVALID_ARGUMENT, "terminated_text", __LINE__);
    return false;
}

#endif
