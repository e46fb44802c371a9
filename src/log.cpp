#include "log.h"

#include <syslog.h>

#include <algorithm>
#include <cstdarg>
#include <cstring>
#include <string_view>

#include "fixed_text.h"
#include "one_line.h"

namespace qrm_log {
namespace {

// What the usual log daemons take in one message.
constexpr std::size_t kMaxMessage = 8000;

// How much of a line text from outside may take.
constexpr std::size_t kMaxOutside = 7000;

constexpr const char *kBlank = "***";

int HexDigit(char c) {
    if (c >= '0' && c <= '9') {
        return c - '0';
    }
    const char lower = static_cast<char>(c | 0x20);
    return lower >= 'a' && lower <= 'f' ? lower - 'a' + 10 : -1;
}

// The value of so many hexadecimal digits at the place; -1 when they are not there.
int HexValue(const std::string &strText, std::size_t at, std::size_t digits) {
    int value = 0;
    for (std::size_t i = at; i < at + digits; ++i) {
        const int digit = i < strText.size() ? HexDigit(strText[i]) : -1;
        if (digit < 0) {
            return -1;
        }
        value = value * 16 + digit;
    }
    return value;
}

// How many bytes of the text at the place stand for the character, plain or escaped; 0 for none.
std::size_t Stands(const std::string &strText, std::size_t at, char c) {
    if (at >= strText.size()) {
        return 0;
    }
    const int code = static_cast<unsigned char>(c);
    if (strText[at] == '%' && HexValue(strText, at + 1, 2) == code) {
        return 3;
    }
    if (strText[at] == '\\' && at + 1 < strText.size()) {
        if (strText[at + 1] == 'u' && HexValue(strText, at + 2, 4) == code) {
            return 6;
        }
        if (strText[at + 1] == c) {
            return 2;
        }
    }
    return strText[at] == c ? 1 : 0;
}

std::size_t StandsWhole(const std::string &strText, std::size_t at, const std::string &strSecret) {
    std::size_t end = at;
    for (char c : strSecret) {
        const std::size_t cb = Stands(strText, end, c);
        if (cb == 0) {
            return 0;
        }
        end += cb;
    }
    return end - at;
}

// Copies the text with its control characters escaped; false, with whole characters, when it is
// cut.
bool CopyOnOneLine(std::string_view text, FixedText<kMaxMessage> &out) {
    char *const szOut = out.Buffer();
    std::size_t cb = 0;
    for (std::size_t at = 0; at < text.size(); ++at) {
        const FixedText<8> shown = one_line::Shown(text, at);
        const std::size_t cbShown = std::strlen(shown.sz());
        if (cbShown >= kMaxMessage - cb) {
            DropPartialCharacter(szOut);
            return false;
        }
        std::memcpy(szOut + cb, shown.sz(), cbShown);
        cb += cbShown;
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
    const std::string_view format = szFormat;
    const bool blEnded = cbWhole < kMaxMessage && !format.empty() && format.back() == '\n';
    text.remove_suffix(blEnded ? 1 : 0);
    FixedText<kMaxMessage> safe;
    if (CopyOnOneLine(text, safe) && cbWhole < kMaxMessage) {
        syslog(LOG_ERR, "%s:%d %s%s", szStem, line, safe.sz(), blEnded ? "\n" : "");
    } else {
        syslog(LOG_ERR, "%s:%d %s... [cut, %zu bytes in all]", szStem, line, safe.sz(), cbWhole);
    }
}

std::string SafeText(const std::string &strText, const std::vector<std::string> &secrets) {
    std::string strSafe;
    for (std::size_t at = 0; at < strText.size();) {
        if (strSafe.size() >= kMaxOutside) {
            return strSafe + "... [cut, " + std::to_string(strText.size()) + " bytes in all]";
        }
        std::size_t cbSecret = 0;
        for (const std::string &strSecret : secrets) {
            cbSecret = std::max(cbSecret, StandsWhole(strText, at, strSecret));
        }
        if (cbSecret > 0) {
            strSafe += kBlank;
            at += cbSecret;
            continue;
        }
        strSafe += one_line::Shown(strText, at).sz();
        ++at;
    }
    return strSafe;
}

}  // namespace qrm_log
