// Why a request to the joined server got no usable reply, for a message that names the cause.

#ifndef QRMCTL_LOST_REPLY_H
#define QRMCTL_LOST_REPLY_H

#include <json/value.h>

#include <string>

#include "joined_server.h"
#include "report.h"

namespace qrmctl {

// Ends the command with the code that a server's reply holds, as "server_code" and "server_error".
ExitCode FailRefused(const Json::Value &reply, const std::string &strWhat, Report &report);

// Ends the command after a request for the API that failed: asks the server once more, without a
// token, where it serves the API. An error code that it answers with is its refusal; an HTTP status
// other than 200 is named; otherwise the failure is the id with strError.
ExitCode FailRequest(ErrorId id, const std::string &strError, const JoinedServer &server,
                     const std::string &strApi, Report &report);

}  // namespace qrmctl

#endif
