// Choosing and running the hooks of notifications.

#include "notification_hooks.h"

#include <dirent.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <memory>
#include <utility>

#include "printable.h"
#include "program.h"

namespace {

constexpr const char *kFile = "notification_hooks";
constexpr const char *kFolder = "/usr/zelo/etc/notify.d";
constexpr std::chrono::seconds kLimit(10);

struct CloseFolder {
    void operator()(DIR *pFolder) const { closedir(pFolder); }
};
using FolderHandle = std::unique_ptr<DIR, CloseFolder>;

// Whether nobody but root and the process's own user can change it.
bool IsOurs(const struct stat &status) {
    return (status.st_uid == 0 || status.st_uid == geteuid()) &&
           (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

void LogNotRun(const std::string &strPath, const char *szReason, int line) {
    syslog(LOG_WARNING, "%s:%d notification hook '%s' is not run: %s", kFile, line,
           printable::Line(strPath).c_str(), szReason);
}

// Folders, and files that nobody may execute, are no hooks.
bool IsHook(const std::string &strPath) {
    struct stat status = {};
    if (lstat(strPath.c_str(), &status) != 0 || S_ISDIR(status.st_mode)) {
        return false;
    }
    if (!S_ISREG(status.st_mode)) {
        LogNotRun(strPath, "it is no regular file", __LINE__);
        return false;
    }
    if ((status.st_mode & (S_IXUSR | S_IXGRP | S_IXOTH)) == 0) {
        return false;
    }
    if (!IsOurs(status)) {
        LogNotRun(strPath, "other users can change it", __LINE__);
        return false;
    }
    return true;
}

// The hooks' paths in their order. A folder that is not there holds none.
std::vector<std::string> ListHooks() {
    const FolderHandle pFolder(opendir(kFolder));
    if (pFolder == nullptr) {
        if (errno != ENOENT) {
            LogNotRun(kFolder, std::strerror(errno), __LINE__);
        }
        return {};
    }
    struct stat status = {};
    if (fstat(dirfd(pFolder.get()), &status) != 0 || !IsOurs(status)) {
        LogNotRun(kFolder, "other users can change the folder", __LINE__);
        return {};
    }
    std::vector<std::string> hooks;
    while (const dirent *const pEntry = readdir(pFolder.get())) {
        std::string strPath = std::string(kFolder) + '/' + pEntry->d_name;
        if (IsHook(strPath)) {
            hooks.push_back(std::move(strPath));
        }
    }
    std::sort(hooks.begin(), hooks.end());
    return hooks;
}

// "%QRM_SERVER%" as "QRM_SERVER": what is no letter, digit or underscore becomes an underscore.
std::string VariableName(const std::string &strName) {
    std::string strPlain = strName;
    if (strPlain.size() > 2 && strPlain.front() == '%' && strPlain.back() == '%') {
        strPlain = strPlain.substr(1, strPlain.size() - 2);
    }
    constexpr const char *kAllowed =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789_";
    for (char &c : strPlain) {
        c = std::strchr(kAllowed, c) != nullptr ? c : '_';
    }
    return strPlain;
}

std::vector<std::string> Environment(const host::Notification &notification) {
    std::vector<std::string> environment = {
        "ZELO_NOTIFY_TAG=" + notification.strTag,
        "ZELO_NOTIFY_TITLE=" + notification.strTitle,
        "ZELO_NOTIFY_TEXT=" + notification.strText,
    };
    for (const auto &[strName, strValue] : notification.variables) {
        environment.push_back("ZELO_NOTIFY_VAR_" + VariableName(strName) + '=' + strValue);
    }
    return environment;
}

std::string Describe(const host::ProgramEnd &end) {
    using Kind = host::ProgramEnd::Kind;
    switch (end.kind) {
        case Kind::kNotRun:
            return end.value == 0 ? "its end is not known"
                                  : std::string("it could not be run: ") + std::strerror(end.value);
        case Kind::kTimedOut:
            return "it took longer than " + std::to_string(kLimit.count()) + " s and was ended";
        case Kind::kSignalled:
            return "signal " + std::to_string(end.value) + " ended it";
        default:
            return "exit status " + std::to_string(end.value);
    }
}

}  // namespace

void host::RunHooks(const Notification &notification) {
    const std::vector<std::string> hooks = ListHooks();
    const std::vector<std::string> environment = Environment(notification);
    for (const std::string &strHook : hooks) {
        const ProgramEnd end = RunProgram({strHook, notification.strTag}, environment, kLimit);
        if (end.kind != ProgramEnd::Kind::kExited || end.value != 0) {
            syslog(LOG_WARNING, "%s:%d notification hook '%s' failed for '%s': %s", kFile, __LINE__,
                   printable::Line(strHook).c_str(), printable::Line(notification.strTag).c_str(),
                   Describe(end).c_str());
        }
    }
}
