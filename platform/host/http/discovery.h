// Discovery: under which path a server serves a Web API.

#ifndef ZELO_HOST_DISCOVERY_H
#define ZELO_HOST_DISCOVERY_H

#include <string>

#include "server_address.h"
#include "status.h"

namespace host {

// Asks the server for the path, which this process remembers.
Status AskForPath(const ServerAddress &server, const std::string &api, std::string &strPath);

// The path that this process remembers; otherwise asks for it.
Status FindPath(const ServerAddress &server, const std::string &api, std::string &strPath);

// It is not there any more.
void ForgetPath(const ServerAddress &server, const std::string &api);

}  // namespace host

#endif
