// The checks of one way to a server, from the name to the Web API.

#ifndef QRMCTL_CONNECTION_CHECKS_H
#define QRMCTL_CONNECTION_CHECKS_H

#include "check.h"
#include "probe.h"

namespace qrmctl {

constexpr const char *kQrmApi = "ZELO.QRM.RPC";

// No step of a check takes longer.
constexpr long kStep_ms = 10'000;

// All checks of the way, in a fixed order; those behind one that failed are skipped. Nothing but
// the discovery of the API is asked of the server, and no token is sent.
Checks CheckConnection(const Way &way, const TimeLimit &limit);

// Whether a server with the API answers there: its last check succeeded.
bool IsUsable(const Checks &checks);

// Such as "https://localhost:8443".
std::string WayText(const Way &way);

// A moment such as "2030-05-14T09:26:53Z".
std::string TimeText(std::time_t time);

}  // namespace qrmctl

#endif
