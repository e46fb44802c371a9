// HTTP exchanges on pooled libcurl handles.

#include "http_exchange.h"

#include <curl/curl.h>
#include <openssl/ssl.h>
#include <pthread.h>
#include <sys/socket.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <limits>
#include <memory>
#include <mutex>
#include <new>
#include <set>
#include <string_view>

#include "appliance_ca.h"
#include "key_value_lookup.h"
#include "last_error.h"
#include "printable.h"
#include "reply_sink.h"
#include "waiting.h"

namespace host {
namespace {

constexpr const char *kFile = "http_exchange";

constexpr long kConnectTimeout_s = 10;
// A server that sends a byte now and then stalls too.
constexpr long kStallBytesPerSecond = 100;
constexpr long kStallTime_s = 30;
// For a body in memory; one that goes to a stream may take its time as long as it moves.
constexpr long kWholeTimeout_s = 300;
constexpr long kLongestTimeout_s = std::numeric_limits<int>::max() / 1000;
constexpr long kStreamBuffer = 512 * 1024L;
constexpr long kReplyBuffer = 16 * 1024L;
// What is sent is small, while libcurl allocates and frees its buffer for each exchange.
constexpr long kUploadBuffer = 16 * 1024L;

// Of the ciphers of TLS 1.3: takes less time than the one that OpenSSL puts first.
constexpr std::string_view kFirstCipher = "TLS_AES_128_GCM_SHA256";

// More idle handles than this are not kept.
constexpr std::size_t kMaxIdle = 8;

struct CleanupEasy {
    void operator()(CURL *pEasy) const { curl_easy_cleanup(pEasy); }
};
struct FreeList {
    void operator()(curl_slist *pList) const { curl_slist_free_all(pList); }
};
struct CleanupUrl {
    void operator()(CURLU *pUrl) const { curl_url_cleanup(pUrl); }
};
struct FreeText {
    void operator()(char *sz) const { curl_free(sz); }
};

// The headers of an exchange as libcurl takes them.
struct HeaderList {
    bool blPost = false;
    std::vector<std::string> own;  // the request's
    std::unique_ptr<curl_slist, FreeList> pList;
};

// A handle with the connections that it keeps. The sockets are known by number, so that a child
// process can close its copies without a word on the wire.
struct Connection {
    std::set<curl_socket_t> sockets;
    CaState caState;
    bool blNamesProxy = false;  // whether the environment did when the handle was made
    std::array<char, CURL_ERROR_SIZE> reason = {};
    HeaderList headers;  // of the latest exchange; the next one mostly has the same
    // Goes first: cleaning it up closes its sockets, which calls back to the set above.
    std::unique_ptr<CURL, CleanupEasy> pEasy;
};

// All handles of the process, idle and in use. Never destroyed: other threads may still be in an
// exchange while the process ends.
struct Pool {
    std::mutex mutex;
    std::vector<std::unique_ptr<Connection>> idle;
    std::set<Connection *> inUse;
    std::vector<Connection *> abandoned;
};

Pool &ThePool() {
    static auto *const pPool = new Pool;
    return *pPool;
}

void LockBeforeFork() {
    ThePool().mutex.lock();
}

void UnlockInParent() {
    ThePool().mutex.unlock();
}

// The child closes its copies of the sockets and forgets the handles without cleaning them up: an
// orderly end of a TLS connection would end the parent's.
void AbandonInChild() {
    Pool &pool = ThePool();
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
        pConnection->caState = CaState();
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
        const std::lock_guard<std::mutex> lock(ThePool().mutex);
        static_cast<Connection *>(pContext)->sockets.insert(fd);
        return fd;
    } catch (const std::bad_alloc &) {
        close(fd);
        return CURL_SOCKET_BAD;
    }
}

int CloseSocket(void *pContext, curl_socket_t fd) {
    const std::lock_guard<std::mutex> lock(ThePool().mutex);
    static_cast<Connection *>(pContext)->sockets.erase(fd);
    return close(fd);
}

struct Transfer {
    const HttpRequest &request;
    CURL *pEasy;
    ReplySink sink;
    long status = 0;  // once the body has begun
    bool blStopped = false;
};

size_t TakeBody(char *pData, size_t size, size_t count, void *pContext) {
    auto *const pTransfer = static_cast<Transfer *>(pContext);
    if (pTransfer->status == 0) {
        curl_easy_getinfo(pTransfer->pEasy, CURLINFO_RESPONSE_CODE, &pTransfer->status);
    }
    const size_t cb = size * count;
    return pTransfer->sink.Take(pData, cb, pTransfer->status) ? cb : CURL_WRITEFUNC_ERROR;
}

int ShowProgress(void *pContext, curl_off_t cbExpected, curl_off_t /*cbReceived*/,
                 curl_off_t /*cbToSend*/, curl_off_t /*cbSent*/) {
    auto *const pTransfer = static_cast<Transfer *>(pContext);
    pTransfer->blStopped = !pTransfer->request.pfnObserver(pTransfer->request.pObserverContext,
                                                           pTransfer->sink.Written(),
                                                           cbExpected > 0 ? cbExpected : -1);
    return pTransfer->blStopped ? 1 : 0;
}

// Puts the cipher first where it is allowed; what the system's configuration leaves out stays out.
void PreferCipher(SSL_CTX *pTls) {
    std::string strFirst;
    std::string strOthers;
    const STACK_OF(SSL_CIPHER) *pCiphers = SSL_CTX_get_ciphers(pTls);
    for (int i = 0; i < sk_SSL_CIPHER_num(pCiphers); ++i) {
        const SSL_CIPHER *pCipher = sk_SSL_CIPHER_value(pCiphers, i);
        const std::string_view name = SSL_CIPHER_get_name(pCipher);
        if (name == kFirstCipher) {
            strFirst = name;
        } else if (SSL_CIPHER_get_version(pCipher) == std::string_view("TLSv1.3")) {
            strOthers.append(":").append(name);
        }
    }
    if (!strFirst.empty()) {
        static_cast<void>(SSL_CTX_set_ciphersuites(pTls, (strFirst + strOthers).c_str()));
    }
}

CURLcode SetUpTls(CURL * /*pEasy*/, void *pSslContext, void * /*pContext*/) {
    try {
        auto *const pTls = static_cast<SSL_CTX *>(pSslContext);
        PreferCipher(pTls);
        X509_STORE *pStore = SSL_CTX_get_cert_store(pTls);
        return AddApplianceCa(pStore) ? CURLE_OK : CURLE_SSL_CACERT_BADFILE;
    } catch (const std::bad_alloc &) {
        return CURLE_OUT_OF_MEMORY;
    }
}

// --- What every exchange on a handle has in common ----------------------------------------------

void SetTransport(CURL *pEasy, Connection *pConnection) {
    curl_easy_setopt(pEasy, CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(pEasy, CURLOPT_PROTOCOLS_STR, "http,https");
    curl_easy_setopt(pEasy, CURLOPT_FOLLOWLOCATION, 0L);
    curl_easy_setopt(pEasy, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
    curl_easy_setopt(pEasy, CURLOPT_CONNECTTIMEOUT, kConnectTimeout_s);
    // A name server that is silent is not waited for either.
    curl_easy_setopt(pEasy, CURLOPT_QUICK_EXIT, 1L);
    curl_easy_setopt(pEasy, CURLOPT_LOW_SPEED_LIMIT, kStallBytesPerSecond);
    curl_easy_setopt(pEasy, CURLOPT_LOW_SPEED_TIME, kStallTime_s);
    curl_easy_setopt(pEasy, CURLOPT_UPLOAD_BUFFERSIZE, kUploadBuffer);
    curl_easy_setopt(pEasy, CURLOPT_SUPPRESS_CONNECT_HEADERS, 1L);
    curl_easy_setopt(pEasy, CURLOPT_OPENSOCKETFUNCTION, OpenSocket);
    curl_easy_setopt(pEasy, CURLOPT_OPENSOCKETDATA, pConnection);
    curl_easy_setopt(pEasy, CURLOPT_CLOSESOCKETFUNCTION, CloseSocket);
    curl_easy_setopt(pEasy, CURLOPT_CLOSESOCKETDATA, pConnection);
    curl_easy_setopt(pEasy, CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYPEER, 1L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_VERIFYHOST, 2L);
    curl_easy_setopt(pEasy, CURLOPT_SSL_CTX_FUNCTION, SetUpTls);
    curl_easy_setopt(pEasy, CURLOPT_WRITEFUNCTION, TakeBody);
    curl_easy_setopt(pEasy, CURLOPT_XFERINFOFUNCTION, ShowProgress);
    curl_easy_setopt(pEasy, CURLOPT_ERRORBUFFER, pConnection->reason.data());
}

// Whether the environment names a proxy, in one of the variables that libcurl looks at. Where it
// names none, as on most appliances, an exchange need not read the configuration.
bool NamesProxy() {
    constexpr std::array<const char *, 5> kVariables = {"http_proxy", "https_proxy", "HTTPS_PROXY",
                                                        "all_proxy", "ALL_PROXY"};
    return std::any_of(kVariables.begin(), kVariables.end(),
                       [](const char *szName) { return std::getenv(szName) != nullptr; });
}

// --- Pool ---------------------------------------------------------------------------------------

// A handle borrowed from the pool, given back when the exchange is over.
class Borrowed {
  public:
    Borrowed() {
        static const CURLcode globalInit = curl_global_init(CURL_GLOBAL_DEFAULT);
        if (globalInit != CURLE_OK) {
            return;
        }
        m_pConnection = TakeIdle();
        if (m_pConnection == nullptr) {
            m_pConnection = std::make_unique<Connection>();
            m_pConnection->pEasy.reset(curl_easy_init());
            m_pConnection->caState = CaState::Now();
            m_pConnection->blNamesProxy = NamesProxy();
            if (m_pConnection->pEasy != nullptr) {
                SetTransport(m_pConnection->pEasy.get(), m_pConnection.get());
            }
        }
        const std::lock_guard<std::mutex> lock(ThePool().mutex);
        ThePool().inUse.insert(m_pConnection.get());
    }
    ~Borrowed() {
        if (m_pConnection == nullptr) {
            return;
        }
        Pool &pool = ThePool();
        const std::lock_guard<std::mutex> lock(pool.mutex);
        pool.inUse.erase(m_pConnection.get());
        if (pool.idle.size() < pool.idle.capacity() && m_pConnection->pEasy != nullptr) {
            pool.idle.push_back(std::move(m_pConnection));
        }
    }
    Borrowed(const Borrowed &) = delete;
    Borrowed &operator=(const Borrowed &) = delete;

    CURL *Easy() const { return m_pConnection == nullptr ? nullptr : m_pConnection->pEasy.get(); }
    Connection *Get() const { return m_pConnection.get(); }

  private:
    // Connections verified against another set of authorities are not used again.
    static std::unique_ptr<Connection> TakeIdle() {
        Pool &pool = ThePool();
        std::unique_ptr<Connection> pConnection;
        while (true) {
            {
                const std::lock_guard<std::mutex> lock(pool.mutex);
                pool.idle.reserve(kMaxIdle);
                if (pool.idle.empty()) {
                    return nullptr;
                }
                pConnection = std::move(pool.idle.back());
                pool.idle.pop_back();
            }
            if (pConnection->caState.Holds()) {
                return pConnection;
            }
            // Outside the lock: closing a connection calls back into the pool.
            pConnection.reset();
        }
    }

    std::unique_ptr<Connection> m_pConnection;
};

// --- What each exchange on a handle sets anew ---------------------------------------------------

// Chooses the way: through the relay, as the environment says where the configuration allows it, or
// direct. False when the relay is asked for and none is named.
bool SetWay(const Connection &connection, bool blRelay) {
    CURL *const pEasy = connection.pEasy.get();
    std::string strValue;
    if (blRelay) {
        if (LookUpKey(kConfigFile, "farlink_relay", strValue) != LookUp::kFound ||
            strValue.empty()) {
            return false;
        }
        curl_easy_setopt(pEasy, CURLOPT_PROXY, ("http://" + strValue).c_str());
        curl_easy_setopt(pEasy, CURLOPT_NOPROXY, "");
        curl_easy_setopt(pEasy, CURLOPT_HTTPPROXYTUNNEL, 1L);
        return true;
    }
    const bool blEnvironment =
        connection.blNamesProxy &&
        LookUpKey(kConfigFile, "use_proxy_environment", strValue) == LookUp::kFound &&
        strValue == "yes";
    curl_easy_setopt(pEasy, CURLOPT_PROXY, blEnvironment ? nullptr : "");
    curl_easy_setopt(pEasy, CURLOPT_NOPROXY, nullptr);
    curl_easy_setopt(pEasy, CURLOPT_HTTPPROXYTUNNEL, 0L);
    return true;
}

bool Append(HeaderList &headers, const char *szHeader) {
    curl_slist *pLonger = curl_slist_append(headers.pList.get(), szHeader);
    if (pLonger == nullptr) {
        return false;
    }
    static_cast<void>(headers.pList.release());
    headers.pList.reset(pLonger);
    return true;
}

bool BuildHeaders(const HttpRequest &request, HeaderList &headers) {
    if (headers.pList != nullptr && headers.blPost == request.blPost &&
        headers.own == request.headers) {
        return true;
    }
    HeaderList built;
    bool blAll = Append(built, "Accept: application/json");
    if (request.blPost) {
        // No waiting for a "100 Continue" that some servers never send.
        blAll =
            blAll && Append(built, "Content-Type: application/json") && Append(built, "Expect:");
    }
    for (const std::string &strHeader : request.headers) {
        blAll = blAll && Append(built, strHeader.c_str());
    }
    if (blAll) {
        built.blPost = request.blPost;
        built.own = request.headers;
        headers = std::move(built);
    }
    return blAll;
}

void SetRequest(CURL *pEasy, const HttpRequest &request, const curl_slist *pHeaders) {
    curl_easy_setopt(pEasy, CURLOPT_URL, request.strUrl.c_str());
    curl_easy_setopt(pEasy, CURLOPT_HTTPHEADER, pHeaders);
    const long wholeTimeout_s = request.pStream == nullptr ? kWholeTimeout_s : 0;
    // What libcurl refuses would leave the limit of the exchange before.
    const long ownTimeout_s = std::min<long>(request.timeout_s, kLongestTimeout_s);
    curl_easy_setopt(pEasy, CURLOPT_TIMEOUT, ownTimeout_s > 0 ? ownTimeout_s : wholeTimeout_s);
    curl_easy_setopt(pEasy, CURLOPT_FORBID_REUSE, request.blKeepConnection ? 0L : 1L);
    curl_easy_setopt(pEasy, CURLOPT_BUFFERSIZE,
                     request.pStream == nullptr ? kReplyBuffer : kStreamBuffer);
    curl_easy_setopt(pEasy, CURLOPT_NOPROGRESS, request.pfnObserver == nullptr ? 1L : 0L);
    if (!request.blPost) {
        curl_easy_setopt(pEasy, CURLOPT_HTTPGET, 1L);
        return;
    }
    curl_easy_setopt(pEasy, CURLOPT_POSTFIELDS, request.strBody.c_str());
    curl_easy_setopt(pEasy, CURLOPT_POSTFIELDSIZE_LARGE,
                     static_cast<curl_off_t>(request.strBody.size()));
}

// Whether the text holds nothing but letters, digits, '.', '-', '_' and the one other character.
bool IsPlain(const std::string &strText, char other) {
    return std::all_of(strText.begin(), strText.end(), [other](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
               c == '.' || c == '-' || c == '_' || c == other;
    });
}

// "https://host:port" of an URL.
std::string_view ServerOf(std::string_view url) {
    const std::size_t host = url.find("//");
    return host == std::string_view::npos ? url : url.substr(0, url.find_first_of("/?", host + 2));
}

// The error of a request as the platform's last error.
unsigned int LastErrorOf(int error) {
    switch (error) {
        case ZELO::CRED_REQ_ERR_MEMORY:
            return YLIBC_ERR_OUT_OF_MEMORY;
        case ZELO::CRED_REQ_ERR_STREAM:
            return YLIBC_ERR_FILE;
        case ZELO::CRED_REQ_ERR_REPLY:
        case ZELO::CRED_REQ_ERR_STATUS:
            return YLIBC_ERR_REPLY;
        case ZELO::CRED_REQ_ERR_UNCHANGED:
            return YLIBC_ERR_UNCHANGED;
        default:
            return YLIBC_ERR_NETWORK;
    }
}

int Fail(int error, const HttpRequest &request, const char *szReason, int line) {
    if (error != ZELO::CRED_REQ_ERR_UNCHANGED) {
        // The query names nothing that helps, and it came from a caller.
        const std::string strUrl = request.strUrl.substr(0, request.strUrl.find('?'));
        syslog(LOG_WARNING, "%s:%d %s%s: %s", kFile, line, strUrl.c_str(),
               request.blRelay ? " through the relay" : "", printable::Line(szReason).c_str());
    }
    YLIBCErrSetEx(LastErrorOf(error), kFile, line);
    return error;
}

int Transact(const HttpRequest &request, Connection &connection, HttpReply &reply) {
    CURL *const pEasy = connection.pEasy.get();
    Transfer transfer{request, pEasy,
                      ReplySink(request.pStream, request.pfnWrite, request.blHasCopy)};
    curl_easy_setopt(pEasy, CURLOPT_WRITEDATA, &transfer);
    curl_easy_setopt(pEasy, CURLOPT_XFERINFODATA, &transfer);
    connection.reason[0] = '\0';
    const Waiting waiting({"asking '", ServerOf(request.strUrl), "'"});
    const CURLcode result = curl_easy_perform(pEasy);
    curl_easy_getinfo(pEasy, CURLINFO_RESPONSE_CODE, &reply.status);
    reply.strBody.swap(transfer.sink.Body());
    if (transfer.blStopped) {
        return Fail(ZELO::CRED_REQ_ERR_STOPPED, request, "the program ended it", __LINE__);
    }
    ReplySink &sink = transfer.sink;
    if (sink.Error() != ZELO::CRED_REQ_ERR_NONE ||
        (result == CURLE_OK && !sink.Finish(reply.status))) {
        return Fail(sink.Error(), request, sink.Reason().c_str(), __LINE__);
    }
    if (result != CURLE_OK) {
        return Fail(
            ZELO::CRED_REQ_ERR_NETWORK, request,
            connection.reason[0] != '\0' ? connection.reason.data() : curl_easy_strerror(result),
            __LINE__);
    }
    return ZELO::CRED_REQ_ERR_NONE;
}

}  // namespace

int Perform(const HttpRequest &request, HttpReply &reply) {
    const Borrowed connection;
    CURL *const pEasy = connection.Easy();
    if (pEasy == nullptr || !BuildHeaders(request, connection.Get()->headers)) {
        return Fail(ZELO::CRED_REQ_ERR_MEMORY, request, "out of memory", __LINE__);
    }
    if (!SetWay(*connection.Get(), request.blRelay)) {
        return Fail(ZELO::CRED_REQ_ERR_NETWORK, request,
                    "no relay: set farlink_relay=\"host:port\" in /etc/zeloinfo.conf", __LINE__);
    }
    SetRequest(pEasy, request, connection.Get()->headers.pList.get());
    return Transact(request, *connection.Get(), reply);
}

std::string BuildUrl(const std::string &strScheme, const std::string &strHost, long port,
                     const std::string &strPath, const std::string &strQuery) {
    // libcurl would take a host with control characters, and so would a log line.
    const bool blPlain = std::none_of(strHost.begin(), strHost.end(),
                                      [](unsigned char c) { return c <= ' ' || c == 0x7F; });
    if (port < 1 || port > 65535 || !blPlain) {
        return {};
    }
    // Plain parts, as nearly all are, make an URL as they stand; all others are left to libcurl.
    if (!strHost.empty() && IsPlain(strHost, '.') && IsPlain(strPath, '/') &&
        IsPlain(strQuery, '=') && strQuery.find('=') == strQuery.rfind('=')) {
        return strScheme + "://" + strHost + ':' + std::to_string(port) + strPath +
               (strQuery.empty() ? "" : "?") + strQuery;
    }
    const bool blBareIPv6 = strHost.find(':') != std::string::npos && strHost.front() != '[';
    const std::string strUrlHost = blBareIPv6 ? '[' + strHost + ']' : strHost;
    const std::unique_ptr<CURLU, CleanupUrl> pUrl(curl_url());
    if (pUrl == nullptr ||
        curl_url_set(pUrl.get(), CURLUPART_SCHEME, strScheme.c_str(), 0) != CURLUE_OK ||
        curl_url_set(pUrl.get(), CURLUPART_HOST, strUrlHost.c_str(), 0) != CURLUE_OK ||
        curl_url_set(pUrl.get(), CURLUPART_PORT, std::to_string(port).c_str(), 0) != CURLUE_OK ||
        curl_url_set(pUrl.get(), CURLUPART_PATH, strPath.c_str(), 0) != CURLUE_OK ||
        (!strQuery.empty() && curl_url_set(pUrl.get(), CURLUPART_QUERY, strQuery.c_str(),
                                           CURLU_APPENDQUERY | CURLU_URLENCODE) != CURLUE_OK)) {
        return {};
    }
    char *szRaw = nullptr;
    if (curl_url_get(pUrl.get(), CURLUPART_URL, &szRaw, 0) != CURLUE_OK) {
        return {};
    }
    const std::unique_ptr<char, FreeText> szUrl(szRaw);
    return szUrl.get();
}

}  // namespace host
