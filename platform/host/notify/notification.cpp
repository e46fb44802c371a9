// Notifications: their texts in the appliance's language, and whom they are handed to.

#include "notification.h"

#include <algorithm>
#include <exception>
#include <string>
#include <string_view>

#include "files/key_value_lookup.h"
#include "notification_hooks.h"
#include "notification_journal.h"
#include "notification_record.h"
#include "status.h"
#include "strings_file.h"

namespace {

constexpr const char *kFile = "notification";
constexpr const char *kSection = "notification";
constexpr const char *kEnglish = "enu";
constexpr int kMaxText = 4096;

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
    std::string strBuffer(kMaxText, '\0');
    const int cb = YLIBCFileGetSectionValue(strPath.c_str(), kSection, strKey.c_str(),
                                            strBuffer.data(), kMaxText);
    if (cb < 0) {
        return false;
    }
    strText = strBuffer.substr(0, static_cast<std::size_t>(cb));
    return true;
}

// Title and text of the tag, both in one language.
void ReadTexts(host::Notification &notification) {
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
std::string FillIn(std::string_view text, const host::Notification &notification) {
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

host::Notification Compose(const char *szTag, const YLIBSZHASH *pHash) {
    host::Notification notification;
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

}  // namespace

int ZELOSysNotifySendNotifiction(const char *szTag, YLIBSZHASH **ppHash) {
    if (szTag == nullptr || *szTag == '\0') {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        // Texts may be looked for in two places, and what becomes of the hooks does not count.
        const host::LastError before;
        const host::Notification notification =
            Compose(szTag, ppHash == nullptr ? nullptr : *ppHash);
        const int result = host::AppendToJournal(notification);
        const host::LastError ofJournal;
        host::RunHooks(notification);
        (result == 0 ? before : ofJournal).Restore();
        return result;
    } catch (const std::exception &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}
