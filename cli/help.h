// The text of --help: at most 80 columns wide, and for a program with commands a screen high.

#ifndef ZELO_HELP_H
#define ZELO_HELP_H

#include <string>

#include "option_table.h"

namespace help {

// The help of a program or of one of its commands.
std::string Text(const option_table::Command &command);

}  // namespace help

#endif
