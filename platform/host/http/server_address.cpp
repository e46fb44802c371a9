#include "server_address.h"

#include <curl/curl.h>

#include <algorithm>
#include <memory>

#include "printable.h"
#include "store/credential_record.h"

namespace host {
namespace {

struct CleanupUrl {
    void operator()(CURLU *pUrl) const { curl_url_cleanup(pUrl); }
};
struct FreeText {
    void operator()(char *sz) const { curl_free(sz); }
};

// libcurl would take a host with control characters, and so would a log line.
bool CanStandInUrl(const ServerAddress &server) {
    return server.port >= 1 && server.port <= 65535 &&
           std::none_of(server.strHost.begin(), server.strHost.end(),
                        [](unsigned char c) { return c <= ' ' || c == 0x7F; });
}

bool BuildUrl(const ServerAddress &server, const std::string &strPath, const std::string &strQuery,
              std::string &strUrl) {
    const std::string &strHost = server.strHost;
    const bool blBareIPv6 = strHost.find(':') != std::string::npos && strHost.front() != '[';
    const std::string strUrlHost = blBareIPv6 ? '[' + strHost + ']' : strHost;
    const std::unique_ptr<CURLU, CleanupUrl> pUrl(curl_url());
    const auto set = [&](CURLUPart part, const std::string &strText, unsigned int flags = 0) {
        return curl_url_set(pUrl.get(), part, strText.c_str(), flags) == CURLUE_OK;
    };
    char *szUrl = nullptr;
    if (!set(CURLUPART_SCHEME, server.IsRelayed() ? "https" : server.strProtocol) ||
        !set(CURLUPART_HOST, strUrlHost) || !set(CURLUPART_PORT, std::to_string(server.port)) ||
        !set(CURLUPART_PATH, strPath) ||
        (!strQuery.empty() &&
         !set(CURLUPART_QUERY, strQuery, CURLU_APPENDQUERY | CURLU_URLENCODE)) ||
        curl_url_get(pUrl.get(), CURLUPART_URL, &szUrl, 0) != CURLUE_OK) {
        return false;
    }
    strUrl = std::unique_ptr<char, FreeText>(szUrl).get();
    return true;
}

}  // namespace

Status ServerAddress::Url(const std::string &strPath, const std::string &strQuery,
                          std::string &strUrl) const {
    if (strProtocol != "https" && strProtocol != "http" && !IsRelayed()) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT,
                          "the protocol '" + printable::Line(strProtocol) + "' is none of ours");
    }
    if (!CanStandInUrl(*this) || !BuildUrl(*this, strPath, strQuery, strUrl)) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT,
                          "a host or port that cannot stand in an URL: '" +
                              printable::Line(strHost) + "', " + std::to_string(port));
    }
    return {};
}

std::string HostAndPortOf(const std::string &strUrl) {
    const std::size_t begin = strUrl.find("//") + 2;
    return strUrl.substr(begin, strUrl.find_first_of("/?", begin) - begin);
}

Status ReadAddress(const ZELO_CRED *pCred, ServerAddress &address) {
    HOST_REQUIRE(pCred != nullptr && pCred->protocol && pCred->host && pCred->port);
    address = {*pCred->protocol, *pCred->host, *pCred->port};
    return {};
}

}  // namespace host
