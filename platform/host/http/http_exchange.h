// One HTTP exchange over the connections that this process keeps open.
//
// What the transport promises: certificate and host name of each connection are verified against
// the system's and the appliance's own authorities, unless the request says otherwise; only http
// and https; no redirect; a POST is sent at most once; no reply counts that is cut or encoded;
// connecting, stalling, a body in memory and whatever else arrives are bounded, and the process's
// deadline holds; connections are used again, but never by a child process.

#ifndef ZELO_HOST_HTTP_EXCHANGE_H
#define ZELO_HOST_HTTP_EXCHANGE_H

#include <cstdio>
#include <string>
#include <vector>

#include "status.h"
#include "web_api_request.h"

namespace host {

struct HttpRequest {
    std::string strUrl;            // one of ServerAddress::Url's
    bool blRelay = false;          // through the relay of the platform's configuration
    bool blPost = false;           // POST strBody as JSON; otherwise GET
    bool blKeepConnection = true;  // false: close the connection afterwards
    long long limit_ms = 0;        // for the whole exchange; 0: the transport's own
    bool blVerify = true;          // false: take whoever answers, over a new connection
    bool blOwnConnection = false;  // over a new connection, none that was kept
    std::string strBody;
    std::vector<std::string> headers;  // "Name: value"

    // Where the body goes instead of HttpReply.
    std::FILE *pStream = nullptr;
    ZELO::CredRequest::RespWriteCallback pfnWrite = nullptr;
    bool blHasCopy = false;  // the request tells of a copy that may turn out to be current
};

struct HttpReply {
    int error = ZELO::CRED_REQ_ERR_NONE;  // why there is none: a value of CRED_REQ_ERROR
    long status = 0;
    std::string strBody;
};

// Performs the exchange, watched by the thread's progress observer; it is the thread's latest
// exchange then. It succeeds when a whole reply arrived, whatever its status (with a stream: one of
// 2xx, and written whole). Otherwise reply holds the status, and what came of the body into memory,
// as far as there was one. A failure is to be logged, unless it says that the copy is current.
// Throws std::bad_alloc.
Status Perform(const HttpRequest &request, HttpReply &reply);

}  // namespace host

#endif
