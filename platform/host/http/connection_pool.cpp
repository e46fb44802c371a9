#include "connection_pool.h"

#include <openssl/ssl.h>
#include <poll.h>
#include <pthread.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <mutex>
#include <new>
#include <utility>
#include <vector>

#include "appliance_ca.h"
#include "exchange_record.h"
#include "never_destroyed.h"

namespace host {
namespace {

// More idle handles than this are not kept.
constexpr std::size_t kMaxIdleHandles = 8;
// A connection that is idle for longer is not used again: servers close theirs after 5 s or more,
// and a call must not meet that moment.
constexpr long kMaxIdleTime_s = 3;
// An authority that is removed is not trusted for longer than this.
constexpr long kMaxLife_s = 180;

// All handles of the process, idle and in use.
struct Pool {
    std::mutex mutex;
    std::vector<std::unique_ptr<Connection>> idle;
    std::set<Connection *> inUse;
    std::vector<Connection *> abandoned;
};

NeverDestroyed<Pool> g_pool;

// What libcurl needs once, before a thread can fork in the middle of it.
const CURLcode g_globalInit = curl_global_init(CURL_GLOBAL_DEFAULT);

void LockBeforeFork() {
    g_pool->mutex.lock();
}

void UnlockInParent() {
    g_pool->mutex.unlock();
}

// The child closes its copies of the sockets and forgets the handles without cleaning them up: an
// orderly end of a TLS connection would end the parent's.
void AbandonInChild() {
    Pool &pool = *g_pool;
    for (auto &pConnection : pool.idle) {
        pool.abandoned.push_back(pConnection.release());
    }
    pool.abandoned.insert(pool.abandoned.end(), pool.inUse.begin(), pool.inUse.end());
    pool.idle.clear();
    pool.inUse.clear();
    for (Connection *pConnection : pool.abandoned) {
        for (curl_socket_t fd : pConnection->sockets) {
            close(fd);
        }
        pConnection->sockets.clear();
    }
    pool.mutex.unlock();
}

const int g_forkHandlers = pthread_atfork(LockBeforeFork, UnlockInParent, AbandonInChild);

// --- Callbacks: they run inside libcurl, so nothing may be thrown out of them -------------------

curl_socket_t OpenSocket(void *pContext, curlsocktype /*purpose*/, curl_sockaddr *pAddress) {
    const int fd = socket(pAddress->family, pAddress->socktype | SOCK_CLOEXEC, pAddress->protocol);
    if (fd < 0) {
        return CURL_SOCKET_BAD;
    }
    try {
        auto *const pConnection = static_cast<Connection *>(pContext);
        NoteAddress(pAddress->addr, *pConnection->pRecord);
        const std::lock_guard<std::mutex> lock(g_pool->mutex);
        pConnection->sockets.insert(fd);
        return fd;
    } catch (const std::bad_alloc &) {
        close(fd);
        return CURL_SOCKET_BAD;
    }
}

int CloseSocket(void *pContext, curl_socket_t fd) {
    const std::lock_guard<std::mutex> lock(g_pool->mutex);
    static_cast<Connection *>(pContext)->sockets.erase(fd);
    return close(fd);
}

Connection *ConnectionOf(const SSL *pTls) {
    return static_cast<Connection *>(SSL_CTX_get_app_data(SSL_get_SSL_CTX(pTls)));
}

// libcurl does not tell an end that TLS announces from one that anybody on the way can make.
void NoteAlert(const SSL *pTls, int where, int alert) {
    if (where == SSL_CB_READ_ALERT && (alert & 0xFF) == SSL_AD_CLOSE_NOTIFY) {
        ConnectionOf(pTls)->blEndAnnounced = true;
    }
}

int NoteCertificateRequest(SSL *pTls, X509 ** /*ppCertificate*/, EVP_PKEY ** /*ppKey*/) {
    ConnectionOf(pTls)->pRecord->blCertificateAsked = true;
    return 0;  // there is none
}

// Runs in place of OpenSSL's verification, which it calls: it notes what comes of it. The last word
// without verification is that all is well.
int Verify(X509_STORE_CTX *pVerification, void *pContext) {
    const Connection &connection = *static_cast<Connection *>(pContext);
    const bool blTrusted = X509_verify_cert(pVerification) == 1;
    try {
        NoteCertificate(pVerification, blTrusted, connection.strHost, *connection.pRecord);
    } catch (const std::bad_alloc &) {
        X509_STORE_CTX_set_error(pVerification, X509_V_ERR_OUT_OF_MEM);
        return 0;
    }
    if (!connection.blVerify) {
        X509_STORE_CTX_set_error(pVerification, X509_V_OK);
    }
    return blTrusted || !connection.blVerify ? 1 : 0;
}

CURLcode SetUpTls(CURL * /*pEasy*/, void *pSslContext, void *pConnection) {
    try {
        auto *const pTls = static_cast<SSL_CTX *>(pSslContext);
        SSL_CTX_set_app_data(pTls, pConnection);
        SSL_CTX_set_info_callback(pTls, NoteAlert);
        SSL_CTX_set_client_cert_cb(pTls, NoteCertificateRequest);
        SSL_CTX_set_cert_verify_callback(pTls, Verify, pConnection);
        const bool blAll = AddApplianceCa(SSL_CTX_get_cert_store(pTls));
        return blAll || !static_cast<Connection *>(pConnection)->blVerify
                   ? CURLE_OK
                   : CURLE_SSL_CACERT_BADFILE;
    } catch (const std::bad_alloc &) {
        return CURLE_OUT_OF_MEMORY;
    }
}

// --- Handles ------------------------------------------------------------------------------------

// Whether the environment names a proxy, in one of the variables that libcurl looks at. Where it
// names none, as on most appliances, an exchange need not read the configuration.
bool NamesProxy() {
    constexpr std::array<const char *, 5> kVariables = {"http_proxy", "https_proxy", "HTTPS_PROXY",
                                                        "all_proxy", "ALL_PROXY"};
    return std::any_of(kVariables.begin(), kVariables.end(),
                       [](const char *szName) { return std::getenv(szName) != nullptr; });
}

void SetOptions(Connection &connection) {
    CURL *const pEasy = connection.pEasy.get();
    // Forgets the options of the exchange before, and how often libcurl has sent one again.
    curl_easy_reset(pEasy);
    curl_easy_setopt(pEasy, CURLOPT_ERRORBUFFER, connection.reason.data());
    curl_easy_setopt(pEasy, CURLOPT_MAXAGE_CONN, kMaxIdleTime_s);
    curl_easy_setopt(pEasy, CURLOPT_MAXLIFETIME_CONN, kMaxLife_s);
    // Each connection is verified against the authorities that there are as it begins.
    curl_easy_setopt(pEasy, CURLOPT_CA_CACHE_TIMEOUT, 0L);
    curl_easy_setopt(pEasy, CURLOPT_OPENSOCKETFUNCTION, OpenSocket);
    curl_easy_setopt(pEasy, CURLOPT_OPENSOCKETDATA, &connection);
    curl_easy_setopt(pEasy, CURLOPT_CLOSESOCKETFUNCTION, CloseSocket);
    curl_easy_setopt(pEasy, CURLOPT_CLOSESOCKETDATA, &connection);
    curl_easy_setopt(pEasy, CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYPEER, 1L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYHOST, 2L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_CTX_FUNCTION, SetUpTls);
    curl_easy_setopt(pEasy, CURLOPT_SSL_CTX_DATA, &connection);
    // A session that is resumed is not verified again.
    curl_easy_setopt(pEasy, CURLOPT_SSL_SESSIONID_CACHE, 0L);
}

// Between exchanges nothing arrives but the end of the connection. libcurl takes a close_notify of
// TLS for data, and the connection for alive.
bool IsQuiet(const Connection &connection) {
    return std::all_of(connection.sockets.begin(), connection.sockets.end(), [](curl_socket_t fd) {
        pollfd look = {fd, POLLIN, 0};
        return poll(&look, 1, 0) == 0;
    });
}

// Connections that have ended are not used again.
std::unique_ptr<Connection> TakeIdle() {
    Pool &pool = *g_pool;
    std::unique_ptr<Connection> pConnection;
    while (true) {
        {
            const std::lock_guard<std::mutex> lock(pool.mutex);
            pool.idle.reserve(kMaxIdleHandles);
            if (pool.idle.empty()) {
                return nullptr;
            }
            pConnection = std::move(pool.idle.back());
            pool.idle.pop_back();
        }
        if (IsQuiet(*pConnection)) {
            return pConnection;
        }
        // Outside the lock: closing a connection calls back into the pool.
        pConnection.reset();
    }
}

}  // namespace

Borrowed::Borrowed() {
    if (g_globalInit != CURLE_OK) {
        return;
    }
    m_pConnection = TakeIdle();
    if (m_pConnection == nullptr) {
        m_pConnection = std::make_unique<Connection>();
        m_pConnection->pEasy.reset(curl_easy_init());
        m_pConnection->blNamesProxy = NamesProxy();
    }
    if (m_pConnection->pEasy != nullptr) {
        SetOptions(*m_pConnection);
    }
    const std::lock_guard<std::mutex> lock(g_pool->mutex);
    g_pool->inUse.insert(m_pConnection.get());
    // A child process, where memory may be short, moves all of them there.
    g_pool->abandoned.reserve(g_pool->abandoned.size() + kMaxIdleHandles + g_pool->inUse.size());
}

Borrowed::~Borrowed() {
    if (m_pConnection == nullptr) {
        return;
    }
    Pool &pool = *g_pool;
    const std::lock_guard<std::mutex> lock(pool.mutex);
    pool.inUse.erase(m_pConnection.get());
    if (pool.idle.size() < pool.idle.capacity() && m_pConnection->pEasy != nullptr) {
        pool.idle.push_back(std::move(m_pConnection));
    }
}

}  // namespace host
