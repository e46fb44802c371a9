// Opening files: links are followed one by one, so that each folder on the way is looked at.

#include "trusted_file.h"

#include <fcntl.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>

#include "foreign_file.h"
#include "status.h"

namespace host {
namespace {

constexpr const char *kFile = "trusted_file";

// As many as the kernel follows.
constexpr int kMaxLinks = 40;

constexpr std::size_t kMaxContent = std::size_t{64} * 1024 * 1024;

void SetPath(FoundFile &found, const std::string &strPath) {
    const std::size_t cbFolder = strPath.rfind('/') + 1;  // npos + 1 is 0
    found.strFolder = strPath.substr(0, cbFolder);
    found.strName = strPath.substr(cbFolder);
}

Find Failed(unsigned int code, int line) {
    Fail(code, kFile, line);
    return Find::kFailed;
}

Find LookAtOpened(FoundFile &found) {
    if (fstat(found.file.Get(), &found.status) != 0) {
        return Failed(YLIBC_ERR_FILE, __LINE__);
    }
    if (IsOwnFile(found.status)) {
        return Find::kFile;
    }
    bool blShared = false;
    if (!ReadShared(found.strFolder, blShared)) {
        return Find::kFailed;
    }
    if (blShared) {
        return Failed(YLIBC_ERR_UNSAFE_FILE, __LINE__);
    }
    return S_ISREG(found.status.st_mode) ? Find::kFile : Failed(YLIBC_ERR_FILE, __LINE__);
}

// Why there is a file that cannot be opened. In a shared folder the reason is whose it is.
Find FailToOpen(const FoundFile &found) {
    struct stat status = {};
    bool blShared = false;
    const bool blUnsafe = lstat(found.Path().c_str(), &status) == 0 && !IsOwnFile(status) &&
                          ReadShared(found.strFolder, blShared) && blShared;
    return Failed(blUnsafe ? YLIBC_ERR_UNSAFE_FILE : YLIBC_ERR_FILE, __LINE__);
}

bool FollowLink(FoundFile &found) {
    bool blShared = false;
    if (!ReadShared(found.strFolder, blShared)) {
        return false;
    }
    if (blShared) {
        HOST_FAIL(YLIBC_ERR_UNSAFE_FILE);
        return false;
    }
    std::array<char, PATH_MAX> target;
    const ssize_t cb = readlink(found.Path().c_str(), target.data(), target.size());
    if (cb <= 0) {
        HOST_FAIL(YLIBC_ERR_FILE);
        return false;
    }
    const std::string strTarget(target.data(), static_cast<std::size_t>(cb));
    SetPath(found, strTarget.front() == '/' ? strTarget : found.strFolder + strTarget);
    return true;
}

}  // namespace

bool IsOwnFile(const struct stat &status) {
    return S_ISREG(status.st_mode) && status.st_nlink <= 1 &&
           (status.st_uid == 0 || status.st_uid == geteuid());
}

bool ReadShared(const std::string &strFolder, bool &blShared) {
    struct stat status = {};
    if (stat(strFolder.empty() ? "." : strFolder.c_str(), &status) != 0) {
        HOST_FAIL(YLIBC_ERR_FILE);
        return false;
    }
    blShared = (status.st_mode & S_IWOTH) != 0;
    return true;
}

Find FindFile(const char *szPath, FoundFile &found) {
    SetPath(found, szPath);
    for (int links = 0; links <= kMaxLinks; ++links) {
        RemoveForeignFile(found.Path());
        found.file = Descriptor(
            open(found.Path().c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
        found.blThere = found.file.IsOpen();
        if (found.blThere) {
            return LookAtOpened(found);
        }
        if (errno == ENOENT) {
            return Find::kNoFile;
        }
        if (errno != ELOOP) {
            return FailToOpen(found);
        }
        if (!FollowLink(found)) {
            return Find::kFailed;
        }
    }
    return Failed(YLIBC_ERR_FILE, __LINE__);
}

bool ReadContent(const FoundFile &found, std::string &strContent) {
    const auto cbExpected = static_cast<std::size_t>(found.status.st_size);
    std::size_t cb = 0;
    // With a byte more than expected, the first read mostly shows that there is no more to come.
    strContent.resize(std::min(cbExpected, kMaxContent) + 1);
    while (cb <= kMaxContent) {
        if (cb == strContent.size()) {
            strContent.resize(2 * cb + 4096);
        }
        const ssize_t cbRead = read(found.file.Get(), &strContent[cb], strContent.size() - cb);
        if (cbRead < 0) {
            break;
        }
        cb += static_cast<std::size_t>(cbRead);
        if (cbRead == 0 || (cb == cbExpected && cb < strContent.size())) {
            strContent.resize(cb);
            return true;
        }
    }
    HOST_FAIL(YLIBC_ERR_FILE);
    return false;
}

}  // namespace host
