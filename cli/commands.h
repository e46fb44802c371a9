// The commands of qrmctl. Each registers itself with its options, and sets the action that runs
// when it is chosen.

#ifndef QRMCTL_COMMANDS_H
#define QRMCTL_COMMANDS_H

#include <functional>

#include "command.h"
#include "report.h"

namespace qrmctl {

using command::CommandHandle;
using command::OptionHandle;

using Action = std::function<ExitCode(Report &)>;

void AddTestConnection(CommandHandle program, Action &action);
void AddJoin(CommandHandle program, Action &action);
void AddCredential(CommandHandle program, Action &action);
void AddCall(CommandHandle program, Action &action);
void AddUpdate(CommandHandle program, Action &action);
void AddGetFile(CommandHandle program, Action &action);
void AddInfo(CommandHandle program, Action &action);
void AddNotify(CommandHandle program, Action &action);
void AddStatus(CommandHandle program, Action &action);
void AddLeave(CommandHandle program, Action &action);
void AddAccount(CommandHandle program, Action &action);
void AddWelcome(CommandHandle program, Action &action);
void AddPlugins(CommandHandle program, Action &action);
void AddLog(CommandHandle program, Action &action);
void AddIdle(CommandHandle program, Action &action);
void AddDoctor(CommandHandle program, Action &action);
void AddSupport(CommandHandle program, Action &action);

}  // namespace qrmctl

#endif
