// Key-value look-up for the host platform's own settings.

#ifndef ZELO_HOST_KEY_VALUE_LOOKUP_H
#define ZELO_HOST_KEY_VALUE_LOOKUP_H

#include <string>

namespace host {

// The host platform's own settings stand beside the appliance's.
constexpr const char *kConfigFile = "/etc/zeloinfo.conf";

enum class LookUp { kFound, kAbsent, kUnreadable };

// Looks the key up in the file; strValue is set, whole, when it is found. Only a file that cannot
// be read sets the last error: a setting that is absent has its default.
LookUp LookUpKey(const char *szPath, const char *szKey, std::string &strValue);

// Looks up a setting of the host platform's that has a default. False where that serves: a file
// that cannot be read is no failure of the caller's operation, and the last error stays as it was.
bool LookUpSetting(const char *szKey, std::string &strValue);

}  // namespace host

#endif
