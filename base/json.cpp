#include "json.h"

#include <json/reader.h>
#include <json/writer.h>

#include <algorithm>
#include <cstring>
#include <string_view>

#include "printable.h"

namespace json {
namespace {

// Counted as the reader counts: a plain value is a level too.
bool IsTooDeep(const Json::Value &value, int depthLeft) {
    if (depthLeft == 0) {
        return true;
    }
    if (!value.isArray() && !value.isObject()) {
        return false;
    }
    return std::any_of(value.begin(), value.end(), [depthLeft](const Json::Value &element) {
        return IsTooDeep(element, depthLeft - 1);
    });
}

// JsonCpp reports "* Line 3, Column 5\n  Missing ':' after object member name\nSee …": one line of
// it is enough for a person.
std::string OneLine(const std::string &strReport) {
    std::string strLine;
    for (char c : strReport) {
        if (c == '\n' || c == ' ' || c == '*') {
            if (!strLine.empty() && strLine.back() != ' ') {
                strLine += ' ';
            }
            continue;
        }
        strLine += c;
    }
    while (!strLine.empty() && strLine.back() == ' ') {
        strLine.pop_back();
    }
    return strLine;
}

// The last character of the comment that begins at the place; the place itself when none does.
std::size_t EndOfComment(const std::string &strText, std::size_t at) {
    std::size_t end = at;
    if (strText.compare(at, 2, "/*") == 0) {
        end = strText.find("*/", at + 2);
        end = end == std::string::npos ? end : end + 1;
    } else if (strText.compare(at, 2, "//") == 0) {
        end = strText.find_first_of("\r\n", at);
    }
    return std::min(end, strText.size());
}

// An upper bound for the number of values in the text: every value but the first comes after one of
// these characters.
bool HasTooManyValues(const std::string &strText) {
    std::size_t count = 0;
    bool blInText = false;
    for (std::size_t i = 0; i < strText.size(); ++i) {
        const char c = strText[i];
        if (c == '"') {
            blInText = !blInText;
        } else if (c == '\\' && blInText) {
            ++i;
        } else if (!blInText && c == '/') {
            i = EndOfComment(strText, i);
        } else if (!blInText && (c == ',' || c == '[' || c == '{') && ++count > kMaxValues) {
            return true;
        }
    }
    return false;
}

bool IsUtf8(std::string_view text) {
    unsigned long code = 0;
    for (std::size_t at = 0, cb = 0; at < text.size(); at += cb) {
        cb = (text[at] & 0x80) == 0 ? 1 : printable::CharacterAt(text, at, code);
        if (cb == 0) {
            return false;
        }
    }
    return true;
}

std::string AsUtf8(std::string_view text) {
    constexpr std::string_view kReplacement = "\xEF\xBF\xBD";
    std::string strText;
    unsigned long code = 0;
    for (std::size_t at = 0, cb = 0; at < text.size(); at += std::max<std::size_t>(cb, 1)) {
        cb = printable::CharacterAt(text, at, code);
        strText += cb == 0 ? kReplacement : text.substr(at, cb);
    }
    return strText;
}

std::string_view TextOf(const Json::Value &value) {
    const char *pBegin = nullptr;
    const char *pEnd = nullptr;
    const bool blText = value.isString() && value.getString(&pBegin, &pEnd);
    return blText ? std::string_view(pBegin, static_cast<std::size_t>(pEnd - pBegin))
                  : std::string_view();
}

// JsonCpp's writer takes what follows a byte that begins no character for a part of it.
bool IsWritable(const Json::Value &value) {
    if (!value.isArray() && !value.isObject()) {
        return IsUtf8(TextOf(value));
    }
    for (auto member = value.begin(); member != value.end(); ++member) {
        const char *pEnd = nullptr;
        const char *pName = member.memberName(&pEnd);
        if (!IsUtf8({pName, static_cast<std::size_t>(pEnd - pName)}) || !IsWritable(*member)) {
            return false;
        }
    }
    return true;
}

Json::Value Writable(const Json::Value &value) {
    if (value.isString()) {
        return AsUtf8(TextOf(value));
    }
    if (!value.isArray() && !value.isObject()) {
        return value;
    }
    Json::Value writable(value.type());
    for (auto member = value.begin(); member != value.end(); ++member) {
        (value.isObject() ? writable[AsUtf8(member.name())] : writable.append(Json::Value())) =
            Writable(*member);
    }
    return writable;
}

void SetError(std::string *pstrError, const std::string &strError) {
    if (pstrError != nullptr) {
        *pstrError = strError;
    }
}

}  // namespace

bool ToString(const Json::Value &value, std::string &strText, int maxDepth) {
    if (IsTooDeep(value, maxDepth)) {
        return false;
    }
    try {
        // Takes a fifth of the time of the writer that is configured by a JSON value of its own.
        Json::FastWriter writer;
        writer.omitEndingLineFeed();
        strText = writer.write(IsWritable(value) ? value : Writable(value));
        return true;
    } catch (const Json::Exception &) {
        return false;
    }
}

std::string ToLogText(const Json::Value &value) {
    std::string strText = "...";
    ToString(value, strText);
    return strText;
}

bool FromString(const std::string &strText, Json::Value &value, std::string *pstrError) {
    if (HasTooManyValues(strText)) {
        SetError(pstrError, "too many values");
        return false;
    }
    try {
        Json::Reader reader;
        Json::Value parsed;
        // Comments are passed over: collecting them takes time that grows with their square.
        if (reader.parse(strText, parsed, false)) {
            value.swap(parsed);
            return true;
        }
        SetError(pstrError, OneLine(reader.getFormattedErrorMessages()));
    } catch (const Json::Exception &) {
        SetError(pstrError, "nested too deeply");
    }
    return false;
}

const Json::Value &Member(const Json::Value &object, const char *szKey) {
    if (!object.isObject()) {
        return Json::Value::nullSingleton();
    }
    return object[szKey];
}

bool HasMember(const Json::Value &object, const char *szKey) {
    return object.isObject() && object.isMember(szKey);
}

const char *Text(const Json::Value &value) {
    const char *szBegin = nullptr;
    const char *szEnd = nullptr;
    if (!value.isString() || !value.getString(&szBegin, &szEnd)) {
        return nullptr;
    }
    const auto cb = static_cast<std::size_t>(szEnd - szBegin);
    return std::memchr(szBegin, '\0', cb) == nullptr ? szBegin : nullptr;
}

bool ReadInt(const Json::Value &value, int &n) {
    if (!value.isInt()) {
        return false;
    }
    n = value.asInt();
    return true;
}

bool IsTrue(const Json::Value &value) {
    switch (value.type()) {
        case Json::booleanValue:
        case Json::intValue:
        case Json::uintValue:
        case Json::realValue:
            return value.asBool();
        default:
            return false;
    }
}

int ErrorCode(const Json::Value &reply) {
    int code = 0;
    ReadInt(Member(Member(reply, "error"), "code"), code);
    return code;
}

}  // namespace json
