// Text from outside on one line: control characters escaped, so that it neither ends a line of the
// system log nor changes what a terminal shows.

#ifndef ZELO_ONE_LINE_H
#define ZELO_ONE_LINE_H

#include <cstddef>
#include <string>
#include <string_view>

#include "fixed_text.h"

namespace one_line {

// Control characters of ASCII, and those of Unicode's second page in UTF-8 or alone.
inline bool IsControl(std::string_view text, std::size_t at) {
    const auto byteAt = [text](std::size_t i) {
        return i < text.size() ? static_cast<unsigned char>(text[i]) : 0U;
    };
    const auto isC1 = [](unsigned int byte) { return byte >= 0x80 && byte <= 0x9F; };
    const unsigned int byte = byteAt(at);
    if (byte < 0x20 || byte == 0x7F) {
        return true;
    }
    const unsigned int before = at == 0 ? 0U : byteAt(at - 1);
    return (byte == 0xC2 && isC1(byteAt(at + 1))) ||
           (isC1(byte) && (before < 0x80 || before == 0xC2));
}

// The byte at the place, or what stands for it, such as "\n" or "\x1B".
inline FixedText<8> Shown(std::string_view text, std::size_t at) {
    FixedText<8> shown;
    const char c = text[at];
    if (!IsControl(text, at)) {
        shown.Join({text.substr(at, 1)});
    } else if (c == '\n' || c == '\r' || c == '\t') {
        shown.Join({c == '\n' ? "\\n" : c == '\r' ? "\\r" : "\\t"});
    } else {
        shown.Format("\\x%02X", static_cast<unsigned char>(c));
    }
    return shown;
}

inline std::string Text(std::string_view text) {
    std::string strShown;
    for (std::size_t at = 0; at < text.size(); ++at) {
        strShown += Shown(text, at).sz();
    }
    return strShown;
}

}  // namespace one_line

#endif
