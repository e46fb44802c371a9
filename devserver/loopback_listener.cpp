#include "loopback_listener.h"

#include <arpa/inet.h>
#include <httplib.h>
#include <sys/socket.h>

#include <chrono>
#include <limits>

namespace devserver {
namespace {

// Each open connection, idle or not, keeps one of the threads.
constexpr std::size_t kThreads = 32;
constexpr time_t kIdleConnection_s = 60;
// How long a client may be silent in the middle of its handshake or its request, or take nothing of
// a reply. On a busy machine a process may wait for seconds before it goes on.
constexpr time_t kSilentClient_s = 60;
constexpr std::size_t kMaxRequestBody = 16UL << 20U;
constexpr const char *kAnyPath = "[\\s\\S]*";

using AddressOf = decltype(getsockname);

// -1 for what is no socket with a port.
int PortOf(int fd, AddressOf *pfnAddressOf) {
    // The port stands at the same place in the addresses of both families.
    sockaddr_in6 address{};
    socklen_t cb = sizeof(address);
    const bool blHasPort = pfnAddressOf(fd, reinterpret_cast<sockaddr *>(&address), &cb) == 0 &&
                           (address.sin6_family == AF_INET || address.sin6_family == AF_INET6);
    return blHasPort ? ntohs(address.sin6_port) : -1;
}

// The HTTP library waits for the next request of an idle connection until its time is over, even
// when it is stopped, and does not tell which sockets it accepted: they are those whose own port is
// the one listened on. Descriptors beyond select()'s limit it does not wait for.
// All of them, or the one with this port at its other end.
void ShutDownConnections(int port, int peerPort = 0) {
    for (int fd = 0; fd < FD_SETSIZE; ++fd) {
        if (PortOf(fd, getsockname) == port &&
            (peerPort == 0 || PortOf(fd, getpeername) == peerPort)) {
            shutdown(fd, SHUT_RDWR);
        }
    }
}

// The HTTP library makes a table on its first request. Made before there are threads, it is no race
// to a sanitizer that cannot look into the library.
class FirstRequest : private httplib::Server {
  public:
    FirstRequest() {
        httplib::detail::BufferStream stream;
        bool blClosed = false;
        stream.write("GET / HTTP/1.1\r\n\r\n", 18);
        process_request(stream, true, blClosed, nullptr);
    }
};

std::unique_ptr<httplib::Server> MakeServer(const ServerCertificate *pCertificate) {
    if (pCertificate == nullptr) {
        return std::make_unique<httplib::Server>();
    }
    return std::make_unique<httplib::SSLServer>([pCertificate](SSL_CTX &context) {
        if (pCertificate->blOfClients) {
            SSL_CTX_set_verify(&context, SSL_VERIFY_PEER | SSL_VERIFY_FAIL_IF_NO_PEER_CERT,
                               nullptr);
        }
        return SSL_CTX_set_min_proto_version(&context, TLS1_2_VERSION) == 1 &&
               SSL_CTX_use_certificate(&context, pCertificate->pCertificate.get()) == 1 &&
               SSL_CTX_use_PrivateKey(&context, pCertificate->pKey.get()) == 1;
    });
}

void SetUp(httplib::Server &server, const LoopbackListener::Handler &handler) {
    server.Get(kAnyPath, handler).Post(kAnyPath, handler).Delete(kAnyPath, handler);
    server.Put(kAnyPath, handler).Patch(kAnyPath, handler).Options(kAnyPath, handler);
    server.set_tcp_nodelay(true);
    server.set_keep_alive_max_count(std::numeric_limits<std::size_t>::max());
    server.set_keep_alive_timeout(kIdleConnection_s);
    server.set_read_timeout(kSilentClient_s);
    server.set_write_timeout(kSilentClient_s);
    server.set_payload_max_length(kMaxRequestBody);
    server.new_task_queue = [] { return new httplib::ThreadPool(kThreads); };
    // The library's own choice would share a port with another server instead of failing.
    server.set_socket_options([](int fd) {
        const int yes = 1;
        setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &yes, sizeof(yes));
    });
}

}  // namespace

bool IsLoopback(const std::string &strAddress) {
    in_addr address{};
    if (inet_pton(AF_INET, strAddress.c_str(), &address) == 1) {
        return ntohl(address.s_addr) >> 24U == IN_LOOPBACKNET;
    }
    in6_addr address6{};
    return inet_pton(AF_INET6, strAddress.c_str(), &address6) == 1 &&
           IN6_IS_ADDR_LOOPBACK(&address6);
}

LoopbackListener::LoopbackListener() = default;

LoopbackListener::~LoopbackListener() {
    Stop();
}

bool LoopbackListener::Start(const std::string &strHost, int port,
                             const ServerCertificate *pCertificate, const Handler &handler,
                             std::string &strReason) {
    const FirstRequest before;
    m_pServer = MakeServer(pCertificate);
    if (!m_pServer->is_valid()) {
        strReason = "OpenSSL does not take the server's certificate";
        return false;
    }
    SetUp(*m_pServer, handler);
    if (port == 0) {
        m_port = m_pServer->bind_to_any_port(strHost);
    } else {
        m_port = m_pServer->bind_to_port(strHost, port) ? port : -1;
    }
    if (m_port <= 0) {
        strReason = "cannot listen on " + strHost + " port " + std::to_string(port) +
                    ": it is taken or not allowed; name another port, or 0 for a free one";
        return false;
    }
    m_done = std::async(std::launch::async, [this] { return m_pServer->listen_after_bind(); });
    // Stopping a server that does not run yet would go unnoticed.
    while (!m_pServer->is_running()) {
        if (m_done.wait_for(std::chrono::milliseconds(1)) == std::future_status::ready) {
            strReason = "cannot serve on " + strHost + " port " + std::to_string(m_port);
            return false;
        }
    }
    return true;
}

void LoopbackListener::End(const httplib::Request &request, bool blAbruptly) const {
    if (request.ssl != nullptr && !blAbruptly) {
        SSL_shutdown(const_cast<SSL *>(request.ssl));
        shutdown(SSL_get_fd(request.ssl), SHUT_RD);  // no request is read any more
    } else {
        ShutDownConnections(m_port, request.remote_port);
    }
}

void LoopbackListener::Stop() {
    if (!m_done.valid()) {
        return;
    }
    m_pServer->stop();
    while (m_done.wait_for(std::chrono::milliseconds(20)) != std::future_status::ready) {
        ShutDownConnections(m_port);
    }
    m_done = {};
}

}  // namespace devserver
