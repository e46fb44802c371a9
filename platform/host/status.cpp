#include "status.h"

#include <cstring>

#include "diagnosis.h"
#include "fixed_text.h"
#include "system_log.h"

namespace {

constexpr std::size_t kMaxWords = 1024;

struct LastError {
    unsigned int code = YLIBC_ERR_NONE;
    const char *szFile = "";
    int line = 0;
    // Of no type that is destroyed with its thread: operations may fail until the very end.
    FixedText<kMaxWords> words;
};

thread_local LastError t_lastError;

void Set(unsigned int code, const char *szFile, int line, const char *szWords) {
    t_lastError.code = code;
    t_lastError.szFile = szFile;
    t_lastError.line = line;
    CopyToFit(t_lastError.words.Buffer(), static_cast<int>(kMaxWords), szWords);
}

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
    Set(code, szFile == nullptr ? "" : szFile, line, "");
}

int ZELODiagnosisReason(char *szReason, int cbReason) {
    if (szReason == nullptr || cbReason <= 0) {
        return -1;
    }
    CopyToFit(szReason, cbReason, t_lastError.words.sz());
    return static_cast<int>(std::strlen(szReason));
}

namespace host {

void Status::Log() {
    if (m_level >= 0) {
        system_log::Write(m_level, m_szStem, m_line, m_strWords);
        m_level = -1;
    }
}

void Status::Publish() {
    Log();
    Set(m_code, m_szStem, m_line, m_strWords.c_str());
}

void PublishShortMemory(const char *szStem, int line) {
    Set(YLIBC_ERR_OUT_OF_MEMORY, szStem, line, "memory is short");
}

}  // namespace host
