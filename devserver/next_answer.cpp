#include "next_answer.h"

#include <json/value.h>

#include <algorithm>
#include <limits>

#include "json.h"

namespace devserver {
namespace {

constexpr int kMaxDelay_ms = 10 * 60 * 1000;
constexpr int kMaxInt = std::numeric_limits<int>::max();
constexpr int kMinInt = std::numeric_limits<int>::min();

template <typename Text>
bool ReadText(const Json::Value &value, Text &text) {
    if (!value.isString()) {
        return false;
    }
    text = value.asString();
    return true;
}

template <typename Number>
bool ReadNumber(const Json::Value &value, int least, int most, Number &number) {
    int n = 0;
    if (!json::ReadInt(value, n) || n < least || n > most) {
        return false;
    }
    number = n;
    return true;
}

bool ReadFlag(const Json::Value &value, bool &bl) {
    bl = value.isBool() && value.asBool();
    return value.isBool();
}

bool ReadHeaders(const Json::Value &value, std::map<std::string, std::string> &headers) {
    if (!value.isObject()) {
        return false;
    }
    const Json::Value::Members names = value.getMemberNames();
    return std::all_of(names.begin(), names.end(), [&](const std::string &strName) {
        return ReadText(value[strName], headers[strName]);
    });
}

using V = const Json::Value &;
using A = NextAnswer &;

struct AnswerMember {
    const char *szName;
    bool (*Read)(V value, A answer);
};

constexpr AnswerMember kMembers[] = {
    {"method", [](V v, A a) { return ReadText(v, a.method); }},
    {"status", [](V v, A a) { return ReadNumber(v, 200, 599, a.status); }},
    {"body", [](V v, A a) { return ReadText(v, a.body); }},
    {"error_code", [](V v, A a) { return ReadNumber(v, kMinInt, kMaxInt, a.error_code); }},
    {"headers", [](V v, A a) { return ReadHeaders(v, a.headers); }},
    {"delay_ms", [](V v, A a) { return ReadNumber(v, 0, kMaxDelay_ms, a.delay_ms); }},
    {"cut_after", [](V v, A a) { return ReadNumber(v, 0, kMaxInt, a.cut_after); }},
    {"bytes_per_s", [](V v, A a) { return ReadNumber(v, 0, kMaxInt, a.bytes_per_s); }},
    {"endless", [](V v, A a) { return ReadFlag(v, a.endless); }},
    {"no_length", [](V v, A a) { return ReadFlag(v, a.no_length); }},
    {"no_reply", [](V v, A a) { return ReadFlag(v, a.no_reply); }},
    {"closes", [](V v, A a) { return ReadFlag(v, a.closes); }},
    {"times", [](V v, A a) { return ReadNumber(v, 1, kMaxInt, a.times); }},
};

bool ReadMember(const std::string &strName, V value, A answer) {
    const auto member =
        std::find_if(std::begin(kMembers), std::end(kMembers),
                     [&strName](const AnswerMember &known) { return strName == known.szName; });
    return member != std::end(kMembers) && member->Read(value, answer);
}

}  // namespace

std::string ReadNextAnswer(const std::string &strJson, std::string &strApi, NextAnswer &answer) {
    Json::Value object;
    std::string strError;
    if (!json::FromString(strJson, object, &strError)) {
        return "the body is no JSON: " + strError;
    }
    if (!ReadText(json::Member(object, "api"), strApi)) {
        return "the body has to be an object with the name of an API as \"api\"";
    }
    object.removeMember("api");
    for (const std::string &strName : object.getMemberNames()) {
        if (!ReadMember(strName, object[strName], answer)) {
            return "member \"" + strName + "\" is unknown, of the wrong type or out of range";
        }
    }
    return {};
}

}  // namespace devserver
