// String lists, string hashes and text helpers on the standard containers.
//
// A record is a part of what its own pointer leads to: one allocation holds both, and a record
// never moves.

#include "text_containers.h"

#include <algorithm>
#include <cstring>
#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "fixed_text.h"
#include "hash_place.h"
#include "status.h"

struct YLIBSZLIST_ITEMS {
    YLIBSZLIST record = {0, this};
    std::vector<std::string> texts;
};

struct YLIBSZHASH_PAIRS {
    struct Pair {
        std::string strKey;
        std::string strValue;
    };
    YLIBSZHASH record = {0, this};
    std::deque<Pair> inOrder;  // of the keys' coming; what a deque holds never moves
    std::unordered_map<std::string_view, std::size_t> places;  // of the keys in there
};

namespace {

using host::Status;

// A new record of the given kind whose sequence has room for about cbInitial bytes.
template <typename Content, typename Sequence>
decltype(Content::record) *NewRecord(int cbInitial, Sequence Content::*sequence) {
    decltype(Content::record) *pRecord = nullptr;
    return HOST_OPERATION(pRecord, pRecord, [&]() -> Status {
        HOST_REQUIRE(cbInitial >= 0);
        auto pContent = std::make_unique<Content>();
        (pContent.get()->*sequence)
            .reserve(static_cast<std::size_t>(cbInitial) / sizeof(std::string));
        pRecord = &pContent.release()->record;
        return {};
    });
}

int Append(YLIBSZLIST &list, std::string_view text) {
    list.pItems->texts.emplace_back(text);
    return list.nItem++;
}

// A text of the pair at an index.
const char *TextAt(const YLIBSZHASH *pHash, int index, std::string YLIBSZHASH_PAIRS::Pair::*text) {
    const char *szText = nullptr;
    return HOST_OPERATION(szText, szText, [&]() -> Status {
        HOST_REQUIRE(pHash != nullptr && index >= 0 && index < pHash->nItem);
        szText = (pHash->pPairs->inOrder[static_cast<std::size_t>(index)].*text).c_str();
        return {};
    });
}

bool IsDelimiter(const char *szDelimiter) {
    return szDelimiter != nullptr && szDelimiter[0] != '\0';
}

std::string_view Trimmed(std::string_view text, std::string_view set) {
    const std::size_t begin = text.find_first_not_of(set);
    if (begin == std::string_view::npos) {
        return text.substr(0, 0);
    }
    return text.substr(begin, text.find_last_not_of(set) - begin + 1);
}

std::string_view Between(const char *szBegin, const char *szEnd) {
    return {szBegin, static_cast<std::size_t>(szEnd - szBegin)};
}

// Appends the piece unless the text would become longer than cbMost bytes.
bool AppendWithin(std::size_t cbMost, std::string_view piece, std::string &strText) {
    if (piece.size() > cbMost - strText.size()) {
        return false;
    }
    strText += piece;
    return true;
}

// Builds the text with every occurrence replaced, unless it is longer than cbMost bytes. Returns
// the number of occurrences, or -1 when it is. Without an occurrence the result stays empty.
int Replace(const char *szText, const char *szOld, std::string_view replacement, std::size_t cbMost,
            std::string &strResult) {
    const std::size_t cbOld = std::strlen(szOld);
    const char *szRest = szText;
    const char *szMatch = std::strstr(szText, szOld);
    if (szMatch == nullptr) {
        return 0;
    }
    strResult.reserve(std::min(std::strlen(szText) + replacement.size(), cbMost));
    int occurrences = 0;
    for (; szMatch != nullptr; szMatch = std::strstr(szRest, szOld)) {
        if (!AppendWithin(cbMost, Between(szRest, szMatch), strResult) ||
            !AppendWithin(cbMost, replacement, strResult)) {
            return -1;
        }
        szRest = szMatch + cbOld;
        ++occurrences;
    }
    return AppendWithin(cbMost, szRest, strResult) ? occurrences : -1;
}

}  // namespace

// --- Lists --------------------------------------------------------------------------------------

YLIBSZLIST *YLIBCSzListAlloc(int cbInitial) {
    return NewRecord(cbInitial, &YLIBSZLIST_ITEMS::texts);
}

void YLIBCSzListFree(YLIBSZLIST *pslList) {
    if (pslList != nullptr) {
        delete pslList->pItems;
    }
}

int YLIBCSzListPush(YLIBSZLIST **ppslList, const char *szText) {
    int index = -1;
    return HOST_OPERATION(-1, index, [&]() -> Status {
        HOST_REQUIRE(ppslList != nullptr && *ppslList != nullptr && szText != nullptr);
        index = Append(**ppslList, szText);
        return {};
    });
}

const char *YLIBCSzListGet(const YLIBSZLIST *pslList, int index) {
    const char *szText = nullptr;
    return HOST_OPERATION(szText, szText, [&]() -> Status {
        HOST_REQUIRE(pslList != nullptr && index >= 0 && index < pslList->nItem);
        szText = pslList->pItems->texts[static_cast<std::size_t>(index)].c_str();
        return {};
    });
}

// --- Hashes -------------------------------------------------------------------------------------

host::PlaceInHash host::FindOrAddKey(YLIBSZHASH &hash, std::string_view key) {
    YLIBSZHASH_PAIRS &pairs = *hash.pPairs;
    const auto known = pairs.places.find(key);
    if (known != pairs.places.end()) {
        return {known->second, pairs.inOrder[known->second].strValue};
    }
    const auto index = static_cast<std::size_t>(hash.nItem);
    pairs.inOrder.resize(index);  // without what another call has not come to the end of
    YLIBSZHASH_PAIRS::Pair &pair = pairs.inOrder.emplace_back();
    pair.strKey = key;
    pairs.places.emplace(pair.strKey, index);
    ++hash.nItem;
    return {index, pair.strValue};
}

YLIBSZHASH *YLIBCSzHashAlloc(int cbInitial) {
    return NewRecord(cbInitial, &YLIBSZHASH_PAIRS::places);
}

void YLIBCSzHashFree(YLIBSZHASH *pHash) {
    if (pHash != nullptr) {
        delete pHash->pPairs;
    }
}

int YLIBCSzHashSetValue(YLIBSZHASH **ppHash, const char *szKey, const char *szValue) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(ppHash != nullptr && *ppHash != nullptr);
        HOST_REQUIRE(szKey != nullptr && szValue != nullptr);
        std::string strValue = szValue;
        host::FindOrAddKey(**ppHash, szKey).strValue.swap(strValue);
        return {};
    });
}

const char *YLIBCSzHashGetValue(const YLIBSZHASH *pHash, const char *szKey) {
    const char *szValue = nullptr;
    return HOST_OPERATION(szValue, szValue, [&]() -> Status {
        HOST_REQUIRE(pHash != nullptr && szKey != nullptr);
        const auto known = pHash->pPairs->places.find(szKey);
        if (known == pHash->pPairs->places.end()) {
            return HOST_ERROR(YLIBC_ERR_NOT_FOUND, std::string("there is no key '") + szKey + '\'');
        }
        szValue = pHash->pPairs->inOrder[known->second].strValue.c_str();
        return {};
    });
}

const char *YLIBCSzHashKeyAt(const YLIBSZHASH *pHash, int index) {
    return TextAt(pHash, index, &YLIBSZHASH_PAIRS::Pair::strKey);
}

const char *YLIBCSzHashValueAt(const YLIBSZHASH *pHash, int index) {
    return TextAt(pHash, index, &YLIBSZHASH_PAIRS::Pair::strValue);
}

// --- Text ---------------------------------------------------------------------------------------

int YLIBCStrTok(const char *szText, const char *szDelimiter, YLIBSZLIST **ppslList) {
    int pieces = 0;
    return HOST_OPERATION(-1, pieces, [&]() -> Status {
        HOST_REQUIRE(szText != nullptr && IsDelimiter(szDelimiter));
        HOST_REQUIRE(ppslList != nullptr && *ppslList != nullptr);
        if (szText[0] == '\0') {
            return {};
        }
        const char *szRest = szText;
        while (const char *szEnd = std::strstr(szRest, szDelimiter)) {
            Append(**ppslList, Between(szRest, szEnd));
            szRest = szEnd + std::strlen(szDelimiter);
            ++pieces;
        }
        Append(**ppslList, szRest);
        ++pieces;
        return {};
    });
}

char *YLIBCStrTokIndex(char **pszText, const char *szDelimiter) {
    char *szPiece = nullptr;
    return HOST_OPERATION(szPiece, szPiece, [&]() -> Status {
        HOST_REQUIRE(pszText != nullptr && IsDelimiter(szDelimiter));
        szPiece = *pszText;
        char *const szEnd = szPiece == nullptr ? nullptr : std::strstr(szPiece, szDelimiter);
        *pszText = szEnd == nullptr ? nullptr : szEnd + std::strlen(szDelimiter);
        if (szEnd != nullptr) {
            *szEnd = '\0';
        }
        return {};
    });
}

int YLIBCStrTrim(const char *szText, char *szOut, const char *szSet) {
    int cb = 0;
    return HOST_OPERATION(-1, cb, [&]() -> Status {
        HOST_REQUIRE(szText != nullptr && szOut != nullptr && szSet != nullptr);
        const std::string_view trimmed = Trimmed(szText, szSet);
        std::memmove(szOut, trimmed.data(), trimmed.size());
        szOut[trimmed.size()] = '\0';
        cb = static_cast<int>(trimmed.size());
        return {};
    });
}

int YLIBCStrReplace(char *szText, const char *szOld, const char *szNew, int /*flags*/, int cbText) {
    int occurrences = 0;
    return HOST_OPERATION(-1, occurrences, [&]() -> Status {
        HOST_REQUIRE(szText != nullptr && szOld != nullptr && szNew != nullptr && cbText > 0);
        const std::size_t cbMost = static_cast<std::size_t>(cbText) - 1;
        HOST_REQUIRE(strnlen(szText, cbMost + 1) <= cbMost);
        std::string strResult;
        occurrences = szOld[0] == '\0' ? 0 : Replace(szText, szOld, szNew, cbMost, strResult);
        HOST_REQUIRE(occurrences >= 0);
        if (occurrences > 0) {
            CopyToFit(szText, cbText, strResult);
        }
        return {};
    });
}
