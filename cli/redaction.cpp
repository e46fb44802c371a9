#include "redaction.h"

#include <json/value.h>
#include <openssl/evp.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <set>
#include <sstream>
#include <string_view>
#include <tuple>

#include "json_text.h"
#include "last_error.h"
#include "platform_handles.h"

namespace qrmctl {
namespace {

constexpr std::size_t kMinSecret = 4;
constexpr std::size_t kMaxToken = std::size_t{64} * 1024;

// --- By value -----------------------------------------------------------------------------------

// The value of so many hexadecimal digits at the place; -1 when they are not there.
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

// --- By name ------------------------------------------------------------------------------------

std::string Lower(std::string strText) {
    std::transform(strText.begin(), strText.end(), strText.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return strText;
}

std::string MaskText(const std::string &strText);

void MaskMembers(Json::Value &value) {
    if (value.isString()) {
        value = MaskText(value.asString());
    } else if (value.isObject()) {
        for (auto member = value.begin(); member != value.end(); ++member) {
            if (IsSecretName(member.name())) {
                *member = kRedacted;
            } else {
                MaskMembers(*member);
            }
        }
    } else if (value.isArray()) {
        for (Json::Value &element : value) {
            MaskMembers(element);
        }
    }
}

bool IsNameCharacter(char c) {
    return std::isalnum(static_cast<unsigned char>(c)) != 0 ||
           std::string_view("_-.%").find(c) != std::string_view::npos;
}

// The word before the separator at the place; quotes and blanks between them do not count.
std::string NameBefore(const std::string &strLine, std::size_t at) {
    const auto isFiller = [](char c) {
        return std::string_view(" \t\"'\\").find(c) != std::string_view::npos;
    };
    std::size_t end = at;
    while (end > 0 && isFiller(strLine[end - 1])) {
        --end;
    }
    std::size_t begin = end;
    while (begin > 0 && IsNameCharacter(strLine[begin - 1])) {
        --begin;
    }
    return strLine.substr(begin, end - begin);
}

// "://name:password@host" loses what stands before the "@".
std::string MaskUrls(std::string strLine) {
    for (std::size_t at = 0; (at = strLine.find("://", at)) != std::string::npos;) {
        at += 3;
        const std::size_t end = strLine.find_first_of("/ \t\"'", at);
        const std::size_t sign = strLine.substr(0, end).rfind('@');
        if (sign != std::string::npos && sign > at) {
            strLine.replace(at, sign - at, kRedacted);
        }
    }
    return strLine;
}

// How long the separator between a name and its value is at the place; 0 for none.
std::size_t SeparatorAt(const std::string &strLine, std::size_t at) {
    if (strLine[at] == '=' || strLine[at] == ':') {
        return 1;
    }
    const int value = strLine[at] == '%' ? HexValue(strLine, at + 1, 2) : -1;
    return value == '=' || value == ':' ? 3 : 0;
}

// Words of this length that mix classes of characters are taken for tokens that nobody knows any
// more, such as those of an earlier membership.
constexpr std::size_t kTokenLike = 16;

bool IsTokenLike(const std::string &strWord) {
    const auto has = [&strWord](int (*pfnIs)(int)) {
        return std::any_of(strWord.begin(), strWord.end(),
                           [pfnIs](unsigned char c) { return pfnIs(c) != 0; });
    };
    return strWord.size() >= kTokenLike &&
           has(std::isdigit) + has(std::islower) + has(std::isupper) > 1;
}

std::string MaskTokenLike(const std::string &strLine) {
    const auto isInWord = [](char c) {
        return std::isalnum(static_cast<unsigned char>(c)) != 0 ||
               std::string_view("+_~-").find(c) != std::string_view::npos;
    };
    std::string strSafe;
    for (std::size_t at = 0; at < strLine.size();) {
        std::size_t end = at;
        while (end < strLine.size() && isInWord(strLine[end])) {
            ++end;
        }
        const std::string strWord = strLine.substr(at, std::max(end, at + 1) - at);
        strSafe += IsTokenLike(strWord) ? kRedacted : strWord;
        at += strWord.size();
    }
    return strSafe;
}

std::string MaskPlain(const std::string &strLine) {
    std::size_t end = Lower(strLine).find("bearer ");
    std::size_t cbName = end == std::string::npos ? 0 : 7;
    for (std::size_t at = 0; at < std::min(end, strLine.size()); ++at) {
        const std::size_t cb = SeparatorAt(strLine, at);
        if (cb > 0 && IsSecretName(NameBefore(strLine, at))) {
            end = at;
            cbName = cb;
        }
    }
    const bool blMasked = end != std::string::npos;
    const std::string strBefore = blMasked ? strLine.substr(0, end + cbName) : strLine;
    return MaskTokenLike(MaskUrls(strBefore)) + (blMasked ? kRedacted : "");
}

std::string MaskLine(const std::string &strLine) {
    Json::Value value;
    if (json_text::FromString(strLine, value) && (value.isObject() || value.isArray())) {
        MaskMembers(value);
        return json_text::ToLogText(value);
    }
    return MaskPlain(strLine);
}

// A text of one or more lines, without a line end behind the last.
std::string MaskText(const std::string &strText) {
    std::string strMasked = MaskNamed(strText);
    if (!strMasked.empty()) {
        strMasked.pop_back();
    }
    return strMasked;
}

}  // namespace

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

bool IsSecretName(const std::string &strName) {
    // Sources, which stand before the line number of a log line.
    constexpr std::array<const char *, 5> kSources = {"qrm_server_credential", "credential_store",
                                                      "credential_database", "key_value_file",
                                                      "credential_command"};
    if (std::find(kSources.begin(), kSources.end(), strName) != kSources.end()) {
        return false;
    }
    constexpr std::array<const char *, 9> kParts = {"token", "passw", "passphrase", "pwd", "secret",
                                                    "key",   "cred",  "cookie",     "auth"};
    constexpr std::array<const char *, 3> kWords = {"sid", "pass", "bearer"};
    const std::string strLower = Lower(strName);
    const std::string strLast = strLower.substr(strLower.find_last_of("_-.%") + 1);
    return std::any_of(
               kParts.begin(), kParts.end(),
               [&](const char *szPart) { return strLower.find(szPart) != std::string::npos; }) ||
           std::find(kWords.begin(), kWords.end(), strLast) != kWords.end();
}

std::string MaskNamed(const std::string &strLines) {
    std::istringstream lines(strLines);
    std::string strMasked;
    for (std::string strLine; std::getline(lines, strLine);) {
        strMasked += MaskLine(strLine) + '\n';
    }
    return strMasked;
}

}  // namespace qrmctl
