// Words and the text that they make.

#ifndef ZELO_WORDS_H
#define ZELO_WORDS_H

#include <string>
#include <vector>

namespace words {

std::string Joined(const std::vector<std::string> &words, const char *szBetween);

// The words between the separators; an empty last one is left out.
std::vector<std::string> Split(const std::string &strText, char separator);

// A text from outside for a message: of a long one its beginning, cut between two characters.
std::string Shortened(const std::string &strText);

}  // namespace words

#endif
