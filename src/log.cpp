#include "log.h"

#include <syslog.h>

#include <cstdarg>
#include <cstring>
#include <string_view>

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

// Copies the text made safe for a line; false, with whole characters, when it is cut.
bool CopySafe(std::string_view text, FixedText<kMaxMessage> &out) {
    std::size_t cb = 0;
    for (std::size_t at = 0; at < text.size();) {
        const printable::Shown shown = printable::ShowAt(text, at);
        const std::size_t cbShown = std::strlen(shown.text.sz());
        if (cbShown >= kMaxMessage - cb) {
            return false;
        }
        std::memcpy(out.Buffer() + cb, shown.text.sz(), cbShown);
        cb += cbShown;
        at += shown.cb;
    }
    return true;
}

}  // namespace

void Write(const char *szStem, int line, const char *szFormat, ...) {
    FixedText<kMaxMessage> message;
    va_list args;
    va_start(args, szFormat);
    const std::size_t cbWhole = message.FormatV(szFormat, args);
    va_end(args);

    // A line feed at the end of the fixed text stays one.
    std::string_view text = message.sz();
    const bool blEnded =
        !text.empty() && text.back() == '\n' && std::string_view(szFormat).back() == '\n';
    text.remove_suffix(blEnded ? 1 : 0);
    FixedText<kMaxMessage> safe;
    if (CopySafe(text, safe) && cbWhole < kMaxMessage) {
        syslog(LOG_ERR, "%s:%d %s%s", szStem, line, safe.sz(), blEnded ? "\n" : "");
    } else {
        syslog(LOG_ERR, "%s:%d %s... [cut, %zu bytes in all]", szStem, line, safe.sz(), cbWhole);
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
            at += cbSecret;
            continue;
        }
        const printable::Shown shown = printable::ShowAt(strText, at);
        strSafe += shown.text.sz();
        at += shown.cb;
    }
    return strSafe;
}

}  // namespace qrm_log
