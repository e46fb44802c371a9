#include "certificate_facts.h"

#include <arpa/inet.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>

#include <array>
#include <new>
#include <tuple>

namespace host {
namespace {

constexpr std::size_t kMaxNames = 200;

// What `print` writes; empty when it fails.
template <typename Print>
std::string TextOf(Print print) {
    const Bio pMemory(BIO_new(BIO_s_mem()));
    if (pMemory == nullptr) {
        throw std::bad_alloc();
    }
    char *pText = nullptr;
    const long cb = print(pMemory.get()) ? BIO_get_mem_data(pMemory.get(), &pText) : 0;
    return cb <= 0 ? std::string() : std::string(pText, static_cast<std::size_t>(cb));
}

std::string NameText(const X509_NAME *pName) {
    constexpr unsigned long kForm = XN_FLAG_RFC2253 & ~ASN1_STRFLGS_ESC_MSB;
    return TextOf([&](BIO *pOut) { return X509_NAME_print_ex(pOut, pName, 0, kForm) >= 0; });
}

std::string AlternativeNames(X509 *pCertificate) {
    const int at = X509_get_ext_by_NID(pCertificate, NID_subject_alt_name, -1);
    if (at < 0) {
        return {};
    }
    std::string strNames = TextOf([&](BIO *pOut) {
        return X509V3_EXT_print(pOut, X509_get_ext(pCertificate, at), 0, 0) == 1;
    });
    return strNames.size() <= kMaxNames ? strNames : strNames.substr(0, kMaxNames) + "...";
}

std::time_t TimeOf(const ASN1_TIME *pTime) {
    std::tm utc = {};
    return ASN1_TIME_to_tm(pTime, &utc) == 1 ? timegm(&utc) : 0;
}

std::string Fingerprint(const X509 *pCertificate) {
    constexpr const char *kDigits = "0123456789abcdef";
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest = {};
    unsigned int cb = 0;
    if (X509_digest(pCertificate, EVP_sha256(), digest.data(), &cb) != 1) {
        throw std::bad_alloc();
    }
    std::string strText;
    for (unsigned int i = 0; i < cb; ++i) {
        strText += {kDigits[digest[i] >> 4], kDigits[digest[i] & 0xF]};
    }
    return strText;
}

}  // namespace

ZELO::ServerCertificate ReadCertificate(X509 *pCertificate) {
    ZELO::ServerCertificate certificate;
    certificate.blShown = true;
    certificate.strSubject = NameText(X509_get_subject_name(pCertificate));
    certificate.strIssuer = NameText(X509_get_issuer_name(pCertificate));
    certificate.strNames = AlternativeNames(pCertificate);
    std::tie(certificate.notBefore, certificate.notAfter) = ValidityOf(pCertificate);
    certificate.strFingerprint = Fingerprint(pCertificate);
    return certificate;
}

std::pair<std::time_t, std::time_t> ValidityOf(const X509 *pCertificate) {
    return {TimeOf(X509_get0_notBefore(pCertificate)), TimeOf(X509_get0_notAfter(pCertificate))};
}

std::string PemOf(X509 *pCertificate) {
    return TextOf([&](BIO *pOut) { return PEM_write_bio_X509(pOut, pCertificate) == 1; });
}

bool NamesHost(X509 *pCertificate, const std::string &strHost) {
    in6_addr address = {};
    const bool blAddress = inet_pton(AF_INET, strHost.c_str(), &address) == 1 ||
                           inet_pton(AF_INET6, strHost.c_str(), &address) == 1;
    return blAddress
               ? X509_check_ip_asc(pCertificate, strHost.c_str(), 0) == 1
               : X509_check_host(pCertificate, strHost.data(), strHost.size(), 0, nullptr) == 1;
}

}  // namespace host
