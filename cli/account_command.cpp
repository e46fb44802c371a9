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
                           "the service account could not be deleted; -v shows the reason");
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

void AddWelcomeChange(CLI::App &parent, Action &action, const char *szName, bool blShow) {
    auto *const pCommand = parent.add_subcommand(
        szName, blShow ? "Show a user the welcome pages" : "Hide them from a user");
    const auto pUser = std::make_shared<std::string>();
    pCommand->add_option("USER", *pUser, "The user's name")->required();
    pCommand->callback([pUser, blShow, &action] {
        action = [pUser, blShow](Report &report) { return Welcome(*pUser, blShow, report); };
    });
}

}  // namespace

void AddAccount(CLI::App &app, Action &action) {
    auto *const pAccount =
        app.add_subcommand("account", "Create or delete the server's account on this appliance");
    pAccount->require_subcommand(1);
    pAccount->add_subcommand("create", "Create the account, or refresh it")->callback([&action] {
        action = Create;
    });
    pAccount->add_subcommand("delete", "Delete the account")->callback([&action] {
        action = Delete;
    });
}

void AddWelcome(CLI::App &app, Action &action) {
    auto *const pWelcome = app.add_subcommand("welcome", "Show or hide a user's welcome pages");
    pWelcome->require_subcommand(1);
    AddWelcomeChange(*pWelcome, action, "show", true);
    AddWelcomeChange(*pWelcome, action, "hide", false);
}

void AddPlugins(CLI::App &app, Action &action) {
    auto *const pPlugins = app.add_subcommand("plugins", "Try plug-ins");
    pPlugins->require_subcommand(1);
    auto *const pRun = pPlugins->add_subcommand("run", "Run an action with a made-up server");
    const auto pPlugin = std::make_shared<std::string>();
    const auto pAction = std::make_shared<std::string>();
    pRun->add_option("PLUGIN", *pPlugin, "The event whose plug-ins run")
        ->required()
        ->check(CLI::IsMember({"disjoin"}));
    pRun->add_option("ACTION", *pAction, "Before the event or after it")
        ->required()
        ->check(CLI::IsMember({"PRE", "POST"}));
    pRun->callback([pPlugin, pAction, &action] {
        action = [pAction](Report &report) { return RunPlugins(*pAction, report); };
    });
}

}  // namespace qrmctl
