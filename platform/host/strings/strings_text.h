// The text of a strings file: finding sections, and a key in the lines of one.
//
// Nothing here opens a file or keeps anything, and any bytes may be given.

#ifndef ZELO_HOST_STRINGS_TEXT_H
#define ZELO_HOST_STRINGS_TEXT_H

#include <algorithm>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace host::strings_text {

constexpr std::string_view kBlanks = " \t\r";

inline std::string_view Trim(std::string_view text) {
    const std::size_t begin = text.find_first_not_of(kBlanks);
    if (begin == std::string_view::npos) {
        return {};
    }
    return text.substr(begin, text.find_last_not_of(kBlanks) - begin + 1);
}

// The line that begins at the position, without its line feed.
inline std::string_view LineAt(std::string_view text, std::size_t begin) {
    return text.substr(begin, text.find('\n', begin) - begin);
}

// The name of the section that the line begins; nothing when the line has another form.
inline std::optional<std::string_view> SectionName(std::string_view line) {
    line = Trim(line);
    if (line.size() < 2 || line.front() != '[' || line.back() != ']') {
        return std::nullopt;
    }
    return line.substr(1, line.size() - 2);
}

struct Section {
    std::size_t begin;  // of its line
    std::size_t end;    // of its line, the line feed included
    std::string_view name;
};

// The first section whose line begins at the position, which is itself a line's begin, or later.
// Looks at brackets only, so that all other text is passed at the speed of memory.
inline std::optional<Section> NextSection(std::string_view text, std::size_t from) {
    for (std::size_t bracket = text.find('[', from); bracket != std::string_view::npos;
         bracket = text.find('[', bracket + 1)) {
        std::size_t begin = bracket;
        while (begin > from && kBlanks.find(text[begin - 1]) != std::string_view::npos) {
            --begin;
        }
        if (begin > from && text[begin - 1] != '\n') {
            continue;
        }
        const std::string_view line = LineAt(text, begin);
        if (const auto name = SectionName(line)) {
            return Section{begin, std::min(begin + line.size() + 1, text.size()), *name};
        }
    }
    return std::nullopt;
}

inline char Unescape(char escaped) {
    switch (escaped) {
        case 'n':
            return '\n';
        case 't':
            return '\t';
        case 'r':
            return '\r';
        default:
            return escaped;
    }
}

// What stands between two quotes, its escapes resolved; nothing when the text has another form, or
// holds a NUL, which would end it early.
inline std::optional<std::string> Unquote(std::string_view quoted) {
    if (quoted.size() < 2 || quoted.front() != '"' || quoted.back() != '"' ||
        quoted.find('\0') != std::string_view::npos) {
        return std::nullopt;
    }
    const std::string_view inner = quoted.substr(1, quoted.size() - 2);
    if (inner.find('\\') == std::string_view::npos && inner.find('"') == std::string_view::npos) {
        return std::string(inner);
    }
    std::string strValue;
    for (std::size_t i = 0; i < inner.size(); ++i) {
        if (inner[i] == '"') {
            return std::nullopt;
        }
        if (inner[i] != '\\') {
            strValue += inner[i];
        } else if (++i < inner.size()) {
            strValue += Unescape(inner[i]);
        } else {
            return std::nullopt;  // the last quote is an escaped one
        }
    }
    return strValue;
}

// The value that the line gives to the key; nothing when it has another key or another form.
inline std::optional<std::string> ValueOf(std::string_view line, std::string_view key) {
    const std::size_t begin = line.find_first_not_of(kBlanks);
    if (begin == std::string_view::npos || line.compare(begin, key.size(), key) != 0) {
        return std::nullopt;
    }
    const std::string_view rest = Trim(line.substr(begin + key.size()));
    if (rest.empty() || rest.front() != '=') {
        return std::nullopt;
    }
    return Unquote(Trim(rest.substr(1)));
}

// The value of the key in the lines of one section.
inline std::optional<std::string> FindKey(std::string_view lines, std::string_view key) {
    if (key.empty() || key.front() == '#' || key.find('=') != std::string_view::npos ||
        Trim(key) != key) {
        return std::nullopt;  // no line can have such a key
    }
    for (std::size_t begin = 0; begin < lines.size();) {
        const std::string_view line = LineAt(lines, begin);
        if (auto value = ValueOf(line, key)) {
            return value;
        }
        begin += line.size() + 1;
    }
    return std::nullopt;
}

}  // namespace host::strings_text

#endif
