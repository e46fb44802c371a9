#include "probe.h"

#include <arpa/inet.h>
#include <curl/curl.h>
#include <openssl/bio.h>
#include <openssl/ssl.h>
#include <openssl/x509v3.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <memory>
#include <new>

#include "certificate_authorities.h"
#include "fixed_text.h"
#include "key_value_file.h"
#include "membership.h"

namespace qrmctl {
namespace {

constexpr std::size_t kMaxBody = std::size_t{64} * 1024;
constexpr std::size_t kMaxNames = 200;
constexpr curl_off_t kUsPerMs = 1000;

template <auto Free>
struct Release {
    template <typename T>
    void operator()(T *p) const {
        Free(p);
    }
};
using Easy = std::unique_ptr<CURL, Release<curl_easy_cleanup>>;
using Url = std::unique_ptr<CURLU, Release<curl_url_cleanup>>;
using Headers = std::unique_ptr<curl_slist, Release<curl_slist_free_all>>;
using Bio = std::unique_ptr<BIO, Release<BIO_free>>;

// What the callbacks of one probe share.
struct Transfer {
    const Way &way;
    const Extent extent;
    Probe &probe;
};

// --- Certificates -------------------------------------------------------------------------------

std::string TextOf(const Bio &pMemory) {
    char *pText = nullptr;
    const long cb = BIO_get_mem_data(pMemory.get(), &pText);
    return cb <= 0 ? std::string() : std::string(pText, static_cast<std::size_t>(cb));
}

std::string NameText(const X509_NAME *pName) {
    const Bio pMemory(BIO_new(BIO_s_mem()));
    if (pMemory == nullptr ||
        X509_NAME_print_ex(pMemory.get(), pName, 0, XN_FLAG_RFC2253 & ~ASN1_STRFLGS_ESC_MSB) < 0) {
        return {};
    }
    return TextOf(pMemory);
}

std::string AlternativeNames(X509 *pCertificate) {
    const Bio pMemory(BIO_new(BIO_s_mem()));
    const int at = X509_get_ext_by_NID(pCertificate, NID_subject_alt_name, -1);
    if (pMemory == nullptr || at < 0 ||
        X509V3_EXT_print(pMemory.get(), X509_get_ext(pCertificate, at), 0, 0) != 1) {
        return {};
    }
    std::string strNames = TextOf(pMemory);
    return strNames.size() <= kMaxNames ? strNames : strNames.substr(0, kMaxNames) + "...";
}

std::time_t TimeOf(const ASN1_TIME *pTime) {
    std::tm utc = {};
    return ASN1_TIME_to_tm(pTime, &utc) == 1 ? timegm(&utc) : 0;
}

bool NamesHost(X509 *pCertificate, const std::string &strHost) {
    const bool blBracketed = strHost.front() == '[' && strHost.back() == ']';
    const std::string strBare = blBracketed ? strHost.substr(1, strHost.size() - 2) : strHost;
    in6_addr address = {};
    const bool blAddress = inet_pton(AF_INET, strBare.c_str(), &address) == 1 ||
                           inet_pton(AF_INET6, strBare.c_str(), &address) == 1;
    return blAddress
               ? X509_check_ip_asc(pCertificate, strBare.c_str(), 0) == 1
               : X509_check_host(pCertificate, strBare.data(), strBare.size(), 0, nullptr) == 1;
}

// Runs inside OpenSSL in place of its verification, which it calls: it only watches.
int VerifyAndWatch(X509_STORE_CTX *pContext, void *pArgument) {
    auto *const pTransfer = static_cast<Transfer *>(pArgument);
    const int result = X509_verify_cert(pContext);
    try {
        Certificate &certificate = pTransfer->probe.certificate;
        X509 *const pLeaf = X509_STORE_CTX_get0_cert(pContext);
        certificate.blSeen = true;
        certificate.strSubject = NameText(X509_get_subject_name(pLeaf));
        certificate.strNames = AlternativeNames(pLeaf);
        certificate.strIssuer = NameText(X509_get_issuer_name(pLeaf));
        certificate.notBefore = TimeOf(X509_get0_notBefore(pLeaf));
        certificate.notAfter = TimeOf(X509_get0_notAfter(pLeaf));
        certificate.blNamesHost = NamesHost(pLeaf, pTransfer->way.strHost);
        certificate.verifyError = result == 1 ? X509_V_OK : X509_STORE_CTX_get_error(pContext);
        certificate.depth = X509_STORE_CTX_get_error_depth(pContext);
        certificate.strVerifyReason = X509_verify_cert_error_string(certificate.verifyError);
        auto *const pSsl = static_cast<SSL *>(
            X509_STORE_CTX_get_ex_data(pContext, SSL_get_ex_data_X509_STORE_CTX_idx()));
        pTransfer->probe.strTlsVersion = SSL_get_version(pSsl);
    } catch (const std::bad_alloc &) {
        return 0;
    }
    return result;
}

int NoteCertificateRequest(SSL *pTls, X509 ** /*ppCertificate*/, EVP_PKEY ** /*ppKey*/) {
    auto *const pTransfer = static_cast<Transfer *>(SSL_CTX_get_app_data(SSL_get_SSL_CTX(pTls)));
    pTransfer->probe.blCertificateAsked = true;
    return 0;  // there is none
}

// --- libcurl's callbacks: nothing may be thrown out of them -------------------------------------

CURLcode SetUpTls(CURL * /*pEasy*/, void *pSslContext, void *pArgument) {
    auto *const pContext = static_cast<SSL_CTX *>(pSslContext);
    FixedText<1024> place;
    if (ZELOCertAddAuthorities(SSL_CTX_get_cert_store(pContext), place.Buffer(),
                               FixedText<1024>::Size()) < 0) {
        return CURLE_SSL_CACERT_BADFILE;
    }
    SSL_CTX_set_cert_verify_callback(pContext, VerifyAndWatch, pArgument);
    SSL_CTX_set_app_data(pContext, pArgument);
    SSL_CTX_set_client_cert_cb(pContext, NoteCertificateRequest);
    return CURLE_OK;
}

// Refusing every address makes libcurl go through all of them.
curl_socket_t NoteAddress(void *pArgument, curlsocktype /*purpose*/, curl_sockaddr *pAddress) {
    auto *const pTransfer = static_cast<Transfer *>(pArgument);
    std::array<char, INET6_ADDRSTRLEN> text = {};
    const sockaddr *const pAny = &pAddress->addr;
    const void *const pBytes =
        pAny->sa_family == AF_INET6
            ? static_cast<const void *>(&reinterpret_cast<const sockaddr_in6 *>(pAny)->sin6_addr)
            : static_cast<const void *>(&reinterpret_cast<const sockaddr_in *>(pAny)->sin_addr);
    if (inet_ntop(pAny->sa_family, pBytes, text.data(), text.size()) != nullptr) {
        try {
            pTransfer->probe.addresses.emplace_back(text.data());
        } catch (const std::bad_alloc &) {
            return CURL_SOCKET_BAD;
        }
    }
    return CURL_SOCKET_BAD;
}

size_t TakeBody(char *pData, size_t size, size_t count, void *pArgument) {
    std::string &strBody = static_cast<Transfer *>(pArgument)->probe.strBody;
    const size_t cb = size * count;
    if (cb > kMaxBody - strBody.size()) {
        return CURL_WRITEFUNC_ERROR;
    }
    try {
        strBody.append(pData, cb);
        return cb;
    } catch (const std::bad_alloc &) {
        return CURL_WRITEFUNC_ERROR;
    }
}

// --- Options ------------------------------------------------------------------------------------

Url BuildUrl(const Way &way, Extent extent, const char *szPath, const std::string &strQuery) {
    const bool blBareIPv6 =
        way.strHost.find(':') != std::string::npos && way.strHost.front() != '[';
    const std::string strHost = blBareIPv6 ? '[' + way.strHost + ']' : way.strHost;
    const bool blPlain = std::none_of(strHost.begin(), strHost.end(),
                                      [](unsigned char c) { return c <= ' ' || c == 0x7F; });
    // Without TLS libcurl is done when TCP is.
    const bool blTls = way.IsSecure() && extent != Extent::kConnect;
    Url pUrl(curl_url());
    const auto set = [&pUrl](CURLUPart part, const std::string &strText, unsigned int flags) {
        return curl_url_set(pUrl.get(), part, strText.c_str(), flags) == CURLUE_OK;
    };
    if (pUrl == nullptr || !blPlain || strHost.empty() ||
        !set(CURLUPART_SCHEME, blTls ? "https" : "http", 0) || !set(CURLUPART_HOST, strHost, 0) ||
        !set(CURLUPART_PORT, std::to_string(way.port), 0) || !set(CURLUPART_PATH, szPath, 0) ||
        (!strQuery.empty() &&
         !set(CURLUPART_QUERY, strQuery, CURLU_APPENDQUERY | CURLU_URLENCODE))) {
        return nullptr;
    }
    return pUrl;
}

// The proxy that libcurl would take from the environment for the way; empty for none.
const char *EnvironmentProxy(const Way &way) {
    const std::array<const char *, 4> names = {way.IsSecure() ? "https_proxy" : "http_proxy",
                                               way.IsSecure() ? "HTTPS_PROXY" : "http_proxy",
                                               "all_proxy", "ALL_PROXY"};
    for (const char *szName : names) {
        const char *szProxy = std::getenv(szName);
        if (szProxy != nullptr) {
            return szProxy;
        }
    }
    return "";
}

void SetWay(CURL *pEasy, const Way &way, Extent extent) {
    if (way.IsRelayed()) {
        curl_easy_setopt(pEasy, CURLOPT_PROXY, ("http://" + RelayAddress()).c_str());
        curl_easy_setopt(pEasy, CURLOPT_NOPROXY, "");
        curl_easy_setopt(pEasy, CURLOPT_HTTPPROXYTUNNEL, extent == Extent::kConnect ? 0L : 1L);
        curl_easy_setopt(pEasy, CURLOPT_SUPPRESS_CONNECT_HEADERS, 1L);
    } else if (YLIBCFileCheckKeyValue(kConfigFile, "use_proxy_environment", "yes", 0) != 1) {
        curl_easy_setopt(pEasy, CURLOPT_PROXY, "");
    } else if (extent == Extent::kConnect) {
        // Its URL has another scheme than the way, and thus another variable.
        curl_easy_setopt(pEasy, CURLOPT_PROXY, EnvironmentProxy(way));
    }
}

void SetTransport(CURL *pEasy, Transfer &transfer, long limit_ms) {
    const bool blVerify = transfer.extent != Extent::kLookAtClock;
    curl_easy_setopt(pEasy, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(pEasy, CURLOPT_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(pEasy, CURLOPT_FOLLOWLOCATION, 0L);
    curl_easy_setopt(pEasy, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
    curl_easy_setopt(pEasy, CURLOPT_CONNECTTIMEOUT_MS, limit_ms);
    curl_easy_setopt(pEasy, CURLOPT_TIMEOUT_MS, limit_ms);
    // A name server that is silent is not waited for either.
    curl_easy_setopt(pEasy, CURLOPT_QUICK_EXIT, 1L);
    curl_easy_setopt(pEasy, CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYPEER, blVerify ? 1L : 0L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYHOST, blVerify ? 2L : 0L);
    if (blVerify) {
        curl_easy_setopt(pEasy, CURLOPT_SSL_CTX_FUNCTION, SetUpTls);
        curl_easy_setopt(pEasy, CURLOPT_SSL_CTX_DATA, &transfer);
    }
    if (transfer.extent == Extent::kResolve) {
        curl_easy_setopt(pEasy, CURLOPT_OPENSOCKETFUNCTION, NoteAddress);
        curl_easy_setopt(pEasy, CURLOPT_OPENSOCKETDATA, &transfer);
    } else if (transfer.extent == Extent::kConnect || transfer.extent == Extent::kHandshake) {
        curl_easy_setopt(pEasy, CURLOPT_CONNECT_ONLY, 1L);
    }
    curl_easy_setopt(pEasy, CURLOPT_WRITEFUNCTION, TakeBody);
    curl_easy_setopt(pEasy, CURLOPT_WRITEDATA, &transfer);
}

// --- Results ------------------------------------------------------------------------------------

void ReadAddress(CURL *pEasy, Probe &probe) {
    const char *szAddress = nullptr;
    long port = 0;
    curl_easy_getinfo(pEasy, CURLINFO_PRIMARY_IP, &szAddress);
    curl_easy_getinfo(pEasy, CURLINFO_PRIMARY_PORT, &port);
    if (szAddress != nullptr && szAddress[0] != '\0') {
        const std::string strAddress = szAddress;
        const bool blIPv6 = strAddress.find(':') != std::string::npos;
        probe.strAddress =
            (blIPv6 ? '[' + strAddress + ']' : strAddress) + ':' + std::to_string(port);
    }
}

void ReadAnswer(CURL *pEasy, Probe &probe) {
    curl_easy_getinfo(pEasy, CURLINFO_RESPONSE_CODE, &probe.status);
    curl_header *pDate = nullptr;
    if (curl_easy_header(pEasy, "Date", 0, CURLH_HEADER, -1, &pDate) == CURLHE_OK) {
        probe.serverTime = curl_getdate(pDate->value, nullptr);
        probe.ownTime = std::time(nullptr);
    }
}

}  // namespace

std::string RelayAddress() {
    FixedText<1024> relay;
    return YLIBCFileGetKeyValue(kConfigFile, "farlink_relay", relay.Buffer(),
                                FixedText<1024>::Size(), 0) > 0
               ? relay.sz()
               : "";
}

Probe RunProbe(const Way &way, Extent extent, const char *szPath, const std::string &strQuery,
               long limit_ms) {
    Probe probe;
    static const CURLcode globalInit = curl_global_init(CURL_GLOBAL_DEFAULT);
    const Easy pEasy(globalInit == CURLE_OK ? curl_easy_init() : nullptr);
    const Url pUrl = BuildUrl(way, extent, szPath, strQuery);
    const Headers pHeaders(curl_slist_append(nullptr, "Accept: application/json"));
    if (pUrl == nullptr) {
        probe.strReason = "the host or the port cannot stand in an URL";
        return probe;
    }
    if (pEasy == nullptr || pHeaders == nullptr ||
        curl_slist_append(pHeaders.get(), "Accept-Encoding: identity") == nullptr) {
        probe.strReason = "out of memory";
        return probe;
    }
    if (limit_ms <= 0) {
        probe.blInTime = false;
        probe.strReason = "no time is left";
        return probe;
    }
    Transfer transfer{way, extent, probe};
    std::array<char, CURL_ERROR_SIZE> reason = {};
    SetTransport(pEasy.get(), transfer, limit_ms);
    SetWay(pEasy.get(), way, extent);
    curl_easy_setopt(pEasy.get(), CURLOPT_CURLU, pUrl.get());
    curl_easy_setopt(pEasy.get(), CURLOPT_HTTPHEADER, pHeaders.get());
    curl_easy_setopt(pEasy.get(), CURLOPT_ERRORBUFFER, reason.data());

    const CURLcode result = curl_easy_perform(pEasy.get());
    probe.blInTime = result != CURLE_OPERATION_TIMEDOUT;
    probe.strReason = reason[0] != '\0' ? reason.data() : curl_easy_strerror(result);
    ReadAddress(pEasy.get(), probe);
    ReadAnswer(pEasy.get(), probe);
    curl_easy_getinfo(pEasy.get(), CURLINFO_HTTP_CONNECTCODE, &probe.relayStatus);
    curl_off_t duration_us = 0;
    curl_easy_getinfo(pEasy.get(), CURLINFO_TOTAL_TIME_T, &duration_us);
    probe.duration_ms = static_cast<long>(duration_us / kUsPerMs);
    probe.blDone = extent == Extent::kResolve ? !probe.addresses.empty() : result == CURLE_OK;
    return probe;
}

}  // namespace qrmctl
