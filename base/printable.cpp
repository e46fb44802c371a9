#include "printable.h"

#include <openssl/asn1.h>

#include "fixed_text.h"

namespace printable {
namespace {

struct Character {
    std::size_t cb;
    unsigned long code;  // of a byte that is part of no character: its value
    bool blSafe;
};

// Control characters, line and paragraph separator, and what turns the direction.
bool IsUnseen(unsigned long code) {
    return code < 0x20 || (code >= 0x7F && code <= 0x9F) || code == 0x061C || code == 0x200E ||
           code == 0x200F || (code >= 0x2028 && code <= 0x202E) ||
           (code >= 0x2066 && code <= 0x2069);
}

Character At(std::string_view text, std::size_t at) {
    unsigned long code = static_cast<unsigned char>(text[at]);
    const std::size_t cb = CharacterAt(text, at, code);
    return {cb == 0 ? 1 : cb, code, cb > 0 && !IsUnseen(code)};
}

}  // namespace

std::size_t CharacterAt(std::string_view text, std::size_t at, unsigned long &code) {
    constexpr std::size_t kLongest = 4;
    const std::string_view bytes = text.substr(at, kLongest);
    const int cb = UTF8_getc(reinterpret_cast<const unsigned char *>(bytes.data()),
                             static_cast<int>(bytes.size()), &code);
    return cb > 0 ? static_cast<std::size_t>(cb) : 0;
}

Shown ShowAt(std::string_view text, std::size_t at) {
    const Character character = At(text, at);
    Shown shown;
    shown.cb = character.cb;
    constexpr std::string_view kControls = "\n\r\t";
    const std::size_t letter = kControls.find(text[at]);
    const auto byte = [text, at](std::size_t i) {
        return i + at < text.size() ? static_cast<unsigned char>(text[i + at]) : 0U;
    };
    if (character.blSafe) {
        shown.text.Join({text.substr(at, character.cb)});
    } else if (letter != std::string_view::npos) {
        shown.text.Format("\\%c", "nrt"[letter]);
    } else if (character.cb == 1) {
        shown.text.Format("\\x%02X", byte(0));
    } else if (character.cb == 2) {
        shown.text.Format("\\x%02X\\x%02X", byte(0), byte(1));
    } else {
        shown.text.Format("\\x%02X\\x%02X\\x%02X", byte(0), byte(1), byte(2));
    }
    return shown;
}

std::string Line(std::string_view text) {
    std::string strLine;
    for (std::size_t at = 0; at < text.size();) {
        const Shown shown = ShowAt(text, at);
        strLine += shown.text.sz();
        at += shown.cb;
    }
    return strLine;
}

std::string Json(std::string_view text) {
    std::string strJson;
    for (std::size_t at = 0; at < text.size();) {
        const Character character = At(text, at);
        if (character.blSafe || text[at] == '\n') {
            strJson += text.substr(at, character.cb);
        } else {
            FixedText<8> code;
            code.Format("\\u%04lx", character.code);
            strJson += code.sz();
        }
        at += character.cb;
    }
    return strJson;
}

}  // namespace printable
