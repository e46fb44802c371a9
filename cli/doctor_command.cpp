// qrmctl doctor: what is wrong between this appliance and a server? It looks and changes nothing.

#include <algorithm>
#include <memory>
#include <vector>

#include "candidates.h"
#include "commands.h"
#include "connection_checks.h"
#include "credential_checks.h"
#include "json.h"
#include "web_api_request.h"

namespace qrmctl {
namespace {

// For all ways together; the stored token is tried after it too.
constexpr std::chrono::seconds kLimit{120};

struct Options {
    std::string strCandidates;
    std::string strServer;
    int httpPort = 0;
    int httpsPort = 0;
};

// The ways of a candidate in the order in which the connection test tries them; none when it would
// pass the candidate over.
void AddWays(const Json::Value &candidate, std::vector<Way> &ways) {
    const char *szHost = json::Text(json::Member(candidate, "host"));
    int httpPort = 0;
    int httpsPort = 0;
    if (szHost == nullptr || szHost[0] == '\0' ||
        !json::ReadInt(json::Member(candidate, "http_port"), httpPort) ||
        !json::ReadInt(json::Member(candidate, "https_port"), httpsPort) ||
        !ZELO::APIValidator::IsPort(httpPort) || !ZELO::APIValidator::IsPort(httpsPort)) {
        return;
    }
    if (httpsPort > 0) {
        const bool blRelayed = json::IsTrue(json::Member(candidate, "farlink_direct"));
        ways.push_back({blRelayed ? "fld" : "https", szHost, httpsPort});
    }
    if (httpPort > 0) {
        ways.push_back({"http", szHost, httpPort});
    }
}

bool FindWays(const Options &options, Report &report, std::vector<Way> &ways,
              std::string &strError) {
    if (!options.strCandidates.empty()) {
        Json::Value candidates;
        if (!ReadCandidates(options.strCandidates, report, candidates, strError)) {
            return false;
        }
        for (const Json::Value &candidate : candidates) {
            AddWays(candidate, ways);
        }
        strError = "no candidate of '" + options.strCandidates + "' has a port to try";
        return !ways.empty();
    }
    if (!options.strServer.empty()) {
        Json::Value candidate;
        candidate["host"] = options.strServer;
        candidate["http_port"] = options.httpPort;
        candidate["https_port"] = options.httpsPort;
        AddWays(candidate, ways);
        strError = "neither port is above 0: give --https-port";
        return !ways.empty();
    }
    Way stored;
    if (ReadStoredServer(stored)) {
        ways.push_back(stored);
    }
    return true;
}

Json::Value ToJson(const Checks &checks) {
    Json::Value array(Json::arrayValue);
    for (const Check &check : checks) {
        Json::Value entry;
        entry["name"] = check.strName;
        entry["outcome"] = OutcomeName(check.outcome);
        entry["duration_ms"] = static_cast<Json::Int64>(check.duration_ms);
        entry["seen"] = check.strSeen;
        entry["remedy"] = check.strRemedy.empty() ? Json::Value() : Json::Value(check.strRemedy);
        array.append(entry);
    }
    return array;
}

std::string Padded(const std::string &strText, std::size_t width) {
    return strText + std::string(width - std::min(width, strText.size()), ' ');
}

void Show(const std::string &strTitle, const Checks &checks, const Report &report) {
    constexpr std::size_t kNameWidth = 17;
    constexpr std::size_t kOutcomeWidth = 9;
    constexpr std::size_t kTimeWidth = 6;
    report.Say(strTitle);
    for (const Check &check : checks) {
        const std::string strTime = std::to_string(check.duration_ms);
        report.Say("  " + Padded(check.strName, kNameWidth) +
                   Padded(OutcomeName(check.outcome), kOutcomeWidth) +
                   Padded("", kTimeWidth - std::min(kTimeWidth, strTime.size())) + strTime +
                   " ms  " + check.strSeen +
                   (check.outcome == Outcome::kSkipped ? "; " + check.strRemedy : ""));
        if (check.outcome != Outcome::kSkipped && !check.strRemedy.empty()) {
            report.Say("      remedy: " + check.strRemedy);
        }
    }
}

bool HasFailed(const Checks &checks) {
    return std::any_of(checks.begin(), checks.end(),
                       [](const Check &check) { return check.outcome == Outcome::kFailed; });
}

ExitCode Conclude(bool blUsable, bool blTried, bool blStoredFailed, Report &report) {
    if (!blTried && !blStoredFailed) {
        return report.Fail(
            ErrorId::kNoCredential,
            "no server is stored and none is named: give --server with its ports, or --candidates");
    }
    if (blStoredFailed) {
        return report.Fail(ErrorId::kCheckFailed,
                           blUsable || !blTried
                               ? "what is stored of the membership does not work: see its remedies"
                               : "no way to a server works, nor what is stored of the membership: "
                                 "see the remedies");
    }
    if (!blUsable) {
        return report.Fail(ErrorId::kNoServer, "no way to a server works: see the remedies");
    }
    report.Say("A server can be used.");
    return report.Done();
}

ExitCode Doctor(const Options &options, Report &report) {
    std::vector<Way> ways;
    std::string strError;
    if (!FindWays(options, report, ways, strError)) {
        return report.Fail(ErrorId::kBadInput, strError);
    }
    const bool blStoredWay = options.strCandidates.empty() && options.strServer.empty();
    if (!CanLookAtServers()) {
        report.Warn(
            "this platform cannot look at servers: only whether the API answers, and what is "
            "stored, is checked");
    }
    const TimeLimit limit(kLimit);
    bool blUsable = false;
    Json::Value connections(Json::arrayValue);
    for (const Way &way : ways) {
        Report::Stage("checking " + WayText(way));
        const Checks checks = CheckConnection(way, limit);
        blUsable = blUsable || IsUsable(checks);
        Json::Value entry;
        entry["protocol"] = way.strProtocol;
        entry["host"] = way.strHost;
        entry["port"] = way.port;
        entry["usable"] = IsUsable(checks);
        entry["checks"] = ToJson(checks);
        connections.append(entry);
        Show(WayText(way), checks, report);
    }
    report.Member("connections", connections);

    Report::Stage("checking what is stored");
    const Checks stored = CheckCredential(!blStoredWay || blUsable);
    report.Member("credential_checks", ToJson(stored));
    Show("what is stored", stored, report);
    return Conclude(blUsable, !ways.empty(), HasFailed(stored), report);
}

}  // namespace

void AddDoctor(CommandHandle program, Action &action) {
    const CommandHandle command =
        program.Add("doctor", "Check each step on the way to a server, changing nothing");
    const auto pOptions = std::make_shared<Options>();
    const OptionHandle candidates =
        command
            .Text("--candidates", pOptions->strCandidates,
                  "JSON file with the candidate connections, - for standard input")
            .ValueName("FILE");
    const OptionHandle server =
        command
            .Text("--server", pOptions->strServer,
                  "The server's name or address (default: the stored connection)")
            .ValueName("HOST")
            .Checked(HostFlaw);
    const OptionHandle http =
        command.Number("--http-port", pOptions->httpPort, "Its port for plain HTTP; 0: none")
            .ValueName("N")
            .Between(0, 65535);
    const OptionHandle https =
        command.Number("--https-port", pOptions->httpsPort, "Its port for HTTPS; 0: none")
            .ValueName("N")
            .Between(0, 65535);
    server.Excludes(candidates).Needs(http).Needs(https);
    http.Needs(server);
    https.Needs(server);
    command.RunsWhenChosen([pOptions, &action] {
        action = [pOptions](Report &report) { return Doctor(*pOptions, report); };
    });
}

}  // namespace qrmctl
