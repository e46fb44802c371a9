// The commands of qrmctl. Each registers itself with its options, and sets the action that runs
// when it is chosen.

#ifndef QRMCTL_COMMANDS_H
#define QRMCTL_COMMANDS_H

#include <CLI/CLI.hpp>
#include <functional>

#include "report.h"

namespace qrmctl {

using Action = std::function<ExitCode(Report &)>;

void AddTestConnection(CLI::App &app, Action &action);
void AddJoin(CLI::App &app, Action &action);
void AddCredential(CLI::App &app, Action &action);

}  // namespace qrmctl

#endif
