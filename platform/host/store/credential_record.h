// How the host platform lays out the records of the credential store in memory.

#ifndef ZELO_HOST_CREDENTIAL_RECORD_H
#define ZELO_HOST_CREDENTIAL_RECORD_H

#include <optional>
#include <string>

#include "credential_store.h"

// A field without a value was never set.
struct ZELO_CRED {
    long id = -1;
    std::optional<std::string> application;
    std::optional<std::string> host;
    std::optional<std::string> protocol;
    std::optional<std::string> extraInfo;
    std::optional<long> port;
    std::optional<long> owner;
    std::optional<long> createTime_s;
    std::optional<long> modifyTime_s;
};

struct ZELO_CRED_SESS {
    long id = -1;
    std::optional<std::string> accessToken;
    std::optional<std::string> csrfToken;
};

#endif
