#include "command_line.h"

#include <charconv>

#include "command_texts.h"
#include "deadline.h"

namespace qrmctl {
namespace {

constexpr double kStatusDeadline_s = 10;
constexpr double kSupportDeadline_s = 180;

std::string DeadlineFlaw(const std::string &strSeconds) {
    double seconds = 0;
    const char *const szEnd = strSeconds.data() + strSeconds.size();
    const auto [szRest, error] = std::from_chars(strSeconds.data(), szEnd, seconds);
    const bool blValid =
        error == std::errc() && szRest == szEnd && seconds > 0 && seconds <= kMaxDeadline_s;
    return blValid ? "" : "'" + strSeconds + "' is no number of seconds above 0";
}

// Every command at every level takes the common options, so that they may stand anywhere.
void AddCommonOptions(CommandHandle command, CommonOptions &options) {
    command.Flag("--json", options.blJson, "Print one JSON object");
    command.Flag("-v", options.blVerbose, "Show the library's log lines on standard error");
    command
        .Real("--deadline", options.deadline_s,
              "End after so many seconds, whatever it waits for (default: 10 for status, "
              "180 for support, none for the others)")
        .ValueName("SECONDS")
        .Checked(DeadlineFlaw);
    for (const CommandHandle each : command.Commands()) {
        AddCommonOptions(each, options);
    }
}

}  // namespace

double DeadlineOf(CommandHandle program, const CommonOptions &options) {
    if (options.deadline_s == 0 && program.Command("support").IsChosen()) {
        return kSupportDeadline_s;
    }
    const bool blStatus = options.deadline_s == 0 && program.Command("status").IsChosen();
    return blStatus ? kStatusDeadline_s : options.deadline_s;
}

void AddCommandLine(CommandHandle program, Action &action, CommonOptions &options) {
    program.RequireCommand();
    AddTestConnection(program, action);
    AddJoin(program, action);
    AddStatus(program, action);
    AddLeave(program, action);
    AddCredential(program, action);
    AddCall(program, action);
    AddUpdate(program, action);
    AddGetFile(program, action);
    AddLog(program, action);
    AddInfo(program, action);
    AddNotify(program, action);
    AddAccount(program, action);
    AddWelcome(program, action);
    AddPlugins(program, action);
    AddIdle(program, action);
    AddDoctor(program, action);
    AddSupport(program, action);
    AddCommonOptions(program, options);
    AddTexts(program);
}

}  // namespace qrmctl
