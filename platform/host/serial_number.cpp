// Serial numbers: on Linux two files of one line each stand for flash memory and for the number
// that a service technician may set.

#include "../serial_number.h"

#include <cerrno>
#include <fstream>
#include <new>
#include <string>

#include "last_error.h"
#include "text_buffer.h"

namespace {

constexpr const char *kFile = "serial_number";
constexpr const char *kFlashFile = "/etc.defaults/serial_number";
constexpr const char *kCustomFile = "/etc/custom_serial_number";

// A file that cannot be read further throws: it is not one without a number.
std::string FirstLine(std::ifstream &file) {
    file.exceptions(std::ios::badbit);
    std::string strLine;
    std::getline(file, strLine);
    const std::size_t end = strLine.find_last_not_of(" \t\r");
    return end == std::string::npos ? std::string() : strLine.substr(0, end + 1);
}

}  // namespace

int YLIBGetCustomSerialNumber(char *szSerial, int cbSerial) {
    if (szSerial == nullptr || cbSerial <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        errno = 0;
        std::ifstream file(kCustomFile);
        if (!file && errno != ENOENT) {
            return HOST_FAIL(YLIBC_ERR_FILE);
        }
        return host::CopyText(file ? FirstLine(file) : std::string(), szSerial, cbSerial);
    } catch (const std::ios_base::failure &) {
        return HOST_FAIL(YLIBC_ERR_FILE);
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
        const std::string strSerial = file ? FirstLine(file) : std::string();
        if (strSerial.empty()) {
            return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
        }
        return host::CopyText(strSerial, szSerial, cbSerial);
    } catch (const std::ios_base::failure &) {
        return HOST_FAIL(YLIBC_ERR_FILE);
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
