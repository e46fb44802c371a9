// Users and groups: the records in memory, and the operations that pass them to the account files.

#include "user_group.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <string>
#include <utility>

#include "account_change.h"
#include "file_system.h"
#include "files/key_value_lookup.h"
#include "fixed_text.h"
#include "key_value_file.h"
#include "status.h"

namespace {

constexpr const char *kFile = "user_group";
constexpr const char *kAdministrators = "administrators";
constexpr const char *kPreferenceParent = "/usr/zelo/etc/preference";
constexpr const char *kExtraAdminKey = "extra_admin_";
constexpr mode_t kPreferenceMode = 0700;
constexpr mode_t kPreferenceParentMode = 0755;

template <auto pfnFree>
struct Release {
    template <typename Record>
    void operator()(Record *pRecord) const {
        pfnFree(pRecord);
    }
};
using UserHandle = std::unique_ptr<ZELO_USER, Release<ZELOUserFree>>;
using GroupHandle = std::unique_ptr<ZELO_GROUP, Release<ZELOGroupFree>>;

// The operations have C linkage: short memory becomes a failure here.
template <typename Body>
int NoThrow(Body &&body) {
    try {
        return std::forward<Body>(body)();
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

// --- Records ------------------------------------------------------------------------------------

// False when the text does not fit.
template <std::size_t cb>
bool SetText(char (&szField)[cb], const char *szText) {
    const std::string_view text = szText == nullptr ? "" : szText;
    if (text.size() >= cb) {
        return false;
    }
    szField[text.copy(szField, cb - 1)] = '\0';
    return true;
}

int FillUser(const host::UserFiles &files, const struct passwd &entry, ZELO_USER *pUser) {
    if (!SetText(pUser->szName, entry.pw_name) || !SetText(pUser->szDescription, entry.pw_gecos) ||
        !SetText(pUser->szHome, entry.pw_dir) || !SetText(pUser->szShell, entry.pw_shell)) {
        return HOST_FAIL(YLIBC_ERR_FILE);
    }
    const spwd *const pShadow = files.shadow.Find(entry.pw_name);
    pUser->uid = entry.pw_uid;
    pUser->gid = entry.pw_gid;
    pUser->nExpireDay = pShadow == nullptr ? -1 : static_cast<int>(pShadow->sp_expire);
    pUser->blEnabled = host::LetsIn(files.StoredPassword(entry.pw_name)) ? 1 : 0;
    return 0;
}

// What a record keeps of its group: the members as the store had them when they were read, or when
// they were last set.
struct GotGroup {
    std::string strName;
    std::vector<std::string> members;
};

int FillGroup(const struct group &entry, ZELO_GROUP *pGroup) {
    if (!SetText(pGroup->szName, entry.gr_name)) {
        return HOST_FAIL(YLIBC_ERR_FILE);
    }
    pGroup->gid = entry.gr_gid;
    const std::vector<char *> members = host::ListTexts(entry.gr_mem);
    pGroup->pPort = new GotGroup{entry.gr_name, host::ListNames(entry.gr_mem)};
    pGroup->ppszMembers = static_cast<char **>(std::calloc(members.size() + 1, sizeof(char *)));
    if (pGroup->ppszMembers == nullptr) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
    for (std::size_t i = 0; i < members.size(); ++i) {
        pGroup->ppszMembers[i] = strdup(members[i]);
        if (pGroup->ppszMembers[i] == nullptr) {
            return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
        }
    }
    return 0;
}

// Tells the caller, if asked to, what became of these users: all were changed or none.
int Report(int result, int nUsers, const std::string &strFirst, YLIBCM_RESULT **ppResult) {
    if (ppResult == nullptr || *ppResult == nullptr) {
        return result;
    }
    YLIBCM_RESULT &record = **ppResult;
    record = {};
    if (result == 0) {
        record.nDone = nUsers;
    } else {
        record.nFailed = nUsers;
        CopyToFit(record.szFailed, sizeof(record.szFailed), strFirst);
    }
    return result;
}

}  // namespace

int ZELOUserAlloc(ZELO_USER **ppUser, const char *szName, const char *szPassword, uid_t uid,
                  gid_t gid, const char *szDescription, const char *szHome, const char *szShell,
                  int nExpireDay, int blEnabled, const void * /*pReserved*/) {
    if (ppUser == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    *ppUser = nullptr;
    if (szName == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    UserHandle pUser(new (std::nothrow) ZELO_USER());
    if (pUser == nullptr) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
    if (!SetText(pUser->szName, szName) || !SetText(pUser->szPassword, szPassword) ||
        !SetText(pUser->szDescription, szDescription) || !SetText(pUser->szHome, szHome) ||
        !SetText(pUser->szShell, szShell)) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    pUser->uid = uid;
    pUser->gid = gid;
    pUser->nExpireDay = nExpireDay;
    pUser->blEnabled = blEnabled;
    *ppUser = pUser.release();
    return 0;
}

void ZELOUserFree(ZELO_USER *pUser) {
    if (pUser != nullptr) {
        explicit_bzero(pUser, sizeof(*pUser));
        delete pUser;
    }
}

void ZELOGroupFree(ZELO_GROUP *pGroup) {
    if (pGroup == nullptr) {
        return;
    }
    for (char **ppsz = pGroup->ppszMembers; ppsz != nullptr && *ppsz != nullptr; ++ppsz) {
        std::free(*ppsz);
    }
    std::free(pGroup->ppszMembers);
    delete static_cast<GotGroup *>(pGroup->pPort);
    delete pGroup;
}

YLIBCM_RESULT *YLIBCMResultAlloc() {
    auto *const pResult = new (std::nothrow) YLIBCM_RESULT();
    if (pResult == nullptr) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
    return pResult;
}

void YLIBCMResultFree(YLIBCM_RESULT *pResult) {
    delete pResult;
}

// --- Users --------------------------------------------------------------------------------------

int ZELOUserGet(const char *szName, ZELO_USER **ppUser) {
    if (ppUser == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    *ppUser = nullptr;
    if (szName == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        host::UserFiles files;
        if (!files.Read()) {
            return -1;
        }
        const struct passwd *const pEntry = files.passwd.Find(szName);
        if (pEntry == nullptr) {
            return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
        }
        UserHandle pUser(new ZELO_USER());
        if (FillUser(files, *pEntry, pUser.get()) != 0) {
            return -1;
        }
        *ppUser = pUser.release();
        return 0;
    });
}

int ZELOUserSetOne(const char *szCurrentName, const ZELO_USER *pUser, YLIBCM_RESULT **ppResult) {
    if (pUser == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        const std::string strName(pUser->szName, strnlen(pUser->szName, sizeof(pUser->szName)));
        const int result = host::StoreUser(szCurrentName, *pUser) ? 0 : -1;
        return Report(result, 1, strName, ppResult);
    });
}

int ZELOUserDelete(const char *const *ppszNames, int nNames, YLIBCM_RESULT **ppResult) {
    if (ppszNames == nullptr || nNames < 0 ||
        std::find(ppszNames, ppszNames + nNames, nullptr) != ppszNames + nNames) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        const std::vector<std::string> names(ppszNames, ppszNames + nNames);
        const int result = host::DeleteUsers(names) ? 0 : -1;
        return Report(result, nNames, nNames > 0 ? names.front() : "", ppResult);
    });
}

int YLIBUserNumRemained() {
    return NoThrow([] {
        host::PasswdFile passwd;
        int remaining = 0;
        return passwd.Read() && host::CountRemaining(passwd, remaining) ? remaining : -1;
    });
}

int ZELOUserPreferenceDirGet(const char *szName, char *szPath, int cbPath) {
    if (szName == nullptr || szPath == nullptr || cbPath <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        host::PasswdFile passwd;
        std::string strPath;
        if (!host::PreferencePath(szName, strPath)) {
            return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        }
        if (!passwd.Read()) {
            return -1;
        }
        if (passwd.Find(szName) == nullptr) {
            return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
        }
        if (strPath.size() >= static_cast<std::size_t>(cbPath)) {
            return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        }
        if (ZELOFSMkdirP(kPreferenceParent, 0, 0, 0, 0, kPreferenceParentMode) < 0 ||
            ZELOFSMkdirP(strPath.c_str(), 0, 0, 0, 0, kPreferenceMode) < 0) {
            return -1;
        }
        CopyToFit(szPath, cbPath, strPath);
        return 0;
    });
}

// --- Groups -------------------------------------------------------------------------------------

int ZELOGroupGet(const char *szName, ZELO_GROUP **ppGroup) {
    if (ppGroup == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    *ppGroup = nullptr;
    if (szName == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        host::GroupFile file;
        if (!file.Read()) {
            return -1;
        }
        const struct group *const pEntry = file.Find(szName);
        if (pEntry == nullptr) {
            return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
        }
        GroupHandle pGroup(new ZELO_GROUP());
        if (FillGroup(*pEntry, pGroup.get()) != 0) {
            return -1;
        }
        *ppGroup = pGroup.release();
        return 0;
    });
}

int ZELOGroupSet(const char *szName, const ZELO_GROUP *pGroup) {
    if (szName == nullptr || pGroup == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    char *pNobody = nullptr;
    char **const ppszMembers = pGroup->ppszMembers == nullptr ? &pNobody : pGroup->ppszMembers;
    for (char **ppsz = ppszMembers; *ppsz != nullptr; ++ppsz) {
        if (**ppsz == '\0') {
            return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        }
    }
    return NoThrow([&] {
        std::vector<std::string> members = host::ListNames(ppszMembers);
        auto *const pGot = static_cast<GotGroup *>(pGroup->pPort);
        const bool blSame = pGot != nullptr && pGot->strName == szName;
        if (!host::StoreMembers(szName, blSame ? &pGot->members : nullptr, members)) {
            return -1;
        }
        if (blSame) {
            pGot->members.swap(members);
        }
        return 0;
    });
}

int YLIBGroupIsAdminGroupMem(const char *szName, int /*flags*/) {
    if (szName == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        host::PasswdFile passwd;
        host::GroupFile groups;
        if (!passwd.Read() || !groups.Read()) {
            return -1;
        }
        const struct passwd *const pUser = passwd.Find(szName);
        const struct group *const pGroup = groups.Find(kAdministrators);
        if (pUser == nullptr || pGroup == nullptr) {
            return 0;
        }
        const std::vector<char *> members = host::ListTexts(pGroup->gr_mem);
        const bool blListed = std::any_of(members.begin(), members.end(), [&](const char *sz) {
            return std::strcmp(sz, szName) == 0;
        });
        return static_cast<int>(blListed || pUser->pw_gid == pGroup->gr_gid);
    });
}

int YLIBGroupExtraAdminSet(const char *szName, int n1, int n2, int n3, int n4) {
    if (szName == nullptr || *szName == '\0') {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        const std::string strKey = kExtraAdminKey + std::string(szName);
        std::optional<std::string> before;
        const bool blClear = n1 == 0 && n2 == 0 && n3 == 0 && n4 == 0;
        const bool blRead = !host::LookUpKey(host::kConfigFile, strKey.c_str(), before).Failed();
        if (blClear && blRead && before.value_or("").empty()) {
            return 0;
        }
        std::string strValue;
        if (!blClear) {
            for (const int n : {n1, n2, n3, n4}) {
                strValue += (strValue.empty() ? "" : " ") + std::to_string(n);
            }
        }
        return YLIBCINFOSetKeyValue(strKey.c_str(), strValue.c_str());
    });
}
