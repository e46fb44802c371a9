// A request to the joined server: what a command line says of it, and why the server refused it.

#ifndef QRMCTL_SERVER_REQUEST_H
#define QRMCTL_SERVER_REQUEST_H

#include <string>

#include "commands.h"
#include "diagnosis.h"
#include "report.h"

namespace qrmctl {

// Which method of which Web API is called, and with what.
struct ApiCall {
    std::string strApi;
    std::string strMethod;
    int version = 1;
    std::string strParams;  // for ReadParams (input_file.h)
};

// Lets the command take them.
void AddApiCall(CommandHandle command, ApiCall &call);

// The latest exchange with a server; an empty one on a platform that keeps no record of it.
ZELO::Exchange LatestExchange();

// How many certificates of the appliance's own authorities there are. Where one cannot be read, no
// exchange over HTTPS succeeds, and strFlaw says so.
int CountAuthorities(std::string &strFlaw);

// Warns of an authority that cannot be read, where another way to the server was found.
void WarnOfAuthority(Report &report);

// Ends the command after an exchange that failed: with strError, or with the authority that cannot
// be read.
ExitCode FailExchange(ErrorId id, const std::string &strError, Report &report);

// For a request that failed: whether the server's answer to the latest exchange says why. Then
// strAnswer names its error code and its HTTP status, and the report has them as members.
bool FindRefusal(Report &report, std::string &strAnswer);

// Ends the command after a request that failed: with strWhat, which names the server, and with its
// answer, or, when that says nothing, with the reasons that there may be.
ExitCode FailRequest(ErrorId id, const std::string &strWhat, const std::string &strReasons,
                     Report &report);

}  // namespace qrmctl

#endif
