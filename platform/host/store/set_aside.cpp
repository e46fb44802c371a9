#include "set_aside.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <system_error>

#include "descriptor.h"

namespace host {
namespace {

namespace fs = std::filesystem;

constexpr const char *kMark = ".damaged-";
constexpr std::array<const char *, 3> kCompanions = {"-journal", "-wal", "-shm"};

bool IsThere(const std::string &strPath) {
    struct stat status = {};
    return lstat(strPath.c_str(), &status) == 0;
}

std::string TimeText() {
    const std::time_t now = std::time(nullptr);
    std::tm utc = {};
    gmtime_r(&now, &utc);
    std::array<char, 32> text = {};
    std::strftime(text.data(), text.size(), "%Y%m%dT%H%M%SZ", &utc);
    return text.data();
}

bool Move(const std::string &strFrom, const std::string &strTo) {
    return renameat2(AT_FDCWD, strFrom.c_str(), AT_FDCWD, strTo.c_str(), RENAME_NOREPLACE) == 0;
}

// The companions go first, so that no journal is ever at the path without its database. All or
// nothing, with errno; only where the database has gone meanwhile its companions do not come back.
bool MoveAll(const std::string &strPath, const std::string &strName) {
    constexpr std::array<const char *, 4> kAll = {"-journal", "-wal", "-shm", ""};
    std::vector<const char *> moved;
    for (const char *szSuffix : kAll) {
        // What has the name already belongs to another database, also where nothing would move.
        const bool blTaken = IsThere(strName + szSuffix);
        if (!blTaken && Move(strPath + szSuffix, strName + szSuffix)) {
            moved.push_back(szSuffix);
            continue;
        }
        const int error = blTaken ? EEXIST : errno;
        if (error == ENOENT && *szSuffix != '\0') {
            continue;
        }
        for (const char *szMoved : moved) {
            static_cast<void>(!IsThere(strPath) || Move(strName + szMoved, strPath + szMoved));
        }
        errno = error;
        return false;
    }
    return true;
}

// Whether the file is named by that of its database. What a broken-off move has left is not.
bool IsBesideItsDatabase(const std::string &strPath) {
    return std::any_of(kCompanions.begin(), kCompanions.end(), [&strPath](const char *szSuffix) {
        const std::size_t cb = std::strlen(szSuffix);
        return strPath.size() >= cb && strPath.compare(strPath.size() - cb, cb, szSuffix) == 0 &&
               IsThere(strPath.substr(0, strPath.size() - cb));
    });
}

bool SyncFolder(const std::string &strFolder) {
    const Descriptor folder(open(strFolder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return folder.Get() >= 0 && fsync(folder.Get()) == 0;
}

}  // namespace

bool SetAside(const std::string &strPath, std::string &strAside) {
    // Two damages within a second get different names.
    const std::string strFirst = strPath + kMark + TimeText();
    std::string strName = strFirst;
    for (int i = 2; !MoveAll(strPath, strName); ++i) {
        if (errno != EEXIST) {
            return false;
        }
        strName = strFirst + '.' + std::to_string(i);
    }
    strAside = strName;
    return SyncFolder(fs::path(strPath).parent_path());
}

bool ListSetAside(const std::string &strPath, std::vector<std::string> &paths) {
    const std::string strBegin = fs::path(strPath).filename().string() + kMark;
    std::error_code error;
    for (fs::directory_iterator entry(fs::path(strPath).parent_path(), error);
         !error && entry != fs::directory_iterator(); entry.increment(error)) {
        const std::string strName = entry->path().filename().string();
        if (strName.compare(0, strBegin.size(), strBegin) == 0 &&
            !IsBesideItsDatabase(entry->path().string())) {
            paths.push_back(entry->path().string());
        }
    }
    std::sort(paths.begin(), paths.end());
    return !error || error == std::errc::no_such_file_or_directory;
}

}  // namespace host
