// Key-value files: a key, a value, and the text of a file. What is listed can be looked up; what is
// set or removed changes nothing else.

#include <key_value_file.h>

#include <algorithm>
#include <utility>
#include <vector>

#include "input.h"
#include "platform_handles.h"

namespace {

using Pairs = std::vector<std::pair<std::string, std::string>>;

const fuzz::InputFile &File() {
    static const fuzz::InputFile file;
    return file;
}

Pairs ReadPairs() {
    HashHandle hash(YLIBCSzHashAlloc(0));
    Pairs pairs;
    FUZZ_EXPECT(YLIBCFileGetPair(File().Path(), hash.Address()) == hash.Get()->nItem);
    for (int i = 0; i < hash.Get()->nItem; ++i) {
        pairs.emplace_back(YLIBCSzHashKeyAt(hash.Get(), i), YLIBCSzHashValueAt(hash.Get(), i));
    }
    return pairs;
}

Pairs Without(Pairs pairs, const std::string &strKey) {
    pairs.erase(std::remove_if(pairs.begin(), pairs.end(),
                               [&strKey](const auto &pair) { return pair.first == strKey; }),
                pairs.end());
    return pairs;
}

void LookUp(const std::string &strKey, const std::string &strValue) {
    constexpr int kSize = 8;
    std::vector<char> out(kSize, '?');
    const int cb = YLIBCFileGetKeyValue(File().Path(), strKey.c_str(), out.data(), kSize, 0);
    FUZZ_EXPECT(cb == std::min(static_cast<int>(strValue.size()), kSize - 1));
    FUZZ_EXPECT(strValue.compare(0, kSize - 1, out.data()) == 0);
    FUZZ_EXPECT(YLIBCFileCheckKeyValue(File().Path(), strKey.c_str(), strValue.c_str(), 0) == 1);
}

}  // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *pData, std::size_t cb) {
    constexpr std::size_t kLookedUp = 8;
    std::string_view input = fuzz::Input(pData, cb);
    const std::string strKey = fuzz::TakePart(input);
    const std::string strValue = fuzz::TakePart(input);
    File().Write(input);
    const Pairs before = ReadPairs();
    for (std::size_t i = 0; i < std::min(before.size(), kLookedUp); ++i) {
        LookUp(before[i].first, before[i].second);
    }

    if (YLIBCFileSetKeyValue(File().Path(), strKey.c_str(), strValue.c_str(), 0) == 0) {
        LookUp(strKey, strValue);
        FUZZ_EXPECT(Without(ReadPairs(), strKey) == Without(before, strKey));
    } else {
        FUZZ_EXPECT(File().Read() == input);
    }
    FUZZ_EXPECT(YLIBCFileRemoveKey(File().Path(), strKey.c_str()) >= 0);
    FUZZ_EXPECT(ReadPairs() == Without(before, strKey));
    return 0;
}
