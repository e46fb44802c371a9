// String lists, string hashes and text helpers on the standard containers.
//
// A record is a part of what its own pointer leads to: one allocation holds both, and a record
// never moves.

#include "text_containers.h"

#include <algorithm>
#include <cstring>
#include <deque>
#include <memory>
#include <new>
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

constexpr const char *kFile = "text_containers";

// A new record of the given kind whose sequence has room for about cbInitial bytes.
template <typename Content, typename Sequence>
decltype(Content::record) *NewRecord(int cbInitial, Sequence Content::*sequence) {
    if (cbInitial < 0) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return nullptr;
    }
    try {
        auto pContent = std::make_unique<Content>();
        (pContent.get()->*sequence)
            .reserve(static_cast<std::size_t>(cbInitial) / sizeof(std::string));
        return &pContent.release()->record;
    } catch (const std::bad_alloc &) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
        return nullptr;
    }
}

int Append(YLIBSZLIST &list, std::string_view text) {
    try {
        list.pItems->texts.emplace_back(text);
        return list.nItem++;
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

// The pair at an index; null when there is none.
const YLIBSZHASH_PAIRS::Pair *PairAt(const YLIBSZHASH *pHash, int index) {
    if (pHash == nullptr || index < 0 || index >= pHash->nItem) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return nullptr;
    }
    return &pHash->pPairs->inOrder[static_cast<std::size_t>(index)];
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
    if (ppslList == nullptr || *ppslList == nullptr || szText == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return Append(**ppslList, szText);
}

const char *YLIBCSzListGet(const YLIBSZLIST *pslList, int index) {
    if (pslList == nullptr || index < 0 || index >= pslList->nItem) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return nullptr;
    }
    return pslList->pItems->texts[static_cast<std::size_t>(index)].c_str();
}

// --- Hashes -------------------------------------------------------------------------------------

host::PlaceInHash host::FindOrAddKey(YLIBSZHASH &hash, std::string_view key) {
    YLIBSZHASH_PAIRS &pairs = *hash.pPairs;
    const auto known = pairs.places.find(key);
    if (known != pairs.places.end()) {
        return {known->second, pairs.inOrder[known->second].strValue};
    }
    const std::size_t index = pairs.inOrder.size();
    YLIBSZHASH_PAIRS::Pair &pair = pairs.inOrder.emplace_back();
    try {
        pair.strKey = key;
        pairs.places.emplace(pair.strKey, index);
    } catch (const std::bad_alloc &) {
        pairs.inOrder.pop_back();
        throw;
    }
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
    if (ppHash == nullptr || *ppHash == nullptr || szKey == nullptr || szValue == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        std::string strValue = szValue;
        host::FindOrAddKey(**ppHash, szKey).strValue.swap(strValue);
        return 0;
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

const char *YLIBCSzHashGetValue(const YLIBSZHASH *pHash, const char *szKey) {
    if (pHash == nullptr || szKey == nullptr) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return nullptr;
    }
    const auto known = pHash->pPairs->places.find(szKey);
    if (known == pHash->pPairs->places.end()) {
        HOST_FAIL(YLIBC_ERR_NOT_FOUND);
        return nullptr;
    }
    return pHash->pPairs->inOrder[known->second].strValue.c_str();
}

const char *YLIBCSzHashKeyAt(const YLIBSZHASH *pHash, int index) {
    const auto *const pPair = PairAt(pHash, index);
    return pPair == nullptr ? nullptr : pPair->strKey.c_str();
}

const char *YLIBCSzHashValueAt(const YLIBSZHASH *pHash, int index) {
    const auto *const pPair = PairAt(pHash, index);
    return pPair == nullptr ? nullptr : pPair->strValue.c_str();
}

// --- Text ---------------------------------------------------------------------------------------

int YLIBCStrTok(const char *szText, const char *szDelimiter, YLIBSZLIST **ppslList) {
    if (szText == nullptr || !IsDelimiter(szDelimiter) || ppslList == nullptr ||
        *ppslList == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    if (szText[0] == '\0') {
        return 0;
    }
    const std::size_t cbDelimiter = std::strlen(szDelimiter);
    const char *szRest = szText;
    int pieces = 1;
    while (const char *szEnd = std::strstr(szRest, szDelimiter)) {
        if (Append(**ppslList, Between(szRest, szEnd)) < 0) {
            return -1;
        }
        szRest = szEnd + cbDelimiter;
        ++pieces;
    }
    return Append(**ppslList, szRest) < 0 ? -1 : pieces;
}

char *YLIBCStrTokIndex(char **pszText, const char *szDelimiter) {
    if (pszText == nullptr || !IsDelimiter(szDelimiter)) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return nullptr;
    }
    char *const szPiece = *pszText;
    if (szPiece == nullptr) {
        return nullptr;
    }
    char *const szEnd = std::strstr(szPiece, szDelimiter);
    if (szEnd == nullptr) {
        *pszText = nullptr;
        return szPiece;
    }
    *szEnd = '\0';
    *pszText = szEnd + std::strlen(szDelimiter);
    return szPiece;
}

int YLIBCStrTrim(const char *szText, char *szOut, const char *szSet) {
    if (szText == nullptr || szOut == nullptr || szSet == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    const std::string_view trimmed = Trimmed(szText, szSet);
    std::memmove(szOut, trimmed.data(), trimmed.size());
    szOut[trimmed.size()] = '\0';
    return static_cast<int>(trimmed.size());
}

int YLIBCStrReplace(char *szText, const char *szOld, const char *szNew, int /*flags*/, int cbText) {
    if (szText == nullptr || szOld == nullptr || szNew == nullptr || cbText <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    const std::size_t cbMost = static_cast<std::size_t>(cbText) - 1;
    if (strnlen(szText, cbMost + 1) > cbMost) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    if (szOld[0] == '\0') {
        return 0;
    }
    try {
        std::string strResult;
        const int occurrences = Replace(szText, szOld, szNew, cbMost, strResult);
        if (occurrences < 0) {
            return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        }
        if (occurrences > 0) {
            CopyToFit(szText, cbText, strResult);
        }
        return occurrences;
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
