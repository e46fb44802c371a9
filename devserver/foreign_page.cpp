#include "foreign_page.h"

#include <httplib.h>

#include <regex>

namespace devserver {
namespace {

// localhost, 127.0.0.0/8 or [::1], with any port.
constexpr const char *kLoopback = R"((localhost|127(\.[0-9]{1,3}){3}|\[::1\])(:[0-9]{0,5})?)";

}  // namespace

std::string WhyForeign(const httplib::Request &request) {
    static const std::regex host(kLoopback, std::regex::icase);
    static const std::regex origin(std::string("https?://") + kLoopback, std::regex::icase);
    for (const auto &[szName, expected] : {std::pair{"Host", host}, std::pair{"Origin", origin}}) {
        const auto [begin, end] = request.headers.equal_range(szName);
        for (auto header = begin; header != end; ++header) {
            if (!std::regex_match(header->second, expected)) {
                return std::string("the ") + szName + " '" + header->second +
                       "' is not this machine: ask for localhost, 127.0.0.1 or [::1]";
            }
        }
    }
    return {};
}

}  // namespace devserver
