// qrmctl call and update: requests to the joined server.

#include <memory>

#include "commands.h"
#include "input_file.h"
#include "joined_server.h"
#include "json.h"
#include "server_request.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

struct Options {
    ApiCall call;
    bool blCached = false;
    std::string strHost;
};

ExitCode Call(const Options &options, Report &report) {
    Json::Value params;
    std::string strError;
    Report::Stage("reading the parameters");
    if (!ReadParams(options.call.strParams, params, strError)) {
        return report.Fail(ErrorId::kBadInput, strError);
    }
    ExitCode code = kFailed;
    const std::optional<JoinedServer> server = RequireJoinedServer(report, code);
    if (!server) {
        return code;
    }
    const ApiCall &call = options.call;
    Report::Stage("calling " + call.strApi + ' ' + call.strMethod + " at " + server->Address());
    Json::Value reply;
    if (ZELOQRMClientSendWebapi(reply, call.strApi, call.version, call.strMethod, params,
                                options.blCached) != 0) {
        // A code without a reply comes of the look for the API's path.
        return LatestExchange().errorCode != 0
                   ? FailRequest(ErrorId::kRefused,
                                 "the server does not serve the API '" + call.strApi + '\'', "",
                                 report)
                   : FailRequest(ErrorId::kNoReply,
                                 "no usable reply from the server at " + server->Address(),
                                 ": run 'qrmctl doctor', which tries the way to it step by step; "
                                 "-v shows the reason",
                                 report);
    }
    report.Document("reply", reply);
    if (!json::IsTrue(json::Member(reply, "success"))) {
        const int code = json::ErrorCode(reply);
        report.Member("server_code", code);
        report.Member("server_error", ServerErrorName(code));
        return FailRequest(ErrorId::kRefused, "the server refused the call",
                           ", and its reply has no error code", report);
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
        constexpr int kNoSuchApi = 102;
        return FailRequest(
            LatestExchange().errorCode == kNoSuchApi ? ErrorId::kRefused : ErrorId::kUpdateFailed,
            "the server did not take the update",
            ", or a fact of this appliance is missing: run 'qrmctl doctor'; -v "
            "shows the reason",
            report);
    }
    report.Say("The server's entry for this appliance is up to date.");
    return report.Done();
}

}  // namespace

void AddCall(CommandHandle program, Action &action) {
    const CommandHandle command = program.Add("call", "Call a Web API of the joined server");
    const auto pOptions = std::make_shared<Options>();
    AddApiCall(command, pOptions->call);
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
