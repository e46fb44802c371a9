// The record of each thread's latest exchange (diagnosis.h).

#ifndef ZELO_HOST_EXCHANGE_RECORD_H
#define ZELO_HOST_EXCHANGE_RECORD_H

#include <curl/curl.h>
#include <openssl/x509.h>

#include <string>

#include "diagnosis.h"

namespace host {

// The calling thread's record, empty at first. Throws std::bad_alloc.
ZELO::Exchange &LatestRecord();

// --- What fills it ------------------------------------------------------------------------------

// An address that libcurl is about to connect to.
void NoteAddress(const sockaddr &address, ZELO::Exchange &exchange);

// The server's certificate, and how OpenSSL has judged it.
void NoteCertificate(X509_STORE_CTX *pVerification, bool blTrusted, const std::string &strHost,
                     ZELO::Exchange &exchange);

// The time at which there is a TCP connection: libcurl has none where TLS fails then.
void NoteConnection(CURL *pEasy, ZELO::Exchange &exchange);

// What libcurl knows when the exchange is over: the times, the address, the answers.
void NoteAnswer(CURL *pEasy, ZELO::Exchange &exchange);

}  // namespace host

#endif
