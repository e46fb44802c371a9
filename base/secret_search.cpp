#include "secret_search.h"

#include <algorithm>
#include <set>
#include <string_view>
#include <utility>

namespace {

// Readings of one place; text with more is noise.
constexpr std::size_t kMaxReadings = 16;
// So many bytes that agree tell a secret.
constexpr std::size_t kTellingBytes = 32;

constexpr struct {
    std::string_view name;
    char c;
} kEntities[] = {
    {"quot", '"'},   {"amp", '&'},    {"apos", '\''},   {"lt", '<'},     {"gt", '>'},
    {"sol", '/'},    {"bsol", '\\'},  {"plus", '+'},    {"equals", '='}, {"lowbar", '_'},
    {"period", '.'}, {"comma", ','},  {"colon", ':'},   {"semi", ';'},   {"excl", '!'},
    {"quest", '?'},  {"num", '#'},    {"dollar", '$'},  {"percnt", '%'}, {"ast", '*'},
    {"commat", '@'}, {"Hat", '^'},    {"grave", '`'},   {"lpar", '('},   {"rpar", ')'},
    {"lsqb", '['},   {"lbrack", '['}, {"rsqb", ']'},    {"rbrack", ']'}, {"lcub", '{'},
    {"lbrace", '{'}, {"rcub", '}'},   {"rbrace", '}'},  {"verbar", '|'}, {"vert", '|'},
    {"nbsp", ' '},   {"Tab", '\t'},   {"NewLine", '\n'}};

// A byte that has one reading: itself.
bool IsPlain(char c) {
    return c != '%' && c != '&' && c != '\\' && c != '+';
}

int DigitValue(char c, int base) {
    const char lower = static_cast<char>(c | 0x20);
    const int value = c >= '0' && c <= '9'           ? c - '0'
                      : lower >= 'a' && lower <= 'f' ? lower - 'a' + 10
                                                     : base;
    return value < base ? value : -1;
}

// The value of so many hexadecimal digits at the place; -1 when they are not there.
int HexValue(const std::string &strText, std::size_t at, std::size_t digits) {
    int value = 0;
    for (std::size_t i = at; i < at + digits; ++i) {
        const int digit = i < strText.size() ? DigitValue(strText[i], 16) : -1;
        if (digit < 0) {
            return -1;
        }
        value = value * 16 + digit;
    }
    return value;
}

std::string Utf8(unsigned int code) {
    const auto tail = [code](unsigned int shift) {
        return static_cast<char>(0x80U | ((code >> shift) & 0x3FU));
    };
    if (code < 0x80) {
        return {static_cast<char>(code)};
    }
    if (code < 0x800) {
        return {static_cast<char>(0xC0U | (code >> 6U)), tail(0)};
    }
    if (code < 0x10000) {
        return {static_cast<char>(0xE0U | (code >> 12U)), tail(6), tail(0)};
    }
    return {static_cast<char>(0xF0U | (code >> 18U)), tail(12), tail(6), tail(0)};
}

// A character by its number; below 0x100 it may stand for a byte, too.
void AddNumbered(unsigned int code, std::size_t end, std::vector<Reading> &readings) {
    readings.push_back({Utf8(code), end});
    if (code >= 0x80 && code < 0x100) {
        readings.push_back({{static_cast<char>(code)}, end});
    }
}

// What the text behind "%" makes of it.
void AddUrl(const std::string &strText, std::size_t at, std::vector<Reading> &readings) {
    const int value = HexValue(strText, at, 2);
    if (value >= 0) {
        readings.push_back({{static_cast<char>(value)}, at + 2});
    }
}

// What the text behind "&" makes of it: a name, or "#" and a number.
void AddEntity(const std::string &strText, std::size_t at, std::vector<Reading> &readings) {
    constexpr int kLastCharacter = 0x10FFFF;
    for (const auto &entity : kEntities) {
        const std::size_t end = at + entity.name.size();
        if (strText.compare(at, entity.name.size(), entity.name) == 0 && end < strText.size() &&
            strText[end] == ';') {
            readings.push_back({{entity.c}, end + 1});
        }
    }
    if (at >= strText.size() || strText[at] != '#') {
        return;
    }
    const bool blHex = at + 1 < strText.size() && (strText[at + 1] | 0x20) == 'x';
    const int base = blHex ? 16 : 10;
    const std::size_t first = at + (blHex ? 2 : 1);
    std::size_t end = first;
    int value = 0;
    while (end < strText.size() && value <= kLastCharacter && DigitValue(strText[end], base) >= 0) {
        value = value * base + DigitValue(strText[end++], base);
    }
    if (end > first && value <= kLastCharacter) {
        end += end < strText.size() && strText[end] == ';' ? 1 : 0;
        AddNumbered(static_cast<unsigned int>(value), end, readings);
    }
}

// What the text behind a backslash makes of it: a control character, \xXX or \uXXXX, of which two
// may be one character.
void AddBackslashed(const std::string &strText, std::size_t at, std::vector<Reading> &readings) {
    constexpr std::string_view kLetters = "bfnrt";
    constexpr std::string_view kControls = "\b\f\n\r\t";
    const char c = at < strText.size() ? strText[at] : '\0';
    const std::size_t letter = kLetters.find(c);
    if (letter != std::string_view::npos) {
        readings.push_back({{kControls[letter]}, at + 1});
    }
    if (c == 'x' && HexValue(strText, at + 1, 2) >= 0) {
        readings.push_back({{static_cast<char>(HexValue(strText, at + 1, 2))}, at + 3});
    }
    const int first = c == 'u' ? HexValue(strText, at + 1, 4) : -1;
    if (first < 0) {
        return;
    }
    AddNumbered(static_cast<unsigned int>(first), at + 5, readings);
    const std::size_t next = std::min(strText.find_first_not_of('\\', at + 5), strText.size());
    const int second =
        next < strText.size() && strText[next] == 'u' ? HexValue(strText, next + 1, 4) : -1;
    if (first >= 0xD800 && first < 0xDC00 && second >= 0xDC00 && second < 0xE000) {
        readings.push_back({Utf8(0x10000U + ((static_cast<unsigned int>(first) & 0x3FFU) << 10U) +
                                 (static_cast<unsigned int>(second) & 0x3FFU)),
                            next + 5});
    }
}

bool IsBlank(const std::string &strBytes) {
    return strBytes == "\n" || strBytes == "\r" || strBytes == " " || strBytes == "\t";
}

// How much of a secret has been found up to a place of the text.
struct Progress {
    std::size_t found;
    std::size_t at;

    bool operator<(const Progress &other) const {
        return std::pair(found, at) < std::pair(other.found, other.at);
    }
};

}  // namespace

std::vector<Reading> ReadingsAt(const std::string &strText, std::size_t at) {
    std::vector<Reading> readings = {{{strText[at]}, at + 1}};
    for (std::size_t i = 0; i < readings.size() && readings.size() < kMaxReadings; ++i) {
        const std::size_t end = readings[i].end;
        if (readings[i].strBytes == "%") {
            AddUrl(strText, end, readings);
        } else if (readings[i].strBytes == "&") {
            AddEntity(strText, end, readings);
        } else if (readings[i].strBytes == "\\") {
            AddBackslashed(strText, end, readings);
        }
    }
    if (strText[at] == '+') {
        readings.push_back({" ", at + 1});
    }
    return readings;
}

void SecretSearch::Add(const std::string &strSecret) {
    if (!strSecret.empty()) {
        m_byFirstByte[static_cast<unsigned char>(strSecret.front())].push_back(strSecret);
    }
}

std::size_t SecretSearch::LengthAt(const std::string &strText, std::size_t at) const {
    std::size_t end = at;
    const auto lookFrom = [&](const Reading &reading) {
        const auto first = static_cast<unsigned char>(reading.strBytes.front());
        for (const std::string &strSecret : m_byFirstByte[first]) {
            end = std::max(end, EndOf(strSecret, strText, reading));
        }
    };
    if (IsPlain(strText[at])) {
        lookFrom({{strText[at]}, at + 1});
        return end - at;
    }
    for (const Reading &reading : ReadingsAt(strText, at)) {
        lookFrom(reading);
        // The last backslash before a secret belongs to it.
        if (reading.strBytes == "\\" && reading.end < strText.size() &&
            IsPlain(strText[reading.end])) {
            lookFrom({{strText[reading.end]}, reading.end + 1});
        }
    }
    return end - at;
}

// The end of the secret whose first byte, or bytes, has been read; 0 when the text is another.
std::size_t SecretSearch::EndOf(const std::string &strSecret, const std::string &strText,
                                const Reading &first) const {
    if (strSecret.compare(0, first.strBytes.size(), first.strBytes) != 0) {
        return 0;
    }
    const std::size_t telling = std::min(strSecret.size(), kTellingBytes);
    std::size_t end = first.strBytes.size() >= telling ? first.end : 0;
    std::set<Progress> open = {{first.strBytes.size(), first.end}};
    const auto goOn = [&](const Progress &to) {
        end = to.found >= telling ? std::max(end, to.at) : end;
        return to;
    };
    while (!open.empty()) {
        Progress from = *open.begin();
        open.erase(open.begin());
        // Most text is plain.
        while (from.found < strSecret.size() && from.at < strText.size() &&
               IsPlain(strText[from.at]) && strText[from.at] == strSecret[from.found]) {
            from = goOn({from.found + 1, from.at + 1});
        }
        if (from.found == strSecret.size() || from.at == strText.size()) {
            continue;
        }
        for (const Reading &reading : ReadingsAt(strText, from.at)) {
            const std::size_t cb = reading.strBytes.size();
            if (strSecret.compare(from.found, cb, reading.strBytes) == 0) {
                open.insert(goOn({from.found + cb, reading.end}));
            }
            if (reading.strBytes == "\\" || (m_blWrapped && IsBlank(reading.strBytes))) {
                open.insert({from.found, reading.end});
            }
        }
    }
    return end;
}
