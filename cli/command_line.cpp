#include "command_line.h"

#include <charconv>

#include "command_texts.h"
#include "deadline.h"
#include "help.h"
#include "suggestion.h"

namespace qrmctl {
namespace {

constexpr double kStatusDeadline_s = 10;

std::string DeadlineFlaw(const std::string &strSeconds) {
    double seconds = 0;
    const char *const szEnd = strSeconds.data() + strSeconds.size();
    const auto [szRest, error] = std::from_chars(strSeconds.data(), szEnd, seconds);
    const bool blValid =
        error == std::errc() && szRest == szEnd && seconds > 0 && seconds <= kMaxDeadline_s;
    return blValid ? "" : "'" + strSeconds + "' is no number of seconds above 0";
}

// Every command at every level takes the common options, so that they may stand anywhere.
void AddCommonOptions(CLI::App &app, CommonOptions &options) {
    app.add_flag("--json", options.blJson, "Print one JSON object");
    app.add_flag("-v", options.blVerbose, "Show the library's log lines on standard error");
    app.add_option("--deadline", options.deadline_s,
                   "End after so many seconds, whatever it waits for (default: 10 for status, "
                   "none for the others)")
        ->type_name("SECONDS")
        ->check(DeadlineFlaw);
    for (CLI::App *pCommand : app.get_subcommands(nullptr)) {
        AddCommonOptions(*pCommand, options);
    }
}

// A misspelt command or option is what the user has to know, not what is missing because of it.
std::string UsageMessage(const CLI::App *pApp, const CLI::Error &error) {
    const std::string strUnknown = suggestion::UnknownWord(*pApp);
    const std::string strWhat = Printable(strUnknown.empty() ? error.what() : strUnknown);
    return "qrmctl: " + strWhat + (strWhat.back() == '?' ? " " : "; ") +
           "'qrmctl --help' shows the commands, 'qrmctl COMMAND --help' the options of one\n";
}

}  // namespace

double DeadlineOf(const CLI::App &app, const CommonOptions &options) {
    const bool blStatus = options.deadline_s == 0 && app.got_subcommand("status");
    return blStatus ? kStatusDeadline_s : options.deadline_s;
}

void AddCommandLine(CLI::App &app, Action &action, CommonOptions &options) {
    app.require_subcommand(1);
    app.failure_message(UsageMessage);
    app.formatter(std::make_shared<help::Formatter>());
    app.set_version_flag("--version", "qrmctl " ZELO_VERSION, "Show the version");
    AddTestConnection(app, action);
    AddJoin(app, action);
    AddStatus(app, action);
    AddLeave(app, action);
    AddCredential(app, action);
    AddCall(app, action);
    AddUpdate(app, action);
    AddGetFile(app, action);
    AddLog(app, action);
    AddInfo(app, action);
    AddNotify(app, action);
    AddAccount(app, action);
    AddWelcome(app, action);
    AddPlugins(app, action);
    AddIdle(app, action);
    AddDoctor(app, action);
    AddSupport(app, action);
    AddCommonOptions(app, options);
    AddTexts(app);
}

}  // namespace qrmctl
