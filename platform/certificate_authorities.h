// Certificate authorities: whom the appliance trusts besides the system's own authorities.
//
// Every TLS connection of the Web API requests (web_api_request.h) is verified against the system's
// authorities and these as they are when it is made. A change counts for every connection that is
// made after it; one that was made before is used for three minutes at the most. A program that
// opens a connection of its own, in order to find out why a request fails, adds them by the same
// rules here.

#ifndef ZELO_PLATFORM_CERTIFICATE_AUTHORITIES_H
#define ZELO_PLATFORM_CERTIFICATE_AUTHORITIES_H

#include "api.h"

// OpenSSL's X509_STORE.
struct x509_store_st;

extern "C" {

// Adds the certificates of the appliance's authorities to an OpenSSL certificate store, which stays
// the caller's. An appliance without any adds none.
//
// Returns 0 when all of them are in the store. Returns a negative value when some cannot be read
// (YLIBC_ERR_FILE), which fails a request too: trusting less than the operator meant is an error.
// Then szPlace, a buffer of cbPlace bytes, gets the path of the file, or of the folder, that cannot
// be read; it is left as it was on success. A null store, or no buffer, is
// YLIBC_ERR_INVALID_ARGUMENT.
ZELO_PLATFORM_API int ZELOCertAddAuthorities(struct x509_store_st *pStore, char *szPlace,
                                             int cbPlace);
}

#endif
