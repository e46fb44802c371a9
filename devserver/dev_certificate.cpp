#include "dev_certificate.h"

#include <arpa/inet.h>
#include <openssl/bio.h>
#include <openssl/ec.h>
#include <openssl/pem.h>
#include <openssl/rand.h>
#include <openssl/x509v3.h>

#include <cstdint>

namespace devserver {
namespace {

constexpr const char *kCurve = "P-256";

using BioOwner = std::unique_ptr<BIO, OpensslRelease<BIO_free_all>>;
using ExtensionOwner = std::unique_ptr<X509_EXTENSION, OpensslRelease<X509_EXTENSION_free>>;

struct Extension {
    int nid;
    std::string strValue;
};

// A serial number by chance keeps certificates of authorities with the same name apart.
bool SetSerialNumber(X509 *pCertificate) {
    std::uint64_t serial = 0;
    return RAND_bytes(reinterpret_cast<unsigned char *>(&serial), sizeof(serial)) == 1 &&
           ASN1_INTEGER_set_uint64(X509_get_serialNumber(pCertificate), serial >> 1U) == 1;
}

bool SetSubject(X509 *pCertificate, const char *szName) {
    return X509_NAME_add_entry_by_txt(X509_get_subject_name(pCertificate), "CN", MBSTRING_UTF8,
                                      reinterpret_cast<const unsigned char *>(szName), -1, -1,
                                      0) == 1;
}

bool AddExtensions(X509 *pCertificate, X509 *pIssuer, const std::vector<Extension> &extensions) {
    X509V3_CTX context;
    X509V3_set_ctx(&context, pIssuer, pCertificate, nullptr, nullptr, 0);
    for (const Extension &extension : extensions) {
        const ExtensionOwner pExtension(
            X509V3_EXT_nconf_nid(nullptr, &context, extension.nid, extension.strValue.c_str()));
        if (!pExtension || X509_add_ext(pCertificate, pExtension.get(), -1) != 1) {
            return false;
        }
    }
    return true;
}

// An authority issues its own certificate: then pIssuer is null.
X509Owner MakeCertificate(EVP_PKEY *pKey, const char *szName, const CertificateRequest &request,
                          const std::vector<Extension> &extensions, X509 *pIssuer,
                          EVP_PKEY *pIssuerKey) {
    X509Owner pCertificate(X509_new());
    X509 *const p = pCertificate.get();
    X509 *const pSigner = pIssuer == nullptr ? p : pIssuer;
    const bool blMade = p != nullptr && X509_set_version(p, X509_VERSION_3) == 1 &&
                        SetSerialNumber(p) && SetSubject(p, szName) &&
                        X509_set_issuer_name(p, X509_get_subject_name(pSigner)) == 1 &&
                        ASN1_TIME_set(X509_getm_notBefore(p), request.not_before) != nullptr &&
                        ASN1_TIME_set(X509_getm_notAfter(p), request.not_after) != nullptr &&
                        X509_set_pubkey(p, pKey) == 1 && AddExtensions(p, pSigner, extensions) &&
                        X509_sign(p, pIssuerKey, EVP_sha256()) > 0;
    return blMade ? std::move(pCertificate) : nullptr;
}

std::string PemText(X509 *pCertificate) {
    const BioOwner pMemory(BIO_new(BIO_s_mem()));
    char *pText = nullptr;
    if (!pMemory || PEM_write_bio_X509(pMemory.get(), pCertificate) != 1) {
        return {};
    }
    const long cb = BIO_get_mem_data(pMemory.get(), &pText);
    return {pText, static_cast<std::size_t>(cb)};
}

bool IsAddress(const std::string &strName) {
    in6_addr address{};
    return inet_pton(AF_INET, strName.c_str(), &address) == 1 ||
           inet_pton(AF_INET6, strName.c_str(), &address) == 1;
}

std::string AlternativeNames(const std::vector<std::string> &names) {
    std::string strNames;
    for (const std::string &name : names) {
        strNames += strNames.empty() ? "" : ",";
        strNames += (IsAddress(name) ? "IP:" : "DNS:") + name;
    }
    return strNames;
}

}  // namespace

bool CertificateAuthority::Create() {
    m_pKey.reset(EVP_EC_gen(kCurve));
    if (!m_pKey) {
        return false;
    }
    m_pCertificate = MakeCertificate(m_pKey.get(), "QRM development authority", {},
                                     {{NID_basic_constraints, "critical,CA:TRUE,pathlen:0"},
                                      {NID_key_usage, "critical,keyCertSign,cRLSign"},
                                      {NID_subject_key_identifier, "hash"}},
                                     nullptr, m_pKey.get());
    m_strPem = m_pCertificate ? PemText(m_pCertificate.get()) : std::string();
    return !m_strPem.empty();
}

bool CertificateAuthority::Issue(const CertificateRequest &request,
                                 ServerCertificate &certificate) const {
    KeyOwner pKey(EVP_EC_gen(kCurve));
    if (!pKey || !m_pCertificate || request.names.empty()) {
        return false;
    }
    X509Owner pCertificate =
        MakeCertificate(pKey.get(), "QRM development server", request,
                        {{NID_basic_constraints, "critical,CA:FALSE"},
                         {NID_key_usage, "critical,digitalSignature"},
                         {NID_ext_key_usage, "serverAuth"},
                         {NID_subject_key_identifier, "hash"},
                         {NID_authority_key_identifier, "keyid"},
                         {NID_subject_alt_name, AlternativeNames(request.names)}},
                        m_pCertificate.get(), m_pKey.get());
    if (!pCertificate) {
        return false;
    }
    certificate = {std::move(pKey), std::move(pCertificate), request.of_clients};
    return true;
}

}  // namespace devserver
