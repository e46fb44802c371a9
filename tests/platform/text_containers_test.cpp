// String lists, string hashes and text helpers.

#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "last_error.h"
#include "text_containers.h"

namespace {

using List = std::unique_ptr<YLIBSZLIST, decltype(&YLIBCSzListFree)>;
using Hash = std::unique_ptr<YLIBSZHASH, decltype(&YLIBCSzHashFree)>;

TEST(SzList, GrowsPastItsInitialSize) {
    YLIBSZLIST *pslList = YLIBCSzListAlloc(16);
    for (int i = 0; i < 1000; ++i) {
        ASSERT_EQ(YLIBCSzListPush(&pslList, std::to_string(i).c_str()), i);
    }
    const List owner(pslList, YLIBCSzListFree);
    EXPECT_EQ(pslList->nItem, 1000);
    EXPECT_STREQ(YLIBCSzListGet(pslList, 0), "0");
    EXPECT_STREQ(YLIBCSzListGet(pslList, 999), "999");
    EXPECT_EQ(YLIBCSzListGet(pslList, 1000), nullptr);
    EXPECT_EQ(YLIBCSzListGet(pslList, -1), nullptr);
}

TEST(SzHash, KeepsTheOrderOfItsKeys) {
    YLIBSZHASH *pHash = YLIBCSzHashAlloc(0);
    for (int i = 999; i >= 0; --i) {
        ASSERT_GE(YLIBCSzHashSetValue(&pHash, std::to_string(i).c_str(), ""), 0);
    }
    ASSERT_GE(YLIBCSzHashSetValue(&pHash, "998", "new"), 0);
    const Hash owner(pHash, YLIBCSzHashFree);
    EXPECT_EQ(pHash->nItem, 1000);
    EXPECT_STREQ(YLIBCSzHashKeyAt(pHash, 1), "998");
    EXPECT_STREQ(YLIBCSzHashValueAt(pHash, 1), "new");
    EXPECT_STREQ(YLIBCSzHashKeyAt(pHash, 999), "0");
    EXPECT_STREQ(YLIBCSzHashGetValue(pHash, "998"), "new");
    EXPECT_STREQ(YLIBCSzHashGetValue(pHash, "0"), "");
    EXPECT_EQ(YLIBCSzHashGetValue(pHash, "none"), nullptr);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NOT_FOUND));
    EXPECT_EQ(YLIBCSzHashKeyAt(pHash, 1000), nullptr);
    EXPECT_EQ(YLIBCSzHashValueAt(pHash, -1), nullptr);
}

TEST(Text, ReplacesEveryOccurrenceOrNone) {
    const std::string strMany(4094, 'a');
    const struct {
        std::string strText;
        std::string strOld;
        std::string strNew;
        int cbText;
        int result;
        std::string strResult;
    } rows[] = {
        {"{0} and {0}", "{0}", "x", 12, 2, "x and x"},
        {"aaa", "a", "aa", 7, 3, "aaaaaa"},
        {"aaa", "a", "aa", 6, -1, "aaa"},
        {"axa", "a", "bbb", 6, -1, "axa"},
        {"aaa", "aa", "b", 4, 1, "ba"},
        {"aaa", "a", "", 4, 3, ""},
        {"abc", "", "x", 4, 0, "abc"},
        {"abc", "abcd", "x", 4, 0, "abc"},
        {"abc", "x", "y", 3, -1, "abc"},
        {strMany, "a", "b", 4096, 4094, std::string(4094, 'b')},
        {strMany + "c", "aa", "bb", 4096, 2047, std::string(4094, 'b') + "c"},
        {strMany + "c", "c", "dd", 4096, -1, strMany + "c"},
    };
    for (const auto &row : rows) {
        const auto cbText = static_cast<std::size_t>(row.cbText);
        std::vector<char> buffer(cbText);  // of exactly this size: nothing past it is touched
        row.strText.copy(buffer.data(), cbText);
        EXPECT_EQ(
            YLIBCStrReplace(buffer.data(), row.strOld.c_str(), row.strNew.c_str(), 0, row.cbText),
            row.result);
        EXPECT_EQ(std::string(buffer.data(), strnlen(buffer.data(), cbText)), row.strResult)
            << row.strOld << ' ' << row.strNew;
    }
}

}  // namespace
