// Users and groups: what is stored, what stays as it was, and that the system's own checks agree.

#include <crypt.h>
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <ctime>
#include <functional>
#include <map>
#include <new>
#include <thread>

#include "accounts.h"
#include "children.h"
#include "failures.h"
#include "key_value_file.h"

namespace {

// What the clock shows; 0: the machine's.
std::time_t g_now = 0;

// The thread's allocations, and the one of them that fails; 0: none.
thread_local int t_allocations = 0;
thread_local int t_failing = 0;

}  // namespace

// Takes the C library's place, for the platform too.
std::time_t time(std::time_t *pTime) noexcept {
    timespec now = {};
    clock_gettime(CLOCK_REALTIME, &now);
    const std::time_t shown = g_now == 0 ? now.tv_sec : g_now;
    if (pTime != nullptr) {
        *pTime = shown;
    }
    return shown;
}

namespace {

using namespace files;
using namespace accounts;

constexpr const char *kName = "ZelonixQRM";
constexpr const char *kHome = "/var/services/homes/ZelonixQRM";
const std::string kPassword = std::string(100, 'p') + '1';

User NewUser(const std::string &strName, uid_t uid, const std::string &strPassword = kPassword,
             gid_t gid = 100, const char *szDescription = "This user is used for QRM") {
    ZELO_USER *pUser = nullptr;
    const std::string strHome = "/var/services/homes/" + strName;
    EXPECT_EQ(ZELOUserAlloc(&pUser, strName.c_str(), strPassword.c_str(), uid, gid, szDescription,
                            strHome.c_str(), "/sbin/nologin", -1, 1, nullptr),
              0);
    return {pUser, ZELOUserFree};
}

// Each test begins with the accounts and settings of a fresh box.
class UserGroup : public testing::Test {
  protected:
    void SetUp() override {
        static const Files fresh = ReadFiles();
        m_before = fresh;
        WriteFiles(fresh);
        fs::remove_all("/var/services");
        fs::remove_all("/usr/zelo/etc/preference");
        EXPECT_EQ(YLIBCFileSetKeyValue(kConfig, "max_users", "100", 0), 0);
        ASSERT_EQ(Findings(), "");
    }
    Files m_before;
};

TEST_F(UserGroup, AUserIsAddedRefreshedAndDeletedAndNothingElseChanges) {
    chmod("/etc/shadow", 0640);
    YLIBCM_RESULT *pResult = YLIBCMResultAlloc();
    ASSERT_EQ(ZELOUserSetOne(nullptr, NewUser(kName, 50000).get(), &pResult), 0);
    EXPECT_EQ(pResult->nDone, 1);
    YLIBCMResultFree(pResult);
    Files now = ReadFiles();
    EXPECT_EQ(now["passwd"], m_before["passwd"] +
                                 "ZelonixQRM:x:50000:100:This user is used for QRM:/var/services/"
                                 "homes/ZelonixQRM:/sbin/nologin\n");
    EXPECT_EQ(now["shadow"].compare(0, m_before["shadow"].size(), m_before["shadow"]), 0);
    EXPECT_EQ(now["group"] + now["gshadow"], m_before["group"] + m_before["gshadow"]);
    EXPECT_EQ(FileMode("/etc/shadow"), 0640U);
    EXPECT_EQ(FileMode(kHome), 0700U);
    EXPECT_EQ(Findings(), "");

    const std::string strHash = PasswordIn("shadow", kName);
    const User pUser = Get(kName);
    EXPECT_STREQ(pUser->szName, kName);
    EXPECT_STREQ(pUser->szPassword, "");
    EXPECT_EQ(std::vector<long>({pUser->uid, pUser->gid, pUser->nExpireDay, pUser->blEnabled}),
              std::vector<long>({50000, 100, -1, 1}));
    EXPECT_STREQ(pUser->szHome, kHome);
    EXPECT_EQ(Change(pUser), 0);
    EXPECT_EQ(ReadFiles(), now);
    pUser->nExpireDay = 25000;
    EXPECT_EQ(std::string("new").copy(pUser->szPassword, 3), 3U);
    EXPECT_EQ(Change(pUser), 0);
    EXPECT_EQ(Get(kName)->nExpireDay, 25000);
    EXPECT_EQ(ReadFiles()["passwd"], now["passwd"]);
    EXPECT_NE(PasswordIn("shadow", kName), strHash);
    EXPECT_EQ(SetMembers({"nobody", kName, "daemon"}), 0);
    EXPECT_EQ(Findings(), "");

    char szPath[64];
    EXPECT_EQ(ZELOUserPreferenceDirGet(kName, szPath, sizeof(szPath)), 0);
    std::ofstream(std::string(szPath) + "/usersettings") << "{}";
    EXPECT_EQ(Delete({kName, "nosuchuser"}), 0);
    EXPECT_EQ(Get(kName), nullptr);
    EXPECT_EQ(Members(), Names({"nobody", "daemon"}));
    EXPECT_EQ(Findings(), "");
    EXPECT_EQ(SetMembers({}), 0);
    EXPECT_EQ(ReadFiles(), m_before);
    EXPECT_FALSE(fs::exists(kHome));
    EXPECT_FALSE(fs::exists(szPath));
}

TEST_F(UserGroup, EveryCharacterOfThePasswordCounts) {
    ASSERT_EQ(kPassword.size(), 101U);
    ASSERT_EQ(Add(NewUser(kName, 50000)), 0);
    const std::string strHash = PasswordIn("shadow", kName);
    EXPECT_EQ(strHash.compare(0, 3, "$y$"), 0);
    EXPECT_EQ(crypt(kPassword.c_str(), strHash.c_str()), strHash);
    EXPECT_NE(crypt((std::string(100, 'p') + '2').c_str(), strHash.c_str()), strHash);

    const User pUser = Get(kName);
    for (const int blEnabled : {0, 0, 1, 1}) {
        pUser->blEnabled = blEnabled;
        EXPECT_EQ(Change(pUser), 0);
        EXPECT_EQ(Get(kName)->blEnabled, blEnabled);
        EXPECT_EQ(PasswordIn("shadow", kName), (blEnabled ? "" : "!") + strHash);
    }
    std::ofstream("/etc/shadow", std::ios::app) << "silent:left-behind:1::::::\n";
    EXPECT_EQ(Add(NewUser("silent", 50001, "")), 0);
    EXPECT_EQ(PasswordIn("shadow", "silent"), "!");
}

TEST_F(UserGroup, OnlyMembersAreAdministrators) {
    EXPECT_EQ(Add(NewUser(kName, 50000)), 0);
    EXPECT_EQ(Add(NewUser("first", 1500, "", 101)), 0);
    const std::pair<Names, int> rows[] = {{{}, 0},
                                          {{"ZelonixQRM2"}, 0},
                                          {{"zelonixqrm", "nobody"}, 0},
                                          {{kName}, 1},
                                          {{"ZelonixQRM2", kName, "nobody"}, 1}};
    for (const auto &[members, result] : rows) {
        EXPECT_EQ(SetMembers(members), 0);
        EXPECT_EQ(Members(), members);
        EXPECT_EQ(YLIBGroupIsAdminGroupMem(kName, 0), result);
    }
    EXPECT_EQ(YLIBGroupIsAdminGroupMem("first", 0), 1) << "the group that it has from the start";
    EXPECT_EQ(SetMembers({"ghost"}), 0);
    EXPECT_EQ(YLIBGroupIsAdminGroupMem("ghost", 0), 0);
    for (const char *szBad : {"", "a,b", "a:b", "a\nb"}) {
        EXPECT_LT(SetMembers({"nobody", szBad}), 0);
        EXPECT_EQ(Members(), Names({"ghost"}));
    }
}

TEST_F(UserGroup, OnlyTheDifferenceToWhatWasReadIsWritten) {
    // First, what others have made of {a, b, c} since it was read.
    const std::tuple<Names, Names, Names> rows[] = {
        {{"a", "b", "c"}, {"c", "x", "a"}, {"c", "x", "a"}},
        {{"a", "b", "c", "new"}, {"a", "b", "c", "x"}, {"a", "b", "c", "new", "x"}},
        {{"b", "c"}, {"a", "b", "c", "x"}, {"b", "c", "x"}},
        {{"a", "b", "c", "new"}, {"a"}, {"a", "new"}},
        {{"x"}, {"a", "b", "c", "x"}, {"x"}},
        {{"new"}, {"a", "b", "c"}, {"new"}},
    };
    for (const auto &[now, set, after] : rows) {
        EXPECT_EQ(SetMembers({"a", "b", "c"}), 0);
        const Group pGroup = Administrators();
        EXPECT_EQ(SetMembers(now), 0);
        EXPECT_EQ(SetMembers(set, pGroup), 0);
        EXPECT_EQ(Members(), after);
        EXPECT_EQ(SetMembers({"a", "b", "c"}, pGroup), 0);
        EXPECT_EQ(SetMembers(set, pGroup), 0) << "what was set counts as read";
        const Names again = Members();
        EXPECT_TRUE(std::is_permutation(after.begin(), after.end(), again.begin(), again.end()));
    }
    const Group pOwn(new ZELO_GROUP(), ZELOGroupFree);
    EXPECT_EQ(SetMembers({"b"}, pOwn), 0);
    EXPECT_EQ(Members(), Names({"b"}));
}

TEST_F(UserGroup, WhatCannotBeReadIsNotTakenForMissing) {
    ASSERT_EQ(Add(NewUser(kName, 50000)), 0);
    const std::function<int()> lookUps[] = {
        [] { return Get(kName) == nullptr ? -1 : 0; },
        [] { return Administrators() == nullptr ? -1 : 0; },
        [] { return YLIBGroupIsAdminGroupMem(kName, 0); }, [] { return YLIBUserNumRemained(); },
        [] { return YLIBGroupExtraAdminSet("QRM", 0, 0, 0, 0); }};
    const std::map<std::string, int> expected = {
        {"/etc/passwd", 3}, {"/etc/group", 2}, {kConfig, 2}};
    for (const auto &[strFile, lost] : expected) {
        const std::string strKept = strFile + ".kept";
        fs::rename(strFile, strKept);
        for (const bool blFolder : {true, false}) {
            int failed = 0;
            blFolder ? fs::create_directory(strFile) : fs::remove(strFile);
            for (const auto &lookUp : lookUps) {
                YLIBCErrSetEx(YLIBC_ERR_NOT_FOUND, "", 0);
                failed += FailureOf(lookUp()) == YLIBC_ERR_FILE ? 1 : 0;
            }
            // A setting that the missing file does not hold has its default.
            EXPECT_EQ(failed, strFile == kConfig && !blFolder ? 0 : lost) << strFile;
        }
        fs::rename(strKept, strFile);
    }
    EXPECT_EQ(Get("nosuchuser"), nullptr);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NOT_FOUND));
}

TEST_F(UserGroup, APasswordThatIsSetWithoutAClockNeedNotBeChanged) {
    for (const std::time_t now : {5L, 86'400L * 20'000}) {
        g_now = now;
        EXPECT_EQ(Add(NewUser(kName, 50000)), 0);
        g_now = 0;
        const std::string strLine = PasswordIn("shadow", kName) + (now == 5 ? "::" : ":20000:");
        EXPECT_TRUE(Holds(ReadFiles()["shadow"], ':' + strLine));
        EXPECT_EQ(Delete({kName}), 0);
    }
}

TEST_F(UserGroup, WhatCannotBeStoredIsRefused) {
    ASSERT_EQ(Add(NewUser("present", 1500)), 0);
    const Files before = ReadFiles();
    const std::tuple<const char *, User, YLIBC_ERROR> rows[] = {
        {nullptr, NewUser("present", 1501), YLIBC_ERR_EXISTS},
        {nullptr, NewUser("twin", 1500), YLIBC_ERR_EXISTS},
        {nullptr, NewUser("lost", 1501, "", 4711), YLIBC_ERR_NOT_FOUND},
        {"absent", NewUser("absent", 1501), YLIBC_ERR_NOT_FOUND},
        {"present", NewUser("renamed", 1500), YLIBC_ERR_INVALID_ARGUMENT},
        {nullptr, NewUser("..", 1501), YLIBC_ERR_INVALID_ARGUMENT},
        {nullptr, NewUser("a/b", 1501), YLIBC_ERR_INVALID_ARGUMENT},
        {nullptr, NewUser("a\nb", 1501), YLIBC_ERR_INVALID_ARGUMENT},
        {nullptr, NewUser("-a", 1501), YLIBC_ERR_INVALID_ARGUMENT},
        {nullptr, NewUser("a", 1501, "", 100, "x:/:/bin/sh"), YLIBC_ERR_INVALID_ARGUMENT},
        {nullptr, NewUser("a", 1501, "", 100, "x\nroot2::0:0::/:"), YLIBC_ERR_INVALID_ARGUMENT},
        {nullptr, NewUser("a", static_cast<uid_t>(-1)), YLIBC_ERR_INVALID_ARGUMENT},
        {nullptr, User(nullptr, ZELOUserFree), YLIBC_ERR_INVALID_ARGUMENT},
    };
    for (const auto &[szCurrent, pUser, error] : rows) {
        EXPECT_EQ(FailureOf(ZELOUserSetOne(szCurrent, pUser.get(), nullptr)), error)
            << (pUser == nullptr ? "" : pUser->szName);
    }
    EXPECT_EQ(Delete({"present", "root"}), -1);
    EXPECT_EQ(Delete({"present", nullptr}), -1);
    EXPECT_EQ(ReadFiles(), before);
    ZELO_USER *pUser = nullptr;
    const std::string strLong(sizeof(pUser->szPassword), 'x');
    EXPECT_LT(ZELOUserAlloc(&pUser, "a", strLong.c_str(), 1, 1, "", "/", "", -1, 1, nullptr), 0);
    EXPECT_EQ(pUser, nullptr);
}

TEST_F(UserGroup, TheNumberOfUsersIsLimited) {
    EXPECT_EQ(YLIBUserNumRemained(), 100);
    EXPECT_EQ(YLIBCFileSetKeyValue(kConfig, "max_users", "1", 0), 0);
    EXPECT_EQ(Add(NewUser("system", 900)), 0);
    EXPECT_EQ(YLIBUserNumRemained(), 1);
    EXPECT_EQ(Add(NewUser(kName, 50000)), 0);
    EXPECT_EQ(YLIBUserNumRemained(), 0);
    EXPECT_EQ(FailureOf(Add(NewUser("more", 50001))), YLIBC_ERR_LIMIT);
    EXPECT_EQ(Change(NewUser(kName, 50000)), 0);
    EXPECT_EQ(YLIBCFileSetKeyValue(kConfig, "max_users", "many", 0), 0);
    EXPECT_LT(YLIBUserNumRemained(), 0);
    fs::remove(kConfig);
    YLIBCErrSetEx(0x1234, "before", 7);
    EXPECT_GT(YLIBUserNumRemained(), 0);
    EXPECT_EQ(YLIBCErrGet(), 0x1234U) << "a success is no error";
}

TEST_F(UserGroup, LinesOfAnyFormStayByteForByte) {
    const Files odd = {
        {"passwd",
         "# a comment\n\nroot:x:0:0:root:/root:/bin/sh\nno fields\n short:x:7\n"
         "odd:x:0012:0100:\xff, text:/odd:\nroot:x:0:0:again:/root:/bin/sh\nend:*:9:9::/:"},
        {"shadow", "root:*:19700::::::\n#\nodd:!!:0:00:99999:7:::\n+nis"},
        {"group", "administrators:x:101:root,odd\r\n\nusers:!:100:odd,odd,\nx\n"},
        {"gshadow", "users:!:odd:odd, odd\nadministrators:*::\n::\n"}};
    WriteFiles(odd);
    EXPECT_EQ(Add(NewUser(kName, 50000)), 0);
    Files now = ReadFiles();
    for (const char *szFile : {"passwd", "shadow"}) {
        EXPECT_EQ(now[szFile].find(odd.at(szFile) + "\nZelonixQRM:"), 0U);
    }
    EXPECT_EQ(SetMembers({"root", kName}), 0);
    now = ReadFiles();
    EXPECT_EQ(now["group"], "administrators:x:101:root,ZelonixQRM\n\nusers:!:100:odd,odd,\nx\n");
    EXPECT_EQ(now["gshadow"], "users:!:odd:odd, odd\nadministrators:*::root,ZelonixQRM\n::\n");
    EXPECT_EQ(Delete({kName}), 0);
    now = ReadFiles();
    EXPECT_EQ(now["passwd"] + now["shadow"], odd.at("passwd") + '\n' + odd.at("shadow") + '\n');
    EXPECT_EQ(now["group"], "administrators:x:101:root\n\nusers:!:100:odd,odd,\nx\n");
}

TEST_F(UserGroup, ShadowFilesMayBeMissingWhollyOrInPart) {
    Files partly = m_before;
    partly["passwd"] += "ZelonixQRM:x:50000:100::/:/bin/sh\n";
    partly["gshadow"] = partly["gshadow"].substr(0, partly["gshadow"].find("administrators"));
    partly["group"] = partly["group"].substr(0, partly["group"].find("nogroup"));
    partly["passwd"].replace(partly["passwd"].find("65534:65534"), 11, "65534:100");
    WriteFiles(partly);
    EXPECT_NE(Findings(), "");
    EXPECT_EQ(Change(NewUser(kName, 50000)), 0);
    EXPECT_EQ(SetMembers({kName}), 0);
    EXPECT_EQ(Findings(), "");

    partly["passwd"].replace(partly["passwd"].find("QRM:x:") + 4, 1, "$y$hash");
    WriteFiles(partly);
    EXPECT_EQ(Change(NewUser(kName, 50000, "")), 0);
    EXPECT_TRUE(Holds(ReadFiles()["shadow"], "ZelonixQRM:$y$hash::")) << "need not be changed";

    m_before.erase("shadow");
    m_before.erase("gshadow");
    WriteFiles(m_before);
    EXPECT_EQ(Add(NewUser(kName, 50000)), 0);
    const std::string strHash = PasswordIn("passwd", kName);
    EXPECT_EQ(crypt(kPassword.c_str(), strHash.c_str()), strHash);
    EXPECT_EQ(SetMembers({kName}), 0);
    EXPECT_EQ(Findings(), "");
    EXPECT_EQ(Delete({kName}), 0);
    EXPECT_EQ(ReadFiles(), m_before);
}

TEST_F(UserGroup, AChangeThatFailsHalfWayIsTakenBack) {
    m_before["passwd"] += '#' + std::string(4000, '-') + '\n';
    WriteFiles(m_before);
    EXPECT_TRUE(children::InOne([] {
        const struct rlimit limit = {2000, 2000};
        signal(SIGXFSZ, SIG_IGN);
        return setrlimit(RLIMIT_FSIZE, &limit) == 0 && Add(NewUser(kName, 50000)) < 0 &&
               YLIBCErrGet() == YLIBC_ERR_FILE &&
               failures::Reason() == "cannot write '/etc/passwd': File too large";
    }));
    EXPECT_EQ(ReadFiles(), m_before);
}

TEST_F(UserGroup, ShortMemoryLeavesAllOfAChangeOrNothing) {
    ASSERT_EQ(Add(NewUser(kName, 50000)), 0);
    ASSERT_EQ(SetMembers({kName}), 0);
    const Files before = ReadFiles();
    const User pLocked = Get(kName);
    pLocked->blEnabled = 0;
    pLocked->szDescription[0] = '!';
    int failures = 0;
    for (const std::function<int()> &change : std::initializer_list<std::function<int()>>{
             [&] { return Change(pLocked); }, [] { return Delete({kName}); }}) {
        t_allocations = t_failing = 0;
        EXPECT_EQ(change(), 0);
        const int all = t_allocations;
        const Files after = ReadFiles();
        for (int nth = std::max(all - 60, 1); nth <= all; ++nth) {
            WriteFiles(before);
            t_allocations = 0;
            t_failing = nth;
            const int result = change();
            t_failing = 0;
            failures += result < 0 ? 1 : 0;
            EXPECT_EQ(ReadFiles(), result < 0 ? before : after) << "allocation -" << all - nth;
        }
        WriteFiles(before);
    }
    EXPECT_GT(failures, 60);
}

TEST_F(UserGroup, ProcessesAndThreadsChangeAccountsAtOnceAndLoseNothing) {
    constexpr int kProcesses = 5;
    constexpr int kUsers = 4;
    alarm(500);
    EXPECT_TRUE(children::InEach(kProcesses, [](int i) {
        std::atomic<int> added = 0;
        const auto add = [&](int first) {
            for (int n = first; n < kUsers; n += 2) {
                const std::string strName = "p" + std::to_string(i) + "u" + std::to_string(n);
                added += Add(NewUser(strName, static_cast<uid_t>(2000 + 10 * i + n))) == 0;
            }
        };
        std::thread other(add, 1);
        add(0);
        other.join();
        Add(NewUser("wanted", static_cast<uid_t>(3000 + i)));
        return added == kUsers && Delete({("p" + std::to_string(i) + "u0").c_str()}) == 0;
    }));
    EXPECT_EQ(Delete({"wanted0"}), 0);
    EXPECT_GT(alarm(0), 0U);
    EXPECT_EQ(YLIBUserNumRemained(), 100 - kProcesses * (kUsers - 1) - 1);
    EXPECT_EQ(Findings(), "");
}

TEST_F(UserGroup, PreferencesStayInTheirFolder) {
    char szPath[4096] = "before";
    ASSERT_EQ(Add(NewUser(kName, 50000)), 0);
    std::ofstream("/etc/passwd", std::ios::app)
        << "..:x:1:1::/:\na/../../b:x:1:1::/:\n.:x:1:1::/:\n";
    for (const char *szName : {"..", ".", "a/../../b", "", "nosuchuser", "/etc", "ZelonixQR"}) {
        EXPECT_LT(ZELOUserPreferenceDirGet(szName, szPath, sizeof(szPath)), 0) << szName;
    }
    EXPECT_LT(ZELOUserPreferenceDirGet(kName, szPath, 20), 0);
    EXPECT_STREQ(szPath, "before");
    EXPECT_FALSE(fs::exists("/usr/zelo/etc/preference"));
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(ZELOUserPreferenceDirGet(kName, szPath, sizeof(szPath)), 0);
        EXPECT_STREQ(szPath, "/usr/zelo/etc/preference/ZelonixQRM");
    }
    EXPECT_EQ(FileMode(szPath), 0700U);
}

}  // namespace

void *operator new(std::size_t cb) {
    void *const p = ++t_allocations == t_failing ? nullptr : std::malloc(cb);
    return p == nullptr ? throw std::bad_alloc() : p;
}

void operator delete(void *p) noexcept {
    std::free(p);
}

void operator delete(void *p, std::size_t /*cb*/) noexcept {
    std::free(p);
}
