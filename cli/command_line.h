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
};

// Adds everything to the program. The action and the options are set when the line is parsed; both
// have to outlive the program.
void AddCommandLine(CLI::App &app, Action &action, CommonOptions &options);

}  // namespace qrmctl

#endif
