#include "json_text.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <string>

#include "descriptor.h"

namespace json_text {
namespace {

constexpr off_t kMaxFile = off_t{64} * 1024 * 1024;

}  // namespace

bool FromFile(const char *szPath, Json::Value &value, struct stat *pStatus) {
    // A pipe that somebody put there must not make the caller wait.
    const Descriptor file(open(szPath, O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    struct stat status = {};
    if (file.Get() < 0 || fstat(file.Get(), &status) != 0) {
        return false;
    }
    if (pStatus != nullptr) {
        *pStatus = status;
    }
    if (!S_ISREG(status.st_mode) || status.st_size > kMaxFile) {
        return false;
    }
    std::string strText(static_cast<std::size_t>(status.st_size), '\0');
    std::size_t cbRead = 0;
    while (cbRead < strText.size()) {
        const ssize_t cb = read(file.Get(), &strText[cbRead], strText.size() - cbRead);
        if (cb < 0 && errno == EINTR) {
            continue;
        }
        if (cb <= 0) {
            return false;
        }
        cbRead += static_cast<std::size_t>(cb);
    }
    return FromString(strText, value);
}

bool ToFile(const Json::Value &value, int fd) {
    std::string strText;
    if (!ToString(value, strText)) {
        return false;
    }
    strText += '\n';
    if (ftruncate(fd, 0) != 0) {
        return false;
    }
    std::size_t cbWritten = 0;
    while (cbWritten < strText.size()) {
        const ssize_t cb = pwrite(fd, &strText[cbWritten], strText.size() - cbWritten,
                                  static_cast<off_t>(cbWritten));
        if (cb < 0 && errno == EINTR) {
            continue;
        }
        if (cb <= 0) {
            return false;
        }
        cbWritten += static_cast<std::size_t>(cb);
    }
    return fsync(fd) == 0;
}

}  // namespace json_text
