// The libcurl handles of the process, with the connections that they keep.

#ifndef ZELO_HOST_CURL_HANDLE_H
#define ZELO_HOST_CURL_HANDLE_H

#include <curl/curl.h>
#include <pthread.h>

#include <array>
#include <memory>
#include <set>
#include <string>

#include "diagnosis.h"

namespace host {

struct CleanupEasy {
    void operator()(CURL *pEasy) const { curl_easy_cleanup(pEasy); }
};
struct CleanupMulti {
    void operator()(CURLM *pMulti) const { curl_multi_cleanup(pMulti); }
};

// A handle with the connections that it keeps. It is used inside libcurl (fork_guard.h) only.
struct CurlHandle {
    // Known by number, so that a child process can close its copies without a word on the wire.
    std::set<curl_socket_t> sockets;
    bool blNamesProxy = false;  // the environment named a proxy when the handle was made
    // Of the exchange in progress.
    pthread_t user = {};        // the thread that makes it
    bool blForked = false;      // the process was forked in the middle of it: this is the child
    std::string strHost;        // the host that the certificate has to be for
    bool blVerify = true;       // whether the certificate has to be trusted
    ZELO::Exchange record;      // what the exchange meets
    bool blTlsEnded = false;    // TLS has announced the end of the connection
    std::string strTlsFailure;  // why TLS was not begun
    std::array<char, CURL_ERROR_SIZE> reason = {};  // libcurl's, of what failed
    // Last, so that they are destroyed first: cleaning them up closes the sockets, which calls back
    // to the set above. pMulti holds the connections.
    std::unique_ptr<CURL, CleanupEasy> pEasy;
    std::unique_ptr<CURLM, CleanupMulti> pMulti;
};

// A handle from the process's pool, given back when the exchange is over. It comes with the options
// of its connections: who is trusted, and how long one is kept.
class BorrowedHandle {
  public:
    // Throws std::bad_alloc.
    BorrowedHandle();
    ~BorrowedHandle();
    BorrowedHandle(const BorrowedHandle &) = delete;
    BorrowedHandle &operator=(const BorrowedHandle &) = delete;

    CurlHandle &operator*() const { return *m_pHandle; }

  private:
    std::unique_ptr<CurlHandle> m_pHandle;
};

}  // namespace host

#endif
