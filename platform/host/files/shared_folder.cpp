#include "shared_folder.h"

#include <fcntl.h>
#include <pwd.h>
#include <sys/random.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <memory>

#include "own_file.h"

namespace host {
namespace {

// Not by the name service, which may ask other machines.
std::string UserName(uid_t uid) {
    const std::unique_ptr<std::FILE, int (*)(std::FILE *)> pFile(std::fopen("/etc/passwd", "re"),
                                                                 std::fclose);
    std::array<char, 4096> texts;
    struct passwd entry = {};
    struct passwd *pEntry = nullptr;
    while (pFile != nullptr &&
           fgetpwent_r(pFile.get(), &entry, texts.data(), texts.size(), &pEntry) == 0) {
        if (entry.pw_uid == uid) {
            return entry.pw_name;
        }
    }
    return "";
}

}  // namespace

std::string FolderOf(const std::string &strPath) {
    return strPath.substr(0, strPath.rfind('/') + 1);  // npos + 1 is 0
}

Status ReadShared(const std::string &strFolder, bool &blShared) {
    struct stat status = {};
    if (stat(strFolder.empty() ? "." : strFolder.c_str(), &status) != 0) {
        return HOST_ERROR(YLIBC_ERR_FILE,
                          "cannot look at the folder '" + strFolder + "': " + std::strerror(errno));
    }
    blShared = (status.st_mode & S_IWOTH) != 0;
    return {};
}

bool IsForeignToRoot(const std::string &strPath, const struct stat &there) {
    bool blShared = false;
    return there.st_uid != 0 && geteuid() == 0 &&
           !ReadShared(FolderOf(strPath), blShared).Failed() && blShared;
}

// A folder may hold things, so the name is freed first. Another program of root's may have been
// quicker: its file gets the name back, also from whoever has taken it since.
void RemoveForeign(const std::string &strPath) {
    const std::string strAway = UnusedName(strPath);
    const auto giveBack = [&](unsigned int flags) {
        return renameat2(AT_FDCWD, strAway.c_str(), AT_FDCWD, strPath.c_str(), flags) == 0;
    };
    struct stat moved = {};
    if (strAway.empty() || rename(strPath.c_str(), strAway.c_str()) != 0 ||
        lstat(strAway.c_str(), &moved) != 0) {
        return;
    }
    struct stat there = {};
    if (moved.st_uid == 0 && giveBack(RENAME_NOREPLACE)) {
        return;
    }
    if (moved.st_uid == 0 && lstat(strPath.c_str(), &there) == 0 && there.st_uid != 0) {
        static_cast<void>(giveBack(RENAME_EXCHANGE));
    }
    RemoveAny(strAway);
}

void RemoveAny(const std::string &strPath) {
    if (unlink(strPath.c_str()) != 0) {
        static_cast<void>(rmdir(strPath.c_str()));
    }
}

bool IsRefused(const struct stat &there, int error) {
    return !own_file::IsOwn(there) || (error == EACCES && there.st_uid != geteuid());
}

Status Refusal(const std::string &strPath, const struct stat &there) {
    const std::string strFile = '\'' + strPath + "' ";
    if (there.st_uid != geteuid()) {
        const std::string strName = UserName(there.st_uid);
        return HOST_ERROR(YLIBC_ERR_UNSAFE_FILE, strFile + "belongs to the user " +
                                                     std::to_string(there.st_uid) +
                                                     (strName.empty() ? "" : " (" + strName + ')'));
    }
    return HOST_ERROR(YLIBC_ERR_UNSAFE_FILE, strFile + (S_ISLNK(there.st_mode)    ? "is a link"
                                                        : !S_ISREG(there.st_mode) ? "is no file"
                                                                                  : "has a second "
                                                                                    "name"));
}

std::string UnusedName(const std::string &strPath) {
    std::uint64_t number = 0;
    if (getrandom(&number, sizeof(number), 0) != sizeof(number)) {
        return "";
    }
    std::array<char, 24> suffix;
    std::snprintf(suffix.data(), suffix.size(), ".%016llx",
                  static_cast<unsigned long long>(number));
    return strPath + suffix.data();
}

}  // namespace host
