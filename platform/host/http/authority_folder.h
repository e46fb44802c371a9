// The appliance's own certificate authorities: every PEM file (*.pem, *.crt) of the folder
// "/usr/zelo/etc/ssl/ca.d/". They are trusted besides the system's.

#ifndef ZELO_HOST_AUTHORITY_FOLDER_H
#define ZELO_HOST_AUTHORITY_FOLDER_H

#include <openssl/x509.h>

#include <memory>
#include <string>
#include <vector>

#include "status.h"

namespace host {

constexpr const char *kAuthorityFolder = "/usr/zelo/etc/ssl/ca.d";

struct FreeCertificate {
    void operator()(X509 *pCertificate) const { X509_free(pCertificate); }
};
using Certificate = std::unique_ptr<X509, FreeCertificate>;

// One file of the folder, with the certificates in it.
struct AuthorityFile {
    std::string strPath;
    std::vector<Certificate> certificates;
};

// The certificates of a PEM text, at least one.
Status ReadCertificates(const std::string &strPem, std::vector<Certificate> &certificates);

// All files, by name. A folder that is not there holds none. Fails when one cannot be read as
// certificates.
Status ReadAuthorities(std::vector<AuthorityFile> &files);

// Adds all of them to the store.
Status AddAuthorities(X509_STORE *pStore);

}  // namespace host

#endif
