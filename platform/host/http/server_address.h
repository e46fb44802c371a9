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

    // Whether a request can go there, and the URL of a path there; the query is empty, or
    // "name=value" with a value that is encoded here.
    Status Url(const std::string &strPath, const std::string &strQuery, std::string &strUrl) const;
};

Status ReadAddress(const ZELO_CRED *pCred, ServerAddress &address);

}  // namespace host

#endif
