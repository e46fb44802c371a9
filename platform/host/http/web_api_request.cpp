// Web API requests: discovery of an API's path and calls of its methods.

#include "web_api_request.h"

#include <syslog.h>

#include <algorithm>
#include <map>
#include <mutex>
#include <new>
#include <utility>

#include "diagnosis.h"
#include "exchange_record.h"
#include "fork_safe.h"
#include "http_exchange.h"
#include "json.h"
#include "never_destroyed.h"
#include "printable.h"
#include "status.h"
#include "store/credential_record.h"

namespace ZELO {
namespace {

constexpr const char *kFile = "web_api_request";
constexpr const char *kDigest = "md5";
constexpr const char *kDiscoveryPath = "/qrm/discover";
constexpr long kStatusOk = 200;
constexpr long kStatusNotFound = 404;
constexpr std::size_t kMaxPath = 1024;
constexpr std::size_t kMaxUrls = 256;

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
    std::string Url(const std::string &strPath, const std::string &strQuery = "") const {
        return host::BuildUrl(strScheme, strHost, port, strPath, strQuery);
    }
};

bool ReadServer(const std::string &strProtocol, const std::string &strHost, long port,
                Server &server) {
    if (strProtocol != "https" && strProtocol != "http" && strProtocol != "fld") {
        return false;
    }
    server.blRelay = strProtocol == "fld";
    server.strScheme = server.blRelay ? "https" : strProtocol;
    server.strHost = strHost;
    server.port = port;
    return !server.strHost.empty();
}

bool ReadServer(const ZELO_CRED *pCred, Server &server) {
    return pCred != nullptr && pCred->protocol && pCred->host && pCred->port &&
           ReadServer(*pCred->protocol, *pCred->host, *pCred->port, server);
}

// The URLs that this process has learnt, by server and API.
std::mutex g_urlMutex;
const int g_forkHandlers = HoldAroundForks<g_urlMutex>();
host::NeverDestroyed<std::map<std::string, std::string>> g_urls;

std::string FindUrl(const std::string &strKey) {
    const std::lock_guard<std::mutex> lock(g_urlMutex);
    const auto at = g_urls->find(strKey);
    return at == g_urls->end() ? std::string() : at->second;
}

void LearnUrl(const std::string &strKey, const std::string &strUrl) {
    const std::lock_guard<std::mutex> lock(g_urlMutex);
    if (g_urls->size() >= kMaxUrls) {
        g_urls->clear();
    }
    (*g_urls)[strKey] = strUrl;
}

void ForgetUrl(const std::string &strKey) {
    const std::lock_guard<std::mutex> lock(g_urlMutex);
    g_urls->erase(strKey);
}

// Runs the body; short memory becomes the failure value.
template <typename Result, typename Body>
Result NoThrow(Result failure, Body &&body) {
    try {
        return std::forward<Body>(body)();
    } catch (const std::bad_alloc &) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
        return failure;
    }
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

// A token becomes part of a header line: it must not end it, or begin another one.
bool IsHeaderValue(const std::string &strToken) {
    return std::all_of(strToken.begin(), strToken.end(),
                       [](unsigned char c) { return c > ' ' && c != 0x7F; });
}

// The text as a JSON text. A name of letters, digits and dots, as nearly all are, only needs
// quotes.
std::string Quoted(const std::string &strText) {
    const bool blPlain = std::all_of(strText.begin(), strText.end(), [](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
               c == '.';
    });
    if (blPlain) {
        return '"' + strText + '"';
    }
    std::string strQuoted;
    json::ToString(strText, strQuoted);
    return strQuoted;
}

struct Observer {
    CredRequestUtil::ProgressObserver pfn = nullptr;
    void *pContext = nullptr;
};

thread_local Observer t_observer;

// A server without a path for the API: says why. The query names nothing that helps, and it came
// from a caller.
std::string NoPath(const std::string &strUrl, const std::string &strReason, int line) {
    Exchange &record = host::LatestRecord();
    record.code = YLIBC_ERR_REPLY;
    record.strWords = strReason;
    syslog(LOG_WARNING, "%s:%d %s: %s", kFile, line,
           printable::Line(strUrl.substr(0, strUrl.find('?'))).c_str(), strReason.c_str());
    host::Status(YLIBC_ERR_REPLY, kFile, line, strReason).Publish();
    return {};
}

std::string Discover(const Server &server, const std::string &api) {
    host::HttpRequest request;
    request.strUrl = server.Url(kDiscoveryPath, "api=" + api);
    request.blRelay = server.blRelay;
    request.pfnObserver = t_observer.pfn;
    request.pObserverContext = t_observer.pContext;
    host::HttpReply reply;
    if (request.strUrl.empty()) {
        syslog(LOG_WARNING, "%s:%d a host or port that cannot stand in an URL", kFile, __LINE__);
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return {};
    }
    if (host::Perform(request, reply) != CRED_REQ_ERR_NONE) {
        return {};
    }
    if (reply.status != kStatusOk) {
        return NoPath(request.strUrl, "answers with status " + std::to_string(reply.status),
                      __LINE__);
    }
    Json::Value envelope;
    if (!json::FromString(reply.strBody, envelope) || !json::HasMember(envelope, "success")) {
        return NoPath(request.strUrl, "does not answer like a QRM server", __LINE__);
    }
    if (!json::IsTrue(json::Member(envelope, "success"))) {
        return NoPath(request.strUrl, "does not serve the Web API", __LINE__);
    }
    const char *szPath = json::Text(json::Member(json::Member(envelope, "data"), "path"));
    if (szPath == nullptr || !IsPath(szPath)) {
        return NoPath(request.strUrl, "names no path that can be used", __LINE__);
    }
    LearnUrl(server.Key(api), server.Url(szPath));
    return szPath;
}

}  // namespace

struct CredRequest::Impl {
    std::string strUrl;
    std::string strUrlKey;
    bool blRelay = false;
    std::string strApi;
    int version = 0;
    std::string strMethod;
    Json::Value params{Json::objectValue};
    _tag_CRED_REQ_CRYPTO encryptMode = CRED_REQ_CRYPTO_NONE;
    std::string strAccessToken;
    std::string strCsrfToken;
    std::FILE *pStream = nullptr;
    RespWriteCallback pfnWrite = nullptr;
    int error = CRED_REQ_ERR_NONE;
    std::string strResponse;

    bool SetTokens(const ZELO_CRED_SESS &sess) {
        strAccessToken = sess.accessToken.value_or("");
        strCsrfToken = sess.csrfToken.value_or("");
        return IsHeaderValue(strAccessToken) && IsHeaderValue(strCsrfToken);
    }

    bool SetUrl(const ZELO_CRED *pCred, const std::string &api, int ver,
                const std::string &method) {
        Server server;
        if (!ReadServer(pCred, server) || api.empty() || method.empty()) {
            HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
            return false;
        }
        strUrlKey = server.Key(api);
        strUrl = FindUrl(strUrlKey);
        if (strUrl.empty()) {
            const std::string strPath = Discover(server, api);
            if (strPath.empty()) {
                return false;
            }
            strUrl = server.Url(strPath);
        }
        blRelay = server.blRelay;
        strApi = api;
        version = ver;
        strMethod = method;
        return !strUrl.empty();
    }

    void AddHeaders(std::vector<std::string> &headers) const {
        if (!strAccessToken.empty()) {
            headers.push_back("Authorization: Bearer " + strAccessToken);
        }
        if (!strCsrfToken.empty()) {
            headers.push_back("X-QRM-CSRF-Token: " + strCsrfToken);
        }
    }

    // Around the values: a JSON value of the whole, made for one call, takes as much time as the
    // parameters of many.
    bool BuildBody(std::string &strBody) const {
        std::string strParams = "{}";
        // The parameters stand one level below the whole.
        if (!params.empty() && !json::ToString(params, strParams, json::kMaxDepth - 1)) {
            return false;
        }
        strBody = R"({"api":)" + Quoted(strApi) + R"(,"method":)" + Quoted(strMethod) +
                  R"(,"params":)" + strParams + R"(,"version":)" + std::to_string(version) + '}';
        return true;
    }

    // Returns a value of CRED_REQ_ERROR.
    int Exchange(bool blKeepConnection, int timeout_s) {
        strResponse.clear();
        host::HttpRequest request;
        request.strUrl = strUrl;
        request.blRelay = blRelay;
        request.blPost = true;
        request.blKeepConnection = blKeepConnection;
        request.timeout_ms = timeout_s * 1000LL;
        request.pStream = pStream;
        request.pfnWrite = pfnWrite;
        request.blHasCopy = params.isMember(kDigest);
        request.pfnObserver = t_observer.pfn;
        request.pObserverContext = t_observer.pContext;
        AddHeaders(request.headers);
        if (strUrl.empty() || !BuildBody(request.strBody)) {
            HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
            return CRED_REQ_ERR_ARGUMENT;
        }
        host::HttpReply reply;
        const int result = host::Perform(request, reply);
        if (reply.status == kStatusNotFound) {
            ForgetUrl(strUrlKey);
        }
        if (result == CRED_REQ_ERR_NONE) {
            strResponse.swap(reply.strBody);
        }
        return result;
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
    if (pRequest == nullptr || pRequest->m_pImpl == nullptr) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    return NoThrow(false, [&] { return pRequest->m_pImpl->SetUrl(pCred, api, ver, method); });
}

void CredRequestUtil::SetProgressObserver(ProgressObserver pfnObserver, void *pContext) {
    t_observer = {pfnObserver, pContext};
}

CredRequest *CredRequest::CreateWebAPIRequest(const ZELO_CRED *pCred, const ZELO_CRED_SESS *pSess,
                                              const std::string &api, int ver,
                                              const std::string &method,
                                              const Json::Value &params) {
    if (pSess == nullptr || !(params.isObject() || params.isNull())) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return nullptr;
    }
    return NoThrow<CredRequest *>(nullptr, [&]() -> CredRequest * {
        auto pRequest = std::make_unique<CredRequest>();
        if (pRequest->m_pImpl == nullptr || !pRequest->m_pImpl->SetTokens(*pSess)) {
            HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
            return nullptr;
        }
        if (!CredRequestUtil::SetWebAPIURL(pCred, api, ver, method, pRequest.get()) ||
            !(params.isNull() || pRequest->AddPostParam(params))) {
            return nullptr;
        }
        return pRequest.release();
    });
}

CredRequest *CredRequest::CreateWebAPIRequest(long id, const std::string &api, int ver,
                                              const std::string &method,
                                              const Json::Value &params) {
    ZELO_CRED cred;
    ZELO_CRED_SESS sess;
    if (id < 0 || ZELOCredLoad(id, &cred) < 0 || ZELOCredSessLoad(id, &sess) < 0) {
        return nullptr;
    }
    return CreateWebAPIRequest(&cred, &sess, api, ver, method, params);
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
    return NoThrow(false, [&] {
        for (auto member = params.begin(); member != params.end(); ++member) {
            m_pImpl->params[member.name()] = *member;
        }
        return true;
    });
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
    if (m_pImpl == nullptr) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
        return false;
    }
    m_pImpl->error = NoThrow<int>(CRED_REQ_ERR_MEMORY, [&]() -> int {
        return m_pImpl->Exchange(blKeepConnection, timeout_s);
    });
    return m_pImpl->error == CRED_REQ_ERR_NONE;
}

bool CredRequest::SetRespStream(std::FILE *pStream, RespWriteCallback pfnWrite) {
    if (m_pImpl == nullptr || pStream == nullptr) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return false;
    }
    m_pImpl->pStream = pStream;
    m_pImpl->pfnWrite = pfnWrite;
    return true;
}

int CredRequest::GetError() const {
    return m_pImpl == nullptr ? CRED_REQ_ERR_MEMORY : m_pImpl->error;
}

std::string CredRequest::GetResponse() const {
    return m_pImpl == nullptr ? std::string() : m_pImpl->strResponse;
}

std::string CredRequest::GetURL() const {
    return m_pImpl == nullptr ? std::string() : m_pImpl->strUrl;
}

bool LookAtServer(const Look &look, Exchange &exchange, std::string *pBody) {
    Server server;
    host::HttpRequest request;
    exchange = {};
    if (ReadServer(look.strProtocol, look.strHost, look.port, server)) {
        request.strUrl = server.Url(look.strPath, look.strQuery);
    }
    if (request.strUrl.empty() || look.limit_ms <= 0) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        exchange.error = CRED_REQ_ERR_ARGUMENT;
        exchange.code = YLIBC_ERR_INVALID_ARGUMENT;
        exchange.strWords = "the protocol, the host or the port cannot stand in an URL";
        return false;
    }
    request.blRelay = server.blRelay;
    request.blVerify = look.blVerify;
    request.blOwnConnection = true;
    request.timeout_ms = look.limit_ms;
    request.pfnObserver = t_observer.pfn;
    request.pObserverContext = t_observer.pContext;
    host::HttpReply reply;
    const bool blWhole = host::Perform(request, reply) == CRED_REQ_ERR_NONE;
    exchange = LatestExchange();
    if (pBody != nullptr) {
        *pBody = std::move(reply.strBody);
    }
    return blWhole;
}

bool APIValidator::IsPort(const int &port) {
    return port >= 0 && port <= 65535;
}

}  // namespace ZELO
