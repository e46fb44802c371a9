// Plug-in SDK: a plug-in is a folder of programs, run one after the other.

#include "../plugin_sdk.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <map>
#include <new>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "last_error.h"
#include "printable.h"
#include "program.h"
#include "time_limit.h"

struct YLIBPLUGIN {
    std::string strFolder;
    std::string strPrefix;  // of the arguments' names in the environment
    std::map<std::string, std::string> arguments;
};

namespace {

constexpr const char *kFile = "plugin_sdk";
constexpr std::string_view kRoot = "/usr/zelo/etc/plugins";

constexpr const char *kLimitKey = "plugin_timeout";
constexpr std::chrono::seconds kDefaultLimit(60);

// What a program's end counts as when it has no status of its own: the numbers that shells use.
constexpr int kTimedOutStatus = 124;
constexpr int kNotRunStatus = 126;
constexpr int kSignalledBase = 128;

// The operations have C linkage: short memory becomes a failure here.
template <typename Body>
int NoThrow(Body &&body) {
    try {
        return std::forward<Body>(body)();
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

// --- Names --------------------------------------------------------------------------------------

bool IsLower(char c) {
    return c >= 'a' && c <= 'z';
}

bool IsWord(std::string_view text) {
    return !text.empty() && std::all_of(text.begin(), text.end(), [](char c) {
        return IsLower(c) || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_';
    });
}

bool IsFamily(std::string_view text) {
    return IsWord(text) && IsLower(text.front()) &&
           std::none_of(text.begin(), text.end(), [](char c) { return c >= 'A' && c <= 'Z'; });
}

bool IsPluginName(std::string_view text) {
    while (true) {
        const std::size_t slash = text.find('/');
        const std::string_view part = text.substr(0, slash);
        if (part.empty() || part == "." || part == "..") {
            return false;
        }
        if (slash == std::string_view::npos) {
            return true;
        }
        text.remove_prefix(slash + 1);
    }
}

std::string PrefixOf(std::string strFamily) {
    std::transform(strFamily.begin(), strFamily.end(), strFamily.begin(),
                   [](char c) { return IsLower(c) ? static_cast<char>(c - 'a' + 'A') : c; });
    return strFamily + '_';
}

// --- Files --------------------------------------------------------------------------------------

bool OthersCanChange(const struct stat &status) {
    return (status.st_uid != 0 && status.st_uid != geteuid()) ||
           (status.st_mode & (S_IWGRP | S_IWOTH)) != 0;
}

enum class Folder { kUsable, kMissing, kUnusable };  // kUnusable sets the last error

// Looks at every folder from the root of all plug-ins down: whoever can write to one of them can
// put a program of root's own, from elsewhere, into the plug-in.
Folder CheckFolder(const std::string &strFolder) {
    std::size_t end = kRoot.size();
    while (true) {
        const std::string strPart = strFolder.substr(0, end);
        struct stat status = {};
        if (lstat(strPart.c_str(), &status) != 0) {
            if (errno == ENOENT) {
                return Folder::kMissing;
            }
            const char *const szReason = std::strerror(errno);
            syslog(LOG_ERR, "%s:%d cannot look at the plug-in folder '%s': %s", kFile, __LINE__,
                   printable::Line(strPart).c_str(), szReason);
            HOST_FAIL(YLIBC_ERR_FILE);
            return Folder::kUnusable;
        }
        if (!S_ISDIR(status.st_mode) || OthersCanChange(status)) {
            syslog(LOG_ERR,
                   "%s:%d the plug-in folder '%s' is no folder or can be changed by others than "
                   "root: nothing in it is run",
                   kFile, __LINE__, printable::Line(strPart).c_str());
            HOST_FAIL(YLIBC_ERR_UNSAFE_FILE);
            return Folder::kUnusable;
        }
        if (end == std::string::npos) {
            return Folder::kUsable;
        }
        end = strFolder.find('/', end + 1);
    }
}

// Why the file is no program of a plug-in; null when it is one.
const char *WhyNoProgram(const char *szPath) {
    struct stat status = {};
    if (lstat(szPath, &status) != 0) {
        return std::strerror(errno);
    }
    if (!S_ISREG(status.st_mode)) {
        return "it is no regular file";
    }
    if (OthersCanChange(status)) {
        return "it can be changed by others than root";
    }
    return faccessat(AT_FDCWD, szPath, X_OK, AT_EACCESS) == 0 ? nullptr : "it is not executable";
}

// The paths of the programs in the order of their names. False, with the last error set, when the
// folder cannot be read.
bool ListPrograms(const std::string &strFolder, std::vector<std::string> &programs) {
    std::error_code error;
    std::filesystem::directory_iterator entry(strFolder, error);
    for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
        std::string strPath = entry->path().string();
        if (entry->path().filename().string().front() == '.') {
            continue;
        }
        if (const char *const szReason = WhyNoProgram(strPath.c_str()); szReason != nullptr) {
            syslog(LOG_WARNING, "%s:%d '%s' is passed over: %s", kFile, __LINE__,
                   printable::Line(strPath).c_str(), szReason);
            continue;
        }
        programs.push_back(std::move(strPath));
    }
    if (error) {
        syslog(LOG_ERR, "%s:%d cannot read the plug-in folder '%s': %s", kFile, __LINE__,
               printable::Line(strFolder).c_str(), std::strerror(error.value()));
        HOST_FAIL(YLIBC_ERR_FILE);
        return false;
    }
    std::sort(programs.begin(), programs.end());
    return true;
}

// --- Running ------------------------------------------------------------------------------------

std::vector<std::string> EnvironmentOf(const YLIBPLUGIN &plugin) {
    std::vector<std::string> environment;
    for (const auto &[strName, strValue] : plugin.arguments) {
        std::string &strVariable = environment.emplace_back(plugin.strPrefix);
        strVariable.append(strName).append("=").append(strValue);
    }
    return environment;
}

// A program's end, as a status and as the error that it is.
struct Outcome {
    int status;
    unsigned int code;
};

Outcome Judge(const host::ProgramEnd &end) {
    switch (end.kind) {
        case host::ProgramEnd::Kind::kExited:
            return {end.value, YLIBC_ERR_EXEC_STATUS};
        case host::ProgramEnd::Kind::kSignalled:
            return {kSignalledBase + end.value, YLIBC_ERR_EXEC_STATUS};
        case host::ProgramEnd::Kind::kTimedOut:
            return {kTimedOutStatus, YLIBC_ERR_EXEC_TIME};
        default:
            return {kNotRunStatus, YLIBC_ERR_EXEC};
    }
}

void LogFailure(const std::string &strProgram, const char *szAction, const host::ProgramEnd &end,
                std::chrono::seconds limit) {
    const std::string strShown = printable::Line(strProgram);
    const char *const szProgram = strShown.c_str();
    switch (end.kind) {
        case host::ProgramEnd::Kind::kTimedOut:
            syslog(LOG_ERR, "%s:%d plug-in program '%s' was ended: '%s' took longer than %ld s",
                   kFile, __LINE__, szProgram, szAction, static_cast<long>(limit.count()));
            break;
        case host::ProgramEnd::Kind::kNotRun:
            syslog(LOG_ERR, "%s:%d plug-in program '%s' could not be run for '%s': %s", kFile,
                   __LINE__, szProgram, szAction,
                   end.value == 0 ? "its end is not known" : std::strerror(end.value));
            break;
        default:
            syslog(LOG_ERR, "%s:%d plug-in program '%s' failed at '%s' with status %d", kFile,
                   __LINE__, szProgram, szAction, Judge(end).status);
    }
}

// All programs run, whatever the ones before have done. The first failure is the result.
int RunAll(const YLIBPLUGIN &plugin, const char *szAction) {
    std::vector<std::string> programs;
    if (const Folder folder = CheckFolder(plugin.strFolder); folder != Folder::kUsable) {
        return folder == Folder::kMissing ? 0 : -1;
    }
    if (!ListPrograms(plugin.strFolder, programs)) {
        return -1;
    }
    const std::vector<std::string> environment = EnvironmentOf(plugin);
    const std::chrono::seconds limit = host::TimeLimit(kLimitKey, kDefaultLimit);
    Outcome first = {0, YLIBC_ERR_NONE};
    for (const std::string &strProgram : programs) {
        const host::ProgramEnd end = host::RunProgram({strProgram, szAction}, environment, limit);
        const Outcome outcome = Judge(end);
        if (outcome.status == 0) {
            continue;
        }
        LogFailure(strProgram, szAction, end, limit);
        if (first.status == 0) {
            first = outcome;
        }
    }
    if (first.status != 0) {
        HOST_FAIL(first.code);
    }
    return -first.status;
}

}  // namespace

int YLIBPluginSDKInit(const char *szFamily, const char *szPlugin, YLIBPLUGIN **ppHandle) {
    if (ppHandle == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    *ppHandle = nullptr;
    if (szFamily == nullptr || szPlugin == nullptr || !IsFamily(szFamily) ||
        !IsPluginName(szPlugin)) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        YLIBPLUGIN plugin;
        plugin.strFolder = std::string(kRoot) + '/' + szPlugin;
        plugin.strPrefix = PrefixOf(szFamily);
        if (CheckFolder(plugin.strFolder) == Folder::kUnusable) {
            return -1;
        }
        *ppHandle = new YLIBPLUGIN(std::move(plugin));
        return 0;
    });
}

int YLIBPluginHasInit(const YLIBPLUGIN *pHandle) {
    return pHandle != nullptr ? 1 : 0;
}

int YLIBPluginSetArgByInt(YLIBPLUGIN *pHandle, const char *szName, int value) {
    return NoThrow(
        [&] { return YLIBPluginSetArg(pHandle, szName, std::to_string(value).c_str()); });
}

int YLIBPluginSetArg(YLIBPLUGIN *pHandle, const char *szName, const char *szValue) {
    if (pHandle == nullptr || szName == nullptr || !IsWord(szName) || szValue == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        pHandle->arguments.insert_or_assign(szName, std::string(szValue));
        return 0;
    });
}

int YLIBPluginAction(_tag_sdk_plugin_action_ action, YLIBPLUGIN *pHandle) {
    if (pHandle == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    switch (action) {
        case SDK_PLUGIN_ACTION_PRE:
            return NoThrow([&] { return RunAll(*pHandle, "pre"); });
        case SDK_PLUGIN_ACTION_POST:
            return NoThrow([&] { return RunAll(*pHandle, "post"); });
        default:
            return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
}

int YLIBPluginExit(YLIBPLUGIN *pHandle) {
    delete pHandle;
    return 0;
}
