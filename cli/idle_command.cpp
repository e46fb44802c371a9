// qrmctl idle: the disks' idle time.

#include <charconv>
#include <memory>

#include "commands.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

// The whole text as a number. CLI11 itself takes "-1" for the largest one.
bool ReadNumber(const std::string &strText, unsigned long &number) {
    const char *szEnd = strText.data() + strText.size();
    const auto [szRest, error] = std::from_chars(strText.data(), szEnd, number);
    return error == std::errc() && szRest == szEnd;
}

ExitCode Get(Report &report) {
    Report::Stage("reading the idle time");
    unsigned long idleTime = 0;
    if (ZELOQRMIdleTimeGet(idleTime) != 0) {
        return report.Fail(ErrorId::kIdleUnreadable,
                           "the disks' idle time cannot be read; -v shows the reason");
    }
    report.Fact("idle_minutes", static_cast<Json::UInt64>(idleTime));
    return report.Done();
}

ExitCode Set(unsigned long idleTime, Report &report) {
    Report::Stage("setting the idle time, with its lock");
    Report::Remedy("'qrmctl idle get' tells what is set; run this again");
    if (ZELOQRMIdleTimeSet(idleTime) != 0) {
        return report.Fail(ErrorId::kIdleNotSet,
                           "the disks' idle time cannot be set; -v shows the reason");
    }
    report.Fact("idle_minutes", static_cast<Json::UInt64>(idleTime));
    return report.Done();
}

}  // namespace

void AddIdle(CLI::App &app, Action &action) {
    auto *const pIdle = app.add_subcommand("idle", "Read or set the disks' idle time");
    pIdle->require_subcommand(1);
    pIdle->add_subcommand("get", "Show the idle time in force, in minutes; 0: never")
        ->callback([&action] { action = Get; });
    auto *const pSet = pIdle->add_subcommand("set", "Set the idle time");
    const auto pTime = std::make_shared<unsigned long>(0);
    pSet->add_option_function<std::string>(
            "MINUTES",
            [pTime](const std::string &strMinutes) {
                if (!ReadNumber(strMinutes, *pTime)) {
                    throw CLI::ValidationError("MINUTES", "'" + strMinutes + "' is no number");
                }
            },
            "Minutes without use before the disks sleep; 0: never")
        ->required();
    pSet->callback(
        [pTime, &action] { action = [pTime](Report &report) { return Set(*pTime, report); }; });
}

}  // namespace qrmctl
