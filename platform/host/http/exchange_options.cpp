#include "exchange_options.h"

#include <new>

#include "files/key_value_lookup.h"
#include "server_address.h"

namespace host {
namespace {

// A server that sends a byte now and then stalls too.
constexpr long kStallBytesPerSecond = 100;
constexpr long kStallTime_s = 30;
constexpr long kStreamBuffer = 512 * 1024L;
constexpr long kReplyBuffer = 16 * 1024L;
// What is sent is small, while libcurl allocates and frees its buffer for each exchange.
constexpr long kUploadBuffer = 16 * 1024L;

// Without memory for a text libcurl would do without it: with another proxy, or none.
void SetText(CURL *pEasy, CURLoption option, const char *szText) {
    if (curl_easy_setopt(pEasy, option, szText) != CURLE_OK) {
        throw std::bad_alloc();
    }
}

void SetTransport(CURL *pEasy) {
    curl_easy_setopt(pEasy, CURLOPT_NOSIGNAL, 1L);
    SetText(pEasy, CURLOPT_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(pEasy, CURLOPT_FOLLOWLOCATION, 0L);
    curl_easy_setopt(pEasy, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
    curl_easy_setopt(pEasy, CURLOPT_CONNECTTIMEOUT, kConnectLimit_s);
    // A name server that is silent is not waited for.
    curl_easy_setopt(pEasy, CURLOPT_QUICK_EXIT, 1L);
    curl_easy_setopt(pEasy, CURLOPT_LOW_SPEED_LIMIT, kStallBytesPerSecond);
    curl_easy_setopt(pEasy, CURLOPT_LOW_SPEED_TIME, kStallTime_s);
    curl_easy_setopt(pEasy, CURLOPT_UPLOAD_BUFFERSIZE, kUploadBuffer);
    curl_easy_setopt(pEasy, CURLOPT_SUPPRESS_CONNECT_HEADERS, 1L);
}

// Chooses the way: through the relay, as the environment says where the configuration allows it, or
// direct.
Status SetWay(const CurlHandle &handle, bool blRelay) {
    CURL *const pEasy = handle.pEasy.get();
    std::string strValue;
    if (blRelay) {
        if (!LookUpSetting("farlink_relay", strValue) || strValue.empty()) {
            return HOST_ERROR(YLIBC_ERR_NETWORK,
                              "no relay: set farlink_relay=\"host:port\" in /etc/zeloinfo.conf");
        }
        SetText(pEasy, CURLOPT_PROXY, ("http://" + strValue).c_str());
        SetText(pEasy, CURLOPT_NOPROXY, "");
        curl_easy_setopt(pEasy, CURLOPT_HTTPPROXYTUNNEL, 1L);
        return {};
    }
    const bool blEnvironment = handle.blNamesProxy &&
                               LookUpSetting("use_proxy_environment", strValue) &&
                               strValue == "yes";
    SetText(pEasy, CURLOPT_PROXY, blEnvironment ? nullptr : "");
    return {};
}

void Append(const std::string &strHeader, Headers &headers) {
    curl_slist *const pLonger = curl_slist_append(headers.get(), strHeader.c_str());
    if (pLonger == nullptr) {
        throw std::bad_alloc();
    }
    static_cast<void>(headers.release());
    headers.reset(pLonger);
}

void SetHeaders(const HttpRequest &request, CURL *pEasy, Headers &headers) {
    Append("Accept: application/json", headers);
    Append("Accept-Encoding: identity", headers);
    if (request.blPost) {
        Append("Content-Type: application/json", headers);
        // No waiting for a "100 Continue" that some servers never send.
        Append("Expect:", headers);
    }
    for (const std::string &strHeader : request.headers) {
        Append(strHeader, headers);
    }
    curl_easy_setopt(pEasy, CURLOPT_HTTPHEADER, headers.get());
}

void SetRequest(const HttpRequest &request, CURL *pEasy) {
    SetText(pEasy, CURLOPT_URL, request.strUrl.c_str());
    const bool blAlone = request.blOwnConnection || !request.blVerify;
    curl_easy_setopt(pEasy, CURLOPT_FRESH_CONNECT, blAlone ? 1L : 0L);
    curl_easy_setopt(pEasy, CURLOPT_FORBID_REUSE, request.blKeepConnection && !blAlone ? 0L : 1L);
    // The server alone: a proxy that is spoken to over TLS gets a password, and stays verified.
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYPEER, request.blVerify ? 1L : 0L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYHOST, request.blVerify ? 2L : 0L);
    curl_easy_setopt(pEasy, CURLOPT_BUFFERSIZE,
                     request.pStream == nullptr ? kReplyBuffer : kStreamBuffer);
    if (request.blPost) {
        curl_easy_setopt(pEasy, CURLOPT_POSTFIELDS, request.strBody.c_str());
        curl_easy_setopt(pEasy, CURLOPT_POSTFIELDSIZE_LARGE,
                         static_cast<curl_off_t>(request.strBody.size()));
    }
}

// The host alone, without the brackets of an address.
std::string HostOf(const std::string &strUrl) {
    const std::string strBoth = HostAndPortOf(strUrl);
    const std::string strHost = strBoth.substr(0, strBoth.rfind(':'));
    return strHost.front() == '[' ? strHost.substr(1, strHost.size() - 2) : strHost;
}

}  // namespace

Status SetOptions(const HttpRequest &request, CurlHandle &handle, Headers &headers) {
    handle.strHost = HostOf(request.strUrl);
    handle.blVerify = request.blVerify;
    SetTransport(handle.pEasy.get());
    HOST_TRY(SetWay(handle, request.blRelay));
    SetHeaders(request, handle.pEasy.get(), headers);
    SetRequest(request, handle.pEasy.get());
    return {};
}

}  // namespace host
