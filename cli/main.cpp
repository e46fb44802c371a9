// qrmctl: the library at a shell.

#include <json/value.h>
#include <syslog.h>

#include <algorithm>
#include <exception>
#include <iostream>
#include <new>
#include <string>
#include <string_view>
#include <system_error>

#include "command_line.h"
#include "deadline.h"
#include "printable.h"

namespace {

// A command line that is wrong has not been read to its end, so its options are not known.
bool AsksForJson(int argc, char **argv) {
    return std::any_of(argv, argv + argc,
                       [](const char *sz) { return std::string_view(sz) == "--json"; });
}

// Help goes to standard output, wrong usage to standard error.
int TellUsage(const command::Stop &stop, bool blJson) {
    if (!stop.blWrong) {
        std::cout << stop.strText;
        return qrmctl::kDone;
    }
    const std::string strWhat = printable::Line(stop.strText);
    return qrmctl::Report(blJson).Fail(
        qrmctl::ErrorId::kUsage,
        strWhat + (strWhat.back() == '?' ? " " : "; ") +
            "'qrmctl --help' shows the commands, 'qrmctl COMMAND --help' the options of one");
}

int Run(int argc, char **argv) {
    command::Program program("qrmctl", qrmctl::kSummary, qrmctl::kVersion);
    qrmctl::Action action;
    qrmctl::CommonOptions options;
    qrmctl::AddCommandLine(program.Root(), action, options);
    if (const auto stop = program.Read(argc, argv)) {
        return TellUsage(*stop, AsksForJson(argc, argv));
    }

    openlog("qrmctl", options.blVerbose ? LOG_PERROR : 0, LOG_USER);
    const double deadline_s = qrmctl::DeadlineOf(program.Root(), options);
    if (deadline_s > 0) {
        qrmctl::StartDeadline(deadline_s);
    }
    qrmctl::Report report(options.blJson);
    return action(report);
}

// JsonCpp throws errors of its own where memory is short, and a thread's start an error number.
bool IsShortOfMemory(const std::exception &error) {
    const auto *const pSystem = dynamic_cast<const std::system_error *>(&error);
    return dynamic_cast<const std::bad_alloc *>(&error) != nullptr ||
           dynamic_cast<const Json::RuntimeError *>(&error) != nullptr ||
           (pSystem != nullptr && (pSystem->code() == std::errc::not_enough_memory ||
                                   pSystem->code() == std::errc::resource_unavailable_try_again));
}

int FailUnexpectedly(const std::exception &error, bool blJson) {
    if (!IsShortOfMemory(error)) {
        try {
            return qrmctl::Report(blJson).Fail(qrmctl::ErrorId::kInternal, error.what());
        } catch (const std::exception &) {
            // Memory is short for the telling.
        }
    }
    return qrmctl::FailShortOfMemory(blJson);
}

}  // namespace

int main(int argc, char **argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception &error) {
        return FailUnexpectedly(error, AsksForJson(argc, argv));
    }
}
