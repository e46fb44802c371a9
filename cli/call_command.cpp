// qrmctl call and update: requests to the joined server.

#include <limits>
#include <memory>

#include "commands.h"
#include "input_file.h"
#include "joined_server.h"
#include "json_text.h"
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

// The server's own code, with its name.
ExitCode Refused(const Json::Value &reply, Report &report) {
    const int code = json_text::ErrorCode(reply);
    const std::string strName = ServerErrorName(code);
    report.Member("server_code", code);
    report.Member("server_error", strName);
    return report.Fail(ErrorId::kRefused, "the server refused the call with error code " +
                                              std::to_string(code) + " (" + strName + ')');
}

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
        return report.FailExchange(ErrorId::kNoReply,
                                   "no usable reply from the server at " + server->Address() +
                                       ": can this appliance reach it? -v shows the reason");
    }
    report.Document("reply", reply);
    if (!json_text::IsTrue(json_text::Member(reply, "success"))) {
        return Refused(reply, report);
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
        return report.FailExchange(
            ErrorId::kUpdateFailed,
            "the server did not take the update, or a fact of this appliance is "
            "missing; -v shows the reason");
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
