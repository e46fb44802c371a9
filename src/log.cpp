#include "log.h"

#include <syslog.h>

#include <algorithm>
#include <cstdarg>
#include <cstdio>

#include "fixed_text.h"

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

// Control characters of ASCII, and those of Unicode's second page in UTF-8 or alone.
bool IsControl(const std::string &strText, std::size_t at) {
    const auto byteAt = [&strText](std::size_t i) {
        return i < strText.size() ? static_cast<unsigned char>(strText[i]) : 0U;
    };
    const auto isC1 = [](unsigned int byte) { return byte >= 0x80 && byte <= 0x9F; };
    const unsigned int byte = byteAt(at);
    if (byte < 0x20 || byte == 0x7F) {
        return true;
    }
    const unsigned int before = at == 0 ? 0U : byteAt(at - 1);
    return (byte == 0xC2 && isC1(byteAt(at + 1))) ||
           (isC1(byte) && (before < 0x80 || before == 0xC2));
}

void AppendEscaped(std::string &strSafe, char c) {
    switch (c) {
        case '\n':
            strSafe += "\\n";
            return;
        case '\r':
            strSafe += "\\r";
            return;
        case '\t':
            strSafe += "\\t";
            return;
        default:
            FixedText<8> code;
            code.Format("\\x%02X", static_cast<unsigned char>(c));
            strSafe += code.sz();
    }
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
        if (IsControl(strText, at)) {
            AppendEscaped(strSafe, strText[at]);
        } else {
            strSafe += strText[at];
        }
        ++at;
    }
    return strSafe;
}

}  // namespace qrm_log
