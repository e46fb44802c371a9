#include "qrm_client_description.h"

#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "appliance.h"
#include "fixed_text.h"
#include "key_value_file.h"
#include "serial_number.h"

namespace client_description {
namespace {

// The platform gives a custom serial number fewer bytes than its own.
constexpr int kCustomSerialSize = 31;
constexpr int kSerialSize = 36;

using FactText = FixedText<1024>;
using VersionText = FixedText<16>;

template <std::size_t N>
bool ReadKey(const char *szPath, const char *szKey, FixedText<N> &value) {
    return YLIBCFileGetKeyValue(szPath, szKey, value.Buffer(), FixedText<N>::Size(), 0) > 0;
}

bool ReadPort(const char *szKey, long &port) {
    FactText value;
    if (!ReadKey(appliance::kConfigFile, szKey, value)) {
        return false;
    }
    port = std::strtol(value.sz(), nullptr, 10);
    return true;
}

}  // namespace

bool ReadHostName(std::string &strHostName) {
    FactText name;
    if (gethostname(name.Buffer(), FactText::Size()) < 0) {
        return false;
    }
    strHostName = name.sz();
    return !strHostName.empty();
}

bool ReadModel(std::string &strModel) {
    FactText model;
    if (!ReadKey(appliance::kDefaultsFile, "upnpmodelname", model)) {
        return false;
    }
    strModel = model.sz();
    return true;
}

bool ReadVersion(Json::Value &description) {
    VersionText major;
    VersionText minor;
    VersionText smallFix;
    VersionText build;
    if (!ReadKey(appliance::kVersionFile, "majorversion", major) ||
        !ReadKey(appliance::kVersionFile, "minorversion", minor)) {
        return false;
    }
    if (!ReadKey(appliance::kVersionFile, "smallfixnumber", smallFix)) {
        smallFix.Format("0");
    }
    if (!ReadKey(appliance::kVersionFile, "buildnumber", build)) {
        return false;
    }

    FactText version;
    if (std::strcmp(smallFix.sz(), "0") == 0) {
        version.Format("NVO %s.%s-%s", major.sz(), minor.sz(), build.sz());
    } else {
        version.Format("NVO %s.%s-%s Update %s", major.sz(), minor.sz(), build.sz(), smallFix.sz());
    }
    description["build_number"] = static_cast<Json::Int64>(std::strtol(build.sz(), nullptr, 10));
    description["nvo_version"] = version.sz();
    return true;
}

bool ReadAdminPort(long &port) {
    return ReadPort("admin_port", port);
}

bool ReadSecureAdminPort(long &port) {
    return ReadPort("secure_admin_port", port);
}

bool IsHttpsServed() {
    return YLIBCFileCheckKeyValue(appliance::kConfigFile, "runHTTPS", "yes", 0) == 1;
}

bool ReadSerialNumber(std::string &strSerial) {
    // One byte more than the platform is told, so that a text of the full size still ends.
    FixedText<kSerialSize + 1> serial;
    bool blRead = true;
    if (YLIBGetCustomSerialNumber(serial.Buffer(), kCustomSerialSize) < 0 || serial.Empty()) {
        blRead = YLIBGetSerialNumber(serial.Buffer(), kSerialSize) >= 0;
    }
    strSerial = serial.sz();
    return blRead;
}

}  // namespace client_description
