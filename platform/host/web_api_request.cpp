// Web API requests: discovery of an API's path and calls of its methods.

#include "../web_api_request.h"

#include <map>
#include <mutex>
#include <new>

#include "credential_record.h"
#include "http_exchange.h"
#include "json_text.h"
#include "last_error.h"

namespace ZELO {
namespace {

constexpr const char *kFile = "web_api_request";
constexpr const char *kDiscoveryPath = "/qrm/discover";
constexpr long kStatusOk = 200;
constexpr long kStatusNotFound = 404;
constexpr std::size_t kMaxPath = 1024;
constexpr std::size_t kMaxPaths = 256;

// A server as its credential record describes it.
struct Server {
    std::string strScheme;
    std::string strHost;
    long port = 0;
    bool blRelay = false;

    std::string Key(const std::string &api) const {
        return (blRelay ? "fld" : strScheme) + ' ' + std::to_string(port) + ' ' + strHost + ' ' +
               api;
    }
};

bool ReadServer(const ZELO_CRED *pCred, Server &server) {
    if (pCred == nullptr || !pCred->protocol || !pCred->host || !pCred->port) {
        return false;
    }
    const std::string &strProtocol = *pCred->protocol;
    if (strProtocol != "https" && strProtocol != "http" && strProtocol != "fld") {
        return false;
    }
    server.blRelay = strProtocol == "fld";
    server.strScheme = server.blRelay ? "https" : strProtocol;
    server.strHost = *pCred->host;
    server.port = *pCred->port;
    return !server.strHost.empty();
}

// The paths that this process has learnt, by server and API.
class PathCache {
  public:
    std::string Find(const std::string &strKey) {
        const std::lock_guard<std::mutex> lock(m_mutex);
        const auto at = m_paths.find(strKey);
        return at == m_paths.end() ? std::string() : at->second;
    }
    void Learn(const std::string &strKey, const std::string &strPath) {
        const std::lock_guard<std::mutex> lock(m_mutex);
        if (m_paths.size() >= kMaxPaths) {
            m_paths.clear();
        }
        m_paths[strKey] = strPath;
    }
    void Forget(const std::string &strKey) {
        const std::lock_guard<std::mutex> lock(m_mutex);
        m_paths.erase(strKey);
    }

  private:
    std::mutex m_mutex;
    std::map<std::string, std::string> m_paths;
};

PathCache &Paths() {
    static auto *const pPaths = new PathCache;
    return *pPaths;
}

// The path comes from a server and becomes part of an URL.
bool IsPath(const std::string &strPath) {
    if (strPath.empty() || strPath.front() != '/' || strPath.size() > kMaxPath) {
        return false;
    }
    for (char c : strPath) {
        if (c <= ' ' || c > '~' || c == '?' || c == '#') {
            return false;
        }
    }
    return true;
}

std::string Discover(const Server &server, const std::string &api) {
    host::HttpRequest request;
    request.strUrl =
        host::BuildUrl(server.strScheme, server.strHost, server.port, kDiscoveryPath, "api=" + api);
    request.blRelay = server.blRelay;
    host::HttpReply reply;
    if (request.strUrl.empty()) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return {};
    }
    if (!host::Perform(request, reply)) {
        return {};
    }
    Json::Value envelope;
    if (reply.status != kStatusOk || !json_text::FromString(reply.strBody, envelope) ||
        !json_text::IsTrue(json_text::Member(envelope, "success"))) {
        HOST_FAIL(YLIBC_ERR_REPLY);
        return {};
    }
    const char *szPath =
        json_text::Text(json_text::Member(json_text::Member(envelope, "data"), "path"));
    if (szPath == nullptr || !IsPath(szPath)) {
        HOST_FAIL(YLIBC_ERR_REPLY);
        return {};
    }
    Paths().Learn(server.Key(api), szPath);
    return szPath;
}

}  // namespace

struct CredRequest::Impl {
    std::string strUrl;
    std::string strPathKey;
    bool blRelay = false;
    std::string strApi;
    int version = 0;
    std::string strMethod;
    Json::Value params{Json::objectValue};
    _tag_CRED_REQ_CRYPTO encryptMode = CRED_REQ_CRYPTO_NONE;
    std::string strResponse;

    bool BuildBody(std::string &strBody) const {
        Json::Value call(Json::objectValue);
        call["api"] = strApi;
        call["version"] = version;
        call["method"] = strMethod;
        call["params"] = params;
        return json_text::ToString(call, strBody);
    }
};

std::string CredRequestUtil::GetWebAPIPath(const ZELO_CRED *pCred, const std::string &api) {
    Server server;
    if (!ReadServer(pCred, server) || api.empty()) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return {};
    }
    return Discover(server, api);
}

bool CredRequestUtil::SetWebAPIURL(const ZELO_CRED *pCred, const std::string &api, int ver,
                                   const std::string &method, CredRequest *pRequest) {
    Server server;
    if (!ReadServer(pCred, server) || api.empty() || method.empty() || pRequest == nullptr ||
        pRequest->m_pImpl == nullptr) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    std::string strPath = Paths().Find(server.Key(api));
    if (strPath.empty()) {
        strPath = Discover(server, api);
    }
    if (strPath.empty()) {
        return false;
    }
    CredRequest::Impl &impl = *pRequest->m_pImpl;
    impl.strUrl = host::BuildUrl(server.strScheme, server.strHost, server.port, strPath, "");
    impl.strPathKey = server.Key(api);
    impl.blRelay = server.blRelay;
    impl.strApi = api;
    impl.version = ver;
    impl.strMethod = method;
    return !impl.strUrl.empty();
}

// A request whose memory is short from the start is one without an Impl: it refuses everything.
CredRequest::CredRequest() noexcept {
    try {
        m_pImpl = std::make_unique<Impl>();
    } catch (const std::bad_alloc &) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

CredRequest::~CredRequest() = default;

bool CredRequest::AddPostParam(const Json::Value &params) {
    if (m_pImpl == nullptr || !params.isObject()) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    for (auto member = params.begin(); member != params.end(); ++member) {
        m_pImpl->params[member.name()] = *member;
    }
    return true;
}

bool CredRequest::SetEncryptMode(_tag_CRED_REQ_CRYPTO mode) {
    if (m_pImpl == nullptr || mode < CRED_REQ_CRYPTO_NONE || mode > CRED_REQ_CRYPTO_PARAMS) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    m_pImpl->encryptMode = mode;
    return true;
}

bool CredRequest::Process(bool blKeepConnection, int timeout_s) {
    if (m_pImpl == nullptr || m_pImpl->strUrl.empty()) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    m_pImpl->strResponse.clear();
    host::HttpRequest request;
    request.strUrl = m_pImpl->strUrl;
    request.blRelay = m_pImpl->blRelay;
    request.blPost = true;
    request.blKeepConnection = blKeepConnection;
    request.timeout_s = timeout_s;
    if (!m_pImpl->BuildBody(request.strBody)) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    host::HttpReply reply;
    if (!host::Perform(request, reply)) {
        return false;
    }
    if (reply.status == kStatusNotFound) {
        Paths().Forget(m_pImpl->strPathKey);
    }
    m_pImpl->strResponse.swap(reply.strBody);
    return true;
}

std::string CredRequest::GetResponse() const {
    return m_pImpl == nullptr ? std::string() : m_pImpl->strResponse;
}

std::string CredRequest::GetURL() const {
    return m_pImpl == nullptr ? std::string() : m_pImpl->strUrl;
}

bool APIValidator::IsPort(const int &port) {
    return port >= 0 && port <= 65535;
}

}  // namespace ZELO
