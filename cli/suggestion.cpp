#include "suggestion.h"

#include <algorithm>

#include "words.h"

namespace suggestion {
namespace {

constexpr std::size_t kMostChanges = 2;

std::size_t Letters(const std::string &strWord) {
    return strWord.size() - std::min(strWord.size(), strWord.find_first_not_of('-'));
}

}  // namespace

std::size_t Distance(const std::string &strOne, const std::string &strOther) {
    // Row i holds the distances of the first i letters of one to the beginnings of the other; three
    // rows are enough to look two letters back.
    std::vector<std::size_t> before;
    std::vector<std::size_t> last;
    std::vector<std::size_t> row(strOther.size() + 1);
    for (std::size_t j = 0; j < row.size(); ++j) {
        row[j] = j;
    }
    for (std::size_t i = 1; i <= strOne.size(); ++i) {
        before.swap(last);
        last = row;
        row[0] = i;
        for (std::size_t j = 1; j <= strOther.size(); ++j) {
            const std::size_t replaced = strOne[i - 1] == strOther[j - 1] ? 0 : 1;
            row[j] = std::min({last[j] + 1, row[j - 1] + 1, last[j - 1] + replaced});
            if (i > 1 && j > 1 && strOne[i - 1] == strOther[j - 2] &&
                strOne[i - 2] == strOther[j - 1]) {
                row[j] = std::min(row[j], before[j - 2] + 1);
            }
        }
    }
    return row.back();
}

std::string Meant(const std::string &strWord, const std::vector<std::string> &names) {
    const std::size_t most = std::min(kMostChanges + 1, Letters(strWord));
    std::string strMeant;
    std::size_t least = most;
    for (const std::string &strName : names) {
        const std::size_t distance = Distance(strWord, strName);
        if (distance < least) {
            least = distance;
            strMeant = strName;
        }
    }
    for (std::size_t i = 0; i < names.size() && strMeant.empty() && most > 0; ++i) {
        if (names[i].rfind(strWord, 0) == 0) {
            strMeant = names[i];
        }
    }
    return strMeant;
}

std::string UnknownWord(const std::string &strWord, const option_table::Command &command) {
    const bool blOption = strWord.size() > 1 && strWord.front() == '-';
    std::vector<std::string> names;
    for (const option_table::Option &option : command.options) {
        names.insert(names.end(), option.names.begin(), option.names.end());
    }
    if (!blOption) {
        names.clear();
        for (const option_table::Command &each : command.commands) {
            names.push_back(each.LastName());
        }
    }
    const std::string strMeant = Meant(strWord.substr(0, strWord.find('=')), names);
    if (strMeant.empty() && !blOption && names.empty()) {
        return "'" + words::Shortened(strWord) + "' is one argument too many";
    }
    return "'" + words::Shortened(strWord) + "' is no " + (blOption ? "option" : "command") +
           " of '" + command.strName + "'" +
           (strMeant.empty() ? "" : "; did you mean '" + strMeant + "'?");
}

}  // namespace suggestion
