#include "log_entries.h"

#include <algorithm>
#include <iterator>

#include "json.h"

namespace devserver {
namespace {

using json::HasMember;
using json::Member;

constexpr const char *kMembers[] = {"happen_time", "level", "username", "extra_info", "log"};
constexpr const char *kLevels[] = {"emerg",   "alert",  "crit", "err",
                                   "warning", "notice", "info", "debug"};
constexpr std::size_t kKeptEntries = 1000;

bool IsLevel(const Json::Value &value) {
    return std::any_of(std::begin(kLevels), std::end(kLevels),
                       [&value](const char *szLevel) { return value == szLevel; });
}

bool HasTexts(const Json::Value &value) {
    return value.isObject() && !value.empty() &&
           std::all_of(value.begin(), value.end(),
                       [](const Json::Value &text) { return text.isString(); });
}

}  // namespace

std::string LogEntries::WhyRefused(const Json::Value &params) {
    const Json::Value &time = Member(params, "happen_time");
    if (!time.isInt64() || time.type() == Json::realValue) {
        return "\"happen_time\" has to be an integer";
    }
    if (!IsLevel(Member(params, "level"))) {
        return "\"level\" has to be one of the eight names";
    }
    if (!Member(params, "username").isString()) {
        return "\"username\" has to be a text";
    }
    if (HasMember(params, "extra_info") && !params["extra_info"].isString()) {
        return "\"extra_info\" has to be a text";
    }
    if (!HasTexts(Member(params, "log"))) {
        return "\"log\" has to be an object of texts";
    }
    return {};
}

void LogEntries::Add(const Json::Value &params) {
    Json::Value entry;
    for (const char *szMember : kMembers) {
        if (HasMember(params, szMember)) {
            entry[szMember] = params[szMember];
        }
    }
    m_entries.push_back(std::move(entry));
    if (m_entries.size() > kKeptEntries) {
        m_entries.pop_front();
    }
}

Json::Value LogEntries::All() const {
    Json::Value entries(Json::arrayValue);
    for (const Json::Value &entry : m_entries) {
        entries.append(entry);
    }
    return entries;
}

}  // namespace devserver
