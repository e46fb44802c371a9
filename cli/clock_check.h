// The clock of this appliance beside that of a server, and what the two say about a certificate.

#ifndef QRMCTL_CLOCK_CHECK_H
#define QRMCTL_CLOCK_CHECK_H

#include <ctime>
#include <string>

#include "check.h"
#include "diagnosis.h"

namespace qrmctl {

// A moment such as "2030-05-14T09:26:53Z".
std::string TimeText(std::time_t time);

// Such as "valid from 2030-05-14T09:26:53Z to 2031-05-14T09:26:53Z".
std::string Validity(std::time_t notBefore, std::time_t notAfter);

// Adds the check "clock" of a verified reply.
void CheckClock(const ZELO::Exchange &met, CheckList &checks);

// Adds "certificate" and "clock" for a certificate that is not valid by this appliance's clock;
// strWhich describes it. The look `hint` was not verified, and no other can be had: whoever answers
// may lie, so it leads to advice and no more.
void CheckInvalidNow(const ZELO::ServerCertificate &certificate, const std::string &strWhich,
                     const ZELO::Exchange &hint, CheckList &checks);

}  // namespace qrmctl

#endif
