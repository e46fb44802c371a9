// Time limits that the platform's configuration may set.

#ifndef ZELO_HOST_TIME_LIMIT_H
#define ZELO_HOST_TIME_LIMIT_H

#include <chrono>

namespace host {

// The limit that the key names in "/etc/zeloinfo.conf", in whole seconds, 1 or more. One that is
// not set, or not like this, is `standard`.
std::chrono::seconds TimeLimit(const char *szKey, std::chrono::seconds standard);

}  // namespace host

#endif
