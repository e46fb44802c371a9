#include "account_rules.h"

#include <algorithm>
#include <charconv>
#include <cstring>
#include <optional>
#include <string_view>
#include <system_error>

#include "files/key_value_lookup.h"

namespace host {
namespace {

constexpr const char *kPreferenceFolder = "/usr/zelo/etc/preference/";
constexpr std::size_t kLongestName = 32;
constexpr auto kNoId = static_cast<uid_t>(-1);
constexpr uid_t kFirstCounted = 1024;
constexpr uid_t kNobody = 65534;
constexpr const char *kMaxUsersKey = "max_users";
constexpr int kDefaultMaxUsers = 2048;
constexpr char kLockMark = '!';
constexpr char kNoHashMark = '*';

bool IsLetter(char c) {
    return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || c == '_';
}

bool IsUserName(std::string_view name) {
    return !name.empty() && name.size() <= kLongestName && IsLetter(name.front()) &&
           std::all_of(name.begin(), name.end(), [](char c) {
               return IsLetter(c) || (c >= '0' && c <= '9') || c == '-' || c == '.';
           });
}

bool IsFieldText(std::string_view text) {
    return std::none_of(text.begin(), text.end(),
                        [](unsigned char c) { return c < ' ' || c == 0x7F || c == ':'; });
}

template <std::size_t cb>
bool IsTerminated(const char (&sz)[cb]) {
    return std::memchr(sz, '\0', cb) != nullptr;
}

}  // namespace

Status CheckStorable(const ZELO_USER &user) {
    HOST_REQUIRE(IsTerminated(user.szName) && IsTerminated(user.szPassword));
    HOST_REQUIRE(IsTerminated(user.szDescription) && IsTerminated(user.szHome) &&
                 IsTerminated(user.szShell));
    HOST_REQUIRE(IsUserName(user.szName));
    HOST_REQUIRE(IsFieldText(user.szDescription));
    HOST_REQUIRE(IsFieldText(user.szHome) && user.szHome[0] == '/');
    HOST_REQUIRE(IsFieldText(user.szShell) && (user.szShell[0] == '/' || user.szShell[0] == '\0'));
    HOST_REQUIRE(user.uid != kNoId && user.gid != kNoId);
    return {};
}

Status CheckMayStore(const ZELO_USER &user, bool blNew, const PasswdFile &passwd,
                     const GroupFile &groups) {
    const std::string strUser = std::string("the user '") + user.szName + '\'';
    const bool blExists = passwd.Find(user.szName) != nullptr;
    if (blNew && blExists) {
        return HOST_ERROR(YLIBC_ERR_EXISTS, strUser + " is there already");
    }
    if (!blNew && !blExists) {
        return HOST_ERROR(YLIBC_ERR_NOT_FOUND, strUser + " is not there");
    }
    int remaining = 0;
    if (blNew) {
        HOST_TRY(CountRemaining(passwd, remaining));
        if (remaining == 0) {
            return HOST_ERROR(YLIBC_ERR_LIMIT,
                              strUser + " would be one more than '" + kMaxUsersKey + "' allows");
        }
    }
    const struct passwd *const pOther = passwd.FindIf([&](const struct passwd &entry) {
        return entry.pw_uid == user.uid && std::strcmp(entry.pw_name, user.szName) != 0;
    });
    if (pOther != nullptr) {
        return HOST_ERROR(YLIBC_ERR_EXISTS, "the uid " + std::to_string(user.uid) +
                                                " is that of the user '" + pOther->pw_name + '\'');
    }
    if (groups.FindIf([&](const struct group &entry) { return entry.gr_gid == user.gid; }) ==
        nullptr) {
        return HOST_ERROR(YLIBC_ERR_NOT_FOUND, "there is no group with the gid " +
                                                   std::to_string(user.gid) + " for " + strUser);
    }
    return {};
}

Status CountRemaining(const PasswdFile &passwd, int &remaining) {
    int max = kDefaultMaxUsers;
    std::optional<std::string> setting;
    HOST_TRY(ReadSetting(kMaxUsersKey, setting));
    if (setting) {
        const char *const pEnd = setting->data() + setting->size();
        const auto parsed = std::from_chars(setting->data(), pEnd, max);
        if (parsed.ec != std::errc() || parsed.ptr != pEnd) {
            return HOST_ERROR(YLIBC_ERR_FILE, "'" + *setting + "' of '" + kMaxUsersKey + "' in '" +
                                                  kConfigFile + "' is no number");
        }
    }
    const auto entries = passwd.Entries();
    const auto counted =
        std::count_if(entries.begin(), entries.end(), [](const struct passwd *pEntry) {
            return pEntry->pw_uid >= kFirstCounted && pEntry->pw_uid != kNobody;
        });
    remaining = static_cast<int>(std::max<long>(max - counted, 0));
    return {};
}

std::string StoredPassword(const PasswdFile &passwd, const ShadowFile &shadow,
                           const std::string &strName) {
    if (const spwd *const pShadow = shadow.Find(strName); pShadow != nullptr) {
        return pShadow->sp_pwdp;
    }
    // Without a shadow file, or for a user whom it leaves out, the hash stands here.
    const struct passwd *const pEntry = passwd.Find(strName);
    return pEntry == nullptr || pEntry->pw_passwd == kHashInShadow ? "" : pEntry->pw_passwd;
}

bool LetsIn(const std::string &strPassword) {
    return strPassword.empty() || (strPassword[0] != kLockMark && strPassword[0] != kNoHashMark);
}

std::string PasswordField(const std::string &strPassword, bool blEnabled) {
    if (!blEnabled) {
        return LetsIn(strPassword) ? kLockMark + strPassword : strPassword;
    }
    const std::size_t cbMarks = strPassword.find_first_not_of(kLockMark);
    return cbMarks == std::string::npos ? std::string(1, kLockMark) : strPassword.substr(cbMarks);
}

std::string PreferencePath(const std::string &strName) {
    const bool blLeadsElsewhere = strName.empty() || strName == "." || strName == ".." ||
                                  strName.find('/') != std::string::npos;
    return blLeadsElsewhere ? "" : kPreferenceFolder + strName;
}

}  // namespace host
