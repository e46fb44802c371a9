// The command line of qrmctl: its commands with their options, and the options that all share. The
// manual pages and completions are made from the same tables.

#ifndef QRMCTL_COMMAND_LINE_H
#define QRMCTL_COMMAND_LINE_H

#include <CLI/CLI.hpp>

#include "commands.h"

namespace qrmctl {

constexpr const char *kSummary =
    "Makes this appliance a client of a QRM server, and shows what it is";

struct CommonOptions {
    bool blJson = false;
    bool blVerbose = false;
    double deadline_s = 0;  // 0: none is asked for
};

// Adds everything to the program. The action and the options are set when the line is parsed; both
// have to outlive the program.
// The deadline of the command that was chosen, in seconds; 0 for none.
double DeadlineOf(const CLI::App &app, const CommonOptions &options);

void AddCommandLine(CLI::App &app, Action &action, CommonOptions &options);

}  // namespace qrmctl

#endif
