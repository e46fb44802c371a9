// Serial numbers: on Linux two files of one line each stand for flash memory and for the number
// that a service technician may set.

#include "serial_number.h"

#include <cerrno>
#include <cstring>
#include <fstream>
#include <string>

#include "fixed_text.h"
#include "status.h"

namespace {

constexpr const char *kFlashFile = "/etc.defaults/serial_number";
constexpr const char *kCustomFile = "/etc/custom_serial_number";

// The first line; a file that is not there, or without a line, has the empty one.
host::Status ReadFirstLine(const char *szPath, std::string &strLine) {
    errno = 0;
    std::ifstream file(szPath);
    const bool blMissing = !file && errno == ENOENT;
    std::getline(file, strLine);
    if (!blMissing && (!file.is_open() || file.bad())) {
        return HOST_ERROR(YLIBC_ERR_FILE,
                          std::string("cannot read '") + szPath + "': " + std::strerror(errno));
    }
    strLine.erase(strLine.find_last_not_of(" \t\r") + 1);  // npos + 1 is 0
    return {};
}

int GetSerial(const char *szPath, bool blRequired, char *szSerial, int cbSerial) {
    int cb = 0;
    return HOST_OPERATION(-1, cb, [&]() -> host::Status {
        HOST_REQUIRE(szSerial != nullptr && cbSerial > 0);
        std::string strSerial;
        HOST_TRY(ReadFirstLine(szPath, strSerial));
        if (blRequired && strSerial.empty()) {
            return HOST_ERROR(YLIBC_ERR_NOT_FOUND,
                              std::string("there is no serial number in '") + szPath + '\'');
        }
        cb = CopyToFit(szSerial, cbSerial, strSerial);
        return {};
    });
}

}  // namespace

int YLIBGetCustomSerialNumber(char *szSerial, int cbSerial) {
    return GetSerial(kCustomFile, false, szSerial, cbSerial);
}

int YLIBGetSerialNumber(char *szSerial, int cbSerial) {
    return GetSerial(kFlashFile, true, szSerial, cbSerial);
}
