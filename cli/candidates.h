// Candidate lists: checking one before it is handed on, for messages that name the entry.

#ifndef QRMCTL_CANDIDATES_H
#define QRMCTL_CANDIDATES_H

#include <json/value.h>

#include <string>

#include "report.h"

namespace qrmctl {

// Reads a candidate list, a JSON array that is not empty; strError says what is wrong. Warns of
// each entry that the connection test will pass over, with the reason.
bool ReadCandidates(const std::string &strFile, Report &report, Json::Value &candidates,
                    std::string &strError);

// What keeps a text from being a server's name or address, as a sentence; empty when nothing does.
std::string HostFlaw(const std::string &strHost);

// The candidates that are tried, such as "qrm.example:5001, 10.0.0.5:5001".
std::string CandidateNames(const Json::Value &candidates);

// Turns the port for plain HTTP of every candidate to 0.
void ForbidHttp(Json::Value &candidates);

// Whether some candidate has a port for a secure attempt.
bool HasSecurePort(const Json::Value &candidates);

}  // namespace qrmctl

#endif
