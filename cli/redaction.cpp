#include "redaction.h"

#include <openssl/evp.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <set>
#include <string_view>
#include <tuple>

#include "last_error.h"
#include "platform_handles.h"

namespace qrmctl {
namespace {

constexpr std::size_t kMinSecret = 4;
constexpr std::size_t kMaxToken = std::size_t{64} * 1024;

// --- By value -----------------------------------------------------------------------------------

// Escaping can be repeated; more often than this it is noise.
constexpr std::size_t kMaxRepeated = 64;

// What the text at some place may stand for, and where it ends.
struct Reading {
    std::string strBytes;
    std::size_t end;
};

std::string Utf8(unsigned int code) {
    const auto tail = [code](unsigned int shift) {
        return static_cast<char>(0x80U | ((code >> shift) & 0x3FU));
    };
    if (code < 0x80) {
        return {static_cast<char>(code)};
    }
    if (code < 0x800) {
        return {static_cast<char>(0xC0U | (code >> 6U)), tail(0)};
    }
    if (code < 0x10000) {
        return {static_cast<char>(0xE0U | (code >> 12U)), tail(6), tail(0)};
    }
    return {static_cast<char>(0xF0U | (code >> 18U)), tail(12), tail(6), tail(0)};
}

// The byte itself, and what it begins when it is escaped for an URL, several times over ("%252f" is
// "/", "%2f" or itself).
void ReadUrl(const std::string &strText, std::size_t at, std::vector<Reading> &readings) {
    readings.push_back({{strText[at]}, at + 1});
    if (strText[at] == '+') {
        readings.push_back({" ", at + 1});
    }
    std::size_t digits = at + 1;
    int value = strText[at] == '%' ? HexValue(strText, digits, 2) : -1;
    for (std::size_t i = 0; value >= 0 && i < kMaxRepeated; ++i) {
        digits += 2;
        readings.push_back({{static_cast<char>(value)}, digits});
        value = value == '%' ? HexValue(strText, digits, 2) : -1;
    }
}

// What a backslash before the place makes of it: a control character, \xXX or \uXXXX, of which two
// may be one character.
void ReadEscape(const std::string &strText, std::size_t at, std::vector<Reading> &readings) {
    constexpr std::string_view kLetters = "bfnrt";
    constexpr std::string_view kControls = "\b\f\n\r\t";
    const std::size_t letter = at < strText.size() ? kLetters.find(strText[at]) : std::string::npos;
    if (letter != std::string::npos) {
        readings.push_back({{kControls[letter]}, at + 1});
    }
    if (at < strText.size() && strText[at] == 'x' && HexValue(strText, at + 1, 2) >= 0) {
        readings.push_back({{static_cast<char>(HexValue(strText, at + 1, 2))}, at + 3});
    }
    const int first = at < strText.size() && strText[at] == 'u' ? HexValue(strText, at + 1, 4) : -1;
    if (first < 0) {
        return;
    }
    readings.push_back({Utf8(static_cast<unsigned int>(first)), at + 5});
    if (first < 0x100) {
        readings.push_back({{static_cast<char>(first)}, at + 5});
    }
    std::size_t next = at + 5;
    while (next < strText.size() && strText[next] == '\\') {
        ++next;
    }
    const int second =
        next < strText.size() && strText[next] == 'u' ? HexValue(strText, next + 1, 4) : -1;
    if (first >= 0xD800 && first < 0xDC00 && second >= 0xDC00 && second < 0xE000) {
        readings.push_back({Utf8(0x10000U + ((static_cast<unsigned int>(first) & 0x3FFU) << 10U) +
                                 (static_cast<unsigned int>(second) & 0x3FFU)),
                            next + 5});
    }
}

// How much of a secret has been found up to a place of the text.
struct Progress {
    std::size_t found;
    std::size_t at;
    std::size_t skipped;  // backslashes and line ends in a row
    bool blEscaped;

    bool operator<(const Progress &other) const {
        return std::tie(found, at, skipped, blEscaped) <
               std::tie(other.found, other.at, other.skipped, other.blEscaped);
    }
};

// Where it may go on from there: every reading of the text is tried.
void Proceed(const std::string &strText, const std::string &strSecret, bool blWrapped,
             const Progress &from, std::set<Progress> &open) {
    if (from.at >= strText.size()) {
        return;
    }
    std::vector<Reading> readings;
    ReadUrl(strText, from.at, readings);
    if (from.blEscaped) {
        ReadEscape(strText, from.at, readings);
    }
    for (const Reading &reading : readings) {
        if (strSecret.compare(from.found, reading.strBytes.size(), reading.strBytes) == 0) {
            open.insert({from.found + reading.strBytes.size(), reading.end, 0, false});
        }
        const bool blBackslash = reading.strBytes == "\\";
        const bool blLineEnd = blWrapped && from.found > 0 &&
                               (reading.strBytes == "\n" || reading.strBytes == "\r" ||
                                reading.strBytes == " " || reading.strBytes == "\t");
        if ((blBackslash || blLineEnd) && from.skipped < kMaxRepeated) {
            open.insert({from.found, reading.end, from.skipped + 1, blBackslash});
        }
    }
}

// How many bytes of the text at the place stand for the secret; 0 for none. Backslashes before a
// character do not count; blWrapped: line ends between two do not either.
std::size_t StandsWhole(const std::string &strText, std::size_t at, const std::string &strSecret,
                        bool blWrapped) {
    std::size_t end = 0;
    std::set<Progress> open = {{0, at, 0, false}};
    while (!open.empty()) {
        const Progress next = *open.begin();
        open.erase(open.begin());
        if (next.found == strSecret.size()) {
            end = std::max(end, next.at);
        } else {
            Proceed(strText, strSecret, blWrapped, next, open);
        }
    }
    return end == 0 ? 0 : end - at;
}

std::string Hex(const std::string &strText, const char *szDigits) {
    std::string strHex;
    for (char c : strText) {
        const auto byte = static_cast<unsigned char>(c);
        strHex += {szDigits[byte >> 4U], szDigits[byte & 15U]};
    }
    return strHex;
}

// A run of backslashes as one: those that follow are passed over in the text.
std::string Collapsed(const std::string &strText) {
    std::string strShort;
    for (char c : strText) {
        if (c != '\\' || strShort.empty() || strShort.back() != '\\') {
            strShort += c;
        }
    }
    return strShort;
}

std::string Base64(const std::string &strText) {
    std::string strCode(4 * ((strText.size() + 2) / 3) + 1, '\0');
    const int cb = EVP_EncodeBlock(reinterpret_cast<unsigned char *>(strCode.data()),
                                   reinterpret_cast<const unsigned char *>(strText.data()),
                                   static_cast<int>(strText.size()));
    strCode.resize(static_cast<std::size_t>(cb));
    return strCode;
}

// The part of the secret's Base64 code that does not depend on its neighbours, when so many bytes
// stand before it in its group of three.
std::string Base64Core(const std::string &strSecret, std::size_t before) {
    constexpr std::array<std::size_t, 3> kBefore = {0, 2, 3};
    constexpr std::array<std::size_t, 3> kBehind = {0, 3, 2};
    const std::string strCode = Base64(std::string(before, '\0') + strSecret);
    const std::size_t cut = kBefore[before] + kBehind[(before + strSecret.size()) % 3];
    return strCode.size() <= cut ? std::string()
                                 : strCode.substr(kBefore[before], strCode.size() - cut);
}

bool IsBase64(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) != 0 ||
           std::string_view("+/-_=").find(c) != std::string_view::npos;
}

// The longest of the texts that stands at the place; 0 for none.
std::size_t Longest(const std::string &strText, std::size_t at,
                    const std::vector<std::string> &secrets, bool blWrapped) {
    std::size_t cb = 0;
    for (const std::string &strSecret : secrets) {
        cb = std::max(cb, StandsWhole(strText, at, strSecret, blWrapped));
    }
    return cb;
}

// --- The store ----------------------------------------------------------------------------------

thread_local std::vector<long> *t_pIds = nullptr;

// A filter that keeps nothing: it takes the ids down.
int TakeId(const ZELO_CRED *pCred, const char * /*szValue*/) {
    long id = -1;
    if (ZELOCredItemGetID(&id, pCred) == 0) {
        t_pIds->push_back(id);
    }
    return 0;
}

// False when there is a token that cannot be read whole.
bool AddToken(int (*pfnGet)(char *, int, const ZELO_CRED_SESS *), const ZELO_CRED_SESS *pSess,
              Redaction &redaction) {
    std::vector<char> text(kMaxToken);
    if (pfnGet(text.data(), static_cast<int>(text.size()), pSess) != 0) {
        return YLIBCErrGet() == YLIBC_ERR_NOT_FOUND;
    }
    const std::string strToken = text.data();
    redaction.Add(strToken);
    return strToken.size() + 1 < kMaxToken;  // else it may be cut
}

}  // namespace

int HexValue(const std::string &strText, std::size_t at, std::size_t digits) {
    if (at + digits > strText.size()) {
        return -1;
    }
    int value = 0;
    for (std::size_t i = at; i < at + digits; ++i) {
        if (std::isxdigit(static_cast<unsigned char>(strText[i])) == 0) {
            return -1;
        }
        const char digit = static_cast<char>(std::tolower(static_cast<unsigned char>(strText[i])));
        value = value * 16 + (digit <= '9' ? digit - '0' : digit - 'a' + 10);
    }
    return value;
}

void Redaction::Add(const std::string &strSecret) {
    if (strSecret.size() < kMinSecret) {
        return;
    }
    m_secrets.push_back(Collapsed(strSecret));
    m_secrets.push_back(Hex(strSecret, "0123456789abcdef"));
    m_secrets.push_back(Hex(strSecret, "0123456789ABCDEF"));
    for (std::size_t before = 0; before < 3; ++before) {
        std::string strCore = Base64Core(strSecret, before);
        if (strCore.size() < kMinSecret) {
            continue;
        }
        m_base64.push_back(strCore);
        std::replace(strCore.begin(), strCore.end(), '+', '-');
        std::replace(strCore.begin(), strCore.end(), '/', '_');
        m_base64.push_back(strCore);
    }
}

bool Redaction::AddStored() {
    std::vector<long> ids;
    t_pIds = &ids;
    ZELO_CRED *pList = nullptr;
    const int count = ZELOCredListGet(&pList, TakeId, "");
    t_pIds = nullptr;
    const CredListHandle list(pList);
    const CredSessHandle pSess(ZELOCredSessAlloc());
    bool blKnown = count >= 0 && pSess != nullptr;
    for (std::size_t i = 0; blKnown && i < ids.size(); ++i) {
        if (ZELOCredSessLoad(ids[i], pSess.get()) != 0) {
            blKnown = YLIBCErrGet() == YLIBC_ERR_NOT_FOUND;
            continue;
        }
        blKnown = AddToken(ZELOCredSessItemGetAccessToken, pSess.get(), *this) &&
                  AddToken(ZELOCredSessItemGetCsrfToken, pSess.get(), *this);
    }
    return blKnown;
}

std::string Redaction::Redact(const std::string &strText) const {
    std::string strSafe;
    for (std::size_t at = 0; at < strText.size();) {
        const std::size_t cb = Longest(strText, at, m_secrets, false);
        const std::size_t cbCode = Longest(strText, at, m_base64, true);
        if (cb == 0 && cbCode == 0) {
            strSafe += strText[at++];
            continue;
        }
        at += std::max(cb, cbCode);
        // The ends of a code hold some bits of the secret too.
        while (cbCode > 0 && at < strText.size() && IsBase64(strText[at])) {
            ++at;
        }
        while (cbCode > 0 && !strSafe.empty() && IsBase64(strSafe.back())) {
            strSafe.pop_back();
        }
        strSafe += kRedacted;
    }
    return strSafe;
}

}  // namespace qrmctl
