#include "redaction.h"

#include <json/value.h>
#include <openssl/evp.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <sstream>

#include "json_text.h"
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

// Reads one character that may be escaped for an URL, several times over ("%2525" is "%"). Moves
// behind it; -1 at the end.
int ReadUrlCharacter(const std::string &strText, std::size_t &at) {
    if (at >= strText.size()) {
        return -1;
    }
    std::size_t digits = at + 1;
    while (strText[at] == '%' && HexValue(strText, digits, 2) == '%' &&
           HexValue(strText, digits + 2, 2) >= 0) {
        digits += 2;
    }
    const int value = strText[at] == '%' ? HexValue(strText, digits, 2) : -1;
    at = value < 0 ? at + 1 : digits + 2;
    return value < 0 ? static_cast<unsigned char>(strText[at - 1]) : value;
}

// Moves behind the character, which may have backslashes in front or be written as \uXXXX.
bool PassCharacter(const std::string &strText, std::size_t &at, char c) {
    const int wanted = static_cast<unsigned char>(c);
    std::size_t next = at;
    int value = ReadUrlCharacter(strText, next);
    bool blEscaped = false;
    while (value == '\\' && wanted != '\\') {
        blEscaped = true;
        value = ReadUrlCharacter(strText, next);
    }
    if (blEscaped && value == 'u' && HexValue(strText, next, 4) == wanted) {
        at = next + 4;
        return true;
    }
    if (value != wanted) {
        return false;
    }
    at = next;
    return true;
}

// How many bytes of the text at the place stand for the secret; 0 for none. A run of backslashes is
// one backslash, since escaping doubles them.
std::size_t StandsWhole(const std::string &strText, std::size_t at, const std::string &strSecret) {
    std::size_t end = at;
    for (std::size_t i = 0; i < strSecret.size(); ++i) {
        const bool blAgain = i > 0 && strSecret[i] == '\\' && strSecret[i - 1] == '\\';
        if (blAgain) {
            continue;
        }
        if (!PassCharacter(strText, end, strSecret[i])) {
            return 0;
        }
        while (strSecret[i] == '\\' && PassCharacter(strText, end, '\\')) {
        }
    }
    return end - at;
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
                    const std::vector<std::string> &secrets) {
    std::size_t cb = 0;
    for (const std::string &strSecret : secrets) {
        cb = std::max(cb, StandsWhole(strText, at, strSecret));
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

std::string Token(int (*pfnGet)(char *, int, const ZELO_CRED_SESS *), const ZELO_CRED_SESS *pSess) {
    std::vector<char> text(kMaxToken);
    return pfnGet(text.data(), static_cast<int>(text.size()), pSess) == 0 ? text.data() : "";
}

// --- By name ------------------------------------------------------------------------------------

std::string Lower(std::string strText) {
    std::transform(strText.begin(), strText.end(), strText.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return strText;
}

void MaskMembers(Json::Value &value) {
    if (value.isObject()) {
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
    const auto isFiller = [](char c) { return c == ' ' || c == '\t' || c == '"' || c == '\''; };
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

std::string MaskLine(const std::string &strLine) {
    Json::Value object;
    if (json_text::FromString(strLine, object) && object.isObject()) {
        MaskMembers(object);
        return MaskUrls(json_text::ToLogText(object));
    }
    for (std::size_t at = 0; (at = strLine.find_first_of("=:", at)) != std::string::npos; ++at) {
        if (IsSecretName(NameBefore(strLine, at))) {
            return MaskUrls(strLine.substr(0, at + 1)) + kRedacted;
        }
    }
    return MaskUrls(strLine);
}

}  // namespace

void Redaction::Add(const std::string &strSecret) {
    if (strSecret.size() < kMinSecret) {
        return;
    }
    m_secrets.push_back(strSecret);
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
    for (long id : ids) {
        if (pSess != nullptr && ZELOCredSessLoad(id, pSess.get()) == 0) {
            Add(Token(ZELOCredSessItemGetAccessToken, pSess.get()));
            Add(Token(ZELOCredSessItemGetCsrfToken, pSess.get()));
        }
    }
    return count >= 0 && pSess != nullptr;
}

std::string Redaction::Redact(const std::string &strText) const {
    std::string strSafe;
    for (std::size_t at = 0; at < strText.size();) {
        const std::size_t cb = Longest(strText, at, m_secrets);
        const std::size_t cbCode = Longest(strText, at, m_base64);
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
    constexpr std::array<const char *, 7> kParts = {"token", "passw",  "secret",       "key",
                                                    "cred",  "cookie", "authorization"};
    const std::string strLower = Lower(strName);
    return std::any_of(kParts.begin(), kParts.end(), [&](const char *szPart) {
        return strLower.find(szPart) != std::string::npos;
    });
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
