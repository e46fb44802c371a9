#include "status.h"

namespace {

struct LastError {
    unsigned int code = YLIBC_ERR_NONE;
    const char *szFile = "";
    int line = 0;
};

thread_local LastError t_lastError;

}  // namespace

unsigned int YLIBCErrGet() {
    return t_lastError.code;
}

const char *YLIBCErrorGetFile() {
    return t_lastError.szFile;
}

int YLIBCErrorGetLine() {
    return t_lastError.line;
}

void YLIBCErrSetEx(unsigned int code, const char *szFile, int line) {
    t_lastError = {code, szFile == nullptr ? "" : szFile, line};
}
