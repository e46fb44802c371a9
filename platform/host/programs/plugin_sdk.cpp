// Plug-in SDK: a plug-in is a folder of programs, run one after the other.

#include "plugin_sdk.h"

#include <algorithm>
#include <chrono>
#include <map>
#include <new>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "files/time_limit.h"
#include "program_folder.h"
#include "status.h"

struct YLIBPLUGIN {
    std::string strFolder;
    std::string strPrefix;  // of the arguments' names in the environment
    std::map<std::string, std::string> arguments;
};

namespace {

constexpr const char *kFile = "plugin_sdk";
constexpr const char *kRoot = "/usr/zelo/etc/plugins/";

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

// --- Running ------------------------------------------------------------------------------------

std::vector<std::string> EnvironmentOf(const YLIBPLUGIN &plugin) {
    std::vector<std::string> environment;
    for (const auto &[strName, strValue] : plugin.arguments) {
        std::string &strVariable = environment.emplace_back(plugin.strPrefix);
        strVariable.append(strName).append("=").append(strValue);
    }
    return environment;
}

int StatusOf(const host::ProgramEnd &end) {
    switch (end.kind) {
        case host::ProgramEnd::Kind::kExited:
            return end.value;
        case host::ProgramEnd::Kind::kSignalled:
            return kSignalledBase + end.value;
        case host::ProgramEnd::Kind::kTimedOut:
            return kTimedOutStatus;
        default:
            return kNotRunStatus;
    }
}

// The first failure is the result.
int RunAll(const YLIBPLUGIN &plugin, const char *szAction) {
    host::ProgramEnd first;
    if (!host::RunProgramFolder(plugin.strFolder,
                                {"plug-in program", szAction, EnvironmentOf(plugin),
                                 host::TimeLimit(kLimitKey, kDefaultLimit)},
                                first)) {
        return -1;
    }
    const int status = StatusOf(first);
    if (status != 0) {
        HOST_FAIL(host::LastErrorOf(first));
    }
    return -status;
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
        plugin.strFolder = std::string(kRoot) + szPlugin;
        plugin.strPrefix = PrefixOf(szFamily);
        if (host::CheckProgramFolder(plugin.strFolder) == host::ProgramFolder::kRefused) {
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
