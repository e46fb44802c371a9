// qrmctl: the library at a shell.

#include <syslog.h>

#include <CLI/CLI.hpp>
#include <exception>
#include <iostream>

#include "command_line.h"

namespace {

int Run(int argc, char **argv) {
    CLI::App app(qrmctl::kSummary, "qrmctl");
    qrmctl::Action action;
    qrmctl::CommonOptions options;
    qrmctl::AddCommandLine(app, action, options);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &error) {
        return app.exit(error) == 0 ? qrmctl::kDone : qrmctl::kUsage;
    }

    openlog("qrmctl", options.blVerbose ? LOG_PERROR : 0, LOG_USER);
    qrmctl::Report report(options.blJson);
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
