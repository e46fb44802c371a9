// The checks of what is stored: the server's credential, and whether the server takes its token.

#ifndef QRMCTL_CREDENTIAL_CHECKS_H
#define QRMCTL_CREDENTIAL_CHECKS_H

#include "check.h"
#include "connection_checks.h"

namespace qrmctl {

// The stored server; false when none is stored, or it cannot be read whole.
bool ReadStoredServer(Way &way);

// The credential, then the token. The token goes to the stored server alone, by the platform's
// requests, which verify the server, and never over plain HTTP. Nothing is stored and no status is
// set. blReachable: false when a check has shown that the stored server cannot be reached.
Checks CheckCredential(bool blReachable);

}  // namespace qrmctl

#endif
