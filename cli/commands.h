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
void AddCall(CLI::App &app, Action &action);
void AddUpdate(CLI::App &app, Action &action);
void AddGetFile(CLI::App &app, Action &action);
void AddInfo(CLI::App &app, Action &action);
void AddNotify(CLI::App &app, Action &action);
void AddStatus(CLI::App &app, Action &action);
void AddLeave(CLI::App &app, Action &action);
void AddAccount(CLI::App &app, Action &action);
void AddWelcome(CLI::App &app, Action &action);
void AddPlugins(CLI::App &app, Action &action);
void AddLog(CLI::App &app, Action &action);
void AddIdle(CLI::App &app, Action &action);
void AddDoctor(CLI::App &app, Action &action);
void AddSupport(CLI::App &app, Action &action);

}  // namespace qrmctl

#endif
