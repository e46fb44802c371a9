#include "account_change.h"

#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <string_view>
#include <system_error>

#include "file_system.h"
#include "files/key_value_lookup.h"
#include "password_hash.h"
#include "status.h"

namespace host {
namespace {

constexpr const char *kFile = "account_change";
constexpr const char *kPreferenceFolder = "/usr/zelo/etc/preference/";
constexpr std::string_view kHomes = "/var/services/homes/";
constexpr mode_t kHomeMode = 0700;
constexpr mode_t kHomeParentMode = 0755;
constexpr std::size_t kLongestName = 32;
constexpr auto kNoId = static_cast<uid_t>(-1);
constexpr uid_t kFirstCounted = 1024;
constexpr uid_t kNobody = 65534;
constexpr const char *kMaxUsersKey = "max_users";
constexpr int kDefaultMaxUsers = 2048;
constexpr char kLockMark = '!';
constexpr char kNoHashMark = '*';
constexpr const char *kInShadow = "x";
constexpr long kSecondsPerDay = 86400;

using Names = std::vector<std::string>;

#define REFUSE(code) (HOST_FAIL(code) == 0)

// The C library's entries hold texts that one could write to; it only reads them.
char *Text(const char *sz) {
    return const_cast<char *>(sz);
}

bool IsText(const char *sz, const char *szOther) {
    return std::strcmp(sz, szOther) == 0;
}

// --- What may be stored -------------------------------------------------------------------------

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

bool IsStorable(const ZELO_USER &user) {
    return IsTerminated(user.szName) && IsTerminated(user.szPassword) &&
           IsTerminated(user.szDescription) && IsTerminated(user.szHome) &&
           IsTerminated(user.szShell) && IsUserName(user.szName) &&
           IsFieldText(user.szDescription) && IsFieldText(user.szHome) &&
           IsFieldText(user.szShell) && user.szHome[0] == '/' &&
           (user.szShell[0] == '/' || user.szShell[0] == '\0') && user.uid != kNoId &&
           user.gid != kNoId;
}

bool IsUidTaken(const PasswdFile &passwd, const ZELO_USER &user) {
    const auto entries = passwd.Entries();
    return std::any_of(entries.begin(), entries.end(), [&](const struct passwd *pEntry) {
        return pEntry->pw_uid == user.uid && !IsText(pEntry->pw_name, user.szName);
    });
}

bool ExistsGroup(const GroupFile &group, gid_t gid) {
    const auto entries = group.Entries();
    return std::any_of(entries.begin(), entries.end(),
                       [&](const struct group *pEntry) { return pEntry->gr_gid == gid; });
}

bool MayStore(const ZELO_USER &user, bool blNew, const PasswdFile &passwd, const GroupFile &group) {
    const bool blExists = passwd.Find(user.szName) != nullptr;
    if (blNew == blExists) {
        return REFUSE(blNew ? YLIBC_ERR_EXISTS : YLIBC_ERR_NOT_FOUND);
    }
    int remaining = 0;
    if (blNew && !CountRemaining(passwd, remaining)) {
        return false;
    }
    if (blNew && remaining == 0) {
        return REFUSE(YLIBC_ERR_LIMIT);
    }
    if (IsUidTaken(passwd, user)) {
        return REFUSE(YLIBC_ERR_EXISTS);
    }
    return ExistsGroup(group, user.gid) || REFUSE(YLIBC_ERR_NOT_FOUND);
}

// --- Storing a user -----------------------------------------------------------------------------

// The password field's text for a user who is to be let in or not. It is never empty: that would
// let everybody in.
std::string PasswordField(const std::string &strPassword, bool blEnabled) {
    if (!blEnabled) {
        return LetsIn(strPassword) ? kLockMark + strPassword : strPassword;
    }
    const std::size_t cbMarks = strPassword.find_first_not_of(kLockMark);
    return cbMarks == std::string::npos ? std::string(1, kLockMark) : strPassword.substr(cbMarks);
}

bool PutPasswd(const ZELO_USER &user, const char *szPassword, PasswdFile &passwd) {
    struct passwd entry = {};
    entry.pw_name = Text(user.szName);
    entry.pw_passwd = Text(szPassword);
    entry.pw_uid = user.uid;
    entry.pw_gid = user.gid;
    entry.pw_gecos = Text(user.szDescription);
    entry.pw_dir = Text(user.szHome);
    entry.pw_shell = Text(user.szShell);
    return passwd.Put(entry, passwd.Find(user.szName));
}

// The day of a change, -1 for an empty field where the clock has not been set: day 0 would mean
// that the password has to be changed before it lets anybody in.
long Today() {
    const long day = static_cast<long>(std::time(nullptr)) / kSecondsPerDay;
    return day > 0 ? day : -1;
}

// The line that an earlier user of the same name has left behind gives a new one nothing.
bool PutShadow(const ZELO_USER &user, bool blNew, const char *szPassword, ShadowFile &shadow) {
    const spwd *const pPlace = shadow.Find(user.szName);
    spwd entry = {};
    if (pPlace != nullptr && !blNew) {
        entry = *pPlace;
    } else {
        entry.sp_namp = Text(user.szName);
        entry.sp_min = entry.sp_max = entry.sp_warn = entry.sp_inact = -1;
        entry.sp_flag = ~0UL;
    }
    if (blNew || user.szPassword[0] != '\0') {
        entry.sp_lstchg = Today();
    }
    entry.sp_pwdp = Text(szPassword);
    entry.sp_expire = user.nExpireDay < 0 ? -1 : user.nExpireDay;
    return shadow.Put(entry, pPlace);
}

// A home directory without a slash at its end and without ".." in it.
std::string HomePath(const char *szHome) {
    std::string strHome = std::filesystem::path(szHome).lexically_normal();
    if (strHome.size() > 1 && strHome.back() == '/') {
        strHome.pop_back();
    }
    return strHome;
}

bool MakeHome(const ZELO_USER &user) {
    const std::string strHome = HomePath(user.szHome);
    const std::string strParent = std::filesystem::path(strHome).parent_path();
    return ZELOFSMkdirP(strParent.c_str(), 0, 0, 0, 0, kHomeParentMode) >= 0 &&
           ZELOFSMkdirP(strHome.c_str(), 0, 1, static_cast<int>(user.uid),
                        static_cast<int>(user.gid), kHomeMode) >= 0;
}

// --- Deleting users -----------------------------------------------------------------------------

// Takes the names off the entry's lists; a group that has none of them keeps its line as it is.
template <typename File, typename... Lists>
bool TakeOff(const Names &names, File &file, Lists... lists) {
    for (const auto *pEntry : file.Entries()) {
        auto entry = *pEntry;
        std::vector<std::vector<char *>> kept;
        bool blChanged = false;
        const auto takeOff = [&](char **&ppszList) {
            kept.push_back(ListTexts(ppszList));
            std::vector<char *> &texts = kept.back();
            const auto end = std::remove_if(texts.begin(), texts.end(), [&](const char *sz) {
                return std::find(names.begin(), names.end(), sz) != names.end();
            });
            blChanged = blChanged || end != texts.end();
            texts.erase(end, texts.end());
            texts.push_back(nullptr);
            ppszList = texts.data();
        };
        (takeOff(entry.*lists), ...);
        if (blChanged && !file.Put(entry, pEntry)) {
            return false;
        }
    }
    return true;
}

// What resists its removal is left: the users are gone all the same.
void RemoveDirectories(const Names &names, const Names &homes, const PasswdFile &others) {
    for (const std::string &strHome : homes) {
        const auto entries = others.Entries();
        const bool blShared = std::any_of(
            entries.begin(), entries.end(),
            [&](const struct passwd *pEntry) { return HomePath(pEntry->pw_dir) == strHome; });
        if (!blShared && strHome.compare(0, kHomes.size(), kHomes) == 0) {
            rmdir(strHome.c_str());
        }
    }
    for (const std::string &strName : names) {
        std::string strPath;
        std::error_code ignored;
        if (PreferencePath(strName, strPath)) {
            std::filesystem::remove_all(strPath, ignored);
        }
    }
}

// --- Members of a group -------------------------------------------------------------------------

bool Holds(const Names &names, const std::string &strName) {
    return std::find(names.begin(), names.end(), strName) != names.end();
}

// What the list becomes when it has changed since it was got: those who were added come to its end,
// those who were taken off go, and what others have changed meanwhile stays.
Names Merged(const Names &now, const Names &got, const Names &wanted) {
    if (now == got) {
        return wanted;
    }
    Names merged;
    for (const std::string &strName : now) {
        if (Holds(wanted, strName) || !Holds(got, strName)) {
            merged.push_back(strName);
        }
    }
    for (const std::string &strName : wanted) {
        if (!Holds(got, strName) && !Holds(merged, strName)) {
            merged.push_back(strName);
        }
    }
    return merged;
}

}  // namespace

Names ListNames(char **ppszList) {
    const std::vector<char *> texts = ListTexts(ppszList);
    return Names(texts.begin(), texts.end());
}

bool LetsIn(const std::string &strPassword) {
    return strPassword.empty() || (strPassword[0] != kLockMark && strPassword[0] != kNoHashMark);
}

std::string UserFiles::StoredPassword(const std::string &strName) const {
    const spwd *const pShadow = shadow.Find(strName);
    if (pShadow != nullptr) {
        return pShadow->sp_pwdp;
    }
    // Without a shadow file, or for a user whom it leaves out, the hash stands here.
    const struct passwd *const pEntry = passwd.Find(strName);
    return pEntry == nullptr || IsText(pEntry->pw_passwd, kInShadow) ? "" : pEntry->pw_passwd;
}

bool CountRemaining(const PasswdFile &passwd, int &remaining) {
    int max = kDefaultMaxUsers;
    std::string strMax;
    if (LookUpSetting(kMaxUsersKey, strMax)) {
        const char *const pEnd = strMax.data() + strMax.size();
        const auto parsed = std::from_chars(strMax.data(), pEnd, max);
        if (parsed.ec != std::errc() || parsed.ptr != pEnd) {
            return REFUSE(YLIBC_ERR_FILE);
        }
    }
    const auto entries = passwd.Entries();
    const auto counted =
        std::count_if(entries.begin(), entries.end(), [](const struct passwd *pEntry) {
            return pEntry->pw_uid >= kFirstCounted && pEntry->pw_uid != kNobody;
        });
    remaining = static_cast<int>(std::max<long>(max - counted, 0));
    return true;
}

bool PreferencePath(const std::string &strName, std::string &strPath) {
    if (strName.empty() || strName == "." || strName == ".." ||
        strName.find('/') != std::string::npos) {
        return false;
    }
    strPath = kPreferenceFolder + strName;
    return true;
}

bool StoreUser(const char *szCurrentName, const ZELO_USER &user) {
    const bool blNew = szCurrentName == nullptr;
    if (!IsStorable(user) || (!blNew && !IsText(szCurrentName, user.szName))) {
        return REFUSE(YLIBC_ERR_INVALID_ARGUMENT);
    }
    // Hashing takes its time by design; nobody needs to wait for it.
    std::string strPassword;
    if (user.szPassword[0] != '\0' && !HashPassword(user.szPassword, strPassword)) {
        return false;
    }
    const AccountLock lock;
    UserFiles files;
    GroupFile group;
    if (!lock.IsHeld() || !files.Read() || !group.Read() ||
        !MayStore(user, blNew, files.passwd, group) || !MakeHome(user)) {
        return false;
    }
    if (strPassword.empty() && !blNew) {
        strPassword = files.StoredPassword(user.szName);
    }
    strPassword = PasswordField(strPassword, user.blEnabled != 0);
    if (!files.shadow.Exists()) {
        return PutPasswd(user, strPassword.c_str(), files.passwd) && WriteInOrder(files.passwd);
    }
    return PutShadow(user, blNew, strPassword.c_str(), files.shadow) &&
           PutPasswd(user, kInShadow, files.passwd) && WriteInOrder(files.shadow, files.passwd);
}

bool DeleteUsers(const Names &names) {
    const AccountLock lock;
    UserFiles files;
    GroupFile group;
    GroupShadowFile groupShadow;
    if (!lock.IsHeld() || !files.Read() || !group.Read() || !groupShadow.Read() ||
        !TakeOff(names, group, &group::gr_mem) ||
        !TakeOff(names, groupShadow, &sgrp::sg_adm, &sgrp::sg_mem)) {
        return false;
    }
    Names homes;
    for (const std::string &strName : names) {
        const struct passwd *const pEntry = files.passwd.Find(strName);
        if (pEntry != nullptr && pEntry->pw_uid == 0) {
            return REFUSE(YLIBC_ERR_INVALID_ARGUMENT);
        }
        if (pEntry != nullptr) {
            homes.push_back(HomePath(pEntry->pw_dir));
        }
        files.shadow.Remove(strName);
        files.passwd.Remove(strName);
    }
    if (!WriteInOrder(groupShadow, group, files.shadow, files.passwd)) {
        return false;
    }
    RemoveDirectories(names, homes, files.passwd);
    return true;
}

bool StoreMembers(const std::string &strGroup, const Names *pGot, const Names &wanted) {
    const AccountLock lock;
    GroupFile group;
    GroupShadowFile groupShadow;
    if (!lock.IsHeld() || !group.Read() || !groupShadow.Read()) {
        return false;
    }
    const struct group *const pPlace = group.Find(strGroup);
    if (pPlace == nullptr) {
        return REFUSE(YLIBC_ERR_NOT_FOUND);
    }
    const Names members =
        pGot == nullptr ? wanted : Merged(ListNames(pPlace->gr_mem), *pGot, wanted);
    std::vector<char *> list;
    for (const std::string &strName : members) {
        list.push_back(Text(strName.c_str()));
    }
    list.push_back(nullptr);
    struct group entry = *pPlace;
    entry.gr_mem = list.data();
    if (!groupShadow.Exists()) {
        return group.Put(entry, pPlace) && WriteInOrder(group);
    }
    // A group without a line in the shadow file gets one, and its password moves there.
    char *pNobody = nullptr;
    const sgrp *const pShadow = groupShadow.Find(strGroup);
    sgrp shadowEntry = {};
    shadowEntry.sg_namp = entry.gr_name;
    shadowEntry.sg_passwd = IsText(entry.gr_passwd, kInShadow) ? Text("!") : entry.gr_passwd;
    shadowEntry.sg_adm = &pNobody;
    if (pShadow != nullptr) {
        shadowEntry = *pShadow;
    }
    shadowEntry.sg_mem = list.data();
    entry.gr_passwd = Text(kInShadow);
    return groupShadow.Put(shadowEntry, pShadow) && group.Put(entry, pPlace) &&
           WriteInOrder(groupShadow, group);
}

}  // namespace host
