#include "connect_failed_marker.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <optional>

#include "file_system.h"
#include "locked_file.h"
#include "process.h"

namespace {

constexpr const char *kMarker = "/tmp/qrmclientconnectfailed";
constexpr const char *kMarkerFolder = "/tmp";
constexpr const char *kTouch = "/bin/touch";
constexpr mode_t kMode = 0600;  // nobody else can open it and take its lock
constexpr long kNotifyInterval_s = 7200;

// As long as a touch may take that another process has begun.
constexpr std::chrono::seconds kTouchWait{1};

// Whether nobody else can have put it there. A type or a number of names that the platform leaves
// at 0 is taken as right.
bool IsMarkerOurs(const struct stat &status) {
    const mode_t type = status.st_mode & S_IFMT;
    return (type == 0 || type == S_IFREG) && status.st_nlink <= 1 &&
           (status.st_uid == 0 || status.st_uid == geteuid());
}

// A folder in the marker's place goes; one that others keep something in is moved aside.
void RemoveFolder() {
    char szAside[] = "/tmp/qrmclientconnectfailed.XXXXXX";
    if (rmdir(kMarker) != 0 && (errno == ENOTEMPTY || errno == EEXIST) &&
        mkdtemp(szAside) != nullptr && std::rename(kMarker, szAside) != 0) {
        rmdir(szAside);
    }
}

// Whether others can neither rename nor remove what is the caller's in the marker's folder.
bool IsFolderSafe() {
    struct stat status = {};
    return stat(kMarkerFolder, &status) == 0 &&
           (status.st_uid == 0 || status.st_uid == geteuid()) &&
           ((status.st_mode & (S_IWGRP | S_IWOTH)) == 0 || (status.st_mode & S_ISVTX) != 0);
}

}  // namespace

bool connect_failed_marker::IsRecent() {
    struct stat status = {};
    return YLIBCFileStat(kMarker, 1, &status) == 0 && IsMarkerOurs(status) &&
           std::labs(static_cast<long>(std::time(nullptr) - status.st_mtime)) <= kNotifyInterval_s;
}

// "/tmp" is everybody's, and touch follows links. So it is only run on a file of our own that
// nobody else can take from its name: neither others, whom the sticky bit stops, nor our own
// processes, which remove the marker under its lock.
void connect_failed_marker::Touch() {
    RemoveFolder();
    std::optional<LockedFile> marker(std::in_place, kMarker, kMode, kTouchWait);
    if (!marker->IsHeld() && unlink(kMarker) == 0) {
        // Who holds the lock for longer than a touch takes is no process of ours.
        marker.emplace(kMarker, kMode, kTouchWait);
    }
    if (marker->IsHeld() && IsFolderSafe()) {
        static_cast<void>(YLIBCExec(kTouch, kMarker, nullptr, nullptr, nullptr));
    } else if (marker->IsHeld()) {
        static_cast<void>(futimens(marker->Get(), nullptr));
    }
}

// Waits for another process's touch of the same file: a name that is free too soon may become a
// link.
void connect_failed_marker::Remove() {
    const LockedFile marker(kMarker, std::nullopt, kTouchWait);
    unlink(kMarker);
}
