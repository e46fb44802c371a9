#include "bare_exchange.h"

#include <openssl/ssl.h>
#include <unistd.h>

#include "json.h"

namespace bench {
namespace {

size_t TakeReply(char *pData, size_t size, size_t count, void *pContext) {
    static_cast<std::string *>(pContext)->append(pData, size * count);
    return size * count;
}

size_t WriteReply(char *pData, size_t size, size_t count, void *pContext) {
    const ssize_t cb = write(*static_cast<int *>(pContext), pData, size * count);
    return cb < 0 ? 0 : static_cast<size_t>(cb);
}

// The appliance's authority, besides the system's.
CURLcode AddAuthority(CURL * /*pEasy*/, void *pSslContext, void * /*pContext*/) {
    return SSL_CTX_load_verify_file(static_cast<SSL_CTX *>(pSslContext), kAuthority) == 1
               ? CURLE_OK
               : CURLE_SSL_CACERT_BADFILE;
}

}  // namespace

BareExchange::BareExchange() : m_pEasy(curl_easy_init()) {
    AddHeader("Accept: application/json");
    curl_easy_setopt(m_pEasy.get(), CURLOPT_PROXY, "");
    curl_easy_setopt(m_pEasy.get(), CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(m_pEasy.get(), CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
    curl_easy_setopt(m_pEasy.get(), CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    curl_easy_setopt(m_pEasy.get(), CURLOPT_SSL_VERIFYPEER, 1L);
    curl_easy_setopt(m_pEasy.get(), CURLOPT_SSL_VERIFYHOST, 2L);
    curl_easy_setopt(m_pEasy.get(), CURLOPT_SSL_CTX_FUNCTION, AddAuthority);
    curl_easy_setopt(m_pEasy.get(), CURLOPT_WRITEFUNCTION, TakeReply);
    curl_easy_setopt(m_pEasy.get(), CURLOPT_WRITEDATA, &m_strReply);
}

void BareExchange::AddHeader(const std::string &strHeader) {
    curl_slist *pLonger = curl_slist_append(m_pHeaders.get(), strHeader.c_str());
    static_cast<void>(m_pHeaders.release());
    m_pHeaders.reset(pLonger);
    curl_easy_setopt(m_pEasy.get(), CURLOPT_HTTPHEADER, pLonger);
}

void BareExchange::Get(const std::string &strUrl) {
    curl_easy_setopt(m_pEasy.get(), CURLOPT_URL, strUrl.c_str());
}

void BareExchange::Post(const std::string &strUrl, const std::string &strBody,
                        const std::string &strToken) {
    curl_easy_setopt(m_pEasy.get(), CURLOPT_URL, strUrl.c_str());
    curl_easy_setopt(m_pEasy.get(), CURLOPT_COPYPOSTFIELDS, strBody.c_str());
    AddHeader("Content-Type: application/json");
    AddHeader("Expect:");
    AddHeader("Authorization: Bearer " + strToken);
}

void BareExchange::WriteTo(int fd, long cbBuffer) {
    m_fd = fd;
    curl_easy_setopt(m_pEasy.get(), CURLOPT_BUFFERSIZE, cbBuffer);
    curl_easy_setopt(m_pEasy.get(), CURLOPT_WRITEFUNCTION, WriteReply);
    curl_easy_setopt(m_pEasy.get(), CURLOPT_WRITEDATA, &m_fd);
}

bool BareExchange::Perform() {
    m_strReply.clear();
    long status = 0;
    return curl_easy_perform(m_pEasy.get()) == CURLE_OK &&
           curl_easy_getinfo(m_pEasy.get(), CURLINFO_RESPONSE_CODE, &status) == CURLE_OK &&
           status == 200;
}

bool BareExchange::Perform(Json::Value &envelope) {
    return Perform() && json::FromString(m_strReply, envelope) &&
           json::IsTrue(json::Member(envelope, "success"));
}

}  // namespace bench
