// What a certificate says, in words and numbers that need no OpenSSL.

#ifndef ZELO_HOST_CERTIFICATE_FACTS_H
#define ZELO_HOST_CERTIFICATE_FACTS_H

#include <openssl/bio.h>
#include <openssl/x509.h>

#include <ctime>
#include <memory>
#include <string>
#include <utility>

#include "diagnosis.h"

namespace host {

struct FreeBio {
    void operator()(BIO *pBio) const { BIO_free(pBio); }
};
using Bio = std::unique_ptr<BIO, FreeBio>;

// Subject, issuer, names, times and fingerprint. Throws std::bad_alloc, as all of these do.
ZELO::ServerCertificate ReadCertificate(X509 *pCertificate);

// Since when, and until when, it is valid.
std::pair<std::time_t, std::time_t> ValidityOf(const X509 *pCertificate);

// The certificate as a PEM block.
std::string PemOf(X509 *pCertificate);

// Whether it is for the host, a name or an address without brackets.
bool NamesHost(X509 *pCertificate, const std::string &strHost);

}  // namespace host

#endif
