// One loopback port on which HTTP requests are served, in the clear or over TLS.
//
// Connections stay open between requests for as long as they are used now and then.

#ifndef ZELO_LOOPBACK_LISTENER_H
#define ZELO_LOOPBACK_LISTENER_H

#include <functional>
#include <future>
#include <memory>
#include <string>

#include "dev_certificate.h"

namespace httplib {
struct Request;
struct Response;
class Server;
}  // namespace httplib

namespace devserver {

// Whether the text is a numeric loopback address: 127.0.0.0/8 or ::1.
bool IsLoopback(const std::string &strAddress);

class LoopbackListener {
  public:
    using Handler = std::function<void(const httplib::Request &, httplib::Response &)>;

    LoopbackListener();
    ~LoopbackListener();  // stops

    // Listens on the port, 0 for a free one, and gives each request to the handler, in threads of
    // its own. Speaks TLS when there is a certificate. Returns false, and says why in one line,
    // when it cannot.
    bool Start(const std::string &strHost, int port, const ServerCertificate *pCertificate,
               const Handler &handler, std::string &strReason);

    // Ends the connection of a request that is being served. Over TLS it ends in TLS's own way
    // alone, so that the reply before gets there, unless abruptly.
    void End(const httplib::Request &request, bool blAbruptly) const;

    // Ends every connection and returns when no thread is left. A handler is waited for.
    void Stop();

    // The port that is listened on, after Start.
    int Port() const { return m_port; }

  private:
    std::unique_ptr<httplib::Server> m_pServer;
    std::future<bool> m_done;
    int m_port = 0;
};

}  // namespace devserver

#endif
