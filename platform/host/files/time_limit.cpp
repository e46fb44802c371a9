#include "time_limit.h"

#include <charconv>
#include <string>
#include <system_error>

#include "key_value_lookup.h"

std::chrono::seconds host::TimeLimit(const char *szKey, std::chrono::seconds standard) {
    std::string strLimit;
    if (!LookUpSetting(szKey, strLimit)) {
        return standard;
    }
    int limit_s = 0;
    const char *const szEnd = strLimit.data() + strLimit.size();
    const std::from_chars_result read = std::from_chars(strLimit.data(), szEnd, limit_s);
    const bool blValid = read.ec == std::errc() && read.ptr == szEnd && limit_s > 0;
    return blValid ? std::chrono::seconds(limit_s) : standard;
}
