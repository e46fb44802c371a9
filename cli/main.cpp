// qrmctl: the library at a shell.

#include <syslog.h>

#include <CLI/CLI.hpp>
#include <exception>
#include <iostream>

#include "commands.h"

namespace {

// Every command at every level takes the same two flags, so that they may stand anywhere.
void AddCommonFlags(CLI::App &app, bool &blJson, bool &blVerbose) {
    app.add_flag("--json", blJson, "Print one JSON object");
    app.add_flag("-v", blVerbose, "Show the library's log lines on standard error");
    for (CLI::App *pCommand : app.get_subcommands(nullptr)) {
        AddCommonFlags(*pCommand, blJson, blVerbose);
    }
}

// A misspelt command or option is what the user has to know, not what is missing because of it.
std::string UsageMessage(const CLI::App *pApp, const CLI::Error &error) {
    const std::vector<std::string> unknown = pApp->remaining(true);
    const std::string strWhat =
        unknown.empty() ? error.what() : "'" + unknown.front() + "' is no command or option here";
    return "qrmctl: " + qrmctl::Printable(strWhat) +
           "; 'qrmctl --help' shows the commands, 'qrmctl COMMAND --help' the options of one\n";
}

int Run(int argc, char **argv) {
    CLI::App app("Makes this appliance a client of a QRM server, and shows what it is.", "qrmctl");
    app.require_subcommand(1);
    app.failure_message(UsageMessage);
    qrmctl::Action action;
    qrmctl::AddTestConnection(app, action);
    qrmctl::AddJoin(app, action);
    qrmctl::AddCredential(app, action);
    qrmctl::AddCall(app, action);
    qrmctl::AddUpdate(app, action);
    qrmctl::AddGetFile(app, action);
    qrmctl::AddInfo(app, action);
    qrmctl::AddNotify(app, action);
    qrmctl::AddStatus(app, action);
    qrmctl::AddLeave(app, action);
    qrmctl::AddAccount(app, action);
    qrmctl::AddWelcome(app, action);
    qrmctl::AddPlugins(app, action);
    qrmctl::AddLog(app, action);
    qrmctl::AddIdle(app, action);
    bool blJson = false;
    bool blVerbose = false;
    AddCommonFlags(app, blJson, blVerbose);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &error) {
        return app.exit(error) == 0 ? qrmctl::kDone : qrmctl::kUsage;
    }

    openlog("qrmctl", blVerbose ? LOG_PERROR : 0, LOG_USER);
    qrmctl::Report report(blJson);
    return action(report);
}

}  // namespace

int main(int argc, char **argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception &error) {
        std::cerr << "qrmctl: " << error.what() << '\n';
        return qrmctl::kFailed;
    }
}
