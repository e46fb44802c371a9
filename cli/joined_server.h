// The server that this appliance is joined to, as it is stored.

#ifndef QRMCTL_JOINED_SERVER_H
#define QRMCTL_JOINED_SERVER_H

#include <json/value.h>

#include <optional>
#include <string>

#include "report.h"

namespace qrmctl {

// Which of the two flaws the platform operation that has just failed has found in its store.
ErrorId LastStoreFlaw();

// What is wrong with the credential store; nothing when it can be read, an empty one included.
std::optional<ErrorId> StoreFlaw();

// A sentence about that flaw.
std::string StoreFlawText(ErrorId flaw);

// For the commands that may begin anew: sets a damaged credential store or web session store aside,
// and says where it is; blServerLost tells whether the stored server went with it. A store that can
// neither be used nor set aside fails the command, with the exit code that is returned.
std::optional<ExitCode> ClearDamagedStores(Report &report, bool &blServerLost);

// A stored value as text: a text itself, anything else as JSON.
std::string AsText(const Json::Value &value);

// This appliance's own serial number, which join sends unless it is given another; "" without one.
std::string OwnSerialNumber();

struct JoinedServer {
    Json::Value host;  // null when it is not stored, as the others
    Json::Value port;
    Json::Value protocol;
    Json::Value sn;  // this appliance's serial number there

    // Such as "qrm.example:5001".
    std::string HostAndPort() const;

    // Such as "https://qrm.example:5001".
    std::string Address() const;
};

// The server in force; nothing when none is stored, or the store cannot be read.
std::optional<JoinedServer> FindJoinedServer();

// The same, also where the server's session is not stored: after a join that was killed.
std::optional<JoinedServer> FindStoredServer();

// FindJoinedServer for a command that cannot do without; when there is none, the command has
// failed, and code is its exit code.
std::optional<JoinedServer> RequireJoinedServer(Report &report, ExitCode &code);

}  // namespace qrmctl

#endif
