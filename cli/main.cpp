// qrmctl: the library at a shell.

#include <syslog.h>

#include <algorithm>
#include <exception>
#include <iostream>
#include <string>
#include <string_view>

#include "command_line.h"
#include "deadline.h"
#include "output.h"
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
        qrmctl::StartDeadline(deadline_s, options.blJson);
    }
    qrmctl::Report report(options.blJson);
    return action(report);
}

}  // namespace

int main(int argc, char **argv) {
    const qrmctl::GuardedOutput output;
    try {
        return Run(argc, argv);
    } catch (const std::exception &error) {
        return qrmctl::Report(AsksForJson(argc, argv))
            .Fail(qrmctl::ErrorId::kInternal, error.what());
    }
}
