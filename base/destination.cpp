#include "destination.h"

#include <fcntl.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/vfs.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <utility>

#include "own_file.h"

namespace destination {
namespace {

constexpr int kLook = O_PATH | O_CLOEXEC;

// As many as the kernel follows.
constexpr int kMaxLinks = 40;

// Takes the first name off the path; "." when there is none left.
std::string TakeName(std::string &strPath) {
    const std::size_t begin = std::min(strPath.find_first_not_of('/'), strPath.size());
    const std::size_t end = std::min(strPath.find('/', begin), strPath.size());
    std::string strName = strPath.substr(begin, end - begin);
    strPath.erase(0, end);
    return strName.empty() ? "." : strName;
}

// Notes what the folder, and the entry that was found in it, mean for the way. False for a link
// that is not to be followed.
bool IsSafe(const struct stat &folder, const struct stat *pEntry, Place &place) {
    const bool blTrusted =
        pEntry == nullptr || pEntry->st_uid == geteuid() || pEntry->st_uid == folder.st_uid;
    place.blShared = (folder.st_mode & S_IWOTH) != 0;
    // The sticky bit keeps others from renaming and removing what is not theirs.
    place.blFixed =
        place.blFixed && (!place.blShared || (blTrusted && (folder.st_mode & S_ISVTX) != 0));
    const bool blOthersWrite = (folder.st_mode & (S_IWGRP | S_IWOTH)) != 0;
    const bool blOwnEntry = pEntry != nullptr && own_file::IsRootOrCaller(pEntry->st_uid);
    place.blOwn = place.blOwn && own_file::IsRootOrCaller(folder.st_uid) &&
                  (!blOthersWrite || (blOwnEntry && (folder.st_mode & S_ISVTX) != 0));
    return !place.blShared || blTrusted || !S_ISLNK(pEntry->st_mode);
}

// Links of /proc lead to what a process has open, and not to what their text says.
bool IsInProc(const Descriptor &folder) {
    struct statfs status = {};
    return fstatfs(folder.Get(), &status) == 0 && status.f_type == PROC_SUPER_MAGIC;
}

// Puts the link's target in front of the rest of the path.
bool TakeTarget(const Descriptor &link, Place &place, std::string &strRest) {
    std::array<char, PATH_MAX> target;
    const ssize_t cb = readlinkat(link.Get(), "", target.data(), target.size());
    if (cb <= 0) {
        return false;
    }
    strRest.insert(0, target.data(), static_cast<std::size_t>(cb));
    if (strRest.front() == '/') {
        place.folder = Descriptor(open("/", kLook | O_DIRECTORY));
    }
    return place.folder.Get() >= 0;
}

// One name on. kFound: the way ends here, or `strRest` goes on from the folder.
Result Step(std::string &strRest, bool &blEnd, int &links, Place &place) {
    place.strName = TakeName(strRest);
    const char *const szName = place.strName.c_str();
    blEnd = strRest.find_first_not_of('/') == std::string::npos;
    Descriptor entry(openat(place.folder.Get(), szName, kLook | O_NOFOLLOW));
    struct stat folder = {};
    struct stat status = {};
    const bool blThere = entry.Get() >= 0;
    if ((!blThere && !(blEnd && errno == ENOENT)) || fstat(place.folder.Get(), &folder) != 0 ||
        (blThere && fstat(entry.Get(), &status) != 0)) {
        return Result::kFailed;
    }
    if (!IsSafe(folder, blThere ? &status : nullptr, place)) {
        return Result::kForeignLink;
    }
    if (S_ISLNK(status.st_mode)) {
        if (++links > kMaxLinks) {
            errno = ELOOP;
            return Result::kFailed;
        }
        if (!IsInProc(place.folder)) {
            blEnd = false;
            return TakeTarget(entry, place, strRest) ? Result::kFound : Result::kFailed;
        }
        entry = Descriptor(openat(place.folder.Get(), szName, kLook));
        if (entry.Get() < 0) {
            return Result::kFailed;
        }
    }
    (blEnd ? place.file : place.folder) = std::move(entry);
    return Result::kFound;
}

// Creates the file where others could put something into its place before it is opened.
bool Hold(Place &place) {
    if (place.file.Get() < 0 && (place.blShared || !place.blFixed)) {
        place.file = Descriptor(openat(place.folder.Get(), place.strName.c_str(),
                                       O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0666));
        return place.file.Get() >= 0;
    }
    return true;
}

}  // namespace

Result Find(const std::string &strPath, Place &place) {
    place = {};
    if (strPath.empty()) {
        errno = ENOENT;
        return Result::kFailed;
    }
    place.folder = Descriptor(open(strPath.front() == '/' ? "/" : ".", kLook | O_DIRECTORY));
    std::string strRest = strPath;
    Result result = place.folder.Get() >= 0 ? Result::kFound : Result::kFailed;
    int links = 0;
    for (bool blEnd = false; result == Result::kFound && !blEnd;) {
        result = Step(strRest, blEnd, links, place);
    }
    return result;
}

std::string PathOf(const Descriptor &held) {
    return "/proc/self/fd/" + std::to_string(held.Get());
}

// By its path where nobody else can make that lead elsewhere, else by the descriptor: it is the
// very file that was looked at.
std::FILE *OpenToWrite(const std::string &strPath) {
    Place place;
    if (Find(strPath, place) != Result::kFound || !Hold(place)) {
        return nullptr;
    }
    const std::string strOpened = place.blFixed ? strPath : PathOf(place.file);
    std::FILE *pFile = nullptr;
    do {
        pFile = fopen64(strOpened.c_str(), "w");
    } while (pFile == nullptr && errno == EINTR);
    return pFile;
}

}  // namespace destination
