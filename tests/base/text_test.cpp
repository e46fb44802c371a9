// Text that is cut to fit, and text from outside made safe for a line.

#include <gtest/gtest.h>

#include "fixed_text.h"
#include "printable.h"

namespace {

TEST(Text, IsCutBetweenCharactersAndEnded) {
    const std::string strText = "a\u00E9\u20AC\U0001F600z";
    const std::pair<int, std::size_t> rows[] = {
        // the buffer, and how much of the text fits
        {1, 0}, {2, 1}, {3, 1}, {4, 3}, {6, 3}, {7, 6}, {10, 6}, {11, 10}, {12, 11}, {40, 11}};
    for (const auto &[cbBuffer, cb] : rows) {
        char sz[40] = {};
        EXPECT_EQ(CopyToFit(sz, cbBuffer, strText.c_str()), static_cast<int>(cb)) << cbBuffer;
        EXPECT_EQ(sz, strText.substr(0, cb));
    }
    char szNone[] = "kept";
    EXPECT_EQ(CopyToFit(szNone, 0, "text"), 0);
    EXPECT_STREQ(szNone, "kept");
    // What is no UTF-8 loses no more than a character could have.
    EXPECT_EQ(CopyToFit(szNone, 4, "\x80\x80\x80\x80\x80"), 3);
}

TEST(Text, FromOutsideControlsNothing) {
    const std::pair<std::string, std::string> rows[] = {
        {"\u00E9 \u20AC", "\u00E9 \u20AC"},  {"a\nb\r\tc", R"(a\nb\r\tc)"},
        {"\x1B[31m\x7F", R"(\x1B[31m\x7F)"}, {"\u202Etxt", R"(\xE2\x80\xAEtxt)"},
        {"\xC3(\xFF", R"(\xC3(\xFF)"},       {std::string(1, '\0'), R"(\x00)"}};
    for (const auto &[strText, strLine] : rows) {
        EXPECT_EQ(printable::Line(strText), strLine);
    }
    EXPECT_EQ(printable::Json("{\"a\":\"\x7F\"}\n"), "{\"a\":\"\\u007f\"}\n");
}

}  // namespace
