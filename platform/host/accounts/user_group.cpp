// Users and groups: the records in memory, and the operations that pass them to the account files.

#include "user_group.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "account_change.h"
#include "account_rules.h"
#include "files/key_value_lookup.h"
#include "fixed_text.h"

namespace {

using host::Status;

constexpr const char *kAdministrators = "administrators";
constexpr const char *kExtraAdminKey = "extra_admin_";

template <auto pfnFree>
struct Release {
    template <typename Record>
    void operator()(Record *pRecord) const {
        pfnFree(pRecord);
    }
};
using UserHandle = std::unique_ptr<ZELO_USER, Release<ZELOUserFree>>;
using GroupHandle = std::unique_ptr<ZELO_GROUP, Release<ZELOGroupFree>>;

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

// A record that a field of the account files does not fit into is no user's.
Status FillUser(const struct passwd &entry, ZELO_USER &user) {
    if (!SetText(user.szName, entry.pw_name) || !SetText(user.szDescription, entry.pw_gecos) ||
        !SetText(user.szHome, entry.pw_dir) || !SetText(user.szShell, entry.pw_shell)) {
        return HOST_ERROR(YLIBC_ERR_FILE, std::string("a field of the user '") + entry.pw_name +
                                              "' is too long for a record");
    }
    user.uid = entry.pw_uid;
    user.gid = entry.pw_gid;
    return {};
}

// What the C library gives when it has memory.
template <typename T>
T *NotNull(T *p) {
    if (p == nullptr) {
        throw std::bad_alloc();
    }
    return p;
}

// What a record keeps of its group: the members as the store had them when they were read, or when
// they were last set.
struct GotGroup {
    std::string strName;
    std::vector<std::string> members;
};

Status FillGroup(const struct group &entry, ZELO_GROUP &group) {
    if (!SetText(group.szName, entry.gr_name)) {
        return HOST_ERROR(YLIBC_ERR_FILE, std::string("the name of the group '") + entry.gr_name +
                                              "' is too long for a record");
    }
    group.gid = entry.gr_gid;
    const std::vector<std::string> members = host::ListNames(entry.gr_mem);
    group.pPort = new GotGroup{entry.gr_name, members};
    group.ppszMembers =
        NotNull(static_cast<char **>(std::calloc(members.size() + 1, sizeof(char *))));
    for (std::size_t i = 0; i < members.size(); ++i) {
        group.ppszMembers[i] = NotNull(strdup(members[i].c_str()));
    }
    return {};
}

std::string_view NameIn(const ZELO_USER &user) {
    return {user.szName, strnlen(user.szName, sizeof(user.szName))};
}

// Tells the caller, if asked to, what became of these users: all were changed or none.
void Report(int result, int nUsers, std::string_view first, YLIBCM_RESULT **ppResult) {
    if (ppResult == nullptr || *ppResult == nullptr) {
        return;
    }
    YLIBCM_RESULT &record = **ppResult;
    record = {};
    if (result == 0) {
        record.nDone = nUsers;
    } else {
        record.nFailed = nUsers;
        CopyToFit(record.szFailed, sizeof(record.szFailed), first);
    }
}

}  // namespace

int ZELOUserAlloc(ZELO_USER **ppUser, const char *szName, const char *szPassword, uid_t uid,
                  gid_t gid, const char *szDescription, const char *szHome, const char *szShell,
                  int nExpireDay, int blEnabled, const void * /*pReserved*/) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(ppUser != nullptr);
        *ppUser = nullptr;
        HOST_REQUIRE(szName != nullptr);
        UserHandle pUser(new ZELO_USER());
        HOST_REQUIRE(SetText(pUser->szName, szName) && SetText(pUser->szPassword, szPassword));
        HOST_REQUIRE(SetText(pUser->szDescription, szDescription));
        HOST_REQUIRE(SetText(pUser->szHome, szHome) && SetText(pUser->szShell, szShell));
        pUser->uid = uid;
        pUser->gid = gid;
        pUser->nExpireDay = nExpireDay;
        pUser->blEnabled = blEnabled;
        *ppUser = pUser.release();
        return {};
    });
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
    std::unique_ptr<YLIBCM_RESULT> pResult;
    return HOST_OPERATION(decltype(pResult)(), pResult,
                          [&] {
                              pResult = std::make_unique<YLIBCM_RESULT>();
                              return Status();
                          })
        .release();
}

void YLIBCMResultFree(YLIBCM_RESULT *pResult) {
    delete pResult;
}

// --- Users --------------------------------------------------------------------------------------

int ZELOUserGet(const char *szName, ZELO_USER **ppUser) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(ppUser != nullptr);
        *ppUser = nullptr;
        HOST_REQUIRE(szName != nullptr);
        host::PasswdFile passwd;
        host::ShadowFile shadow;
        HOST_TRY(host::ReadAll(passwd, shadow));
        const struct passwd *pEntry = nullptr;
        HOST_TRY(passwd.Get(szName, pEntry));
        UserHandle pUser(new ZELO_USER());
        HOST_TRY(FillUser(*pEntry, *pUser));
        const spwd *const pShadow = shadow.Find(szName);
        pUser->nExpireDay = pShadow == nullptr ? -1 : static_cast<int>(pShadow->sp_expire);
        pUser->blEnabled = host::LetsIn(host::StoredPassword(passwd, shadow, szName)) ? 1 : 0;
        *ppUser = pUser.release();
        return {};
    });
}

int ZELOUserSetOne(const char *szCurrentName, const ZELO_USER *pUser, YLIBCM_RESULT **ppResult) {
    const int result = HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pUser != nullptr);
        return host::StoreUser(szCurrentName, *pUser);
    });
    Report(result, 1, pUser == nullptr ? std::string_view() : NameIn(*pUser), ppResult);
    return result;
}

int ZELOUserDelete(const char *const *ppszNames, int nNames, YLIBCM_RESULT **ppResult) {
    const int result = HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(ppszNames != nullptr && nNames >= 0);
        HOST_REQUIRE(std::count(ppszNames, ppszNames + nNames, nullptr) == 0);
        return host::DeleteUsers({ppszNames, ppszNames + nNames});
    });
    const bool blNamed = ppszNames != nullptr && nNames > 0 && ppszNames[0] != nullptr;
    Report(result, std::max(nNames, 0), blNamed ? ppszNames[0] : "", ppResult);
    return result;
}

int YLIBUserNumRemained() {
    int remaining = 0;
    return HOST_OPERATION(-1, remaining, [&]() -> Status {
        host::PasswdFile passwd;
        HOST_TRY(passwd.Read());
        return host::CountRemaining(passwd, remaining);
    });
}

int ZELOUserPreferenceDirGet(const char *szName, char *szPath, int cbPath) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szName != nullptr && szPath != nullptr && cbPath > 0);
        const std::string strPath = host::PreferencePath(szName);
        HOST_REQUIRE(!strPath.empty());
        host::PasswdFile passwd;
        const struct passwd *pEntry = nullptr;
        HOST_TRY(passwd.Read());
        HOST_TRY(passwd.Get(szName, pEntry));
        HOST_REQUIRE(strPath.size() < static_cast<std::size_t>(cbPath));
        HOST_TRY(host::MakePrivateDirectory(strPath, {}));
        CopyToFit(szPath, cbPath, strPath);
        return {};
    });
}

// --- Groups -------------------------------------------------------------------------------------

int ZELOGroupGet(const char *szName, ZELO_GROUP **ppGroup) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(ppGroup != nullptr);
        *ppGroup = nullptr;
        HOST_REQUIRE(szName != nullptr);
        host::GroupFile groups;
        HOST_TRY(groups.Read());
        const struct group *pEntry = nullptr;
        HOST_TRY(groups.Get(szName, pEntry));
        GroupHandle pGroup(new ZELO_GROUP());
        HOST_TRY(FillGroup(*pEntry, *pGroup));
        *ppGroup = pGroup.release();
        return {};
    });
}

int ZELOGroupSet(const char *szName, const ZELO_GROUP *pGroup) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szName != nullptr && pGroup != nullptr);
        std::vector<std::string> members;
        if (pGroup->ppszMembers != nullptr) {
            members = host::ListNames(pGroup->ppszMembers);
        }
        HOST_REQUIRE(std::count(members.begin(), members.end(), "") == 0);
        auto *const pGot = static_cast<GotGroup *>(pGroup->pPort);
        const bool blSame = pGot != nullptr && pGot->strName == szName;
        HOST_TRY(host::StoreMembers(szName, blSame ? &pGot->members : nullptr, members));
        if (blSame) {
            pGot->members.swap(members);
        }
        return {};
    });
}

int YLIBGroupIsAdminGroupMem(const char *szName, int /*flags*/) {
    int isMember = 0;
    return HOST_OPERATION(-1, isMember, [&]() -> Status {
        HOST_REQUIRE(szName != nullptr);
        host::PasswdFile passwd;
        host::GroupFile groups;
        HOST_TRY(host::ReadAll(passwd, groups));
        const struct passwd *const pUser = passwd.Find(szName);
        const struct group *const pGroup = groups.Find(kAdministrators);
        if (pUser != nullptr && pGroup != nullptr) {
            const std::vector<std::string> members = host::ListNames(pGroup->gr_mem);
            const bool blListed = std::count(members.begin(), members.end(), szName) > 0;
            isMember = blListed || pUser->pw_gid == pGroup->gr_gid ? 1 : 0;
        }
        return {};
    });
}

int YLIBGroupExtraAdminSet(const char *szName, int n1, int n2, int n3, int n4) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szName != nullptr && *szName != '\0');
        const std::string strKey = kExtraAdminKey + std::string(szName);
        if (n1 == 0 && n2 == 0 && n3 == 0 && n4 == 0) {
            std::optional<std::string> before;
            HOST_TRY(host::ReadSetting(strKey.c_str(), before));
            return before.value_or("").empty() ? Status() : host::SetSetting(strKey.c_str(), "");
        }
        std::string strValue = std::to_string(n1);
        for (const int n : {n2, n3, n4}) {
            strValue += ' ' + std::to_string(n);
        }
        return host::SetSetting(strKey.c_str(), strValue.c_str());
    });
}
