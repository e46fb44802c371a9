// Plug-in SDK: a plug-in is a folder of programs, run one after the other.

#include "plugin_sdk.h"

#include <algorithm>
#include <chrono>
#include <map>
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

constexpr const char *kRoot = "/usr/zelo/etc/plugins/";

constexpr const char *kLimitKey = "plugin_timeout";
constexpr std::chrono::seconds kDefaultLimit(60);

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

const char *NameOf(_tag_sdk_plugin_action_ action) {
    return action == SDK_PLUGIN_ACTION_PRE    ? "pre"
           : action == SDK_PLUGIN_ACTION_POST ? "post"
                                              : nullptr;
}

}  // namespace

int YLIBPluginSDKInit(const char *szFamily, const char *szPlugin, YLIBPLUGIN **ppHandle) {
    return HOST_OPERATION([&]() -> host::Status {
        HOST_REQUIRE(ppHandle != nullptr);
        *ppHandle = nullptr;
        HOST_REQUIRE(szFamily != nullptr && IsFamily(szFamily));
        HOST_REQUIRE(szPlugin != nullptr && IsPluginName(szPlugin));
        YLIBPLUGIN plugin = {std::string(kRoot) + szPlugin, PrefixOf(szFamily), {}};
        bool blThere = false;
        HOST_TRY(host::CheckProgramFolder(plugin.strFolder, blThere));
        *ppHandle = new YLIBPLUGIN(std::move(plugin));
        return {};
    });
}

int YLIBPluginHasInit(const YLIBPLUGIN *pHandle) {
    return pHandle != nullptr ? 1 : 0;
}

int YLIBPluginSetArgByInt(YLIBPLUGIN *pHandle, const char *szName, int value) {
    return YLIBPluginSetArg(pHandle, szName, std::to_string(value).c_str());
}

int YLIBPluginSetArg(YLIBPLUGIN *pHandle, const char *szName, const char *szValue) {
    return HOST_OPERATION([&]() -> host::Status {
        HOST_REQUIRE(pHandle != nullptr && szValue != nullptr);
        HOST_REQUIRE(szName != nullptr && IsWord(szName));
        pHandle->arguments.insert_or_assign(szName, std::string(szValue));
        return {};
    });
}

int YLIBPluginAction(_tag_sdk_plugin_action_ action, YLIBPLUGIN *pHandle) {
    int status = 1;  // of what is no program's failure
    const int result = HOST_OPERATION([&]() -> host::Status {
        HOST_REQUIRE(pHandle != nullptr);
        const char *const szAction = NameOf(action);
        HOST_REQUIRE(szAction != nullptr);
        return host::RunProgramFolder(pHandle->strFolder,
                                      {"plug-in program", szAction, EnvironmentOf(*pHandle),
                                       host::TimeLimit(kLimitKey, kDefaultLimit)},
                                      status);
    });
    return result == 0 ? 0 : -status;
}

int YLIBPluginExit(YLIBPLUGIN *pHandle) {
    delete pHandle;
    return 0;
}
