#include "server_address.h"

#include "http_exchange.h"
#include "printable.h"
#include "store/credential_record.h"

namespace host {

Status ServerAddress::Url(const std::string &strPath, const std::string &strQuery,
                          std::string &strUrl) const {
    if (strProtocol != "https" && strProtocol != "http" && !IsRelayed()) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT,
                          "the protocol '" + printable::Line(strProtocol) + "' is none of ours");
    }
    strUrl = BuildUrl(IsRelayed() ? "https" : strProtocol, strHost, port, strPath, strQuery);
    if (strUrl.empty()) {
        return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT,
                          "a host or port that cannot stand in an URL: '" +
                              printable::Line(strHost) + "', " + std::to_string(port));
    }
    return {};
}

Status ReadAddress(const ZELO_CRED *pCred, ServerAddress &address) {
    HOST_REQUIRE(pCred != nullptr && pCred->protocol && pCred->host && pCred->port);
    address = {*pCred->protocol, *pCred->host, *pCred->port};
    return {};
}

}  // namespace host
