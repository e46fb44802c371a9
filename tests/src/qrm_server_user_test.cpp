// The service account and its welcome pages, in real account files.

#include "children.h"
#include "membership_state.h"
#include "torture.h"

namespace {

using namespace files;
using namespace membership;
using seam::MessagesOf;
using torture::Expected;

using ServerUser = Membership;

// --- The service account ------------------------------------------------------------------------

constexpr char kCharacters[] =
    "0123456789!@#$%%^&*()_+ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";

// Seeds the generator and tells which password it leads to.
std::string Seed() {
    std::srand(7);
    std::string strPassword;
    for (int i = 0; i < 101; ++i) {
        strPassword += kCharacters[std::rand() % 75];
    }
    std::srand(7);
    return strPassword;
}

TEST_F(ServerUser, CreatingTheAccountSurvivesEveryFailingCall) {
    const auto fails = [](const char *szLog, const char *szState) {
        return Expected{"0", szLog, szState};
    };
    const char *szNotHidden = "Failed to hid welcom page for ZelonixQRM. [ZelonixQRM] [E]";
    const std::string strSettings = kSettings;
    const std::string strTemporary = strSettings + ".tmp";
    const Expected done{"1", "", "account member folder hidden"};
    const std::vector<torture::Step> joiningTheGroup = {
        {"ZELOGroupGet('administrators', *)",
         fails("ZELOGroupGet [administrators] failed. [E]", "account")},
        {"calloc(2, 8)", fails("Failed to malloc szNewMembers", "account")},
        {"strdup('ZelonixQRM')", fails("Failed to strdup member [ZelonixQRM]", "account")},
        {"ZELOGroupSet('administrators', *)",
         fails("ZELOGroupSet failed. [administrators] [E]", "account")},
        {"ZELOUserPreferenceDirGet('ZelonixQRM', buf, 4096)",
         {"1", std::string("Get preference dir failed. [ZelonixQRM] [E]\n") + szNotHidden,
          "account member folder"}},
        {"access('" + strSettings + "', 4)", done},
        {"rename('" + strTemporary + "', '" + strSettings + "')",
         {"1",
          "Failed to rename [" + strTemporary + "] -> [" + strSettings +
              "] Read-only file system\n" + szNotHidden,
          "account member folder"}},
        {"mkdir('/usr/zelo/etc/QRM/', 493)", {"1", "", "account member hidden"}},
        {"YLIBServiceTypeReload(8)", done}};
    const std::string strPassword = Seed();
    const auto run = [&](const char *szName, const std::function<void()> &setUp,
                         const Expected &unfaulted, std::vector<torture::Step> steps,
                         const std::vector<torture::Step> &more) {
        steps.insert(steps.end(), more.begin(), more.end());
        const auto begin = [&] {
            setUp();
            Forget();
            Seed();
        };
        torture::Run({szName, "qrm_server_user", begin,
                      [] { return std::to_string(ZELOQRMClientCreateServerUser()); }, AccountState,
                      unfaulted, steps});
    };
    run("new", Reset, done,
        {{"strdup('" + strPassword + "')", fails("Generate random password fail", "")},
         {"ZELOUserGet('ZelonixQRM', *)", done},
         {"ZELOUserAlloc(*, 'ZelonixQRM', '" + strPassword +
              "', 50000, 100, 'This user is used for QRM', '/var/services/homes/ZelonixQRM', "
              "'/sbin/nologin', -1, 1, null)",
          fails("Failed to Alloc USER [ZelonixQRM] [E]", "")},
         {"YLIBUserNumRemained()", fails("YLIBUserNumRemained failed (-1). [E]", "")},
         {"YLIBCMResultAlloc()", fails("YLIBCMResultAlloc failed. [E]", "")},
         {"ZELOUserSetOne(null, *, *)", fails("ZELOUserSet [ZelonixQRM] failed. [E]", "")}},
        joiningTheGroup);

    // One that is there gets a new password.
    const auto refresh = [&](const char *szBefore) -> std::vector<torture::Step> {
        return {{"strdup('" + strPassword + "')", fails("Generate random password fail", szBefore)},
                {"ZELOUserGet('ZelonixQRM', *)",
                 fails("ZELOUserSet [ZelonixQRM] failed. [E]", szBefore)},
                {"YLIBCMResultAlloc()", fails("YLIBCMResultAlloc failed. [E]", szBefore)},
                {"ZELOUserSetOne('ZelonixQRM', *, *)",
                 fails("ZELOUserSet [ZelonixQRM] failed. [E]", szBefore)}};
    };
    run(
        "existing", [] { Clear(WithoutMember()); }, done, refresh("account same password"),
        joiningTheGroup);
    run("member", [] { Clear(s_with); }, {"1", "", "account member"},
        refresh("account member same password"),
        {{"ZELOGroupGet('administrators', *)",
          fails("ZELOGroupGet [administrators] failed. [E]", "account member")}});
}

// What its calls come to when they fail, the table of leaving shows.
TEST_F(ServerUser, AnAccountThatThePlatformStillFindsIsNotDeleted) {
    Clear(s_with);
    fs::create_directories(kFolder);
    EXPECT_EQ(MessagesOf({"ZELOUserGet", 2, true, 0},
                         [] { EXPECT_FALSE(ZELOQRMClientDeleteServerUser()); }),
              "User delete fail");
    EXPECT_EQ(Remains(), "folder");

    Clear(s_with);
    fs::rename("/etc/passwd", "/etc/passwd.kept");
    fs::create_directory("/etc/passwd");
    EXPECT_EQ(MessagesOf([] { EXPECT_FALSE(ZELOQRMClientDeleteServerUser()); }),
              "ZELOUserDelete fail[400]");
    fs::remove("/etc/passwd");
    fs::rename("/etc/passwd.kept", "/etc/passwd");
    EXPECT_EQ(Remains(), "account member");
}

TEST_F(ServerUser, TheMemberListIsRebuiltWithTheAccountAtItsEnd) {
    for (accounts::Names members :
         {accounts::Names(), accounts::Names{"ZelonixQRM2", "zelonixqrm", "Zelonix"}}) {
        Reset();
        ASSERT_EQ(accounts::SetMembers(members), 0);
        const seam::Outcome outcome =
            seam::Observe([] { EXPECT_TRUE(ZELOQRMClientCreateServerUser()); });
        EXPECT_EQ(outcome.recordsLeft, 0);
        members.emplace_back(kUser);
        EXPECT_EQ(accounts::Members(), members);
        EXPECT_EQ(YLIBGroupIsAdminGroupMem(kUser, 0), 1);
    }
}

TEST_F(ServerUser, TheLimitOfAccountsKeepsOnlyANewOneOut) {
    YLIBCINFOSetKeyValue("max_users", "0");
    EXPECT_EQ(MessagesOf([] { EXPECT_FALSE(ZELOQRMClientCreateServerUser()); }),
              "The limit of local account has been reached.");
    EXPECT_EQ(Remains(), "");
    accounts::WriteFiles(s_with);
    EXPECT_TRUE(ZELOQRMClientCreateServerUser());
    YLIBCINFOSetKeyValue("max_users", "2048");
}

// --- Welcome pages ------------------------------------------------------------------------------

TEST_F(ServerUser, SettingsOfAnyKindKeepTheirOtherMembers) {
    const std::string strInstance = "\"ZELO.PKV.App.WelcomeApp.Instance\":";
    const auto switches = [](bool blHide) {
        const std::string strValue = blHide ? "true" : "false";
        return "\"welcome_nvo40_hide\":" + strValue + ",\"welcome_nvo50_hide\":" + strValue;
    };
    const std::string strOnly = '{' + strInstance + '{' + switches(true) + "}}\n";
    const std::string strBig = "\"big\":\"" + std::string(5'000'000, 'x') + '"';
    const std::string strList = "{\"z\":[0" + Repeated(",0", 200'000) + "]}";
    // "-" stands for no file.
    const std::tuple<std::string, bool, std::string> rows[] = {
        {"-", false, strOnly},
        {"", false, strOnly},
        {"no json", false, strOnly},
        {"[1]", false, strOnly},
        {"{\"z\":1," + strInstance + "{\"a\":2,\"welcome_nvo40_hide\":7}}", true,
         '{' + strInstance + "{\"a\":2," + switches(false) + "},\"z\":1}\n"},
        {'{' + strInstance + "\"text\",\"z\":1}", false,
         '{' + strInstance + '{' + switches(true) + "},\"z\":1}\n"},
        {'{' + strBig + '}', false,
         '{' + strInstance + '{' + switches(true) + "}," + strBig + "}\n"},
        {strList, false,
         '{' + strInstance + '{' + switches(true) + "}," + strList.substr(1) + '\n'},
    };
    accounts::WriteFiles(s_with);
    fs::create_directories(kPreference);
    for (const auto &[strBefore, blShow, strAfter] : rows) {
        fs::remove(kSettings);
        if (strBefore != "-") {
            std::ofstream(kSettings) << strBefore;
        }
        EXPECT_TRUE(ZELOQRMUserWelcomPage(kUser, blShow));
        EXPECT_TRUE(FileText(kSettings) == strAfter) << FileText(kSettings).substr(0, 200);
    }
    EXPECT_FALSE(ZELOQRMUserWelcomPage(nullptr, false));
    for (const mode_t mode : {0600U, 0646U}) {
        chmod(kSettings, mode);
        EXPECT_TRUE(ZELOQRMUserWelcomPage(kUser, false));
        EXPECT_EQ(FileMode(kSettings), mode);
    }

    // A folder in the way of either name, and a link that somebody has left for the program to
    // write through.
    const std::string strTemporary = std::string(kSettings) + ".tmp";
    std::ofstream("/tmp/target") << "kept";
    fs::create_symlink("/tmp/target", strTemporary);
    EXPECT_TRUE(ZELOQRMUserWelcomPage(kUser, false));
    const std::string strOther = std::string(kPreference) + "/other";
    std::ofstream(strOther) << "kept";
    fs::create_hard_link(strOther, strTemporary);
    EXPECT_TRUE(ZELOQRMUserWelcomPage(kUser, false));
    EXPECT_EQ(FileText(strOther), "kept");
    fs::create_directories(strTemporary + "/x");
    const auto hide = [] { EXPECT_FALSE(ZELOQRMUserWelcomPage(kUser, false)); };
    EXPECT_EQ(MessagesOf(hide).substr(0, 30), "Failed to write usersettins [{");
    fs::remove_all(strTemporary);
    fs::remove(kSettings);
    fs::create_directory(kSettings);
    EXPECT_EQ(MessagesOf(hide),
              "Failed to rename [" + strTemporary + "] -> [" + kSettings + "] Is a directory");
    EXPECT_TRUE(fs::exists(strTemporary)) << "the new settings stay for a look";
    fs::remove(kSettings);
    EXPECT_TRUE(ZELOQRMUserWelcomPage(kUser, true)) << "and keep nobody waiting";
    EXPECT_FALSE(fs::exists(strTemporary));
}

TEST_F(ServerUser, OverlappingChangesOfOneUsersSettingsLoseNothing) {
    constexpr int kCalls = 150;
    std::string strMembers;
    for (int i = 0; i < 2000; ++i) {
        strMembers += (i == 0 ? "\"m" : ",\"m") + std::to_string(i) + "\":" + std::to_string(i);
    }
    accounts::WriteFiles(s_with);
    fs::create_directories(kPreference);
    WriteFile(kSettings, '{' + strMembers + '}');
    std::string strContents[2];
    for (const bool blShow : {false, true}) {
        ASSERT_TRUE(ZELOQRMUserWelcomPage(kUser, blShow));
        strContents[blShow ? 1 : 0] = FileText(kSettings);
    }
    EXPECT_TRUE(children::InEach(4, [&](int process) {
        bool blAll = true;
        for (int i = 0; blAll && i < kCalls; ++i) {
            const std::string strContent = FileText(kSettings);
            blAll = (strContent == strContents[0] || strContent == strContents[1]) &&
                    (process == 0 || ZELOQRMUserWelcomPage(kUser, process == 1));
        }
        return blAll;
    }));
    EXPECT_FALSE(fs::exists(std::string(kSettings) + ".tmp"));
}

}  // namespace
