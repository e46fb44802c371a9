// Membership: join status, leaving, the plug-ins around it, the service account and its welcome
// pages, against a real store, real accounts, a real daemon and real programs.

#include <algorithm>
#include <numeric>

#include "children.h"
#include "indicators.h"
#include "joined.h"
#include "json.h"
#include "last_error.h"
#include "membership.h"
#include "membership_state.h"
#include "service.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

using namespace files;
using joined::Messages;
using membership::kUser;
using membership::kWhole;
using seam::MessagesOf;
using torture::Expected;

constexpr const char *kTold = "/tmp/told";
constexpr const char *kPluginFolder = "/usr/zelo/etc/plugins/qrm_client/disjoin";
constexpr const char *kSettings = "/usr/zelo/etc/preference/ZelonixQRM/usersettings";
constexpr const char *kFlagCheck =
    "YLIBCFileCheckKeyValue('/etc/zeloinfo.conf', 'join_nvo_qrm', 'yes', 0)";

class Membership : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        fs::create_directories(kPluginFolder);
        WriteProgram(std::string(kPluginFolder) + "/50-told",
                     "echo \"$1 $QRM_CLIENT_RESULT <$QRM_CLIENT_HOST> "
                     "<$QRM_CLIENT_PROTOCOL> $QRM_CLIENT_PORT <$QRM_CLIENT_SN> "
                     "$QRM_CLIENT_REJOIN $QRM_CLIENT_FROM "
                     "$QRM_CLIENT_CLEAR_GLUSTER\" >>/tmp/told");
        s_without = accounts::ReadFiles();
        ASSERT_TRUE(ZELOQRMClientCreateServerUser());
        s_with = accounts::ReadFiles();
    }
    static void TearDownTestSuite() { membership::Clear(s_without); }
    void SetUp() override { Reset(); }

    static void Reset() {
        membership::Clear(s_without);
        Forget();
    }
    // The account, in no group of its own.
    static accounts::Files WithoutMember() {
        accounts::Files files = s_with;
        files["group"] = s_without["group"];
        files["gshadow"] = s_without["gshadow"];
        return files;
    }
    static void BuildWhole() {
        membership::Build(s_with);
        Forget();
    }
    static void Forget() {
        fs::remove(kTold);
        fs::remove(kJournal);
        YLIBCErrSetEx(0x123, "x", 1);
    }

    // The account's state, the system's own checks included.
    static std::string AccountState() {
        return membership::Remains() + accounts::Findings() +
               (accounts::ReadFiles()["shadow"] == s_with["shadow"] ? " same password" : "") +
               (fs::exists(kSettings) ? " hidden" : "");
    }

    inline static accounts::Files s_without;
    inline static accounts::Files s_with;
};

// --- Join status --------------------------------------------------------------------------------

// Of each indicator beside the flag: when not joined, and when joined.
constexpr std::pair<const char *, const char *> kRules[] = {
    {"FALSE == blJoined && 0 <= CredId", "TRUE == blJoined && 0 > CredId"},
    {"FALSE == blJoined && 0 <= CredId", "TRUE == blJoined && 0 > CredId"},
    {"FALSE == blJoined && 0 == runRet", "TRUE == blJoined && 1 == runRet"},
    {"FALSE == blJoined && true == blSessionExist", "TRUE == blJoined && false == blSessionExist"},
    {nullptr, "TRUE == blJoined"},
    {nullptr, nullptr}};

// The look-ups of the first so many indicators beside the flag: a session is 0 for absent, 2 where
// the machine's is the only one, an account 0 for absent.
std::string LookUps(int count, int session, int account) {
    const std::string lookUps[] = {
        "\nZELOCredIDGetByApplication('ZELO.QRM')",
        "\nZELOCredIDGetByApplication('ZELO.NotificationCenter')",
        "\nYLIBCExec('/usr/zelo/etc/rc.d/S99zelocache.sh', 'status', null, null, null)",
        std::string("\nZeloCgiInit('', *)\nZeloCgiSessionExistByIndex(*, 13, 'ZELO.QRM.Client')") +
            (session == 1 ? "" : "\nZeloCgiSessionExistByIndex(*, 13, 'ZELO.QRM.Client.Machine')"),
        std::string("\nZELOUserGet('ZelonixQRM', *)") +
            (account == 0 ? "" : "\nYLIBGroupIsAdminGroupMem('ZelonixQRM', 0)")};
    return std::accumulate(lookUps, lookUps + count, std::string(kFlagCheck));
}

TEST_F(Membership, TheFirstRuleThatHoldsDecidesAndTheExplanationAgrees) {
    // One indicator is wrong, those before it are as they should be, and those after it are wrong
    // too; of sessions and of accounts there is another kind that comes to the same.
    const auto check = [](bool blJoined, int wrong, bool blOther) {
        const auto isThere = [&](int indicator) { return blJoined == (indicator < wrong); };
        const int session = isThere(3) ? (blOther ? 2 : 1) : 0;
        const int account = isThere(4) ? 1 : (blOther ? 2 : 0);
        YLIBCINFOSetKeyValue("join_nvo_qrm", blJoined ? "yes" : "no");
        membership::Daemon(isThere(2) ? "start" : "stop");
        accounts::WriteFiles(account == 0 ? s_without : account == 1 ? s_with : WithoutMember());
        stored::Clear();
        for (int i = 0; i < 2; ++i) {
            if (isThere(i)) {
                stored::AddCredential(membership::kApplications[i], "h");
            }
            membership::ForSession(
                session == 1 + i ? ZeloCgiAddSessionByIndex : ZeloCgiRemoveSessionByIndex,
                membership::kSessions[i]);
        }
        for (const char *szFault : {"", "YLIBCFileCheckKeyValue"}) {
            SCOPED_TRACE(szFault);
            const bool blRead = szFault[0] == '\0';
            const bool blBroken = blRead && wrong < (blJoined ? 5 : 4);
            const char *szRule = blJoined ? kRules[wrong].second : kRules[wrong].first;
            const std::string strMessage =
                blBroken ? std::string("Status Error: [") + szRule + ']' : "";
            int result = 2;
            const seam::Outcome outcome =
                seam::Observe({szFault}, [&] { result = ZELOQRMClientStatus(); });
            EXPECT_EQ(result, blBroken ? -1 : blRead && blJoined);
            EXPECT_EQ(Messages(outcome), strMessage);
            EXPECT_EQ(torture::Joined(outcome.details, "\n"),
                      LookUps(blBroken ? wrong + 1 : 5, session, account));
            EXPECT_EQ(outcome.recordsLeft, 0);

            std::vector<qrmctl::Indicator> explained;
            seam::Observe({szFault}, [&] { explained = qrmctl::ReadIndicators(); });
            const auto first = std::find_if(explained.begin(), explained.end(),
                                            [](const auto &one) { return one.rule != 0; });
            EXPECT_EQ(explained.size(), 6U);
            ASSERT_EQ(first != explained.end(), blBroken);
            if (blBroken) {
                EXPECT_EQ(first->rule, blJoined && account == 0 && wrong == 4
                                           ? 9
                                           : 2 * wrong + (blJoined ? 2 : 1));
                EXPECT_EQ("Status Error: [" + first->strRule + ']', strMessage);
                EXPECT_NE(first->strRemedy, "");
            }
        }
    };
    for (int i = 0; i < 2 * 6 * 2; ++i) {
        SCOPED_TRACE(i);
        check(i % 2 == 1, i / 4, i / 2 % 2 == 1);
    }

    BuildWhole();
    EXPECT_EQ(MessagesOf({"YLIBCExec", 1, true, 3}, [] { EXPECT_EQ(ZELOQRMClientStatus(), 1); }),
              "")
        << "a daemon that is neither running nor stopped fits both";
}

// --- Leave --------------------------------------------------------------------------------------

// The first three words of each line that the plug-in wrote, and how many users were told.
std::string Told() {
    std::string strAll;
    for (const std::string &strLine : FileLines(kTold)) {
        strAll.append(1, ' ').append(strLine, 0, strLine.find('>') + 1);
    }
    return strAll + " notified=" + std::to_string(joined::CountLines(kJournal));
}

constexpr const char *kAdminCenter = "ZELO.PKV.AdminCenter.Application";
constexpr const char *kGone = "qrm_server_credential cannot find qrm server info";
constexpr const char *kPre = " pre 0 <server.example>";
constexpr const char *kLeft = " post 0 <server.example>";
constexpr const char *kFailed = " post -1 <server.example>";

// What an ordinary leave has to come to: one that ends as it should clears the flag and tells the
// users, for which the server is looked up once more.
Expected Row(const std::string &strRemains, const std::string &strTold,
             const std::string &strLog = "", const std::string &strLogAfter = "",
             bool blGone = true) {
    const bool blDone = strRemains.find("'yes'") == std::string::npos;
    std::string strAll;
    for (const std::string &strLine :
         {strLog, std::string(blDone && blGone ? kGone : ""), strLogAfter}) {
        strAll += (strAll.empty() || strLine.empty() ? "" : "\n") + strLine;
    }
    return {blDone ? "1" : "0", strAll,
            strRemains + " |" + strTold + (blDone ? " notified=1" : " notified=0")};
}

// The calls of an action, with what they tell.
std::string ActionCalls(const std::string &strRejoin, const std::string &strAction) {
    return "YLIBPluginHasInit(*)"
           "\nYLIBPluginSetArgByInt(*, 'RESULT', 0)"
           "\nYLIBPluginSetArg(*, 'HOST', 'server.example')"
           "\nYLIBPluginSetArg(*, 'PROTOCOL', 'https')"
           "\nYLIBPluginSetArg(*, 'PORT', '443')"
           "\nYLIBPluginSetArg(*, 'SN', 'S1')"
           "\nYLIBPluginSetArg(*, 'REJOIN', '" +
           strRejoin +
           "')\nYLIBPluginSetArg(*, 'FROM', '1')"
           "\nYLIBPluginSetArg(*, 'CLEAR_GLUSTER', '1')"
           "\nYLIBPluginAction(" +
           strAction + ", *)";
}

const Expected kDone = Row("", std::string(kPre) + kLeft);

// The calls of a leave with what each comes to when it fails. Of one that is to join again they are
// others, and only they are told.
std::vector<torture::Step> LeaveSteps(bool blRejoin) {
    const std::string strFile = "qrm_delete_server ";
    const std::string strBoth = std::string(kPre) + kLeft;
    const auto stopped = [&](const std::string &strRemains, const std::string &strLog) {
        return Row(strRemains, std::string(kPre) + kFailed, strLog);
    };
    const auto disagrees = [&](const char *szRule) {
        return Row("", strBoth, strFile + "Status Error: [" + szRule + ']');
    };
    const std::string strSessions = "ZELO.QRM.Client ZELO.QRM.Client.Machine ";
    const std::string strRest = "account member folder 'yes' rights";
    const auto noCredential = [&](const std::string &strCredentials) {
        return stopped(strCredentials + strSessions + strRest,
                       strFile + "Remove zelocredential fail");
    };
    const auto noSession = [&](const std::string &strLeft, const char *szLog) {
        return stopped(strLeft + strRest, strFile + szLog + '\n' + strFile + "Remove session fail");
    };
    const auto noUser = [&](const char *szLog) {
        return stopped(
            strRest, std::string("qrm_server_user ") + szLog + '\n' + strFile + "Remove User fail");
    };
    const std::string strNoPre = strFile + "Fail to execute disjoin plugin (PRE)";
    const std::string strNoPost = strFile + "Fail to execute disjoin plugin (POST)";
    Expected nothing = Row(kWhole, "");
    nothing.strResult = "1";
    Expected untold = kDone;
    untold.strStored.back() = '0';
    Expected noHash = untold;
    noHash.strLog = strFile + "Failed to execute YLIBCSzHash operations";
    std::vector<torture::Step> steps = {
        {kFlagCheck, nothing},
        {"ZELOCredIDGetByApplication('ZELO.QRM')", disagrees(kRules[0].second)},
        {"ZELOCredIDGetByApplication('ZELO.NotificationCenter')", disagrees(kRules[1].second)},
        {"YLIBCExec('/usr/zelo/etc/rc.d/S99zelocache.sh', 'status', null, null, null)", kDone},
        {"ZeloCgiInit('', *)", Row("", strBoth,
                                   strFile + "ZeloCgiInit fail\n" + strFile + "Status Error: [" +
                                       kRules[3].second + ']')},
        {"ZeloCgiSessionExistByIndex(*, 13, 'ZELO.QRM.Client')", kDone},
        {"ZELOUserGet('ZelonixQRM', *)\nYLIBGroupIsAdminGroupMem('ZelonixQRM', 0)",
         disagrees("TRUE == blJoined")},
        {"ZELOCredIDGetByApplication('ZELO.QRM')"
         "\nZELOCredAlloc()"
         "\nZELOCredLoad(1, *)"
         "\nZELOCredItemGetHost(buf, 1024, *)"
         "\nZELOCredItemGetProtocol(buf, 1024, *)"
         "\nZELOCredItemGetExtraInfo(buf, 4096, *)"
         "\nZELOCredItemGetPort(*, *)",
         Row("", " pre 0 <> post 0 <>")},
        {"YLIBPluginSDKInit('qrm_client', 'qrm_client/disjoin', *)",
         Row("", "",
             "qrm_plugin Fail to do plugin init[E]\n" + strFile + "Plugin init failed.\n" +
                 strNoPre,
             strNoPost)},
        {ActionCalls(blRejoin ? "1" : "0", "4"), Row("", kLeft, strNoPre)},
        {"YLIBCExec('/usr/zelo/etc/rc.d/S99zelocache.sh', 'stop', null, null, null)",
         stopped(kWhole, strFile + "Stop cache daemon fail")},
        {"ZELOCredIDGetByApplication('ZELO.QRM')", Row("ZELO.QRM", strBoth, "", "", false)},
        {"ZELOCredSessRemoveByID(1)\nZELOCredRemoveByID(1)",
         noCredential("ZELO.QRM ZELO.NotificationCenter ")},
        {"ZELOCredIDGetByApplication('ZELO.NotificationCenter')",
         Row("ZELO.NotificationCenter", strBoth)},
        {"ZELOCredSessRemoveByID(2)\nZELOCredRemoveByID(2)",
         noCredential("ZELO.NotificationCenter ")},
        {"ZeloCgiInit('', *)", noSession(strSessions, "ZeloCgiInit fail")},
        {"ZeloCgiRemoveSessionByIndex(*, 13, 'ZELO.QRM.Client')",
         noSession(strSessions, "Remove QRM session fail.")},
        {"ZeloCgiRemoveSessionByIndex(*, 13, 'ZELO.QRM.Client.Machine')",
         noSession("ZELO.QRM.Client.Machine ", "Remove QRM session fail.")},
        {"ZELOUserGet('ZelonixQRM', *)", Row("account member folder", strBoth)},
        {"YLIBCMResultAlloc()", noUser("YLIBCMResultAlloc fail")},
        {"YLIBCFileLockByFile('/tmp/userlock', 1, *)", noUser("YLIBCFileLockByFile fail")},
        {"calloc(1, 8)", noUser("malloc fail")},
        {"ZELOUserDelete(*, 1, *)", noUser("ZELOUserDelete fail[123]")},
        {"ZELOUserGet('ZelonixQRM', *)\nYLIBServiceTypeReload(8)", kDone},
        {"system('/bin/rm -rf /usr/zelo/etc/QRM/')", Row("folder", strBoth)},
        {std::string("YLIBCINFOSetKeyValue('nvo_qrm_self_join', 'no')"
                     "\nYLIBCINFOSetKeyValue('join_nvo_qrm', '") +
             (blRejoin ? "rejoin')" : "no')"),
         stopped("'yes' rights", strFile + "Set zeloinfo fail")}};
    if (!blRejoin) {
        steps.insert(
            steps.end(),
            {{"YLIBCSzHashAlloc(512)\nYLIBCSzHashSetValue(*, '%QRM_SERVER%', 'server.example')",
              noHash},
             {"ZELOCredListGet(*, *, 'ZELO.QRM')\nYLIBCSzHashGetValue(*, '%QRM_SERVER%')", kDone},
             {"ZELOSysNotifySendNotifiction('QRMClientDetachSuccess', *)", untold},
             {"YLIBGroupExtraAdminSet('QRM', 0, 0, 0, 0)",
              Row("rights", strBoth, "", strFile + "Call YLIBGroupExtraAdminSet() failed.")}});
    }
    steps.insert(steps.end(),
                 {{ActionCalls(blRejoin ? "1" : "0", "5"), Row("", kPre, "", strNoPost)},
                  {"YLIBPluginExit(*)", kDone}});
    return steps;
}

std::string LeaveState() {
    std::string strState = membership::Remains() + " |" + Told();
    EXPECT_TRUE(ZELOQRMClientDeleteServer());
    EXPECT_EQ(ZELOQRMClientStatus(), 0) << "after leaving again";
    return strState;
}

TEST_F(Membership, LeavingGoesOnFromWhereAnyStepFailed) {
    torture::Run(
        {"leave", "", BuildWhole,
         [] { return std::to_string(ZELOQRMClientDeleteServer(false, kAdminCenter, true)); },
         LeaveState, kDone, LeaveSteps(false)});
}

// To the library's look-ups, what cannot be read and what is not there are the same.
TEST_F(Membership, TheToolSaysThatItHasLeftOnlyWhereItCanSeeThatNothingIsLeft) {
    const std::string strHide = std::string(kPluginFolder) + "/60-hide";
    const std::pair<const char *, std::string> rows[] = {
        {"pre", stored::kFolder + std::string("/credentials.db")},
        {"post", "/usr/zelo/etc/sessions/sessions.db"},
        {"post", "/etc/passwd"},
        {"post", kConfig}};
    for (const auto &[szAction, strPath] : rows) {
        const std::string strKept = strPath + ".kept";
        BuildWhole();
        WriteProgram(strHide, std::string("[ $1 != ") + szAction + " ] || { mv " + strPath + ' ' +
                                  strKept + " && mkdir " + strPath + "; }");
        EXPECT_FALSE(qrmctl::LeaveWholly({})) << strPath;
        fs::remove(strHide);
        fs::remove(strPath);
        fs::rename(strKept, strPath);
        EXPECT_TRUE(qrmctl::LeaveWholly({}));
        EXPECT_EQ(membership::Remains(), "");
    }
}

TEST_F(Membership, LeavingToJoinAgainKeepsRightsAndQuiet) {
    const std::string strTold = std::string(" |") + kPre + kLeft + " notified=0";
    const std::string strFailed = std::string(" |") + kPre + kFailed + " notified=0";
    for (const int failing : {0, 1, 2}) {
        BuildWhole();
        const seam::Outcome outcome = seam::Observe(
            {failing == 0 ? "" : "YLIBCINFOSetKeyValue", failing},
            [&] { EXPECT_EQ(ZELOQRMClientDeleteServer(true, kAdminCenter, true), failing == 0); });
        EXPECT_EQ(Messages(outcome), failing == 0 ? "" : "Set zeloinfo fail");
        EXPECT_EQ(LeaveState(),
                  failing == 0 ? "'rejoin' rights" + strTold : "'yes' rights" + strFailed);
        if (failing == 0) {
            torture::CheckCalls(outcome, torture::Calls(LeaveSteps(true)));
        }
    }
}

TEST_F(Membership, PlugInsAreToldTheServerCutTo31Bytes) {
    const std::string strLong(40, 'h');
    const std::string strCut(31, 'h');
    const struct {
        const char *szHost;  // null: no credential
        const char *szExtraInfo;
        bool blRejoin;
        const char *szFrom;
        bool blClearGluster;
        std::string strTold;
    } rows[] = {
        {strLong.c_str(), R"({"sn":"S1"})", true, kAdminCenter, true,
         '<' + strCut + "> <https> 443 <S1> 1 1 1"},
        {"h", R"({"sn":7})", false, "zelo.pkv.admincenter.application", false,
         "<h> <https> 443 <> 0 0 0"},
        {"h", "no json", false, "", true, "<h> <https> 443 <> 0 0 1"},
        {"h", "[1]", true, "", false, "<h> <https> 443 <> 1 0 0"},
        {"h", nullptr, true, kAdminCenter, true, "<> <> 0 <> 0 0 0"},
        {nullptr, nullptr, true, kAdminCenter, true, "<> <> 0 <> 0 0 0"},
    };
    for (const auto &row : rows) {
        Reset();
        YLIBCINFOSetKeyValue("join_nvo_qrm", "yes");
        if (row.szHost != nullptr) {
            stored::AddCredential("ZELO.QRM", row.szHost, row.szExtraInfo);
        }
        EXPECT_TRUE(ZELOQRMClientDeleteServer(row.blRejoin, row.szFrom, row.blClearGluster));
        EXPECT_EQ(FileText(kTold), "pre 0 " + row.strTold + "\npost 0 " + row.strTold + '\n');
        EXPECT_EQ(membership::Remains(), row.blRejoin ? "'rejoin'" : "");
    }
    Reset();
    YLIBCINFOSetKeyValue("join_nvo_qrm", "yes");
    stored::AddCredential("ZELO.QRM", "h", "{}");
    const seam::Outcome filled =
        seam::Observe({"ZELOCredItemGetHost", 1, true, 0, 0, std::string(1024, 'f')},
                      [] { EXPECT_TRUE(ZELOQRMClientDeleteServer()); });
    EXPECT_NE(torture::Joined(filled.details, "\n")
                  .find("'%QRM_SERVER%', '" + std::string(1023, 'f') + "')"),
              std::string::npos)
        << "a host that fills its field ends there";
    Forget();
    const seam::Outcome outcome = seam::Observe([] { EXPECT_TRUE(ZELOQRMClientDeleteServer()); });
    EXPECT_EQ(torture::Joined(outcome.details, "\n"), LookUps(5, 0, 0))
        << "not joined: a look, and nothing else";
}

TEST_F(Membership, ThePlugInInterfaceNamesWhatItIsNotGiven) {
    static __tag_ZELO_QRM_SERVER_INFO__ server;
    static __tag_qrmclient_plugin_env__ env;
    const auto argument = [](const char *szCondition, const std::function<int()> &call) {
        Forget();
        EXPECT_EQ(MessagesOf([&] { EXPECT_EQ(call(), -1); }),
                  szCondition[0] == '\0'
                      ? std::string()
                      : std::string("Invaild Argument (") + szCondition + ")=[0]\n");
        EXPECT_EQ(YLIBCErrGet(), szCondition[0] == '\0' ? 0x123U : 0x0D00U);
    };
    const char *szPlugin = "qrm_client/disjoin";
    argument("__null != pstEnvVar",
             [&] { return ZELOQRMClientPluginInit(nullptr, nullptr, nullptr); });
    argument("__null != szPlugin", [&] { return ZELOQRMClientPluginInit(&env, nullptr, nullptr); });
    argument("NULL != pServerInfo",
             [&] { return ZELOQRMClientPluginInit(&env, szPlugin, nullptr); });
    argument("__null != pstEnvVar", [] { return ZELOQRMClientPluginExit(nullptr); });
    argument("", [] { return ZELOQRMClientPlugin(SDK_PLUGIN_ACTION_PRE, nullptr); });
    ASSERT_EQ(ZELOQRMClientPluginInit(&env, szPlugin, &server), 0);
    env.pServerInfo = nullptr;
    argument("NULL != pstEnvVar->pServerInfo",
             [] { return ZELOQRMClientPlugin(SDK_PLUGIN_ACTION_PRE, &env); });
    EXPECT_EQ(ZELOQRMClientPluginExit(&env), 0);
}

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

TEST_F(Membership, CreatingTheAccountSurvivesEveryFailingCall) {
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
        "existing", [] { membership::Clear(WithoutMember()); }, done,
        refresh("account same password"), joiningTheGroup);
    run("member", [] { membership::Clear(s_with); }, {"1", "", "account member"},
        refresh("account member same password"),
        {{"ZELOGroupGet('administrators', *)",
          fails("ZELOGroupGet [administrators] failed. [E]", "account member")}});
}

// What its calls come to when they fail, the table of leaving shows.
TEST_F(Membership, AnAccountThatThePlatformStillFindsIsNotDeleted) {
    membership::Clear(s_with);
    fs::create_directories(membership::kFolder);
    EXPECT_EQ(MessagesOf({"ZELOUserGet", 2, true, 0},
                         [] { EXPECT_FALSE(ZELOQRMClientDeleteServerUser()); }),
              "User delete fail");
    EXPECT_EQ(membership::Remains(), "folder");

    membership::Clear(s_with);
    fs::rename("/etc/passwd", "/etc/passwd.kept");
    fs::create_directory("/etc/passwd");
    EXPECT_EQ(MessagesOf([] { EXPECT_FALSE(ZELOQRMClientDeleteServerUser()); }),
              "ZELOUserDelete fail[400]");
    fs::remove("/etc/passwd");
    fs::rename("/etc/passwd.kept", "/etc/passwd");
    EXPECT_EQ(membership::Remains(), "account member");
}

TEST_F(Membership, TheMemberListIsRebuiltWithTheAccountAtItsEnd) {
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

TEST_F(Membership, TheLimitOfAccountsKeepsOnlyANewOneOut) {
    YLIBCINFOSetKeyValue("max_users", "0");
    EXPECT_EQ(MessagesOf([] { EXPECT_FALSE(ZELOQRMClientCreateServerUser()); }),
              "The limit of local account has been reached.");
    EXPECT_EQ(membership::Remains(), "");
    accounts::WriteFiles(s_with);
    EXPECT_TRUE(ZELOQRMClientCreateServerUser());
    YLIBCINFOSetKeyValue("max_users", "2048");
}

// --- Welcome pages ------------------------------------------------------------------------------

TEST_F(Membership, SettingsOfAnyKindKeepTheirOtherMembers) {
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
    fs::create_directories(membership::kPreference);
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
    const std::string strOther = std::string(membership::kPreference) + "/other";
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

TEST_F(Membership, OverlappingChangesOfOneUsersSettingsLoseNothing) {
    constexpr int kCalls = 150;
    std::string strMembers;
    for (int i = 0; i < 2000; ++i) {
        strMembers += (i == 0 ? "\"m" : ",\"m") + std::to_string(i) + "\":" + std::to_string(i);
    }
    accounts::WriteFiles(s_with);
    fs::create_directories(membership::kPreference);
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
