#include "discovery.h"

#include <syslog.h>

#include <algorithm>
#include <map>
#include <mutex>
#include <utility>

#include "appliance.h"
#include "diagnosis.h"
#include "exchange_record.h"
#include "fork_safe.h"
#include "http_exchange.h"
#include "json.h"
#include "never_destroyed.h"
#include "printable.h"
#include "web_api_request.h"

namespace host {
namespace {

constexpr long kStatusOk = 200;
constexpr std::size_t kMaxPath = 1024;
constexpr std::size_t kMaxPaths = 256;

// The paths that this process has learnt, by server and API.
std::mutex g_mutex;
const int g_forkHandlers = HoldAroundForks<g_mutex>();
NeverDestroyed<std::map<std::string, std::string>> g_paths;

std::string Key(const ServerAddress &server, const std::string &api) {
    return server.strProtocol + ' ' + std::to_string(server.port) + ' ' + server.strHost + ' ' +
           api;
}

void Remember(const std::string &strKey, const std::string &strPath) {
    const std::lock_guard<std::mutex> lock(g_mutex);
    if (g_paths->size() >= kMaxPaths) {
        g_paths->clear();
    }
    (*g_paths)[strKey] = strPath;
}

// The path comes from a server and becomes part of an URL.
bool IsPath(const std::string &strPath) {
    return !strPath.empty() && strPath.front() == '/' && strPath.size() <= kMaxPath &&
           std::all_of(strPath.begin(), strPath.end(),
                       [](char c) { return c > ' ' && c <= '~' && c != '?' && c != '#'; });
}

// The path in the answer; without one, why there is none.
std::string ReadAnswer(const HttpReply &reply, std::string &strPath) {
    if (reply.status != kStatusOk) {
        return "answers with status " + std::to_string(reply.status);
    }
    Json::Value envelope;
    if (!json::FromString(reply.strBody, envelope) || !json::HasMember(envelope, "success")) {
        return "does not answer like a QRM server";
    }
    if (!json::IsTrue(json::Member(envelope, "success"))) {
        return "does not serve the Web API";
    }
    const char *const szPath = json::Text(json::Member(json::Member(envelope, "data"), "path"));
    if (szPath == nullptr || !IsPath(szPath)) {
        return "names no path that can be used";
    }
    strPath = szPath;
    return {};
}

}  // namespace

Status AskForPath(const ServerAddress &server, const std::string &api, std::string &strPath) {
    HttpRequest request;
    HOST_TRY(server.Url(appliance::kDiscoveryPath, "api=" + api, request.strUrl));
    request.blRelay = server.IsRelayed();
    HttpReply reply;
    HOST_TRY(Perform(request, reply));
    const std::string strWhyNot = ReadAnswer(reply, strPath);
    if (!strWhyNot.empty()) {
        ZELO::Exchange &record = LatestRecord();
        record.code = YLIBC_ERR_REPLY;
        record.strWords = strWhyNot;
        return HOST_ERROR(YLIBC_ERR_REPLY, printable::Line(record.strUrl) + ": " + strWhyNot)
            .Logged(LOG_WARNING);
    }
    Remember(Key(server, api), strPath);
    return {};
}

Status FindPath(const ServerAddress &server, const std::string &api, std::string &strPath) {
    {
        const std::string strKey = Key(server, api);
        const std::lock_guard<std::mutex> lock(g_mutex);
        const auto at = g_paths->find(strKey);
        if (at != g_paths->end()) {
            strPath = at->second;
            return {};
        }
    }
    return AskForPath(server, api, strPath);
}

void ForgetPath(const ServerAddress &server, const std::string &api) {
    const std::string strKey = Key(server, api);
    const std::lock_guard<std::mutex> lock(g_mutex);
    g_paths->erase(strKey);
}

}  // namespace host

// Short memory is thrown: a caller who took it for silence would try a way that is less safe.
std::string ZELO::CredRequestUtil::GetWebAPIPath(const ZELO_CRED *pCred, const std::string &api) {
    std::string strPath;
    host::Status status = [&]() -> host::Status {
        HOST_REQUIRE(!api.empty());
        host::ServerAddress server;
        HOST_TRY(host::ReadAddress(pCred, server));
        return host::AskForPath(server, api, strPath);
    }();
    if (status.Failed()) {
        status.Publish();
    }
    return strPath;
}

// Short memory is thrown here too: an exchange without a word would be taken for what was met.
bool ZELO::LookAtServer(const Look &look, Exchange &exchange, std::string *pBody) {
    exchange = {};
    host::Status status = [&]() -> host::Status {
        const host::ServerAddress server{look.strProtocol, look.strHost, look.port};
        host::HttpRequest request;
        host::Status usable = server.Url(look.strPath, look.strQuery, request.strUrl);
        if (!usable.Failed() && look.limit_ms <= 0) {
            usable = HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT, "no time is left");
        }
        if (usable.Failed()) {
            exchange.error = CRED_REQ_ERR_ARGUMENT;
            exchange.code = usable.Code();
            exchange.strWords = usable.Words();
            return usable;
        }
        request.blRelay = server.IsRelayed();
        request.blVerify = look.blVerify;
        request.blOwnConnection = true;
        request.limit_ms = look.limit_ms;
        host::HttpReply reply;
        host::Status performed = host::Perform(request, reply);
        exchange = LatestExchange();
        if (pBody != nullptr) {
            *pBody = std::move(reply.strBody);
        }
        return performed;
    }();
    if (status.Failed()) {
        status.Publish();
    }
    return !status.Failed();
}
