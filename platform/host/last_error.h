// Setting the last error inside the host platform.

#ifndef ZELO_HOST_LAST_ERROR_H
#define ZELO_HOST_LAST_ERROR_H

#include "../last_error.h"

namespace host {

// Sets the last error and returns the failure value of the operation, so that failing is one line.
inline int Fail(unsigned int code, const char *szFile, int line) {
    YLIBCErrSetEx(code, szFile, line);
    return -1;
}

}  // namespace host

// Each source names itself with: constexpr const char *kFile = "…";
#define HOST_FAIL(code) ::host::Fail(code, kFile, __LINE__)

#endif
