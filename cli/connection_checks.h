// The checks of one way to a server, from the name to the Web API.

#ifndef QRMCTL_CONNECTION_CHECKS_H
#define QRMCTL_CONNECTION_CHECKS_H

#include <string>

#include "appliance.h"
#include "check.h"

namespace qrmctl {

using appliance::kQrmApi;

// No step of a check takes longer.
constexpr long kStep_ms = 10'000;

// A way to a server.
struct Way {
    std::string strProtocol;  // "https", "http" or "fld"
    std::string strHost;
    int port = 0;

    bool IsRelayed() const { return strProtocol == "fld"; }
    bool IsSecure() const { return strProtocol != "http"; }
};

// Whether the platform lets a tool look at servers. Without that, the API is the one check of a
// way.
bool CanLookAtServers();

// All checks of the way, in a fixed order; those behind one that failed are skipped. Nothing but
// the discovery of the API is asked of the server, and no token is sent.
Checks CheckConnection(const Way &way, const TimeLimit &limit);

// Whether a server with the API answers there: its last check succeeded.
bool IsUsable(const Checks &checks);

// Such as "https://localhost:8443".
std::string WayText(const Way &way);

}  // namespace qrmctl

#endif
