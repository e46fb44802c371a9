// ParamGet: a byte for the size of its buffer, the parameter, and the strings file that its
// references are looked up in.

#include <cstring>
#include <vector>

#include "input.h"
#include "platform_handles.h"
#include "zeloqrmclient.h"

namespace {

// The buffer is exactly as large as it is said to be.
void Expand(YLIBSZLIST *pslParams, const char *szFile, int cb) {
    std::vector<char> out(static_cast<std::size_t>(cb), '?');
    ParamGet(pslParams, 0, szFile, out.data(), cb);
    FUZZ_EXPECT(std::memchr(out.data(), '\0', out.size()) != nullptr);
}

}  // namespace

int LLVMFuzzerTestOneInput(const std::uint8_t *pData, std::size_t cb) {
    static const fuzz::InputFile file;
    std::string_view input = fuzz::Input(pData, cb);
    const int size = 1 + 8 * fuzz::TakeByte(input);
    const std::string strParam = fuzz::TakePart(input);
    file.Write(input);
    ListHandle params(YLIBCSzListAlloc(0));
    YLIBCSzListPush(params.Address(), strParam.c_str());
    Expand(params.Get(), file.Path(), size);
    Expand(params.Get(), file.Path(), 4096);
    return 0;
}
