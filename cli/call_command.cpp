// qrmctl call and update: requests to the joined server.

#include <limits>
#include <memory>

#include "commands.h"
#include "input_file.h"
#include "joined_server.h"
#include "json_text.h"
#include "lost_reply.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

struct Options {
    std::string strApi;
    std::string strMethod;
    int version = 1;
    std::string strParams;
    bool blCached = false;
    std::string strHost;
};

ExitCode Call(const Options &options, Report &report) {
    Json::Value params;
    std::string strError;
    Report::Stage("reading the parameters");
    if (!ReadParams(options.strParams, params, strError)) {
        return report.Fail(ErrorId::kBadInput, strError);
    }
    ExitCode code = kFailed;
    const std::optional<JoinedServer> server = RequireJoinedServer(report, code);
    if (!server) {
        return code;
    }
    Report::Stage("calling " + options.strApi + ' ' + options.strMethod + " at " +
                  server->Address());
    Json::Value reply;
    if (ZELOQRMClientSendWebapi(reply, options.strApi, options.version, options.strMethod, params,
                                options.blCached) != 0) {
        return FailRequest(ErrorId::kNoReply,
                           "no usable reply from the server at " + server->Address() +
                               ": run 'qrmctl doctor', which tries the way to it step by step; -v "
                               "shows the reason",
                           *server, options.strApi, report);
    }
    report.Document("reply", reply);
    if (!json_text::IsTrue(json_text::Member(reply, "success"))) {
        return FailRefused(reply, "the call", report);
    }
    return report.Done();
}

ExitCode Update(const Options &options, Report &report) {
    ExitCode code = kFailed;
    const std::optional<JoinedServer> server = RequireJoinedServer(report, code);
    if (!server) {
        return code;
    }
    Json::Value info(Json::objectValue);
    if (!options.strHost.empty()) {
        info["host"] = options.strHost;
    }
    Report::Stage("updating this appliance's entry at " + server->Address());
    if (ZELOQRMClientSendSetClient(info) != 0) {
        return FailRequest(
            ErrorId::kUpdateFailed,
            "the server did not take the update, or a fact of this appliance is missing: run "
            "'qrmctl doctor'; -v shows the reason",
            *server, "ZELO.QRM.RPC.ClientInfo", report);
    }
    report.Say("The server's entry for this appliance is up to date.");
    return report.Done();
}

}  // namespace

void AddCall(CommandHandle program, Action &action) {
    const CommandHandle command = program.Add("call", "Call a Web API of the joined server");
    const auto pOptions = std::make_shared<Options>();
    command.Text("API", pOptions->strApi, "Web API, such as ZELO.QRM.RPC").Required();
    command.Text("METHOD", pOptions->strMethod, "Its method").Required();
    command.Number("--version", pOptions->version, "Version of the API")
        .ValueName("N")
        .Between(1, std::numeric_limits<int>::max())
        .ShowsDefault();
    command
        .Text("--params", pOptions->strParams,
              "Parameters: a JSON object, or @FILE with one (@- for standard input)")
        .ValueName("JSON");
    command.Flag("--cached", pOptions->blCached,
                 "Use the records that this process has loaded before");
    command.RunsWhenChosen([pOptions, &action] {
        action = [pOptions](Report &report) { return Call(*pOptions, report); };
    });
}

void AddUpdate(CommandHandle program, Action &action) {
    const CommandHandle command =
        program.Add("update", "Bring the server's entry for this appliance up to date");
    const auto pOptions = std::make_shared<Options>();
    command
        .Text("--host", pOptions->strHost, "The address at which the server reaches this appliance")
        .ValueName("HOST");
    command.RunsWhenChosen([pOptions, &action] {
        action = [pOptions](Report &report) { return Update(*pOptions, report); };
    });
}

}  // namespace qrmctl
