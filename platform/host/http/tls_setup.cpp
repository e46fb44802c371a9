#include "tls_setup.h"

#include <openssl/err.h>
#include <openssl/ssl.h>

#include <new>

#include "authority_folder.h"
#include "curl_handle.h"
#include "exchange_record.h"

namespace host {
namespace {

// --- Callbacks: they run inside libcurl or OpenSSL, so nothing may be thrown out of them ---------

CurlHandle &HandleOf(const SSL *pTls) {
    return *static_cast<CurlHandle *>(SSL_CTX_get_app_data(SSL_get_SSL_CTX(pTls)));
}

// libcurl does not tell an end that TLS announces from one that anybody on the way can make.
void NoteAlert(const SSL *pTls, int where, int alert) {
    if (where == SSL_CB_READ_ALERT && (alert & 0xFF) == SSL_AD_CLOSE_NOTIFY) {
        HandleOf(pTls).blTlsEnded = true;
    }
}

int NoteCertificateRequest(SSL *pTls, X509 ** /*ppCertificate*/, EVP_PKEY ** /*ppKey*/) {
    HandleOf(pTls).record.blCertificateAsked = true;
    return 0;  // there is none
}

// Runs in place of OpenSSL's verification, which it calls, and notes what comes of it. Where
// nothing is to be verified, OpenSSL goes on all the same.
int Verify(X509_STORE_CTX *pVerification, void *pHandle) {
    CurlHandle &handle = *static_cast<CurlHandle *>(pHandle);
    const bool blTrusted = X509_verify_cert(pVerification) == 1;
    try {
        NoteCertificate(pVerification, blTrusted, handle.strHost, handle.record);
    } catch (const std::bad_alloc &) {
        X509_STORE_CTX_set_error(pVerification, X509_V_ERR_OUT_OF_MEM);
        return 0;
    }
    return blTrusted ? 1 : 0;
}

// libcurl does so only where it verifies.
void AddSystemAuthorities(X509_STORE *pStore) {
    const curl_version_info_data *const pBuilt = curl_version_info(CURLVERSION_NOW);
    static_cast<void>(X509_STORE_load_locations(pStore, pBuilt->cainfo, pBuilt->capath));
    ERR_clear_error();
}

CURLcode SetUpContext(CURL * /*pEasy*/, void *pContext, void *pHandle) {
    auto *const pTls = static_cast<SSL_CTX *>(pContext);
    CurlHandle &handle = *static_cast<CurlHandle *>(pHandle);
    SSL_CTX_set_app_data(pTls, pHandle);
    SSL_CTX_set_info_callback(pTls, NoteAlert);
    SSL_CTX_set_client_cert_cb(pTls, NoteCertificateRequest);
    SSL_CTX_set_cert_verify_callback(pTls, Verify, pHandle);
    if (!handle.blVerify) {
        AddSystemAuthorities(SSL_CTX_get_cert_store(pTls));
    }
    try {
        // Trusting less than the operator meant is an error too.
        const Status added = AddAuthorities(SSL_CTX_get_cert_store(pTls));
        if (added.Failed() && handle.blVerify) {
            handle.strTlsFailure = added.Words();
            return CURLE_SSL_CACERT_BADFILE;
        }
        return CURLE_OK;
    } catch (const std::bad_alloc &) {
        return CURLE_OUT_OF_MEMORY;
    }
}

}  // namespace

void SetUpTls(CurlHandle &handle) {
    CURL *const pEasy = handle.pEasy.get();
    curl_easy_setopt(pEasy, CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYPEER, 1L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYHOST, 2L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_CTX_FUNCTION, SetUpContext);
    curl_easy_setopt(pEasy, CURLOPT_SSL_CTX_DATA, &handle);
    // Each connection is verified against the authorities that there are as it begins, and a
    // session that is resumed is not verified again.
    curl_easy_setopt(pEasy, CURLOPT_CA_CACHE_TIMEOUT, 0L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_SESSIONID_CACHE, 0L);
}

}  // namespace host
