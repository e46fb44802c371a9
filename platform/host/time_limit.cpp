#include "time_limit.h"

#include <charconv>
#include <string>
#include <system_error>

#include "key_value_lookup.h"
#include "last_error.h"

namespace {

// A key that is not there is no failure of the caller's operation.
bool FindSetting(const char *szKey, std::string &strValue) {
    const unsigned int code = YLIBCErrGet();
    const char *const szErrorFile = YLIBCErrorGetFile();
    const int line = YLIBCErrorGetLine();
    const bool blFound =
        host::LookUpKey(host::kConfigFile, szKey, strValue) == host::LookUp::kFound;
    YLIBCErrSetEx(code, szErrorFile, line);
    return blFound;
}

}  // namespace

std::chrono::seconds host::TimeLimit(const char *szKey, std::chrono::seconds standard) {
    std::string strLimit;
    if (!FindSetting(szKey, strLimit)) {
        return standard;
    }
    int limit_s = 0;
    const char *const szEnd = strLimit.data() + strLimit.size();
    const std::from_chars_result read = std::from_chars(strLimit.data(), szEnd, limit_s);
    const bool blValid = read.ec == std::errc() && read.ptr == szEnd && limit_s > 0;
    return blValid ? std::chrono::seconds(limit_s) : standard;
}
