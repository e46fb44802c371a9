#include "account_change.h"

#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <new>
#include <string_view>
#include <system_error>

#include "account_rules.h"
#include "files/directories.h"
#include "password_hash.h"

namespace host {
namespace {

constexpr std::string_view kHomes = "/var/services/homes/";
constexpr long kSecondsPerDay = 86400;

using Names = std::vector<std::string>;

// The C library's entries hold texts that one could write to; it only reads them.
char *Text(const char *sz) {
    return const_cast<char *>(sz);
}

bool Holds(const Names &names, const std::string &strName) {
    return std::find(names.begin(), names.end(), strName) != names.end();
}

// A list of the C library's, which ends with a null. It lives as long as the names.
std::vector<char *> ListOf(const Names &names) {
    std::vector<char *> list;
    for (const std::string &strName : names) {
        list.push_back(Text(strName.c_str()));
    }
    list.push_back(nullptr);
    return list;
}

// --- Storing a user -----------------------------------------------------------------------------

Status PutPasswd(const ZELO_USER &user, const char *szPassword, PasswdFile &passwd) {
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
Status PutShadow(const ZELO_USER &user, bool blNew, const char *szPassword, ShadowFile &shadow) {
    const spwd *const pPlace = shadow.Find(user.szName);
    spwd entry = {};
    if (pPlace != nullptr && !blNew) {
        entry = *pPlace;
    } else {
        entry.sp_namp = Text(user.szName);
        entry.sp_lstchg = entry.sp_min = entry.sp_max = entry.sp_warn = entry.sp_inact = -1;
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

// --- Deleting users -----------------------------------------------------------------------------

// Takes the names off the entry's lists; a group that has none of them keeps its line as it is.
template <typename File, typename... Lists>
Status TakeOff(const Names &names, File &file, Lists... lists) {
    for (const auto *pEntry : file.Entries()) {
        auto entry = *pEntry;
        std::vector<std::vector<char *>> kept;
        bool blChanged = false;
        const auto takeOff = [&](char **&ppszList) {
            std::vector<char *> &left = kept.emplace_back();
            for (char **ppsz = ppszList; *ppsz != nullptr; ++ppsz) {
                Holds(names, *ppsz) ? void(blChanged = true) : left.push_back(*ppsz);
            }
            left.push_back(nullptr);
            ppszList = left.data();
        };
        (takeOff(entry.*lists), ...);
        if (blChanged) {
            HOST_TRY(file.Put(entry, pEntry));
        }
    }
    return {};
}

void RemoveDirectories(const Names &names, const Names &homes, const PasswdFile &others) {
    for (const std::string &strHome : homes) {
        const bool blShared = others.FindIf([&](const struct passwd &entry) {
            return HomePath(entry.pw_dir) == strHome;
        }) != nullptr;
        if (!blShared && strHome.compare(0, kHomes.size(), kHomes) == 0) {
            rmdir(strHome.c_str());
        }
    }
    for (const std::string &strName : names) {
        std::error_code ignored;
        if (const std::string strPath = PreferencePath(strName); !strPath.empty()) {
            std::filesystem::remove_all(strPath, ignored);
        }
    }
}

// --- Members of a group -------------------------------------------------------------------------

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
    Names names;
    for (; *ppszList != nullptr; ++ppszList) {
        names.emplace_back(*ppszList);
    }
    return names;
}

Status MakePrivateDirectory(const std::string &strPath, const Owner &owner) {
    HOST_TRY(MakeDirectories(std::filesystem::path(strPath).parent_path(), {}, 0755));
    return MakeDirectories(strPath, owner, 0700);
}

Status StoreUser(const char *szCurrentName, const ZELO_USER &user) {
    const bool blNew = szCurrentName == nullptr;
    HOST_TRY(CheckStorable(user));
    HOST_REQUIRE(blNew || std::strcmp(szCurrentName, user.szName) == 0);
    // Hashing takes its time by design; nobody needs to wait for it.
    std::string strPassword;
    if (user.szPassword[0] != '\0') {
        HOST_TRY(HashPassword(user.szPassword, strPassword));
    }
    HeldLock lock;
    PasswdFile passwd;
    ShadowFile shadow;
    GroupFile groups;
    HOST_TRY(LockAccounts(lock));
    HOST_TRY(ReadAll(passwd, shadow, groups));
    HOST_TRY(CheckMayStore(user, blNew, passwd, groups));
    HOST_TRY(MakePrivateDirectory(HomePath(user.szHome), {true, user.uid, user.gid}));
    if (strPassword.empty() && !blNew) {
        strPassword = StoredPassword(passwd, shadow, user.szName);
    }
    strPassword = PasswordField(strPassword, user.blEnabled != 0);
    if (!shadow.Exists()) {
        HOST_TRY(PutPasswd(user, strPassword.c_str(), passwd));
        return WriteInOrder(passwd);
    }
    HOST_TRY(PutShadow(user, blNew, strPassword.c_str(), shadow));
    HOST_TRY(PutPasswd(user, kHashInShadow.data(), passwd));
    return WriteInOrder(shadow, passwd);
}

Status DeleteUsers(const Names &names) {
    HeldLock lock;
    PasswdFile passwd;
    ShadowFile shadow;
    GroupFile groups;
    GroupShadowFile groupShadow;
    HOST_TRY(LockAccounts(lock));
    HOST_TRY(ReadAll(passwd, shadow, groups, groupShadow));
    HOST_TRY(TakeOff(names, groups, &group::gr_mem));
    HOST_TRY(TakeOff(names, groupShadow, &sgrp::sg_adm, &sgrp::sg_mem));
    Names homes;
    for (const std::string &strName : names) {
        const struct passwd *const pEntry = passwd.Find(strName);
        if (pEntry != nullptr && pEntry->pw_uid == 0) {
            return HOST_ERROR(YLIBC_ERR_INVALID_ARGUMENT,
                              "the user '" + strName + "' is the superuser, who stays");
        }
        if (pEntry != nullptr) {
            homes.push_back(HomePath(pEntry->pw_dir));
        }
        shadow.Remove(strName);
        passwd.Remove(strName);
    }
    HOST_TRY(WriteInOrder(groupShadow, groups, shadow, passwd));
    try {
        RemoveDirectories(names, homes, passwd);
    } catch (const std::bad_alloc &) {
        // What resists its removal is left: the users are gone all the same.
    }
    return {};
}

Status StoreMembers(const std::string &strGroup, const Names *pGot, const Names &wanted) {
    HeldLock lock;
    GroupFile groups;
    GroupShadowFile groupShadow;
    HOST_TRY(LockAccounts(lock));
    HOST_TRY(ReadAll(groups, groupShadow));
    const struct group *pPlace = nullptr;
    HOST_TRY(groups.Get(strGroup, pPlace));
    const Names members =
        pGot == nullptr ? wanted : Merged(ListNames(pPlace->gr_mem), *pGot, wanted);
    std::vector<char *> list = ListOf(members);
    struct group entry = *pPlace;
    entry.gr_mem = list.data();
    if (!groupShadow.Exists()) {
        HOST_TRY(groups.Put(entry, pPlace));
        return WriteInOrder(groups);
    }
    // A group without a line in the shadow file gets one, and its password moves there.
    char *pNobody = nullptr;
    const sgrp *const pShadow = groupShadow.Find(strGroup);
    sgrp shadowEntry = {};
    shadowEntry.sg_namp = entry.gr_name;
    shadowEntry.sg_passwd = entry.gr_passwd == kHashInShadow ? Text("!") : entry.gr_passwd;
    shadowEntry.sg_adm = &pNobody;
    if (pShadow != nullptr) {
        shadowEntry = *pShadow;
    }
    shadowEntry.sg_mem = list.data();
    entry.gr_passwd = Text(kHashInShadow.data());
    HOST_TRY(groupShadow.Put(shadowEntry, pShadow));
    HOST_TRY(groups.Put(entry, pPlace));
    return WriteInOrder(groupShadow, groups);
}

}  // namespace host
