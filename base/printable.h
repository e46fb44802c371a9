// Text from outside made safe for a line of the log or a terminal: what would control it, break the
// line or turn the text around stands there by its number. The rest stays as it is, so that text in
// any language can be read.

#ifndef ZELO_PRINTABLE_H
#define ZELO_PRINTABLE_H

#include <cstddef>
#include <string>
#include <string_view>

#include "fixed_text.h"

namespace printable {

// How many bytes the character of UTF-8 has that begins at the place, with its code; 0, with the
// code left alone, when none does.
std::size_t CharacterAt(std::string_view text, std::size_t at, unsigned long &code);

// What is shown of a character: itself, or up to three bytes as \xNN.
struct Shown {
    FixedText<3 * 4 + 1> text;
    std::size_t cb = 0;  // how many bytes of the text it stands for
};

// The character of UTF-8 that begins at the place. Control characters, U+061C, U+200E, U+200F,
// U+2028 to U+202E, U+2066 to U+2069 and a byte that is part of no character are shown as \n, \r,
// \t or each byte as \xNN. Allocates nothing.
Shown ShowAt(std::string_view text, std::size_t at);

// The same for a whole text.
std::string Line(std::string_view text);

// The same for JSON text, with \uNNNN; its line ends stay.
std::string Json(std::string_view text);

}  // namespace printable

#endif
