#include <json/value.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <string_view>

#include "json.h"
#include "redaction.h"
#include "words.h"

namespace qrmctl {
namespace {

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

// The word before the separator at the place, as far as it stands behind the other place; quotes
// and blanks between them do not count.
std::string NameBefore(const std::string &strLine, std::size_t at, std::size_t behind) {
    const std::string_view line = std::string_view(strLine).substr(0, at);
    std::size_t end = at;
    for (std::size_t cb = 1; cb > 0 && end > behind; end -= cb) {
        cb = 0;
        for (std::string_view filler : {" ", "\t", "\"", "'", "\\", "&quot;", "&#34;", "&#39;"}) {
            const bool blFills = end - behind >= filler.size() &&
                                 line.substr(end - filler.size(), filler.size()) == filler;
            cb = blFills ? filler.size() : cb;
        }
    }
    std::size_t begin = end;
    while (begin > behind && IsNameCharacter(line[begin - 1])) {
        --begin;
    }
    return strLine.substr(begin, end - begin);
}

// "://name:password@host" loses what stands before the "@".
std::string MaskUrls(const std::string &strLine) {
    std::string strSafe;
    std::size_t at = 0;
    for (std::size_t next = 0; (next = strLine.find("://", at)) != std::string::npos;) {
        next += 3;
        strSafe.append(strLine, at, next - at);
        const std::size_t end = std::min(strLine.find_first_of("/ \t\"'", next), strLine.size());
        const std::size_t sign = std::string_view(strLine).substr(next, end - next).rfind('@');
        const bool blNamed = sign != std::string_view::npos && sign > 0;
        strSafe += blNamed ? kRedacted : "";
        at = next + (blNamed ? sign : 0);
    }
    return strSafe.append(strLine, at);
}

// How long the separator between a name and its value is at the place; 0 for none.
std::size_t SeparatorAt(const std::string &strLine, std::size_t at) {
    if (std::string_view("=:%&").find(strLine[at]) == std::string_view::npos) {
        return 0;
    }
    for (const Reading &reading : ReadingsAt(strLine, at)) {
        if (reading.strBytes == "=" || reading.strBytes == ":") {
            return reading.end - at;
        }
    }
    return 0;
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
    // A name is searched back to just before the separator in front of it, so that a long line
    // takes linear time; so many bytes hold the longest escaped separator.
    constexpr std::size_t kLongestSeparator = 10;
    std::size_t end = Lower(strLine).find("bearer ");
    std::size_t cbName = end == std::string::npos ? 0 : 7;
    std::size_t from = 0;
    for (std::size_t at = 0; at < std::min(end, strLine.size()); ++at) {
        const std::size_t cb = SeparatorAt(strLine, at);
        if (cb == 0) {
            continue;
        }
        if (IsSecretName(NameBefore(strLine, at, from))) {
            end = at;
            cbName = cb;
        }
        from = at - std::min(at, kLongestSeparator);
    }
    const bool blMasked = end != std::string::npos;
    const std::string strBefore = blMasked ? strLine.substr(0, end + cbName) : strLine;
    return MaskTokenLike(MaskUrls(strBefore)) + (blMasked ? kRedacted : "");
}

std::string MaskLine(const std::string &strLine) {
    Json::Value value;
    if (json::FromString(strLine, value) && (value.isObject() || value.isArray())) {
        MaskMembers(value);
        return json::ToLogText(value);
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
    std::string strMasked;
    for (const std::string &strLine : words::Split(strLines, '\n')) {
        strMasked += MaskLine(strLine) + '\n';
    }
    return strMasked;
}

}  // namespace qrmctl
