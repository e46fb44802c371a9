// Discovery: under which path a server serves a Web API.

#ifndef ZELO_HOST_DISCOVERY_H
#define ZELO_HOST_DISCOVERY_H

#include <string>

#include "server_address.h"
#include "status.h"

namespace host {

// Asks the server for the path, which this process remembers.
Status AskForPath(const ServerAddress &server, const std::string &api, std::string &strPath);

// Gets the path that this process remembers, or else asks for it.
Status FindPath(const ServerAddress &server, const std::string &api, std::string &strPath);

// Forgets the path: the server does not serve the API there any more.
void ForgetPath(const ServerAddress &server, const std::string &api);

}  // namespace host

#endif
