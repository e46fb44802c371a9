// Service account: the local administrator that the QRM server uses on this appliance, and the
// switches that hide a user's welcome pages.

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>

#include "appliance.h"
#include "fixed_text.h"
#include "guard.h"
#include "json.h"
#include "json_text.h"
#include "locked_file.h"
#include "log.h"
#include "platform_handles.h"
#include "service.h"
#include "user_group.h"
#include "zeloqrmclient.h"

namespace {

constexpr const char *kDescription = "This user is used for QRM";
constexpr const char *kHome = "/var/services/homes/ZelonixQRM";
constexpr const char *kShell = "/sbin/nologin";
constexpr uid_t kUid = 50000;
constexpr gid_t kGid = 100;
constexpr int kExpireDay = -1;
constexpr int kEnabled = 1;

constexpr const char *kFolder = "/usr/zelo/etc/QRM/";
constexpr mode_t kFolderMode = 0755;
constexpr const char *kRemoveFolder = "/bin/rm -rf /usr/zelo/etc/QRM/";
constexpr int kServiceType = 8;

using UserHandle = MovingHandle<ZELO_USER, ZELOUserFree>;
using GroupHandle = MovingHandle<ZELO_GROUP, ZELOGroupFree>;
using ResultHandle = MovingHandle<YLIBCM_RESULT, YLIBCMResultFree>;

bool Exists(UserHandle &user) {
    return ZELOUserGet(appliance::kServiceAccount, user.Address()) == 0;
}

// Whether the account is known not to be there. Accounts that cannot be read may hold it.
bool IsGone(UserHandle &user) {
    const unsigned int code = YLIBCErrGet();
    const char *const szFile = YLIBCErrorGetFile();
    const int line = YLIBCErrorGetLine();
    YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
    const bool blExists = Exists(user);
    const unsigned int reason = YLIBCErrGet();
    if (reason == YLIBC_ERR_NONE) {
        YLIBCErrSetEx(code, szFile, line);
    }
    // A platform that sets no last error means that there is no such account.
    return !blExists && (reason == YLIBC_ERR_NONE || reason == YLIBC_ERR_NOT_FOUND);
}

// --- The password -------------------------------------------------------------------------------

// Both percent signs count, so "%" comes up twice as often as any other character.
constexpr char kPasswordCharacters[] =
    "0123456789!@#$%%^&*()_+ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
constexpr int kCharacterCount = sizeof(kPasswordCharacters) - 1;
constexpr std::size_t kPasswordLength = 101;

// A password that is wiped when nobody needs it any more.
class Password {
  public:
    Password() {
        char szDrawn[kPasswordLength + 1] = {};
        for (std::size_t i = 0; i < kPasswordLength; ++i) {
            // The generator is the caller's to seed.
            szDrawn[i] = kPasswordCharacters[std::rand() % kCharacterCount];  // NOLINT
        }
        m_sz = strdup(szDrawn);
        explicit_bzero(szDrawn, sizeof(szDrawn));
    }
    ~Password() {
        if (m_sz != nullptr) {
            explicit_bzero(m_sz, kPasswordLength);
            std::free(m_sz);
        }
    }
    Password(const Password &) = delete;
    Password &operator=(const Password &) = delete;

    const char *sz() const { return m_sz; }

  private:
    char *m_sz = nullptr;
};

// --- Creation -----------------------------------------------------------------------------------

bool AllocateResult(ResultHandle &result) {
    result.Reset(YLIBCMResultAlloc());
    if (result.Get() == nullptr) {
        ZELO_LOG("YLIBCMResultAlloc failed. [0x%04X %s:%d]", ZELO_LAST_ERROR);
        return false;
    }
    return true;
}

bool Save(const char *szCurrentName, const ZELO_USER *pUser, ResultHandle &result) {
    if (ZELOUserSetOne(szCurrentName, pUser, result.Address()) < 0) {
        ZELO_LOG("ZELOUserSet [%s] failed. [0x%04X %s:%d]", appliance::kServiceAccount,
                 ZELO_LAST_ERROR);
        return false;
    }
    return true;
}

template <std::size_t N>
void SetField(char (&szField)[N], const char *szText) {
    CopyToFit(szField, N, szText);
}

bool RefreshUser(ZELO_USER *pUser, const Password &password) {
    ResultHandle result;
    if (!AllocateResult(result)) {
        return false;
    }
    SetField(pUser->szPassword, password.sz());
    pUser->uid = kUid;
    pUser->gid = kGid;
    SetField(pUser->szDescription, kDescription);
    SetField(pUser->szHome, kHome);
    SetField(pUser->szShell, kShell);
    pUser->nExpireDay = kExpireDay;
    pUser->blEnabled = kEnabled;
    return Save(pUser->szName, pUser, result);
}

bool AddUser(const Password &password) {
    UserHandle user;
    if (ZELOUserAlloc(user.Address(), appliance::kServiceAccount, password.sz(), kUid, kGid,
                      kDescription, kHome, kShell, kExpireDay, kEnabled, nullptr) < 0) {
        ZELO_LOG("Failed to Alloc USER [%s] [0x%04X %s:%d]", appliance::kServiceAccount,
                 ZELO_LAST_ERROR);
        return false;
    }
    const int remained = YLIBUserNumRemained();
    if (remained < 0) {
        ZELO_LOG("YLIBUserNumRemained failed (%d). [0x%04X %s:%d]", remained, ZELO_LAST_ERROR);
        return false;
    }
    if (remained == 0) {
        ZELO_LOG("The limit of local account has been reached.");
        return false;
    }
    ResultHandle result;
    return AllocateResult(result) && Save(nullptr, user.Get(), result);
}

bool SetUpUser() {
    const Password password;
    if (password.sz() == nullptr) {
        ZELO_LOG("Generate random password fail");
        return false;
    }
    UserHandle user;
    return Exists(user) ? RefreshUser(user.Get(), password) : AddUser(password);
}

// A member list in the form that a group record takes: names and list from the C library's heap.
class MemberList {
  public:
    MemberList() = default;
    ~MemberList() {
        for (std::size_t i = 0; m_ppsz != nullptr && m_ppsz[i] != nullptr; ++i) {
            std::free(m_ppsz[i]);
        }
        std::free(m_ppsz);
    }
    MemberList(const MemberList &) = delete;
    MemberList &operator=(const MemberList &) = delete;

    // Room for so many names and the null that ends the list.
    bool Allocate(std::size_t count) {
        m_ppsz = static_cast<char **>(std::calloc(count + 1, sizeof(char *)));
        return m_ppsz != nullptr;
    }
    bool Append(const char *szName) {
        m_ppsz[m_count] = strdup(szName);
        return m_ppsz[m_count++] != nullptr;
    }
    void Exchange(ZELO_GROUP *pGroup) { std::swap(m_ppsz, pGroup->ppszMembers); }

  private:
    char **m_ppsz = nullptr;
    std::size_t m_count = 0;
};

bool AppendMember(MemberList &members, const char *szName) {
    if (!members.Append(szName)) {
        ZELO_LOG("Failed to strdup member [%s]", szName);
        return false;
    }
    return true;
}

std::size_t CountMembers(const ZELO_GROUP *pGroup, bool &blIsMember) {
    std::size_t count = 0;
    for (char **ppsz = pGroup->ppszMembers; ppsz != nullptr && *ppsz != nullptr; ++ppsz, ++count) {
        blIsMember = blIsMember || std::strcmp(*ppsz, appliance::kServiceAccount) == 0;
    }
    return count;
}

bool AddMember(ZELO_GROUP *pGroup, std::size_t count) {
    MemberList members;
    if (!members.Allocate(count + 1)) {
        ZELO_LOG("Failed to malloc szNewMembers");
        return false;
    }
    for (std::size_t i = 0; i < count; ++i) {
        if (!AppendMember(members, pGroup->ppszMembers[i])) {
            return false;
        }
    }
    if (!AppendMember(members, appliance::kServiceAccount)) {
        return false;
    }
    // The record takes the new list over, and leaves the old one to be released here.
    members.Exchange(pGroup);
    if (ZELOGroupSet(pGroup->szName, pGroup) < 0) {
        ZELO_LOG("ZELOGroupSet failed. [%s] [0x%04X %s:%d]", pGroup->szName, ZELO_LAST_ERROR);
        return false;
    }
    return true;
}

bool Create() {
    if (!SetUpUser()) {
        return false;
    }
    GroupHandle group;
    if (ZELOGroupGet(appliance::kAdministrators, group.Address()) < 0) {
        ZELO_LOG("ZELOGroupGet [%s] failed. [0x%04X %s:%d]", appliance::kAdministrators,
                 ZELO_LAST_ERROR);
        return false;
    }
    bool blIsMember = false;
    const std::size_t count = CountMembers(group.Get(), blIsMember);
    if (blIsMember) {
        return true;
    }
    if (!AddMember(group.Get(), count)) {
        return false;
    }
    if (!ZELOQRMUserWelcomPage(appliance::kServiceAccount, false)) {
        ZELO_LOG("Failed to hid welcom page for ZelonixQRM. [%s] [0x%04X %s:%d]",
                 appliance::kServiceAccount, ZELO_LAST_ERROR);
    }
    static_cast<void>(mkdir(kFolder, kFolderMode));
    static_cast<void>(YLIBServiceTypeReload(kServiceType));
    return true;
}

// --- Deletion -----------------------------------------------------------------------------------

constexpr const char *kUserLock = "/tmp/userlock";

struct FreeNames {
    void operator()(const char **ppsz) const { std::free(ppsz); }
};

bool DeleteLocked(ResultHandle &result) {
    const std::unique_ptr<const char *, FreeNames> names(
        static_cast<const char **>(std::calloc(1, sizeof(char *))));
    if (names == nullptr) {
        ZELO_LOG("malloc fail");
        return false;
    }
    *names = appliance::kServiceAccount;
    if (ZELOUserDelete(names.get(), 1, result.Address()) == -1) {
        ZELO_LOG("ZELOUserDelete fail[%x]", YLIBCErrGet());
        return false;
    }
    UserHandle user;
    if (!IsGone(user)) {
        ZELO_LOG("User delete fail");
        return false;
    }
    static_cast<void>(YLIBServiceTypeReload(kServiceType));
    // A fixed text: nothing of a caller's reaches the shell.
    const int ignored = std::system(kRemoveFolder);  // NOLINT
    static_cast<void>(ignored);
    return true;
}

bool Delete() {
    UserHandle user;
    if (IsGone(user)) {
        return true;
    }
    ResultHandle result(YLIBCMResultAlloc());
    if (result.Get() == nullptr) {
        ZELO_LOG("YLIBCMResultAlloc fail");
        return false;
    }
    FileLock lock;
    if (YLIBCFileLockByFile(kUserLock, 1, lock.Address()) < 0) {
        ZELO_LOG("YLIBCFileLockByFile fail");
        return false;
    }
    return DeleteLocked(result);
}

// --- Welcome pages ------------------------------------------------------------------------------

constexpr const char *kSettingsFile = "usersettings";
constexpr mode_t kModeOfNew = 0644;
constexpr mode_t kModeUntilCopied = 0600;  // until the new file gets the old one's
constexpr std::chrono::seconds kTurnWait{10};
constexpr const char *kInstance = "ZELO.PKV.App.WelcomeApp.Instance";

using PathText = FixedText<4096>;

void HidePages(Json::Value &settings, bool blHide) {
    Json::Value &instance = settings[kInstance];
    if (!instance.isObject()) {
        instance = Json::Value(Json::objectValue);
    }
    instance["welcome_nvo40_hide"] = blHide;
    instance["welcome_nvo50_hide"] = blHide;
}

// Gives the new file the mode and the owner of the old one, the owner as far as the process may.
void KeepModeAndOwner(const struct stat &old, int fd) {
    if (S_ISREG(old.st_mode)) {
        static_cast<void>(fchown(fd, old.st_uid, old.st_gid) == 0);
        static_cast<void>(fchmod(fd, old.st_mode & 07777U) == 0);
    }
}

bool ShowPages(const char *szUser, bool blShow) {
    PathText folder;
    if (ZELOUserPreferenceDirGet(szUser, folder.Buffer(), PathText::Size()) < 0) {
        ZELO_LOG("Get preference dir failed. [%s] [0x%04X %s:%d]",
                 szUser == nullptr ? "(null)" : szUser, ZELO_LAST_ERROR);
        return false;
    }
    PathText path;
    path.Format("%s/%s", folder.sz(), kSettingsFile);
    PathText temporary;
    temporary.Format("%s.tmp", path.sz());

    // Whoever holds the temporary file reads and replaces the settings; the next one reads those.
    struct stat old = {};
    const bool blThere = stat(path.sz(), &old) == 0;
    const LockedFile file(temporary.sz(), blThere ? kModeUntilCopied : kModeOfNew, kTurnWait);

    Json::Value settings(Json::objectValue);
    if (access(path.sz(), R_OK) == 0) {
        static_cast<void>(json_text::FromFile(path.sz(), settings, &old));
    }
    if (!settings.isObject()) {
        settings = Json::Value(Json::objectValue);
    }
    HidePages(settings, !blShow);
    if (file.IsHeld()) {
        KeepModeAndOwner(old, file.Get());
    }
    if (!file.IsHeld() || !json_text::ToFile(settings, file.Get())) {
        ZELO_LOG("Failed to write usersettins [%s] to [%s]", json::ToLogText(settings).c_str(),
                 temporary.sz());
        return false;
    }
    if (std::rename(temporary.sz(), path.sz()) != 0) {
        ZELO_LOG("Failed to rename [%s] -> [%s] %s", temporary.sz(), path.sz(),
                 std::strerror(errno));
        return false;
    }
    return true;
}

}  // namespace

bool ZELOQRMClientCreateServerUser() {
    return ZELO_GUARD(false, Create);
}

bool ZELOQRMClientDeleteServerUser() {
    return ZELO_GUARD(false, Delete);
}

bool ZELOQRMUserWelcomPage(const char *szUser, bool blShow) {
    return ZELO_GUARD(false, [&] { return ShowPages(szUser, blShow); });
}
