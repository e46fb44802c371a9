// What the manual says of the commands beyond their option tables: longer descriptions, examples,
// and the exit status.

#ifndef QRMCTL_COMMAND_TEXTS_H
#define QRMCTL_COMMAND_TEXTS_H

#include <vector>

#include "command.h"

namespace qrmctl {

// Gives each command that there is a text for its text and its examples. Throws when a text is for
// no command, so that none outlives its command.
void AddTexts(command::CommandHandle program);

const std::vector<option_table::ExitStatus> &ExitStatuses();

}  // namespace qrmctl

#endif
