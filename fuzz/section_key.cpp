// CheckSectionKey_tpl1 and CheckSectionKey_tpl2: a byte for the limit, -128 to 127, and the text.

#include <vector>

#include "input.h"
#include "zeloqrmclient.h"

namespace {

using Buffer = std::vector<char>;

// What is found stands in the text, and fits.
void Check(const std::string &strText, int limit) {
    const auto cb = static_cast<std::size_t>(limit > 0 ? limit : 1);
    Buffer section(cb);
    Buffer key(cb);
    Buffer token(cb);
    if (CheckSectionKey_tpl1(strText.c_str(), section.data(), key.data(), limit) == 0) {
        const std::string strFound = std::string("{") + section.data() + ':' + key.data() + '}';
        FUZZ_EXPECT(strText.compare(strText.find('{'), strFound.size(), strFound) == 0);
    }
    if (CheckSectionKey_tpl2(strText.c_str(), section.data(), key.data(), token.data(), limit) ==
        0) {
        const std::string strToken = token.data();
        FUZZ_EXPECT(strText.compare(strText.find("_T("), strToken.size(), strToken) == 0);
        FUZZ_EXPECT(strToken.find(')') == strToken.size() - 1);
        for (const std::string &strPart : {std::string(section.data()), std::string(key.data())}) {
            constexpr const char *kTrimmed = " \t\r\n\"'";
            FUZZ_EXPECT(strToken.find(strPart) != std::string::npos);
            FUZZ_EXPECT(strPart.find_first_not_of(kTrimmed) == 0);
            FUZZ_EXPECT(strPart.find_last_not_of(kTrimmed) == strPart.size() - 1);
        }
    }
}

}  // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *pData, std::size_t cb) {
    std::string_view input = fuzz::Input(pData, cb);
    const int limit = fuzz::TakeByte(input) - 128;
    const std::string strText = fuzz::TakePart(input);
    Check(strText, limit);
    Check(strText, 512);
    return 0;
}
