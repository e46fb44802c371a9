// A server as a credential record describes it.

#ifndef ZELO_HOST_SERVER_ADDRESS_H
#define ZELO_HOST_SERVER_ADDRESS_H

#include <string>

#include "credential_store.h"
#include "status.h"

namespace host {

struct ServerAddress {
    std::string strProtocol;  // "https", "http" or "fld"
    std::string strHost;
    long port = 0;

    bool IsRelayed() const { return strProtocol == "fld"; }

    // The URL of a path there; the query is empty, or "name=value" with a value that is encoded
    // here. Fails when no request can go there: the protocol is none of ours, the port out of
    // range, or the host holds more than a name, an IPv4 or an IPv6 address.
    Status Url(const std::string &strPath, const std::string &strQuery, std::string &strUrl) const;
};

// "host:port" of an URL that Url made.
std::string HostAndPortOf(const std::string &strUrl);

Status ReadAddress(const ZELO_CRED *pCred, ServerAddress &address);

}  // namespace host

#endif
