// The options of libcurl for one exchange.

#ifndef ZELO_HOST_EXCHANGE_OPTIONS_H
#define ZELO_HOST_EXCHANGE_OPTIONS_H

#include <curl/curl.h>

#include <memory>
#include <string>

#include "curl_handle.h"
#include "http_exchange.h"
#include "status.h"

namespace host {

// The longest that connecting may take, from the look-up of the name to the end of the handshake.
constexpr long kConnectLimit_s = 10;

struct FreeHeaders {
    void operator()(curl_slist *pHeaders) const { curl_slist_free_all(pHeaders); }
};
using Headers = std::unique_ptr<curl_slist, FreeHeaders>;

// Sets the options for the request, but for its callbacks. The request and the headers are used
// until the exchange is over. Throws std::bad_alloc.
Status SetOptions(const HttpRequest &request, CurlHandle &handle, Headers &headers);

}  // namespace host

#endif
