// qrmctl: the library at a shell.

#include <syslog.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <exception>
#include <iostream>
#include <sstream>
#include <string>
#include <string_view>

#include "command_line.h"
#include "deadline.h"

namespace {

// A command line that is wrong has not been read to its end, so its options are not known.
bool AsksForJson(int argc, char **argv) {
    return std::any_of(argv, argv + argc,
                       [](const char *sz) { return std::string_view(sz) == "--json"; });
}

// Help goes to standard output, wrong usage to standard error.
int TellUsage(const CLI::App &app, const CLI::ParseError &error, bool blJson) {
    std::ostringstream help;
    std::ostringstream wrong;
    if (app.exit(error, help, wrong) == 0) {
        std::cout << help.str();
        return qrmctl::kDone;
    }
    // The report adds the program's name and the line's end.
    std::string strWrong = wrong.str();
    constexpr std::string_view kName = "qrmctl: ";
    if (strWrong.rfind(kName, 0) == 0) {
        strWrong.erase(0, kName.size());
    }
    while (!strWrong.empty() && strWrong.back() == '\n') {
        strWrong.pop_back();
    }
    return qrmctl::Report(blJson).Fail(qrmctl::ErrorId::kUsage, strWrong);
}

int Run(int argc, char **argv) {
    CLI::App app(qrmctl::kSummary, "qrmctl");
    qrmctl::Action action;
    qrmctl::CommonOptions options;
    qrmctl::AddCommandLine(app, action, options);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &error) {
        return TellUsage(app, error, AsksForJson(argc, argv));
    }

    openlog("qrmctl", options.blVerbose ? LOG_PERROR : 0, LOG_USER);
    const double deadline_s = qrmctl::DeadlineOf(app, options);
    if (deadline_s > 0) {
        qrmctl::StartDeadline(deadline_s, options.blJson);
    }
    qrmctl::Report report(options.blJson);
    return action(report);
}

}  // namespace

int main(int argc, char **argv) {
    try {
        return Run(argc, argv);
    } catch (const std::exception &error) {
        return qrmctl::Report(AsksForJson(argc, argv))
            .Fail(qrmctl::ErrorId::kInternal, error.what());
    }
}
