#include "log.h"

#include <syslog.h>

#include <cstdarg>

#include "fixed_text.h"
#include "printable.h"
#include "secret_search.h"

namespace qrm_log {
namespace {

// What the usual log daemons take in one message.
constexpr std::size_t kMaxMessage = 8000;

// How much of a line text from outside may take.
constexpr std::size_t kMaxOutside = 7000;

constexpr const char *kBlank = "***";

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

std::string SafeText(const std::string &strText, const std::vector<std::string> &secrets) {
    SecretSearch search;
    for (const std::string &strSecret : secrets) {
        search.Add(strSecret);
    }
    std::string strSafe;
    for (std::size_t at = 0; at < strText.size();) {
        if (strSafe.size() >= kMaxOutside) {
            return strSafe + "... [cut, " + std::to_string(strText.size()) + " bytes in all]";
        }
        const std::size_t cbSecret = search.LengthAt(strText, at);
        if (cbSecret > 0) {
            strSafe += kBlank;
        }
        at += cbSecret > 0 ? cbSecret : printable::Append(strSafe, strText, at);
    }
    return strSafe;
}

}  // namespace qrm_log
