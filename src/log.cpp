#include "log.h"

#include <syslog.h>

#include <array>
#include <cstdarg>
#include <cstdio>

#include "fixed_text.h"
#include "json_text.h"

namespace qrm_log {
namespace {

// What the usual log daemons take in one message.
constexpr std::size_t kMaxMessage = 8000;

constexpr const char *kBlank = "***";

void ReplaceAll(std::string &strText, const std::string &strFrom, const std::string &strTo) {
    if (strFrom.empty()) {
        return;
    }
    std::size_t at = 0;
    while ((at = strText.find(strFrom, at)) != std::string::npos) {
        strText.replace(at, strFrom.size(), strTo);
        at += strTo.size();
    }
}

std::string EscapeControls(const std::string &strText) {
    std::string strEscaped;
    strEscaped.reserve(strText.size());
    for (char c : strText) {
        const auto byte = static_cast<unsigned char>(c);
        if (c == '\n') {
            strEscaped += "\\n";
        } else if (c == '\r') {
            strEscaped += "\\r";
        } else if (c == '\t') {
            strEscaped += "\\t";
        } else if (byte < 0x20 || byte == 0x7F) {
            FixedText<8> code;
            code.Format("\\x%02X", byte);
            strEscaped += code.sz();
        } else {
            strEscaped += c;
        }
    }
    return strEscaped;
}

}  // namespace

void Write(const char *szStem, int line, const char *szFormat, ...) {
    FixedText<kMaxMessage> message;
    va_list args;
    va_start(args, szFormat);
    const std::size_t cbWhole = message.FormatV(szFormat, args);
    va_end(args);

    if (cbWhole < kMaxMessage) {
        syslog(LOG_ERR, "%s:%d %s", szStem, line, message.sz());
    } else {
        syslog(LOG_ERR, "%s:%d %s... [cut, %zu bytes in all]", szStem, line, message.sz(), cbWhole);
    }
}

std::string SafeText(const std::string &strText, const std::string &strSecret) {
    std::string strSafe = strText;
    ReplaceAll(strSafe, strSecret, kBlank);

    std::string strQuoted;
    if (json_text::ToString(Json::Value(strSecret), strQuoted) && strQuoted.size() > 2) {
        const std::string strInJson = strQuoted.substr(1, strQuoted.size() - 2);
        ReplaceAll(strSafe, strInJson, kBlank);
        // JSON allows "\/" for "/", and many servers write it so.
        std::string strSlashes = strInJson;
        ReplaceAll(strSlashes, "/", "\\/");
        ReplaceAll(strSafe, strSlashes, kBlank);
    }
    return EscapeControls(strSafe);
}

}  // namespace qrm_log
