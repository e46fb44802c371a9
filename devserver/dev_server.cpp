#include "dev_server.h"

#include <httplib.h>

#include <algorithm>
#include <chrono>

#include "json_text.h"

namespace devserver {
namespace {

using json_text::HasMember;
using json_text::Member;

constexpr const char *kDiscoveryPath = "/qrm/discover";
constexpr const char *kDiscoveryMethod = "discover";
constexpr const char *kJson = "application/json";

enum ErrorCode {
    kBadParameter = 101,
    kUnknownApi = 102,
    kUnknownMethod = 103,
    kUnknownVersion = 104,
    kNoPermission = 105
};

constexpr std::size_t kShownBody = 64UL << 10U;
constexpr std::size_t kKeptRequests = 10'000;

std::string TextOrEmpty(const Json::Value &value) {
    const char *szText = json_text::Text(value);
    return szText == nullptr ? "" : szText;
}

Json::Value Success(const Json::Value &data) {
    Json::Value envelope;
    envelope["success"] = true;
    envelope["data"] = data;
    return envelope;
}

Json::Value Failure(int code) {
    Json::Value envelope;
    envelope["success"] = false;
    envelope["error"]["code"] = code;
    return envelope;
}

void Reply(int status, const Json::Value &value, httplib::Response &response) {
    std::string strText;
    json_text::ToString(value, strText);
    response.status = status;
    response.set_content(strText, kJson);
}

void ReplyAsTold(const NextAnswer &answer, httplib::Response &response) {
    const int status = answer.status.value_or(200);
    if (answer.error_code && !answer.body) {
        Reply(status, Failure(*answer.error_code), response);
        return;
    }
    response.status = status;
    response.set_content(answer.body.value_or(""), kJson);
}

// Promises more than it sends; giving up half-way is what makes the HTTP library close.
void CutReply(std::size_t cut_after, httplib::Response &response) {
    const std::size_t promised = std::max(response.body.size(), cut_after + 1);
    const std::string strSent = response.body.substr(0, cut_after);
    const std::string strType = response.get_header_value("Content-Type");
    response.body.clear();
    response.headers.erase("Content-Type");
    response.set_content_provider(
        promised, strType,
        [strSent](std::size_t /*offset*/, std::size_t /*length*/, httplib::DataSink &sink) {
            sink.write(strSent.data(), strSent.size());
            return false;
        });
}

// The HTTP library adds the connection's addresses to the headers under these names.
bool IsAddedHeader(const std::string &strName) {
    return strName == "REMOTE_ADDR" || strName == "REMOTE_PORT" || strName == "LOCAL_ADDR" ||
           strName == "LOCAL_PORT";
}

Json::Value HeadersOf(const httplib::Request &request) {
    Json::Value headers(Json::objectValue);
    for (const auto &[strName, strValue] : request.headers) {
        if (IsAddedHeader(strName)) {
            continue;
        }
        Json::Value &shown = headers[strName];
        shown = shown.isNull() ? strValue : shown.asString() + ", " + strValue;
    }
    return headers;
}

// The optional parameters of "join": text, except for the numbers.
bool HasJoinTypes(const Json::Value &params) {
    const auto isText = [&params](const char *szKey) {
        return !HasMember(params, szKey) || params[szKey].isString();
    };
    const auto isInteger = [&params](const char *szKey) {
        const Json::ValueType type = Member(params, szKey).type();
        return !HasMember(params, szKey) || type == Json::intValue || type == Json::uintValue;
    };
    return isText("name") && isText("host") && isText("model") && isText("nvo_version") &&
           isInteger("build_number") && isInteger("http_port") && isInteger("https_port");
}

}  // namespace

// A protocol request as far as it could be read.
struct DevServer::Call {
    explicit Call(const httplib::Request &request)
        : strPath(request.path),
          blPost(request.method == "POST"),
          blDiscovery(request.method == "GET" && request.path == kDiscoveryPath) {
        if (blDiscovery) {
            strApi = request.get_param_value("api");
            strMethod = kDiscoveryMethod;
        } else if (blPost) {
            json_text::FromString(request.body, body);
            strApi = TextOrEmpty(Member(body, "api"));
            strMethod = TextOrEmpty(Member(body, "method"));
        }
    }

    std::string strPath;
    bool blPost;
    bool blDiscovery;
    std::string strApi;
    std::string strMethod;
    Json::Value body;
};

// A row for each method; an API stands under one path.
const DevServer::Route DevServer::kRoutes[] = {
    {"ZELO.QRM.RPC", 1, "/qrm/rpc", "join", &DevServer::Join},
};

Json::Value DevServer::Join(const Json::Value &params) {
    const char *szSn = json_text::Text(Member(params, "sn"));
    const char *szToken = json_text::Text(Member(params, "access_token"));
    if (szSn == nullptr || szToken == nullptr || !HasJoinTypes(params)) {
        return Failure(kBadParameter);
    }
    if (szToken != m_options.token) {
        return Failure(kNoPermission);
    }
    Json::Value description = params;
    description.removeMember("access_token");

    const std::lock_guard<std::mutex> lock(m_mutex);
    const auto known =
        std::find_if(m_descriptions.begin(), m_descriptions.end(),
                     [&](const Json::Value &other) { return other["sn"] == params["sn"]; });
    Json::Value data;
    data["id"] = static_cast<int>(known - m_descriptions.begin()) + 1;
    if (known == m_descriptions.end()) {
        m_descriptions.push_back(description);
    } else {
        *known = description;
    }
    return Success(data);
}

void DevServer::Handle(const char *szScheme, const httplib::Request &request,
                       httplib::Response &response) {
    if (request.path.rfind("/dev/", 0) == 0) {
        HandleDevelopment(request, response);
        return;
    }
    const Call call(request);
    Record(szScheme, request, call);
    const NextAnswer answer = TakeAnswer(call).value_or(NextAnswer{});
    Delay(answer.delay_ms);
    if (answer.status || answer.body || answer.error_code) {
        ReplyAsTold(answer, response);
    } else {
        HandleOrdinarily(call, response);
    }
    for (const auto &[strName, strValue] : answer.headers) {
        response.headers.erase(strName);
        response.set_header(strName, strValue);
    }
    if (answer.cut_after) {
        CutReply(*answer.cut_after, response);
    }
}

void DevServer::HandleDevelopment(const httplib::Request &request, httplib::Response &response) {
    const std::string strWhat = request.method + " " + request.path;
    if (strWhat == "GET /dev/requests") {
        Reply(200, Requests(), response);
    } else if (strWhat == "DELETE /dev/requests") {
        ForgetRequests();
        Reply(200, Success(Json::objectValue), response);
    } else if (strWhat == "GET /dev/clients") {
        Reply(200, Clients(), response);
    } else if (strWhat == "POST /dev/next") {
        std::string strApi;
        NextAnswer answer;
        const std::string strError = ReadNextAnswer(request.body, strApi, answer);
        if (strError.empty()) {
            AnswerNext(strApi, answer);
            Reply(200, Success(Json::objectValue), response);
            return;
        }
        Json::Value error;
        error["error"] = strError;
        Reply(400, error, response);
    } else {
        response.status = 404;
    }
}

void DevServer::HandleOrdinarily(const Call &call, httplib::Response &response) {
    const auto route =
        std::find_if(std::begin(kRoutes), std::end(kRoutes), [&call](const Route &candidate) {
            return call.blDiscovery ? call.strApi == candidate.szApi
                                    : call.strPath == candidate.szPath;
        });
    const bool blFound = route != std::end(kRoutes);
    if (call.blDiscovery) {
        Json::Value data;
        data["path"] = blFound ? route->szPath : "";
        Reply(200, blFound ? Success(data) : Failure(kUnknownApi), response);
    } else if (blFound && call.blPost) {
        Reply(200, CarryOut(call), response);
    } else {
        response.status = 404;
    }
}

Json::Value DevServer::CarryOut(const Call &call) {
    int version = 0;
    const Json::Value &params = Member(call.body, "params");
    if (call.strApi.empty() || call.strMethod.empty() || !params.isObject() ||
        !json_text::ReadInt(Member(call.body, "version"), version)) {
        return Failure(kBadParameter);
    }
    int code = kUnknownApi;
    for (const Route &route : kRoutes) {
        if (call.strApi != route.szApi || call.strPath != route.szPath) {
            continue;
        }
        if (version == route.version && call.strMethod == route.szMethod) {
            return (this->*route.Carry)(params);
        }
        if (code != kUnknownMethod) {
            code = version == route.version ? kUnknownMethod : kUnknownVersion;
        }
    }
    return Failure(code);
}

void DevServer::Record(const char *szScheme, const httplib::Request &request, const Call &call) {
    Json::Value record;
    record["scheme"] = szScheme;
    record["method"] = request.method;
    record["path"] = request.path;
    if (!call.strApi.empty()) {
        record["api"] = call.strApi;
    }
    if (!call.strMethod.empty()) {
        record["api_method"] = call.strMethod;
    }
    record["headers"] = HeadersOf(request);
    record["body"] = request.body.substr(0, kShownBody);
    record["connection"] = request.remote_addr + ":" + std::to_string(request.remote_port);

    const std::lock_guard<std::mutex> lock(m_mutex);
    m_requests.push_back(std::move(record));
    if (m_requests.size() > kKeptRequests) {
        m_requests.pop_front();
    }
}

std::optional<NextAnswer> DevServer::TakeAnswer(const Call &call) {
    const std::lock_guard<std::mutex> lock(m_mutex);
    const auto found = std::find_if(m_answers.begin(), m_answers.end(), [&call](const auto &entry) {
        const auto &[strApi, answer] = entry;
        return strApi == call.strApi && (answer.method.empty() || answer.method == call.strMethod);
    });
    if (found == m_answers.end()) {
        return std::nullopt;
    }
    NextAnswer answer = found->second;
    if (--found->second.times <= 0) {
        m_answers.erase(found);
    }
    return answer;
}

void DevServer::Delay(int delay_ms) {
    std::unique_lock<std::mutex> lock(m_mutex);
    m_ending.wait_for(lock, std::chrono::milliseconds(delay_ms), [this] { return m_blEnding; });
}

void DevServer::AnswerNext(const std::string &strApi, const NextAnswer &answer) {
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_answers.emplace_back(strApi, answer);
}

Json::Value DevServer::Requests() const {
    Json::Value requests(Json::arrayValue);
    const std::lock_guard<std::mutex> lock(m_mutex);
    for (const Json::Value &request : m_requests) {
        requests.append(request);
    }
    return requests;
}

void DevServer::ForgetRequests() {
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_requests.clear();
}

Json::Value DevServer::Clients() const {
    Json::Value clients(Json::arrayValue);
    const std::lock_guard<std::mutex> lock(m_mutex);
    for (const Json::Value &description : m_descriptions) {
        Json::Value client;
        client["id"] = clients.size() + 1;
        client["description"] = description;
        clients.append(client);
    }
    return clients;
}

bool DevServer::Start(std::string &strReason) {
    if (!IsLoopback(m_options.host)) {
        strReason = "'" + m_options.host + "' is no loopback address; name 127.0.0.1 or ::1";
        return false;
    }
    ServerCertificate certificate;
    if (!m_authority.Create() || !m_authority.Issue(m_options.certificate, certificate)) {
        strReason = "OpenSSL cannot make the server's certificate";
        return false;
    }
    const auto handlerOf = [this](const char *szScheme) {
        return [this, szScheme](const httplib::Request &request, httplib::Response &response) {
            Handle(szScheme, request, response);
        };
    };
    if (m_http.Start(m_options.host, m_options.http_port, nullptr, handlerOf("http"), strReason) &&
        m_https.Start(m_options.host, m_options.https_port, &certificate, handlerOf("https"),
                      strReason)) {
        return true;
    }
    Stop();
    return false;
}

void DevServer::Stop() {
    {
        const std::lock_guard<std::mutex> lock(m_mutex);
        m_blEnding = true;
    }
    m_ending.notify_all();
    m_http.Stop();
    m_https.Stop();
}

}  // namespace devserver
