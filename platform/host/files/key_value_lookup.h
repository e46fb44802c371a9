// Key-value files for the rooms of the host platform, and its own settings in one.

#ifndef ZELO_HOST_KEY_VALUE_LOOKUP_H
#define ZELO_HOST_KEY_VALUE_LOOKUP_H

#include <optional>
#include <string>

#include "appliance.h"
#include "status.h"

namespace host {

// The host platform's own settings stand beside the appliance's.
using appliance::kConfigFile;

// Looks the key up in the file. A key that is absent is no failure: there is no value then.
Status LookUpKey(const char *szPath, const char *szKey, std::optional<std::string> &value);

// The same for a setting in a file that may be missing: there is no value then either.
Status ReadSetting(const char *szKey, std::optional<std::string> &value);

// Looks up a setting of the host platform's that has a default. False where that serves: a file
// that cannot be read is no failure of the caller's operation.
bool LookUpSetting(const char *szKey, std::string &strValue);

// What YLIBCINFOSetKeyValue (key_value_file.h) does.
Status SetSetting(const char *szKey, const char *szValue);

}  // namespace host

#endif
