// Serial numbers: on Linux two files of one line each stand for flash memory and for the number
// that a service technician may set.

#include "serial_number.h"

#include <cerrno>
#include <fstream>
#include <new>
#include <string>

#include "fixed_text.h"
#include "status.h"

namespace {

constexpr const char *kFile = "serial_number";
constexpr const char *kFlashFile = "/etc.defaults/serial_number";
constexpr const char *kCustomFile = "/etc/custom_serial_number";

// False when it cannot be read; a file without a line has the empty one.
bool ReadFirstLine(std::ifstream &file, std::string &strLine) {
    std::getline(file, strLine);
    strLine.erase(strLine.find_last_not_of(" \t\r") + 1);  // npos + 1 is 0
    return !file.bad();
}

}  // namespace

int YLIBGetCustomSerialNumber(char *szSerial, int cbSerial) {
    if (szSerial == nullptr || cbSerial <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        errno = 0;
        std::ifstream file(kCustomFile);
        std::string strSerial;
        if (file ? !ReadFirstLine(file, strSerial) : errno != ENOENT) {
            return HOST_FAIL(YLIBC_ERR_FILE);
        }
        return CopyToFit(szSerial, cbSerial, strSerial);
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

int YLIBGetSerialNumber(char *szSerial, int cbSerial) {
    if (szSerial == nullptr || cbSerial <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        std::ifstream file(kFlashFile);
        std::string strSerial;
        if (!file || !ReadFirstLine(file, strSerial) || strSerial.empty()) {
            return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
        }
        return CopyToFit(szSerial, cbSerial, strSerial);
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
