#include "exchange_record.h"

#include <arpa/inet.h>
#include <openssl/ssl.h>
#include <pthread.h>

#include <array>
#include <climits>
#include <memory>
#include <new>
#include <tuple>

#include "certificate_facts.h"

namespace host {
namespace {

// A key of POSIX threads, and no thread_local object: requests may be sent until the very end of a
// process, when those are destroyed already.
pthread_key_t MakeKey() {
    pthread_key_t key = 0;
    return pthread_key_create(&key, [](void *p) { delete static_cast<ZELO::Exchange *>(p); }) == 0
               ? key
               : PTHREAD_KEYS_MAX;
}
const pthread_key_t g_key = MakeKey();

std::string AddressText(const std::string &strAddress, long port) {
    const bool blIPv6 = strAddress.find(':') != std::string::npos;
    return (blIPv6 ? '[' + strAddress + ']' : strAddress) + ':' + std::to_string(port);
}

// Milliseconds; -1 for a stage that was not reached.
long Time(CURL *pEasy, CURLINFO info) {
    constexpr curl_off_t kUsPerMs = 1000;
    curl_off_t time_us = 0;
    curl_easy_getinfo(pEasy, info, &time_us);
    return time_us == 0 ? -1 : static_cast<long>(time_us / kUsPerMs);
}

std::string Header(CURL *pEasy, const char *szName) {
    curl_header *pHeader = nullptr;
    return curl_easy_header(pEasy, szName, 0, CURLH_HEADER, -1, &pHeader) == CURLHE_OK
               ? pHeader->value
               : "";
}

}  // namespace

ZELO::Exchange &LatestRecord() {
    auto *pRecord = static_cast<ZELO::Exchange *>(pthread_getspecific(g_key));
    if (pRecord == nullptr) {
        auto pNew = std::make_unique<ZELO::Exchange>();
        if (pthread_setspecific(g_key, pNew.get()) != 0) {
            throw std::bad_alloc();
        }
        pRecord = pNew.release();
    }
    return *pRecord;
}

void NoteAddress(const sockaddr &address, ZELO::Exchange &exchange) {
    std::array<char, INET6_ADDRSTRLEN> text = {};
    const auto &v4 = reinterpret_cast<const sockaddr_in &>(address);
    const auto &v6 = reinterpret_cast<const sockaddr_in6 &>(address);
    const bool blIPv6 = address.sa_family == AF_INET6;
    const void *const pBytes = blIPv6 ? static_cast<const void *>(&v6.sin6_addr) : &v4.sin_addr;
    if (inet_ntop(address.sa_family, pBytes, text.data(), text.size()) != nullptr) {
        exchange.addresses.push_back(
            AddressText(text.data(), ntohs(blIPv6 ? v6.sin6_port : v4.sin_port)));
    }
}

void NoteCertificate(X509_STORE_CTX *pVerification, bool blTrusted, const std::string &strHost,
                     ZELO::Exchange &exchange) {
    X509 *const pServer = X509_STORE_CTX_get0_cert(pVerification);
    ZELO::ServerCertificate &certificate = exchange.certificate;
    certificate = ReadCertificate(pServer);
    const STACK_OF(X509) *const pSent = X509_STORE_CTX_get0_untrusted(pVerification);
    for (int i = 0; i < sk_X509_num(pSent); ++i) {
        certificate.strChainPem += PemOf(sk_X509_value(pSent, i));
    }
    certificate.blNamesHost = NamesHost(pServer, strHost);
    certificate.verifyCode = blTrusted ? X509_V_OK : X509_STORE_CTX_get_error(pVerification);
    certificate.verifyDepth = blTrusted ? 0 : X509_STORE_CTX_get_error_depth(pVerification);
    certificate.strVerifyWords = X509_verify_cert_error_string(certificate.verifyCode);
    X509 *const pRefused = blTrusted ? nullptr : X509_STORE_CTX_get_current_cert(pVerification);
    std::tie(certificate.verifyNotBefore, certificate.verifyNotAfter) =
        ValidityOf(pRefused != nullptr ? pRefused : pServer);
    const auto *const pTls = static_cast<const SSL *>(
        X509_STORE_CTX_get_ex_data(pVerification, SSL_get_ex_data_X509_STORE_CTX_idx()));
    exchange.strTlsVersion = SSL_get_version(pTls);
}

void NoteConnection(CURL *pEasy, ZELO::Exchange &exchange) {
    const char *szAddress = nullptr;
    if (exchange.connected_ms < 0 &&
        curl_easy_getinfo(pEasy, CURLINFO_PRIMARY_IP, &szAddress) == CURLE_OK &&
        szAddress != nullptr && szAddress[0] != '\0') {
        exchange.connected_ms = Time(pEasy, CURLINFO_TOTAL_TIME_T);
    }
}

void NoteAnswer(CURL *pEasy, ZELO::Exchange &exchange) {
    const char *szAddress = nullptr;
    long port = 0;
    curl_easy_getinfo(pEasy, CURLINFO_PRIMARY_IP, &szAddress);
    curl_easy_getinfo(pEasy, CURLINFO_PRIMARY_PORT, &port);
    if (szAddress != nullptr && szAddress[0] != '\0') {
        exchange.strAddress = AddressText(szAddress, port);
    }
    exchange.resolved_ms = Time(pEasy, CURLINFO_NAMELOOKUP_TIME_T);
    const long connected_ms = Time(pEasy, CURLINFO_CONNECT_TIME_T);
    exchange.connected_ms = connected_ms < 0 ? exchange.connected_ms : connected_ms;
    exchange.secured_ms = Time(pEasy, CURLINFO_APPCONNECT_TIME_T);
    if (exchange.addresses.empty()) {  // a connection that was kept
        exchange.resolved_ms = exchange.connected_ms = exchange.secured_ms = -1;
    }
    exchange.answered_ms = Time(pEasy, CURLINFO_STARTTRANSFER_TIME_T);
    exchange.whole_ms = Time(pEasy, CURLINFO_TOTAL_TIME_T);
    long status = 0;
    curl_easy_getinfo(pEasy, CURLINFO_RESPONSE_CODE, &status);
    exchange.httpStatus = static_cast<int>(status);
    curl_easy_getinfo(pEasy, CURLINFO_HTTP_CONNECTCODE, &status);
    exchange.relayStatus = static_cast<int>(status);
    exchange.strDate = Header(pEasy, "Date");
    exchange.strRetryAfter = Header(pEasy, "Retry-After");
    exchange.ownTime = std::time(nullptr);
}

}  // namespace host

ZELO::Exchange ZELO::LatestExchange() {
    return host::LatestRecord();
}
