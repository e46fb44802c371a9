// Notifications: their texts in the appliance's language, and whom they are handed to.

#include "notification.h"

#include <syslog.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <new>
#include <string>
#include <string_view>
#include <vector>

#include "files/key_value_lookup.h"
#include "fixed_text.h"
#include "notification_journal.h"
#include "programs/program_folder.h"
#include "strings/strings_lookup.h"
#include "system_log.h"

namespace {

using host::Notification;

constexpr const char *kEnglish = "enu";
constexpr int kMaxText = 4096;
constexpr const char *kHooks = "/usr/zelo/etc/notify.d";
constexpr std::chrono::seconds kHookLimit(10);

// --- Texts --------------------------------------------------------------------------------------

// A language names a folder, so it is a code and nothing else.
std::string Language() {
    std::string strLanguage;
    const bool blCode = host::LookUpSetting("language", strLanguage) && strLanguage.size() == 3 &&
                        std::all_of(strLanguage.begin(), strLanguage.end(),
                                    [](char c) { return c >= 'a' && c <= 'z'; });
    return blCode ? strLanguage : kEnglish;
}

bool ReadText(const std::string &strLanguage, const std::string &strKey, std::string &strText) {
    const std::string strPath = "/usr/zelo/zeloman/webman/texts/" + strLanguage + "/strings";
    FixedText<kMaxText> fitting;
    if (host::ReadSectionValue(strPath, "notification", strKey, strText).Failed()) {
        return false;
    }
    CopyToFit(fitting.Buffer(), kMaxText, strText);
    strText = fitting.sz();
    return true;
}

// Title and text of the tag, both in one language.
void ReadTexts(Notification &notification) {
    for (const std::string &strLanguage : {Language(), std::string(kEnglish)}) {
        if (ReadText(strLanguage, notification.strTag + "_title", notification.strTitle) &&
            ReadText(strLanguage, notification.strTag + "_text", notification.strText)) {
            return;
        }
    }
    notification.strTitle = notification.strTag;
    notification.strText.clear();
}

// Puts values in place of the variables' names, and does not look at a value again.
std::string FillIn(std::string_view text, const Notification &notification) {
    std::string strFilled;
    while (!text.empty()) {
        const auto variable = std::find_if(
            notification.variables.begin(), notification.variables.end(), [&](const auto &pair) {
                return !pair.first.empty() && text.compare(0, pair.first.size(), pair.first) == 0;
            });
        const bool blFound = variable != notification.variables.end();
        strFilled += blFound ? std::string_view(variable->second) : text.substr(0, 1);
        text.remove_prefix(blFound ? variable->first.size() : 1);
    }
    return strFilled;
}

Notification Compose(const char *szTag, const YLIBSZHASH *pHash) {
    Notification notification;
    notification.strTag = szTag;
    for (int i = 0; pHash != nullptr && i < pHash->nItem; ++i) {
        notification.variables.emplace_back(YLIBCSzHashKeyAt(pHash, i),
                                            YLIBCSzHashValueAt(pHash, i));
    }
    ReadTexts(notification);
    notification.strTitle = FillIn(notification.strTitle, notification);
    notification.strText = FillIn(notification.strText, notification);
    return notification;
}

// --- Hooks --------------------------------------------------------------------------------------

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

std::vector<std::string> Environment(const Notification &notification) {
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

// Hooks are executables that an integrator puts into the folder to pass notifications on. What
// becomes of them does not count, so short memory ends here.
void RunHooks(const Notification &notification) {
    try {
        int status = 0;
        host::RunProgramFolder(
            kHooks,
            {"notification hook", notification.strTag, Environment(notification), kHookLimit},
            status)
            .Log();
    } catch (const std::bad_alloc &) {
        system_log::Write(LOG_ERR, ZELO_SOURCE_STEM, __LINE__,
                          "out of memory: not all notification hooks were run");
    }
}

}  // namespace

int ZELOSysNotifySendNotifiction(const char *szTag, YLIBSZHASH **ppHash) {
    return HOST_OPERATION([&]() -> host::Status {
        HOST_REQUIRE(szTag != nullptr && *szTag != '\0');
        const Notification notification = Compose(szTag, ppHash == nullptr ? nullptr : *ppHash);
        host::Status written = host::AppendToJournal(notification);
        RunHooks(notification);
        return written;
    });
}
