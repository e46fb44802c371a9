// A certificate authority for development, and server certificates that it signs.
//
// Each authority makes a key of its own. Keys and certificates stay in memory and go with their
// owner, so trusting one authority outlasts nothing: the next run has another one.

#ifndef ZELO_DEV_CERTIFICATE_H
#define ZELO_DEV_CERTIFICATE_H

#include <openssl/evp.h>
#include <openssl/x509.h>

#include <ctime>
#include <memory>
#include <string>
#include <vector>

namespace devserver {

template <auto Free>
struct OpensslRelease {
    template <typename T>
    void operator()(T *p) const {
        Free(p);
    }
};
using KeyOwner = std::unique_ptr<EVP_PKEY, OpensslRelease<EVP_PKEY_free>>;
using X509Owner = std::unique_ptr<X509, OpensslRelease<X509_free>>;

constexpr std::time_t kHour = 3600;
constexpr std::time_t kDay = 24 * kHour;

// What a server certificate says. As it stands it is valid for a server on this machine's loopback;
// other names or another time make certificates that a client has to refuse.
struct CertificateRequest {
    std::vector<std::string> names = {"localhost", "127.0.0.1", "::1"};  // host names or addresses
    std::time_t not_before = std::time(nullptr) - kHour;
    std::time_t not_after = std::time(nullptr) + 30 * kDay;
    bool of_clients = false;  // the server demands a certificate of its clients too
};

struct ServerCertificate {
    KeyOwner pKey;
    X509Owner pCertificate;
    bool blOfClients = false;
};

class CertificateAuthority {
  public:
    // Makes the authority's key and certificate; returns false when OpenSSL cannot.
    bool Create();

    // The authority's certificate as PEM text; empty before Create.
    const std::string &Pem() const { return m_strPem; }

    // Fills the certificate with a new key and what the request asks for. Returns false, and leaves
    // the certificate as it was, when there is no name, OpenSSL takes a name for neither host name
    // nor address, or Create did not succeed before.
    bool Issue(const CertificateRequest &request, ServerCertificate &certificate) const;

  private:
    KeyOwner m_pKey;
    X509Owner m_pCertificate;
    std::string m_strPem;
};

}  // namespace devserver

#endif
