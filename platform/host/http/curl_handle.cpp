#include "curl_handle.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <mutex>
#include <new>
#include <utility>
#include <vector>

#include "descriptor.h"
#include "exchange_record.h"
#include "fork_guard.h"
#include "never_destroyed.h"
#include "tls_setup.h"

namespace host {
namespace {

// More idle handles than this are not kept.
constexpr std::size_t kMaxIdleHandles = 8;
constexpr long kMaxConnections = 5;  // of one handle, to different servers
// A connection that is idle for longer is not used again: servers close theirs after 5 s or more,
// and a call must not meet that moment.
constexpr long kMaxIdleTime_s = 3;
// An authority that is removed is not trusted for longer than this.
constexpr long kMaxLife_s = 180;

// All handles of the process, idle and in use. The mutex is taken inside libcurl only, so that no
// thread holds it at a fork.
struct Pool {
    std::mutex mutex;
    std::vector<std::unique_ptr<CurlHandle>> idle;
    std::set<CurlHandle *> inUse;
    std::vector<CurlHandle *> abandoned;
};

NeverDestroyed<Pool> g_pool;

// What libcurl needs once, before a thread can fork in the middle of it.
const CURLcode g_globalInit = curl_global_init(CURL_GLOBAL_DEFAULT);

// A handle that goes on in the child, which was forked by a function that it calls. Its sockets
// become something that is no socket: the exchange fails, and nothing else gets their numbers.
void Disconnect(CurlHandle &handle) {
    handle.blForked = true;
    const Descriptor nothing(open("/dev/null", O_RDWR | O_CLOEXEC));
    for (auto fd = handle.sockets.begin(); fd != handle.sockets.end();) {
        if (dup3(nothing.Get(), *fd, O_CLOEXEC) >= 0) {
            ++fd;
        } else {
            close(*fd);
            fd = handle.sockets.erase(fd);
        }
    }
}

// The child closes its copies of the sockets and forgets the handles without cleaning them up: an
// orderly end of a TLS connection would end the parent's.
void AbandonInChild() {
    Pool &pool = *g_pool;
    for (auto &pHandle : pool.idle) {
        pool.abandoned.push_back(pHandle.release());
    }
    pool.idle.clear();
    for (CurlHandle *pHandle : pool.inUse) {
        if (pthread_equal(pHandle->user, pthread_self()) != 0) {
            Disconnect(*pHandle);
        } else {
            pool.abandoned.push_back(pHandle);
        }
    }
    pool.inUse.clear();
    for (CurlHandle *pHandle : pool.abandoned) {
        for (curl_socket_t fd : pHandle->sockets) {
            close(fd);
        }
        pHandle->sockets.clear();
    }
}

const int g_forkHandlers = GuardForks(AbandonInChild);

// --- Callbacks: they run inside libcurl, so nothing may be thrown out of them -------------------

curl_socket_t OpenSocket(void *pContext, curlsocktype /*purpose*/, curl_sockaddr *pAddress) {
    const int fd = socket(pAddress->family, pAddress->socktype | SOCK_CLOEXEC, pAddress->protocol);
    if (fd < 0) {
        return CURL_SOCKET_BAD;
    }
    try {
        auto *const pHandle = static_cast<CurlHandle *>(pContext);
        NoteAddress(pAddress->addr, pHandle->record);
        pHandle->sockets.insert(fd);
        return fd;
    } catch (const std::bad_alloc &) {
        close(fd);
        return CURL_SOCKET_BAD;
    }
}

int CloseSocket(void *pContext, curl_socket_t fd) {
    return static_cast<CurlHandle *>(pContext)->sockets.erase(fd) > 0 ? close(fd) : 0;
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

std::unique_ptr<CurlHandle> MakeHandle() {
    auto pHandle = std::make_unique<CurlHandle>();
    pHandle->pEasy.reset(g_globalInit == CURLE_OK ? curl_easy_init() : nullptr);
    pHandle->pMulti.reset(pHandle->pEasy != nullptr ? curl_multi_init() : nullptr);
    if (pHandle->pMulti == nullptr) {
        throw std::bad_alloc();
    }
    curl_multi_setopt(pHandle->pMulti.get(), CURLMOPT_MAXCONNECTS, kMaxConnections);
    pHandle->blNamesProxy = NamesProxy();
    return pHandle;
}

void SetOptions(CurlHandle &handle) {
    CURL *const pEasy = handle.pEasy.get();
    // Forgets the options of the exchange before, and how often libcurl has sent one again.
    curl_easy_reset(pEasy);
    curl_easy_setopt(pEasy, CURLOPT_ERRORBUFFER, handle.reason.data());
    curl_easy_setopt(pEasy, CURLOPT_MAXAGE_CONN, kMaxIdleTime_s);
    curl_easy_setopt(pEasy, CURLOPT_MAXLIFETIME_CONN, kMaxLife_s);
    curl_easy_setopt(pEasy, CURLOPT_OPENSOCKETFUNCTION, OpenSocket);
    curl_easy_setopt(pEasy, CURLOPT_OPENSOCKETDATA, &handle);
    curl_easy_setopt(pEasy, CURLOPT_CLOSESOCKETFUNCTION, CloseSocket);
    curl_easy_setopt(pEasy, CURLOPT_CLOSESOCKETDATA, &handle);
    SetUpTls(handle);
}

// Between exchanges nothing arrives but the end of the connection. libcurl takes a close_notify of
// TLS for data, and the connection for alive.
bool IsQuiet(const CurlHandle &handle) {
    return std::all_of(handle.sockets.begin(), handle.sockets.end(), [](curl_socket_t fd) {
        pollfd look = {fd, POLLIN, 0};
        return poll(&look, 1, 0) == 0;
    });
}

// Connections that have ended are not used again.
std::unique_ptr<CurlHandle> TakeIdle() {
    const std::lock_guard<std::mutex> lock(g_pool->mutex);
    auto &idle = g_pool->idle;
    idle.reserve(kMaxIdleHandles);
    while (!idle.empty()) {
        std::unique_ptr<CurlHandle> pHandle = std::move(idle.back());
        idle.pop_back();
        if (IsQuiet(*pHandle)) {
            return pHandle;
        }
    }
    return nullptr;
}

}  // namespace

BorrowedHandle::BorrowedHandle() {
    const InsideLibcurl inside;
    m_pHandle = TakeIdle();
    if (m_pHandle == nullptr) {
        m_pHandle = MakeHandle();
    }
    SetOptions(*m_pHandle);
    m_pHandle->user = pthread_self();
    m_pHandle->record = {};
    m_pHandle->reason[0] = '\0';
    m_pHandle->blTlsEnded = false;
    m_pHandle->strTlsFailure.clear();
    const std::lock_guard<std::mutex> lock(g_pool->mutex);
    // A child process, where memory may be short, moves all of them there.
    g_pool->abandoned.reserve(g_pool->abandoned.size() + kMaxIdleHandles + g_pool->inUse.size() +
                              1);
    // The last step: nothing may fail any more, which would leave the set with a handle that is
    // gone.
    g_pool->inUse.insert(m_pHandle.get());
}

BorrowedHandle::~BorrowedHandle() {
    const InsideLibcurl inside;
    const std::lock_guard<std::mutex> lock(g_pool->mutex);
    g_pool->inUse.erase(m_pHandle.get());
    if (!m_pHandle->blForked && g_pool->idle.size() < g_pool->idle.capacity()) {
        g_pool->idle.push_back(std::move(m_pHandle));
    }
    m_pHandle.reset();
}

}  // namespace host
