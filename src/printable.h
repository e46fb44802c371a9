// Text from outside made safe for a line of the log or a terminal: what would control it, break the
// line or turn the text around stands there by its number. The rest stays as it is, so that text in
// any language can be read.

#ifndef ZELO_PRINTABLE_H
#define ZELO_PRINTABLE_H

#include <cstddef>
#include <string>
#include <string_view>

namespace printable {

// Appends the character of UTF-8 that begins at the place, and returns the number of its bytes.
// Control characters, U+061C, U+200E, U+200F, U+2028 to U+202E, U+2066 to U+2069 and a byte that is
// part of no character are written as \n, \r, \t or each byte as \xNN.
std::size_t Append(std::string &strLine, std::string_view text, std::size_t at);

// The same for a whole text.
std::string Line(std::string_view text);

// The same for JSON text, with \uNNNN; its line ends stay.
std::string Json(std::string_view text);

}  // namespace printable

#endif
