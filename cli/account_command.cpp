// qrmctl account, welcome and plugins: the parts of a membership one by one.

#include <memory>

#include "commands.h"
#include "fixed_text.h"
#include "membership.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

ExitCode Create(Report &report) {
    Report::Stage("creating the service account");
    Report::Remedy(
        "run 'qrmctl account create' again, which completes what was begun, or 'qrmctl leave'");
    if (!CreateServiceAccount()) {
        return report.Fail(ErrorId::kAccountNotCreated,
                           "the service account could not be created; -v shows the reason");
    }
    report.Say("The service account exists and is an administrator.");
    return report.Done();
}

ExitCode Delete(Report &report) {
    Report::Stage("deleting the service account");
    Report::Remedy("run 'qrmctl account delete' again, or 'qrmctl leave'");
    if (!ZELOQRMClientDeleteServerUser()) {
        return report.Fail(ErrorId::kAccountNotDeleted,
                           "the service account could not be deleted, or the account files cannot "
                           "be read; -v shows the reason");
    }
    report.Say("There is no service account any more.");
    return report.Done();
}

ExitCode Welcome(const std::string &strUser, bool blShow, Report &report) {
    Report::Stage("changing the settings of '" + strUser + "'");
    if (!ZELOQRMUserWelcomPage(strUser.c_str(), blShow)) {
        return report.Fail(ErrorId::kWelcomeNotChanged,
                           "the settings of '" + strUser +
                               "' could not be changed: is there such a user? -v shows the reason");
    }
    report.Say("The welcome pages of '" + strUser + (blShow ? "' are shown." : "' are hidden."));
    return report.Done();
}

// A plug-in author's try: the server is made up.
ExitCode RunPlugins(const std::string &strAction, Report &report) {
    __tag_ZELO_QRM_SERVER_INFO__ server = {};
    CopyToFit(server.szHost, sizeof(server.szHost), "qrm.example");
    CopyToFit(server.szProtocol, sizeof(server.szProtocol), "https");
    CopyToFit(server.szSn, sizeof(server.szSn), "TRY");
    server.lPort = 443;
    __tag_qrmclient_plugin_env__ env = {};
    Report::Stage("running the plug-ins for " + strAction);
    const int ready = ZELOQRMClientPluginInit(&env, "qrm_client/disjoin", &server);
    const int result = ZELOQRMClientPlugin(
        strAction == "PRE" ? SDK_PLUGIN_ACTION_PRE : SDK_PLUGIN_ACTION_POST, &env);
    ZELOQRMClientPluginExit(&env);
    if (ready < 0) {
        return report.Fail(ErrorId::kPluginsNotReady,
                           "the plug-ins cannot be made ready; -v shows the reason");
    }
    report.Fact("result", result);
    return result < 0 ? report.Fail(ErrorId::kPluginFailed, "a plug-in failed; -v shows which")
                      : report.Done();
}

void AddWelcomeChange(CommandHandle parent, Action &action, const char *szName, bool blShow) {
    const CommandHandle command =
        parent.Add(szName, blShow ? "Show a user the welcome pages" : "Hide them from a user");
    const auto pUser = std::make_shared<std::string>();
    command.Text("USER", *pUser, "The user's name").Required();
    command.RunsWhenChosen([pUser, blShow, &action] {
        action = [pUser, blShow](Report &report) { return Welcome(*pUser, blShow, report); };
    });
}

}  // namespace

void AddAccount(CommandHandle program, Action &action) {
    const CommandHandle account =
        program.Add("account", "Create or delete the server's account on this appliance");
    account.RequireCommand();
    account.Add("create", "Create the account, or refresh it").RunsWhenChosen([&action] {
        action = Create;
    });
    account.Add("delete", "Delete the account").RunsWhenChosen([&action] { action = Delete; });
}

void AddWelcome(CommandHandle program, Action &action) {
    const CommandHandle welcome = program.Add("welcome", "Show or hide a user's welcome pages");
    welcome.RequireCommand();
    AddWelcomeChange(welcome, action, "show", true);
    AddWelcomeChange(welcome, action, "hide", false);
}

void AddPlugins(CommandHandle program, Action &action) {
    const CommandHandle plugins = program.Add("plugins", "Try plug-ins");
    plugins.RequireCommand();
    const CommandHandle run = plugins.Add("run", "Run an action with a made-up server");
    const auto pPlugin = std::make_shared<std::string>();
    const auto pAction = std::make_shared<std::string>();
    run.Text("PLUGIN", *pPlugin, "The event whose plug-ins run").Required().OneOf({"disjoin"});
    run.Text("ACTION", *pAction, "Before the event or after it").Required().OneOf({"PRE", "POST"});
    run.RunsWhenChosen([pPlugin, pAction, &action] {
        action = [pAction](Report &report) { return RunPlugins(*pAction, report); };
    });
}

}  // namespace qrmctl
