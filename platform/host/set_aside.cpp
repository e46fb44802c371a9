#include "set_aside.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <ctime>
#include <filesystem>
#include <system_error>

#include "file_descriptor.h"

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

// Two damages within a second get different names.
std::string FreeName(const std::string &strPath) {
    const std::string strFirst = strPath + kMark + TimeText();
    std::string strName = strFirst;
    for (int i = 2; IsThere(strName); ++i) {
        strName = strFirst + '.' + std::to_string(i);
    }
    return strName;
}

bool IsCompanion(const std::string &strName) {
    return std::any_of(kCompanions.begin(), kCompanions.end(), [&strName](const char *szSuffix) {
        const std::string strSuffix = szSuffix;
        return strName.size() >= strSuffix.size() &&
               strName.compare(strName.size() - strSuffix.size(), strSuffix.size(), strSuffix) == 0;
    });
}

bool SyncFolder(const std::string &strFolder) {
    const FileDescriptor folder(open(strFolder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return folder.Get() >= 0 && fsync(folder.Get()) == 0;
}

}  // namespace

bool SetAside(const std::string &strPath, std::string &strAside) {
    const std::string strName = FreeName(strPath);
    for (const char *szCompanion : kCompanions) {
        if (std::rename((strPath + szCompanion).c_str(), (strName + szCompanion).c_str()) != 0 &&
            errno != ENOENT) {
            return false;
        }
    }
    if (std::rename(strPath.c_str(), strName.c_str()) != 0) {
        return false;
    }
    strAside = strName;
    return SyncFolder(fs::path(strPath).parent_path());
}

std::vector<std::string> ListSetAside(const std::string &strPath) {
    const std::string strBegin = fs::path(strPath).filename().string() + kMark;
    std::vector<std::string> paths;
    std::error_code error;
    for (fs::directory_iterator entry(fs::path(strPath).parent_path(), error);
         !error && entry != fs::directory_iterator(); entry.increment(error)) {
        const std::string strName = entry->path().filename().string();
        if (strName.compare(0, strBegin.size(), strBegin) == 0 && !IsCompanion(strName)) {
            paths.push_back(entry->path().string());
        }
    }
    std::sort(paths.begin(), paths.end());
    return paths;
}

}  // namespace host
