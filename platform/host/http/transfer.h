// An exchange in progress: what has arrived, and whether it may go on.

#ifndef ZELO_HOST_TRANSFER_H
#define ZELO_HOST_TRANSFER_H

#include <cstddef>

#include "curl_handle.h"
#include "http_exchange.h"
#include "reply_sink.h"
#include "wait.h"

namespace host {

struct Transfer {
    Transfer(const HttpRequest &ofRequest, CurlHandle &onHandle);

    const HttpRequest &request;
    CurlHandle &handle;
    ReplySink sink;
    Wait wait;              // for the whole of it
    const Wait connecting;  // until the request can be sent
    int sendings = 0;
    std::size_t cbBesidesBody = 0;
    bool blHeadersEnded = false;
    long status = 0;  // once the body has begun
    bool blEncoded = false;
    bool blStopped = false;  // by the program's observer

    bool IsConnecting() const { return sendings == 0; }
    bool IsTooMuch() const;
    bool IsTimeUp() const;
};

// Lets libcurl call back for all that arrives, and for what the program wants to see.
void SetCallbacks(Transfer &transfer);

}  // namespace host

#endif
