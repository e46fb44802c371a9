#include "words.h"

#include <sstream>

namespace words {

std::string Joined(const std::vector<std::string> &words, const char *szBetween) {
    std::string strText;
    for (std::size_t i = 0; i < words.size(); ++i) {
        strText += (i == 0 ? "" : szBetween) + words[i];
    }
    return strText;
}

std::vector<std::string> Split(const std::string &strText, char separator) {
    std::vector<std::string> words;
    std::istringstream text(strText);
    text.exceptions(std::ios::badbit);  // or short memory would cut the text
    for (std::string strWord; std::getline(text, strWord, separator);) {
        words.push_back(strWord);
    }
    return words;
}

std::string Shortened(const std::string &strText) {
    constexpr std::size_t kLongest = 200;
    if (strText.size() <= kLongest) {
        return strText;
    }
    std::size_t end = kLongest;
    while (end > 0 && (static_cast<unsigned char>(strText[end]) & 0xC0U) == 0x80) {
        --end;
    }
    return strText.substr(0, end) + "...";
}

}  // namespace words
