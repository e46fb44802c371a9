// The command line of qrmctl: its commands with their options, and the options that all share. The
// manual pages and completions are made from the same tables.

#ifndef QRMCTL_COMMAND_LINE_H
#define QRMCTL_COMMAND_LINE_H

#include "commands.h"

namespace qrmctl {

constexpr const char *kSummary =
    "Makes this appliance a client of a QRM server, and shows what it is";
constexpr const char *kVersion = "qrmctl " ZELO_VERSION;

struct CommonOptions {
    bool blJson = false;
    bool blVerbose = false;
    double deadline_s = 0;  // 0: none is asked for
};

// Adds everything to the program. The action and the options are set when the line is parsed; both
// have to outlive the program.
void AddCommandLine(CommandHandle program, Action &action, CommonOptions &options);

// The deadline of the command that was chosen, in seconds; 0 for none.
double DeadlineOf(CommandHandle program, const CommonOptions &options);

}  // namespace qrmctl

#endif
