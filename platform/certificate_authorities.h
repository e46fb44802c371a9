// Certificate authorities: whom the appliance trusts besides the system's own authorities.
//
// Every TLS connection of the Web API requests (web_api_request.h) is verified against the system's
// authorities and these as they are when it is made. A change counts for every handshake from then
// on; a connection that was made before is used for three minutes at the most.
//
// The authorities stand in PEM files (*.pem, *.crt) of a folder of the platform's, where an
// operator may put some too. When one of the files cannot be read as certificates, no server is
// trusted: trusting less than the operator meant is an error. Then these operations fail too, with
// YLIBC_ERR_FILE, and their words name the file.
//
// Results: 0 on success and -1 on failure, with the last error set (last_error.h).

#ifndef ZELO_PLATFORM_CERTIFICATE_AUTHORITIES_H
#define ZELO_PLATFORM_CERTIFICATE_AUTHORITIES_H

#include "api.h"

// An authority, for as long as its reader runs.
struct ZELO_CERT_AUTHORITY {
    const char *szFingerprint;  // SHA-256, 64 lower-case hexadecimal digits
    const char *szSubject;      // such as "CN=Example Root,O=Example"
    long long notBefore;        // seconds since the epoch
    long long notAfter;
    const char *szFile;  // where it stands
    const char *szPem;
};

extern "C" {

// Trusts the authorities in the PEM text, each in a file of its own; one that is there already
// stays as it is. A certificate that is no authority, or not valid at this time, is refused with
// YLIBC_ERR_INVALID_ARGUMENT, and so is a text without any; then none is added.
ZELO_PLATFORM_API int ZELOCertAuthorityAdd(const char *szPem);

// Called for each authority; it must not throw.
typedef void (*ZELO_CERT_AUTHORITY_READER)(void *pContext, const ZELO_CERT_AUTHORITY *pAuthority);

// Lists the authorities of the folder, by their files' names. The system's are not among them.
ZELO_PLATFORM_API int ZELOCertAuthorityList(ZELO_CERT_AUTHORITY_READER pfnRead, void *pContext);

// Trusts the authority with this fingerprint, with or without colons, no longer, wherever it stands
// in the folder; others in the same file stay. YLIBC_ERR_NOT_FOUND when it is not there. The
// system's own authorities are not this operation's.
ZELO_PLATFORM_API int ZELOCertAuthorityRemove(const char *szFingerprint);
}

#endif
