// Setting the last error inside the host platform.

#ifndef ZELO_HOST_LAST_ERROR_H
#define ZELO_HOST_LAST_ERROR_H

#include "last_error.h"

namespace host {

// Sets the last error and returns the failure value of the operation, so that failing is one line.
inline int Fail(unsigned int code, const char *szFile, int line) {
    YLIBCErrSetEx(code, szFile, line);
    return -1;
}

// The last error as it is now, for putting it back: what an operation looks at besides may fail
// without the operation's failing.
class LastError {
  public:
    void Restore() const { YLIBCErrSetEx(m_code, m_szFile, m_line); }

  private:
    unsigned int m_code = YLIBCErrGet();
    const char *m_szFile = YLIBCErrorGetFile();
    int m_line = YLIBCErrorGetLine();
};

}  // namespace host

// Each source names itself with: constexpr const char *kFile = "…";
#define HOST_FAIL(code) ::host::Fail(code, kFile, __LINE__)

#endif
