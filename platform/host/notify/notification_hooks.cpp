// Choosing and running the hooks of notifications.

#include "notification_hooks.h"

#include <syslog.h>

#include <chrono>
#include <cstring>
#include <new>

#include "programs/program_folder.h"
#include "system_log.h"

namespace {

constexpr const char *kFolder = "/usr/zelo/etc/notify.d";
constexpr std::chrono::seconds kLimit(10);

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

}  // namespace

void host::RunHooks(const Notification &notification) {
    try {
        int status = 0;
        RunProgramFolder(
            kFolder, {"notification hook", notification.strTag, Environment(notification), kLimit},
            status)
            .Log();
    } catch (const std::bad_alloc &) {
        system_log::Write(LOG_ERR, ZELO_SOURCE_STEM, __LINE__,
                          "out of memory: not all notification hooks were run");
    }
}
