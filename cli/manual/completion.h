// Completions for the shells, made from an option table: commands, options, values that are counted
// up, and files where a file is named.

#ifndef ZELO_MANUAL_COMPLETION_H
#define ZELO_MANUAL_COMPLETION_H

#include <string>

#include "option_table.h"

namespace manual {

std::string BashCompletion(const option_table::Command &program);
std::string ZshCompletion(const option_table::Command &program);
std::string FishCompletion(const option_table::Command &program);

}  // namespace manual

#endif
