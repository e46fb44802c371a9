// qrmctl test-connection: which of several connections reaches a server?

#include <memory>

#include "candidates.h"
#include "commands.h"
#include "server_request.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

struct Options {
    std::string strApi;
    std::string strCandidates;
};

ExitCode TestConnection(const Options &options, Report &report) {
    Json::Value candidates;
    std::string strError;
    Report::Stage("reading the candidate list '" + options.strCandidates + "'");
    if (!ReadCandidates(options.strCandidates, report, candidates, strError)) {
        return report.Fail(ErrorId::kBadInput, strError);
    }
    Report::Stage("asking " + CandidateNames(candidates) + " for the API '" + options.strApi + "'");
    Json::Value connection;
    if (!ZELOQRMClientTestConnect(candidates, options.strApi, connection)) {
        return FailExchange(ErrorId::kNoServer,
                            "no candidate of '" + options.strCandidates +
                                "' answered for the API '" + options.strApi +
                                "': check addresses, ports and certificates, with "
                                "'qrmctl doctor'; -v shows the reason of each attempt",
                            report);
    }
    WarnOfAuthority(report);
    report.Fact("protocol", connection["protocol"]);
    report.Fact("host", connection["host"]);
    report.Fact("port", connection["port"]);
    return report.Done();
}

}  // namespace

void AddTestConnection(CommandHandle program, Action &action) {
    const CommandHandle command =
        program.Add("test-connection", "Find the first connection at which a server answers");
    const auto pOptions = std::make_shared<Options>();
    command.Text("--api", pOptions->strApi, "Web API that the server has to serve")
        .ValueName("NAME")
        .Required();
    command
        .Text("CANDIDATES", pOptions->strCandidates,
              "JSON file with the candidate connections, - for standard input")
        .ValueName("FILE")
        .Required();
    command.RunsWhenChosen([pOptions, &action] {
        action = [pOptions](Report &report) { return TestConnection(*pOptions, report); };
    });
}

}  // namespace qrmctl
