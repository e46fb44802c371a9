// qrmctl idle: the disks' idle time.

#include <charconv>
#include <memory>

#include "commands.h"
#include "words.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

// The platform keeps any time. One beyond a year is a slip of the keyboard.
constexpr unsigned long kLongest_min = 365UL * 24 * 60;

// The whole text as a number. The parser itself takes "-1" for the largest one.
bool ReadMinutes(const std::string &strText, unsigned long &minutes) {
    const char *szEnd = strText.data() + strText.size();
    const auto [szRest, error] = std::from_chars(strText.data(), szEnd, minutes);
    return error == std::errc() && szRest == szEnd && minutes <= kLongest_min;
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

void AddIdle(CommandHandle program, Action &action) {
    const CommandHandle idle = program.Add("idle", "Read or set the disks' idle time");
    idle.RequireCommand();
    idle.Add("get", "Show the idle time in force, in minutes; 0: never").RunsWhenChosen([&action] {
        action = Get;
    });
    const CommandHandle set = idle.Add("set", "Set the idle time");
    const auto pMinutes = std::make_shared<std::string>();
    set.Text("MINUTES", *pMinutes,
             "Minutes without use before the disks sleep, at most a year; 0: never")
        .Required()
        .Checked([](const std::string &strMinutes) {
            unsigned long minutes = 0;
            return ReadMinutes(strMinutes, minutes)
                       ? ""
                       : "'" + words::Shortened(strMinutes) +
                             "' is no number of minutes from 0 to " + std::to_string(kLongest_min) +
                             " (a year)";
        });
    set.RunsWhenChosen([pMinutes, &action] {
        action = [pMinutes](Report &report) {
            unsigned long minutes = 0;
            ReadMinutes(*pMinutes, minutes);
            return Set(minutes, report);
        };
    });
}

}  // namespace qrmctl
