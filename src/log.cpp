#include "log.h"

#include <syslog.h>

#include <cstdarg>
#include <string_view>

#include "fixed_text.h"
#include "printable.h"
#include "secret_search.h"
#include "system_log.h"

namespace qrm_log {
namespace {

// How much of a line text from outside may take.
constexpr std::size_t kMaxOutside = 7000;

constexpr const char *kBlank = "***";

}  // namespace

void Write(const char *szStem, int line, const char *szFormat, ...) {
    FixedText<system_log::kMaxMessage> message;
    va_list args;
    va_start(args, szFormat);
    const std::size_t cbWhole = message.FormatV(szFormat, args);
    va_end(args);

    // A line feed at the end of the fixed text stays one.
    std::string_view text = message.sz();
    const bool blCut = cbWhole > text.size();
    const bool blEnded =
        !text.empty() && text.back() == '\n' && std::string_view(szFormat).back() == '\n';
    text.remove_suffix(blEnded ? 1 : 0);
    system_log::Write(LOG_ERR, szStem, line, text, blCut ? cbWhole : 0, blEnded ? "\n" : "");
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
