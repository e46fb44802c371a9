// Which name was meant by a misspelt one?

#ifndef ZELO_SUGGESTION_H
#define ZELO_SUGGESTION_H

#include <string>
#include <vector>

#include "option_table.h"

namespace suggestion {

// How many letters have to be added, left out, replaced, or swapped with their neighbour to make
// one text of the other; no letter is changed twice.
std::size_t Distance(const std::string &strOne, const std::string &strOther);

// The name that is meant by the word: the nearest one that it differs from in at most two letters
// and in fewer than it has, or else one that begins with it. Empty when there is none.
std::string Meant(const std::string &strWord, const std::vector<std::string> &names);

// A word that the command has no use for, as a message that names what was meant.
std::string UnknownWord(const std::string &strWord, const option_table::Command &command);

}  // namespace suggestion

#endif
