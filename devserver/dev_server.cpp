#include "dev_server.h"

#include <httplib.h>

#include <algorithm>
#include <chrono>
#include <ctime>
#include <memory>

#include "console_page.h"
#include "foreign_page.h"
#include "json.h"

namespace devserver {
namespace {

using json::HasMember;
using json::Member;

constexpr const char *kDiscoveryPath = "/qrm/discover";
constexpr const char *kDiscoveryMethod = "discover";

constexpr const char *kFilePath = "/qrm/file";
constexpr const char *kFileType = "application/octet-stream";
constexpr std::int64_t kMaxFile = std::int64_t{1} << 40U;
constexpr std::size_t kMd5Digits = 32;
constexpr int kUnchanged = 304;

enum ErrorCode {
    kBadParameter = 101,
    kUnknownApi = 102,
    kUnknownMethod = 103,
    kUnknownVersion = 104,
    kNoPermission = 105,
    kUnknownClient = 120
};

constexpr std::size_t kShownBody = 64UL << 10U;
constexpr std::size_t kKeptRequests = 10'000;

std::string TextOrEmpty(const Json::Value &value) {
    const char *szText = json::Text(value);
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

Reply Ok(const Json::Value &data) {
    return JsonReply(200, Success(data));
}

Reply Refuse(int code, const char *szReason = nullptr) {
    Json::Value envelope = Failure(code);
    if (szReason != nullptr) {
        envelope["error"]["message"] = szReason;
    }
    return JsonReply(200, envelope);
}

// Where a file is expected, a refusal is no body with status 200: it would be taken for the file.
Reply RefuseFile(int code, const char *szReason) {
    Reply reply = Refuse(code, szReason);
    reply.status = code == kNoPermission ? 403 : 400;
    return reply;
}

Reply AsTold(const NextAnswer &answer) {
    const int status = answer.status.value_or(200);
    if (answer.error_code && !answer.body) {
        return JsonReply(status, Failure(*answer.error_code));
    }
    Reply reply;
    reply.status = status;
    reply.strBody = answer.body.value_or("");
    return reply;
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

Reply DevelopmentError(int status, const std::string &strError) {
    Json::Value error;
    error["error"] = strError;
    return JsonReply(status, error);
}

// For who opens the server's bare address in a browser.
Reply ToConsole() {
    Reply reply;
    reply.status = 302;
    reply.strType = "text/plain";
    reply.headers = {{"Location", kConsolePath}};
    reply.strBody = std::string("The console is at ") + kConsolePath + ".\n";
    return reply;
}

// The optional parameters of a description: text, except for the numbers.
bool HasDescriptionTypes(const Json::Value &params) {
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
            json::FromString(request.body, body);
            strApi = TextOrEmpty(Member(body, "api"));
            strMethod = TextOrEmpty(Member(body, "method"));
            strAuthorization = request.get_header_value("Authorization");
        }
    }

    std::string strPath;
    bool blPost;
    bool blDiscovery;
    std::string strApi;
    std::string strMethod;
    std::string strAuthorization;
    Json::Value body;
};

// A row for each method; an API stands under one path.
const DevServer::Route DevServer::kRoutes[] = {
    {"ZELO.QRM.RPC", 1, "/qrm/rpc", "join", false, &DevServer::Join},
    {"ZELO.QRM.RPC", 1, "/qrm/rpc", "info", true, &DevServer::Info},
    {"ZELO.QRM.RPC.ClientInfo", 1, "/qrm/client-info", "update", true, &DevServer::Update},
    {"ZELO.QRM.RPC.File", 1, kFilePath, "get", true, &DevServer::File},
    {"ZELO.QRM.RPC.Log", 1, "/qrm/log", "push", true, &DevServer::Push},
};

// The caller holds the mutex.
Json::Value *DevServer::FindClient(const Json::Value &sn, int &id) {
    const auto known =
        std::find_if(m_descriptions.begin(), m_descriptions.end(),
                     [&sn](const Json::Value &description) { return description["sn"] == sn; });
    id = static_cast<int>(known - m_descriptions.begin()) + 1;
    return known == m_descriptions.end() ? nullptr : &*known;
}

Reply DevServer::Join(const Json::Value &params) {
    const char *szSn = json::Text(Member(params, "sn"));
    const char *szToken = json::Text(Member(params, "access_token"));
    if (szSn == nullptr || szToken == nullptr || !HasDescriptionTypes(params)) {
        return Refuse(kBadParameter);
    }
    if (szToken != m_options.token) {
        return Refuse(kNoPermission);
    }
    Json::Value description = params;
    description.removeMember("access_token");

    const std::lock_guard<std::mutex> lock(m_mutex);
    int id = 0;
    if (Json::Value *pKnown = FindClient(params["sn"], id)) {
        *pKnown = description;
    } else {
        m_descriptions.push_back(description);
    }
    Json::Value data;
    data["id"] = id;
    return Ok(data);
}

Reply DevServer::Info(const Json::Value & /*params*/) {
    Json::Value data;
    data["name"] = "qrm-devserver";
    data["time"] = static_cast<Json::Int64>(std::time(nullptr));
    const std::lock_guard<std::mutex> lock(m_mutex);
    data["clients"] = static_cast<int>(m_descriptions.size());
    return Ok(data);
}

Reply DevServer::Update(const Json::Value &params) {
    if (json::Text(Member(params, "sn")) == nullptr || !HasDescriptionTypes(params)) {
        return Refuse(kBadParameter);
    }
    const std::lock_guard<std::mutex> lock(m_mutex);
    int id = 0;
    Json::Value *pKnown = FindClient(params["sn"], id);
    if (pKnown == nullptr) {
        return Refuse(kUnknownClient, "no client with this serial number has joined");
    }
    for (const std::string &strName : params.getMemberNames()) {
        (*pKnown)[strName] = params[strName];
    }
    Json::Value data;
    data["id"] = id;
    return Ok(data);
}

Reply DevServer::File(const Json::Value &params) {
    const char *szName = json::Text(Member(params, "name"));
    const Json::Value &size = Member(params, "size");
    if (szName == nullptr || !size.isInt64() || size.asInt64() < 0 || size.asInt64() > kMaxFile) {
        return RefuseFile(kBadParameter, "a file has a \"name\" and a \"size\"");
    }
    Reply reply;
    reply.strType = kFileType;
    reply.pFile =
        std::make_shared<const GeneratedFile>(szName, static_cast<std::uint64_t>(size.asInt64()));
    if (!HasMember(params, "md5")) {
        return reply;
    }
    const std::string strMd5 = TextOrEmpty(Member(params, "md5"));
    if (strMd5.size() != kMd5Digits) {
        return RefuseFile(kBadParameter, "\"md5\" has to be a text of 32 digits");
    }
    if (strMd5 == reply.pFile->Md5()) {
        reply.pFile = nullptr;
        reply.status = kUnchanged;
    }
    return reply;
}

Reply DevServer::Push(const Json::Value &params) {
    const std::string strReason = LogEntries::WhyRefused(params);
    if (!strReason.empty()) {
        return Refuse(kBadParameter, strReason.c_str());
    }
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_log.Add(params);
    return Ok(Json::objectValue);
}

void DevServer::Handle(const char *szScheme, const httplib::Request &request,
                       httplib::Response &response) {
    const auto pause = [this](int ms) { return Delay(ms); };
    if (request.path.rfind("/dev/", 0) == 0) {
        Send(HandleDevelopment(request), {}, pause, {}, response);
        return;
    }
    if (request.method == "GET" && request.path == "/") {
        Send(ToConsole(), {}, pause, {}, response);
        return;
    }
    const Call call(request);
    Record(szScheme, request, call);
    const NextAnswer answer = TakeAnswer(call).value_or(NextAnswer{});
    Delay(answer.delay_ms);
    const bool blTold = answer.status || answer.body || answer.error_code;
    const Reply reply = blTold ? AsTold(answer) : HandleOrdinarily(call);
    const LoopbackListener &listener = request.ssl == nullptr ? m_http : m_https;
    if (answer.no_reply) {
        listener.End(request, true);
    }
    const auto end = [&listener, &request] { listener.End(request, false); };
    Send(reply, answer, pause, end, response);
}

Reply DevServer::HandleDevelopment(const httplib::Request &request) {
    const std::string strForeign = WhyForeign(request);
    if (!strForeign.empty()) {
        return DevelopmentError(403, strForeign);
    }
    const std::string strWhat = request.method + " " + request.path;
    if (strWhat == "GET /dev/requests") {
        return JsonReply(200, Requests());
    }
    if (strWhat == "DELETE /dev/requests") {
        ForgetRequests();
        return Ok(Json::objectValue);
    }
    if (strWhat == "DELETE /dev/next") {
        ForgetAnswers();
        return Ok(Json::objectValue);
    }
    if (strWhat == "GET /dev/clients") {
        return JsonReply(200, Clients());
    }
    if (strWhat == "GET /dev/log") {
        return JsonReply(200, Log());
    }
    if (request.method == "GET") {
        if (const std::optional<Reply> file = ConsoleFile(request.path)) {
            return *file;
        }
    }
    if (strWhat != "POST /dev/next") {
        return Reply{404, "text/plain", "", nullptr};
    }
    std::string strApi;
    NextAnswer answer;
    const std::string strError = ReadNextAnswer(request.body, strApi, answer);
    if (strError.empty()) {
        AnswerNext(strApi, answer);
        return Ok(Json::objectValue);
    }
    return DevelopmentError(400, strError);
}

Reply DevServer::HandleOrdinarily(const Call &call) {
    const auto route =
        std::find_if(std::begin(kRoutes), std::end(kRoutes), [&call](const Route &candidate) {
            return call.blDiscovery ? call.strApi == candidate.szApi
                                    : call.strPath == candidate.szPath;
        });
    const bool blFound = route != std::end(kRoutes);
    if (call.blDiscovery) {
        Json::Value data;
        data["path"] = blFound ? route->szPath : "";
        return blFound ? Ok(data) : Refuse(kUnknownApi);
    }
    return blFound && call.blPost ? CarryOut(call) : Reply{404, "text/plain", "", nullptr};
}

Reply DevServer::CarryOut(const Call &call) {
    // Where a file is expected a refusal must not be taken for it.
    const bool blFile = call.strPath == kFilePath;
    const auto refuse = [blFile](int code) {
        return blFile ? RefuseFile(code, nullptr) : Refuse(code);
    };
    int version = 0;
    const Json::Value &params = Member(call.body, "params");
    if (call.strApi.empty() || call.strMethod.empty() || !params.isObject() ||
        !json::ReadInt(Member(call.body, "version"), version)) {
        return refuse(kBadParameter);
    }
    int code = kUnknownApi;
    for (const Route &route : kRoutes) {
        if (call.strApi != route.szApi || call.strPath != route.szPath) {
            continue;
        }
        if (version == route.version && call.strMethod == route.szMethod) {
            if (!route.blNeedsToken || call.strAuthorization == "Bearer " + m_options.token) {
                return (this->*route.Carry)(params);
            }
            return refuse(kNoPermission);
        }
        if (code != kUnknownMethod) {
            code = version == route.version ? kUnknownMethod : kUnknownVersion;
        }
    }
    return refuse(code);
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

// False when the server is ending.
bool DevServer::Delay(int delay_ms) {
    std::unique_lock<std::mutex> lock(m_mutex);
    return !m_ending.wait_for(lock, std::chrono::milliseconds(delay_ms),
                              [this] { return m_blEnding; });
}

void DevServer::AnswerNext(const std::string &strApi, const NextAnswer &answer) {
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_answers.emplace_back(strApi, answer);
}

void DevServer::ForgetAnswers() {
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_answers.clear();
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

Json::Value DevServer::Log() const {
    const std::lock_guard<std::mutex> lock(m_mutex);
    return m_log.All();
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
