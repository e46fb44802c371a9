// The libcurl handles of the process, with the connections that they keep.

#ifndef ZELO_HOST_CONNECTION_POOL_H
#define ZELO_HOST_CONNECTION_POOL_H

#include <curl/curl.h>

#include <array>
#include <memory>
#include <set>
#include <string>

#include "diagnosis.h"

namespace host {

struct CleanupEasy {
    void operator()(CURL *pEasy) const { curl_easy_cleanup(pEasy); }
};
// A handle with the connections that it keeps. The sockets are known by number, so that a child
// process can close its copies without a word on the wire.
struct Connection {
    std::set<curl_socket_t> sockets;
    bool blNamesProxy = false;  // whether the environment did when the handle was made
    std::array<char, CURL_ERROR_SIZE> reason = {};  // libcurl's, of what failed
    // The exchange that goes on over it, and what TLS says in it.
    std::string strHost;
    bool blVerify = true;
    ZELO::Exchange *pRecord = nullptr;
    bool blEndAnnounced = false;
    // Goes first: cleaning it up closes its sockets, which calls back to the set above.
    std::unique_ptr<CURL, CleanupEasy> pEasy;
};

// A handle borrowed from the pool, given back when the exchange is over. It comes with the options
// of its connections: who is trusted, and how long one is kept.
class Borrowed {
  public:
    Borrowed();
    ~Borrowed();
    Borrowed(const Borrowed &) = delete;
    Borrowed &operator=(const Borrowed &) = delete;

    // Null when there is no memory for one.
    CURL *Easy() const { return m_pConnection == nullptr ? nullptr : m_pConnection->pEasy.get(); }
    Connection *Get() const { return m_pConnection.get(); }

  private:
    std::unique_ptr<Connection> m_pConnection;
};

}  // namespace host

#endif
