// The reply of a server, as the Web API call looks at it: parsed, asked for success and error code,
// written back, and made safe for the log.

#include "input.h"
#include "json.h"
#include "log.h"

int LLVMFuzzerTestOneInput(const std::uint8_t *pData, std::size_t cb) {
    const std::string strText(fuzz::Input(pData, cb));
    Json::Value reply = "untouched";
    std::string strError;
    if (json::FromString(strText, reply, &strError)) {
        json::IsTrue(json::Member(reply, "success"));
        json::ErrorCode(reply);
        json::Text(json::Member(reply, "data"));
        std::string strWritten;
        Json::Value again;
        FUZZ_EXPECT(json::ToString(reply, strWritten));
        FUZZ_EXPECT(strWritten.find('\n') == std::string::npos);
        FUZZ_EXPECT(json::FromString(strWritten, again));
        FUZZ_EXPECT(json::ErrorCode(again) == json::ErrorCode(reply));
    } else {
        FUZZ_EXPECT(reply == "untouched");
        FUZZ_EXPECT(!strError.empty() && strError.find('\n') == std::string::npos);
    }

    constexpr std::size_t kLine = 8000;
    const std::string strSafe = qrm_log::SafeText(strText, {"secret", "\"q/\\"});
    FUZZ_EXPECT(strSafe.size() < kLine);
    FUZZ_EXPECT(strSafe.find("secret") == std::string::npos);
    for (char c : strSafe) {
        FUZZ_EXPECT(static_cast<unsigned char>(c) >= 0x20 && c != 0x7F);
    }
    return 0;
}
