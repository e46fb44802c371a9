// Web API requests: calls of a server's methods.

#include "web_api_request.h"

#include <algorithm>
#include <new>
#include <utility>

#include "discovery.h"
#include "http_exchange.h"
#include "json.h"
#include "server_address.h"
#include "status.h"
#include "store/credential_record.h"

namespace ZELO {
namespace {

constexpr const char *kDigest = "md5";
constexpr long kStatusNotFound = 404;

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

}  // namespace

struct CredRequest::Impl {
    host::ServerAddress server;
    std::string strUrl;
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

    host::Status SetTokens(const ZELO_CRED_SESS &sess) {
        strAccessToken = sess.accessToken.value_or("");
        strCsrfToken = sess.csrfToken.value_or("");
        HOST_REQUIRE(IsHeaderValue(strAccessToken) && IsHeaderValue(strCsrfToken));
        return {};
    }

    host::Status SetUrl(const ZELO_CRED *pCred, const std::string &api, int ver,
                        const std::string &method) {
        HOST_REQUIRE(!api.empty() && !method.empty());
        host::ServerAddress address;
        std::string strPath;
        HOST_TRY(host::ReadAddress(pCred, address));
        HOST_TRY(host::FindPath(address, api, strPath));
        HOST_TRY(address.Url(strPath, "", strUrl));
        server = std::move(address);
        strApi = api;
        version = ver;
        strMethod = method;
        return {};
    }

    host::Status AddParams(const Json::Value &more) {
        HOST_REQUIRE(more.isObject());
        for (auto member = more.begin(); member != more.end(); ++member) {
            params[member.name()] = *member;
        }
        return {};
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

    host::Status Exchange(bool blKeepConnection, int timeout_s) {
        strResponse.clear();
        host::HttpRequest request;
        request.strUrl = strUrl;
        request.blRelay = server.IsRelayed();
        request.blPost = true;
        request.blKeepConnection = blKeepConnection;
        request.limit_ms = timeout_s * 1000LL;
        request.pStream = pStream;
        request.pfnWrite = pfnWrite;
        request.blHasCopy = params.isMember(kDigest);
        AddHeaders(request.headers);
        if (strUrl.empty() || !BuildBody(request.strBody)) {
            error = CRED_REQ_ERR_ARGUMENT;
            return HOST_ERROR(
                YLIBC_ERR_INVALID_ARGUMENT,
                strUrl.empty() ? "the request has no URL" : "the parameters are nested too deeply");
        }
        host::HttpReply reply;
        host::Status status = host::Perform(request, reply);
        error = reply.error;
        if (reply.status == kStatusNotFound) {
            host::ForgetPath(server, strApi);
        }
        if (!status.Failed()) {
            strResponse.swap(reply.strBody);
        }
        return status;
    }
};

// For a request that was made while memory was short.
#define REQUIRE_IMPL(pImpl)                                                          \
    do {                                                                             \
        if ((pImpl) == nullptr) {                                                    \
            return HOST_ERROR(YLIBC_ERR_OUT_OF_MEMORY, "the request has no memory"); \
        }                                                                            \
    } while (false)

bool CredRequestUtil::SetWebAPIURL(const ZELO_CRED *pCred, const std::string &api, int ver,
                                   const std::string &method, CredRequest *pRequest) {
    bool blSet = true;
    return HOST_OPERATION(false, blSet, [&]() -> host::Status {
        // Made with new (std::nothrow), it is null when memory is short.
        REQUIRE_IMPL(pRequest);
        REQUIRE_IMPL(pRequest->m_pImpl);
        return pRequest->m_pImpl->SetUrl(pCred, api, ver, method);
    });
}

CredRequest *CredRequest::CreateWebAPIRequest(const ZELO_CRED *pCred, const ZELO_CRED_SESS *pSess,
                                              const std::string &api, int ver,
                                              const std::string &method,
                                              const Json::Value &params) {
    using RequestHandle = std::unique_ptr<CredRequest>;
    RequestHandle pRequest;
    const auto create = [&]() -> host::Status {
        HOST_REQUIRE(pSess != nullptr);
        pRequest = std::make_unique<CredRequest>();
        REQUIRE_IMPL(pRequest->m_pImpl);
        Impl &impl = *pRequest->m_pImpl;
        HOST_TRY(impl.SetTokens(*pSess));
        HOST_TRY(impl.AddParams(params.isNull() ? Json::Value(Json::objectValue) : params));
        return impl.SetUrl(pCred, api, ver, method);
    };
    return HOST_OPERATION(RequestHandle(), pRequest, create).release();
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
    static_cast<void>(HOST_OPERATION([&]() -> host::Status {
        m_pImpl = std::make_unique<Impl>();
        return {};
    }));
}

CredRequest::~CredRequest() = default;

bool CredRequest::AddPostParam(const Json::Value &params) {
    bool blAdded = true;
    return HOST_OPERATION(false, blAdded, [&]() -> host::Status {
        REQUIRE_IMPL(m_pImpl);
        return m_pImpl->AddParams(params);
    });
}

bool CredRequest::SetEncryptMode(_tag_CRED_REQ_CRYPTO mode) {
    bool blSet = true;
    return HOST_OPERATION(false, blSet, [&]() -> host::Status {
        REQUIRE_IMPL(m_pImpl);
        HOST_REQUIRE(mode >= CRED_REQ_CRYPTO_NONE && mode <= CRED_REQ_CRYPTO_PARAMS);
        m_pImpl->encryptMode = mode;
        return {};
    });
}

bool CredRequest::Process(bool blKeepConnection, int timeout_s) {
    bool blDone = true;
    return HOST_OPERATION(false, blDone, [&]() -> host::Status {
        REQUIRE_IMPL(m_pImpl);
        m_pImpl->error = CRED_REQ_ERR_MEMORY;  // where nothing comes back
        return m_pImpl->Exchange(blKeepConnection, timeout_s);
    });
}

bool CredRequest::SetRespStream(std::FILE *pStream, RespWriteCallback pfnWrite) {
    bool blSet = true;
    return HOST_OPERATION(false, blSet, [&]() -> host::Status {
        REQUIRE_IMPL(m_pImpl);
        HOST_REQUIRE(pStream != nullptr);
        m_pImpl->pStream = pStream;
        m_pImpl->pfnWrite = pfnWrite;
        return {};
    });
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

bool APIValidator::IsPort(const int &port) {
    return port >= 0 && port <= 65535;
}

}  // namespace ZELO
