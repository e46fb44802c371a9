// Strings files for the rooms of the host platform.

#ifndef ZELO_HOST_STRINGS_LOOKUP_H
#define ZELO_HOST_STRINGS_LOOKUP_H

#include <string>
#include <string_view>

#include "status.h"

namespace host {

// Reads a value whole, as YLIBCFileGetSectionValue (strings_file.h) does.
Status ReadSectionValue(const std::string &strPath, std::string_view section, std::string_view key,
                        std::string &strValue);

}  // namespace host

#endif
