#include "candidates.h"

#include <algorithm>

#include "input_file.h"
#include "json.h"
#include "web_api_request.h"
#include "words.h"

namespace qrmctl {
namespace {

using json::Member;

bool IsPort(const Json::Value &value) {
    int port = 0;
    return json::ReadInt(value, port) && ZELO::APIValidator::IsPort(port);
}

// Port 0 is not tried.
bool IsTried(const Json::Value &value) {
    int port = 0;
    return json::ReadInt(value, port) && port > 0;
}

// What keeps an entry from being tried; null when nothing does.
const char *Flaw(const Json::Value &candidate) {
    if (!candidate.isObject()) {
        return "it is no object";
    }
    const char *szHost = json::Text(Member(candidate, "host"));
    if (szHost == nullptr || szHost[0] == '\0') {
        return "\"host\" has to be a text that is not empty";
    }
    if (!IsPort(Member(candidate, "http_port"))) {
        return "\"http_port\" has to be an integer from 0 to 65535";
    }
    if (!IsPort(Member(candidate, "https_port"))) {
        return "\"https_port\" has to be an integer from 0 to 65535";
    }
    return nullptr;
}

}  // namespace

bool ReadCandidates(const std::string &strFile, Report &report, Json::Value &candidates,
                    std::string &strError) {
    if (!ReadJsonFile("candidate list", strFile, candidates, strError)) {
        return false;
    }
    if (!candidates.isArray() || candidates.empty()) {
        strError = "cannot use candidate list '" + strFile + "': it " +
                   (candidates.isArray() ? "is empty, and has to hold one object or more"
                                         : "has to be an array of objects") +
                   " with \"host\", \"http_port\" and \"https_port\"";
        return false;
    }
    for (Json::ArrayIndex i = 0; i < candidates.size(); ++i) {
        const char *szFlaw = Flaw(candidates[i]);
        if (szFlaw != nullptr) {
            report.Warn("candidate " + std::to_string(i + 1) + " of '" + strFile +
                        "' is passed over: " + szFlaw);
        }
    }
    return true;
}

std::string HostFlaw(const std::string &strHost) {
    const bool blForeign = std::any_of(strHost.begin(), strHost.end(), [](char c) {
        return static_cast<unsigned char>(c) <= ' ' || c == '/' || c == 0x7F;
    });
    return blForeign ? "'" + words::Shortened(strHost) +
                           "' is no name or address: leave out 'https://', paths and blanks"
                     : "";
}

std::string CandidateNames(const Json::Value &candidates) {
    std::string strNames;
    for (const Json::Value &candidate : candidates) {
        if (Flaw(candidate) != nullptr) {
            continue;
        }
        const Json::Value &port =
            IsTried(candidate["https_port"]) ? candidate["https_port"] : candidate["http_port"];
        strNames +=
            (strNames.empty() ? "" : ", ") + candidate["host"].asString() + ':' + port.asString();
    }
    return strNames;
}

void ForbidHttp(Json::Value &candidates) {
    for (Json::Value &candidate : candidates) {
        // A port of another type keeps the candidate out altogether.
        if (IsPort(Member(candidate, "http_port"))) {
            candidate["http_port"] = 0;
        }
    }
}

bool HasSecurePort(const Json::Value &candidates) {
    for (const Json::Value &candidate : candidates) {
        if (Flaw(candidate) == nullptr && IsTried(Member(candidate, "https_port"))) {
            return true;
        }
    }
    return false;
}

}  // namespace qrmctl
