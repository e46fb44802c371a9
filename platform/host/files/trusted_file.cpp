// Opening files: links are followed one by one, so that each folder on the way is looked at.

#include "trusted_file.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstring>

#include "own_file.h"
#include "shared_folder.h"

namespace host {
namespace {

// As many as the kernel follows.
constexpr int kMaxLinks = 40;

constexpr std::size_t kMaxContent = std::size_t{64} * 1024 * 1024;

Status CannotOpen(const std::string &strPath, int error) {
    return HOST_ERROR(YLIBC_ERR_FILE, "cannot open '" + strPath + "': " + std::strerror(error));
}

Status FollowLink(FoundFile &found) {
    std::array<char, PATH_MAX> target;
    const ssize_t cb = readlink(found.strPath.c_str(), target.data(), target.size());
    if (cb <= 0) {
        return CannotOpen(found.strPath, errno);
    }
    const std::string strTarget(target.data(), static_cast<std::size_t>(cb));
    found.strPath = strTarget.front() == '/' ? strTarget : FolderOf(found.strPath) + strTarget;
    return {};
}

// One step towards the file: opens what stands at the path, follows it when it is a link, or takes
// the name back. Sets blDone when there is no other step.
Status TakeStep(FoundFile &found, bool &blDone) {
    const char *const szPath = found.strPath.c_str();
    found.file = Descriptor(open(szPath, O_RDONLY | own_file::kFlags));
    found.blThere = found.file.IsOpen();
    const int error = errno;
    blDone = true;
    if (!found.blThere && error == ENOENT) {
        return {};
    }
    if ((found.blThere ? fstat(found.file.Get(), &found.status) : lstat(szPath, &found.status)) !=
        0) {
        blDone = errno != ENOENT;  // gone meanwhile
        return blDone ? CannotOpen(found.strPath, errno) : Status();
    }
    if (found.blThere && own_file::IsOwn(found.status)) {
        return {};
    }
    bool blShared = false;
    HOST_TRY(ReadShared(FolderOf(found.strPath), blShared));
    blDone = false;
    if (blShared && IsForeignToRoot(found.strPath, found.status)) {
        RemoveForeign(found.strPath);
        return {};
    }
    if (blShared && IsRefused(found.status, found.blThere ? 0 : error)) {
        return Refusal(found.strPath, found.status);
    }
    if (!found.blThere) {
        return error == ELOOP ? FollowLink(found) : CannotOpen(found.strPath, error);
    }
    blDone = true;
    return S_ISREG(found.status.st_mode)
               ? Status()
               : HOST_ERROR(YLIBC_ERR_FILE, '\'' + found.strPath + "' is no file");
}

}  // namespace

Status FindFile(const char *szPath, FoundFile &found) {
    found.strPath = szPath;
    bool blDone = false;
    for (int steps = 0; steps <= kMaxLinks && !blDone; ++steps) {
        HOST_TRY(TakeStep(found, blDone));
    }
    return blDone ? Status() : CannotOpen(szPath, ELOOP);
}

Status ReadContent(const FoundFile &found, std::string &strContent) {
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
            return HOST_ERROR(YLIBC_ERR_FILE,
                              "cannot read '" + found.strPath + "': " + std::strerror(errno));
        }
        cb += static_cast<std::size_t>(cbRead);
        if (cbRead == 0 || (cb == cbExpected && cb < strContent.size())) {
            strContent.resize(cb);
            return {};
        }
    }
    return HOST_ERROR(YLIBC_ERR_FILE, '\'' + found.strPath + "' is larger than 64 MiB");
}

}  // namespace host
