// Membership: join status, leaving, the plug-ins around it, the service account and its welcome
// pages, against a real store, real accounts, a real daemon and real programs.

#include <algorithm>
#include <fstream>

#include "children.h"
#include "indicators.h"
#include "joined.h"
#include "json_text.h"
#include "last_error.h"
#include "membership_state.h"
#include "service.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

using joined::FileText;
using joined::Messages;
using membership::kUser;
using membership::kWhole;
using torture::Expected;

constexpr const char *kTold = "/tmp/told";
constexpr const char *kPluginFolder = "/usr/zelo/etc/plugins/qrm_client/disjoin";
constexpr const char *kSettings = "/usr/zelo/etc/preference/ZelonixQRM/usersettings";
constexpr const char *kFlagCheck =
    "YLIBCFileCheckKeyValue('/etc/zeloinfo.conf', 'join_nvo_qrm', 'yes', 0)";

std::string Without(std::string strText, const std::string &strPart) {
    const std::size_t at = strText.find(strPart);
    return at == std::string::npos ? strText : strText.erase(at, strPart.size());
}

class Membership : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        std::filesystem::create_directories(kPluginFolder);
        const std::string strProgram = std::string(kPluginFolder) + "/50-told";
        std::ofstream(strProgram) << "#!/bin/sh\necho \"$1 $QRM_CLIENT_RESULT <$QRM_CLIENT_HOST> "
                                     "<$QRM_CLIENT_PROTOCOL> $QRM_CLIENT_PORT <$QRM_CLIENT_SN> "
                                     "$QRM_CLIENT_REJOIN $QRM_CLIENT_FROM "
                                     "$QRM_CLIENT_CLEAR_GLUSTER\" >>/tmp/told\n";
        std::filesystem::permissions(strProgram, std::filesystem::perms(0755));
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
    static void BuildWhole() {
        membership::Build(s_with);
        Forget();
    }
    static void Forget() {
        std::filesystem::remove(kTold);
        std::filesystem::remove(joined::kJournal);
        YLIBCErrSetEx(0x123, "x", 1);
    }

    static accounts::Files s_without;
    static accounts::Files s_with;
};

accounts::Files Membership::s_without;
accounts::Files Membership::s_with;

// --- Join status --------------------------------------------------------------------------------

struct Rule {
    const char *szWhenNotJoined;
    const char *szWhenJoined;
};
constexpr Rule kRules[] = {
    {"FALSE == blJoined && 0 <= CredId", "TRUE == blJoined && 0 > CredId"},
    {"FALSE == blJoined && 0 <= CredId", "TRUE == blJoined && 0 > CredId"},
    {"FALSE == blJoined && 0 == runRet", "TRUE == blJoined && 1 == runRet"},
    {"FALSE == blJoined && true == blSessionExist", "TRUE == blJoined && false == blSessionExist"},
    {nullptr, "TRUE == blJoined"}};

// What each of the five indicators beside the flag is: 0 for absent, 1 for as it should be when
// joined; a session 2 where the machine's is the only one, an account 2 where it is no
// administrator.
using Indicators = std::array<int, 5>;

struct Verdict {
    int result;
    int rule = 0;  // 1 to 10
    std::string strMessage;
    std::string strLookups;
};

Verdict Judge(int flag, const Indicators &indicators) {
    Verdict verdict{flag == 1 ? 1 : 0, 0, "", kFlagCheck};
    const std::string lookups[] = {
        "\nZELOCredIDGetByApplication('ZELO.QRM')",
        "\nZELOCredIDGetByApplication('ZELO.NotificationCenter')",
        "\nYLIBCExec('/usr/zelo/etc/rc.d/S99zelocache.sh', 'status', null, null, null)",
        std::string("\nZeloCgiInit('', *)\nZeloCgiSessionExistByIndex(*, 13, 'ZELO.QRM.Client')") +
            (indicators[3] == 1 ? ""
                                : "\nZeloCgiSessionExistByIndex(*, 13, 'ZELO.QRM.Client.Machine')"),
        std::string("\nZELOUserGet('ZelonixQRM', *)") +
            (indicators[4] == 0 ? "" : "\nYLIBGroupIsAdminGroupMem('ZelonixQRM', 0)")};
    for (int i = 0; i < 5; ++i) {
        verdict.strLookups += lookups[i];
        const bool blThere = i == 4 ? indicators[i] == 1 : indicators[i] != 0;
        const char *szBroken = nullptr;
        if (flag == 0 && blThere) {
            szBroken = kRules[i].szWhenNotJoined;
            verdict.rule = 2 * i + 1;
        } else if (flag == 1 && !blThere) {
            szBroken = kRules[i].szWhenJoined;
            verdict.rule = i == 4 && indicators[i] == 0 ? 9 : 2 * i + 2;
        }
        if (szBroken != nullptr) {
            verdict.result = -1;
            verdict.strMessage = std::string("Status Error: [") + szBroken + ']';
            return verdict;
        }
    }
    verdict.rule = 0;
    return verdict;
}

TEST_F(Membership, TheFirstRuleThatHoldsDecidesAndTheExplanationAgrees) {
    accounts::Files noAdministrator = s_with;
    noAdministrator["group"] = s_without["group"];
    noAdministrator["gshadow"] = s_without["gshadow"];
    int combinations = 0;
    const auto check = [&](int flag, const Indicators &indicators) {
        SCOPED_TRACE(testing::PrintToString(indicators) + " flag " + std::to_string(flag));
        YLIBCINFOSetKeyValue("join_nvo_qrm", flag == 1 ? "yes" : "no");
        const seam::Fault fault{flag < 0 ? "YLIBCFileCheckKeyValue" : ""};
        const Verdict expected = Judge(flag, indicators);
        int result = 2;
        const seam::Outcome outcome = seam::Observe(fault, [&] { result = ZELOQRMClientStatus(); });
        EXPECT_EQ(result, expected.result);
        EXPECT_EQ(Messages(outcome), expected.strMessage);
        EXPECT_EQ(torture::Joined(outcome.details, "\n"), expected.strLookups);
        EXPECT_EQ(outcome.recordsLeft, 0);

        std::vector<qrmctl::Indicator> explained;
        seam::Observe(fault, [&] { explained = qrmctl::ReadIndicators(); });
        const auto first = std::find_if(explained.begin(), explained.end(),
                                        [](const auto &one) { return one.rule != 0; });
        EXPECT_EQ(explained.size(), 6U);
        EXPECT_EQ(first == explained.end() ? 0 : first->rule, expected.rule);
        if (first != explained.end()) {
            EXPECT_EQ("Status Error: [" + first->strRule + ']', expected.strMessage);
            EXPECT_NE(first->strRemedy, "");
        }
        ++combinations;
    };
    for (int daemon : {0, 1}) {
        membership::Daemon(daemon == 1 ? "start" : "stop");
        for (int account : {0, 1, 2}) {
            accounts::WriteFiles(account == 0   ? s_without
                                 : account == 1 ? s_with
                                                : noAdministrator);
            for (int i = 0; i < 12; ++i) {
                const Indicators indicators{i % 2, i / 2 % 2, daemon, i / 4, account};
                stored::Clear();
                for (int j : {0, 1}) {
                    if (indicators[j] == 1) {
                        stored::AddCredential(membership::kApplications[j], "h");
                    }
                    membership::ForSession(indicators[3] == 1 + j ? ZeloCgiAddSessionByIndex
                                                                  : ZeloCgiRemoveSessionByIndex,
                                           membership::kSessions[j]);
                }
                for (int flag : {0, 1, -1}) {
                    check(flag, indicators);
                }
            }
        }
    }
    EXPECT_EQ(combinations, 2 * 3 * 12 * 3);
}

TEST_F(Membership, StatusSurvivesEveryFailingCall) {
    const auto broken = [](const std::string &strRule) {
        return Expected{"-1", "Status Error: [" + strRule + ']', ""};
    };
    Expected noContext = broken(kRules[3].szWhenJoined);
    noContext.strLog = "ZeloCgiInit fail\n" + noContext.strLog;
    BuildWhole();
    torture::Run({"status",
                  "qrm_delete_server",
                  [] {},
                  [] { return std::to_string(ZELOQRMClientStatus()); },
                  [] { return Without(membership::Remains(), kWhole); },
                  Judge(1, {1, 1, 1, 1, 1}).strLookups,
                  {"1", "", ""},
                  {{"YLIBCFileCheckKeyValue", {"0", "", ""}},
                   {"ZELOCredIDGetByApplication", broken(kRules[0].szWhenJoined)},
                   {"YLIBCExec", {"1", "", ""}},
                   {"ZeloCgiInit", noContext},
                   {"ZeloCgiSessionExistByIndex", {"1", "", ""}},
                   {"ZELOUserGet", broken("TRUE == blJoined")},
                   {"YLIBGroupIsAdminGroupMem", broken("TRUE == blJoined")}}});
    EXPECT_EQ(seam::Observe({"YLIBCExec", 1, true, 3}, [] { EXPECT_EQ(ZELOQRMClientStatus(), 1); })
                  .logs.size(),
              0U)
        << "a daemon that is neither running nor stopped fits both";
}

// --- Leave --------------------------------------------------------------------------------------

// The first three words of each line that the plug-in wrote, and how many users were told.
std::string Told() {
    std::ifstream file(kTold);
    std::string strAll;
    for (std::string strLine; std::getline(file, strLine);) {
        strAll.append(1, ' ').append(strLine, 0, strLine.find('>') + 1);
    }
    return strAll + " notified=" + std::to_string(joined::CountLines(joined::kJournal));
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

// The calls of an action, but for what they tell.
std::string ActionCalls(const char *szResult, bool blRejoin, int action) {
    return std::string("\nYLIBPluginHasInit(*)\nYLIBPluginSetArgByInt(*, 'RESULT', ") + szResult +
           ")\nYLIBPluginSetArg(*, 'HOST', 'server.example')"
           "\nYLIBPluginSetArg(*, 'PROTOCOL', 'https')"
           "\nYLIBPluginSetArg(*, 'PORT', '443')"
           "\nYLIBPluginSetArg(*, 'SN', 'S1')"
           "\nYLIBPluginSetArg(*, 'REJOIN', '" +
           (blRejoin ? "1" : "0") +
           "')\nYLIBPluginSetArg(*, 'FROM', '1')"
           "\nYLIBPluginSetArg(*, 'CLEAR_GLUSTER', '1')"
           "\nYLIBPluginAction(" +
           std::to_string(action) + ", *)";
}

constexpr const char *kDescribing =
    "\nZELOCredIDGetByApplication('ZELO.QRM')"
    "\nZELOCredAlloc()"
    "\nZELOCredLoad(1, *)"
    "\nZELOCredItemGetHost(buf, 1024, *)"
    "\nZELOCredItemGetProtocol(buf, 1024, *)"
    "\nZELOCredItemGetExtraInfo(buf, 4096, *)"
    "\nZELOCredItemGetPort(*, *)"
    "\nYLIBPluginSDKInit('qrm_client', 'qrm_client/disjoin', *)";
constexpr const char *kRemoving =
    "\nYLIBCExec('/usr/zelo/etc/rc.d/S99zelocache.sh', 'stop', null, null, null)"
    "\nZELOCredIDGetByApplication('ZELO.QRM')"
    "\nZELOCredSessRemoveByID(1)"
    "\nZELOCredRemoveByID(1)"
    "\nZELOCredIDGetByApplication('ZELO.NotificationCenter')"
    "\nZELOCredSessRemoveByID(2)"
    "\nZELOCredRemoveByID(2)"
    "\nZeloCgiInit('', *)"
    "\nZeloCgiRemoveSessionByIndex(*, 13, 'ZELO.QRM.Client')"
    "\nZeloCgiRemoveSessionByIndex(*, 13, 'ZELO.QRM.Client.Machine')"
    "\nZELOUserGet('ZelonixQRM', *)"
    "\nYLIBCMResultAlloc()"
    "\nYLIBCFileLockByFile('/tmp/userlock', 1, *)"
    "\ncalloc(1, 8)"
    "\nZELOUserDelete(*, 1, *)"
    "\nZELOUserGet('ZelonixQRM', *)"
    "\nYLIBServiceTypeReload(8)"
    "\nsystem('/bin/rm -rf /usr/zelo/etc/QRM/')"
    "\nYLIBCINFOSetKeyValue('nvo_qrm_self_join', 'no')";
constexpr const char *kTelling =
    "\nYLIBCSzHashAlloc(512)"
    "\nYLIBCSzHashSetValue(*, '%QRM_SERVER%', 'server.example')"
    "\nZELOCredListGet(*, *, 'ZELO.QRM')"
    "\nYLIBCSzHashGetValue(*, '%QRM_SERVER%')"
    "\nZELOSysNotifySendNotifiction('QRMClientDetachSuccess', *)"
    "\nYLIBGroupExtraAdminSet('QRM', 0, 0, 0, 0)";

std::string LeaveCalls(bool blRejoin) {
    return Judge(1, {1, 1, 1, 1, 1}).strLookups + kDescribing + ActionCalls("0", blRejoin, 4) +
           kRemoving + "\nYLIBCINFOSetKeyValue('join_nvo_qrm', '" +
           (blRejoin ? "rejoin')" : std::string("no')") + kTelling) +
           ActionCalls("0", blRejoin, 5) + "\nYLIBPluginExit(*)";
}

std::string LeaveState() {
    std::string strState = membership::Remains() + " |" + Told();
    EXPECT_TRUE(ZELOQRMClientDeleteServer());
    EXPECT_EQ(ZELOQRMClientStatus(), 0) << "after leaving again";
    return strState;
}

TEST_F(Membership, LeavingGoesOnFromWhereAnyStepFailed) {
    const std::string strFile = "qrm_delete_server ";
    const std::string strBoth = std::string(kPre) + kLeft;
    const std::string strFailed = std::string(kPre) + kFailed;
    const auto stopped = [&](const std::string &strRemains, const std::string &strLog) {
        return Row(strRemains, strFailed, strLog);
    };
    const auto disagrees = [&](const char *szRule) {
        return Row("", strBoth, strFile + "Status Error: [" + szRule + ']');
    };
    const std::string strSessions = "ZELO.QRM.Client ZELO.QRM.Client.Machine ";
    const std::string strRest = "account member folder 'yes' rights";
    const std::string strNoSession = '\n' + strFile + "Remove session fail";
    const std::string strNoUser = '\n' + strFile + "Remove User fail";
    const std::string strFlags = "'yes' rights";
    const Expected done = Row("", strBoth);
    const Expected undescribed = Row("", " pre 0 <> post 0 <>");
    const Expected noPre = Row("", kLeft, strFile + "Fail to execute disjoin plugin (PRE)");
    const Expected noPost = Row("", kPre, "", strFile + "Fail to execute disjoin plugin (POST)");
    Expected nothing = Row(kWhole, "");
    nothing.strResult = "1";
    Expected untold = done;
    untold.strStored.back() = '0';
    Expected noHash = untold;
    noHash.strLog = strFile + "Failed to execute YLIBCSzHash operations";
    std::map<std::string, Expected> rows = {
        {"YLIBCFileCheckKeyValue", nothing},
        {"ZELOCredIDGetByApplication#1", disagrees(kRules[0].szWhenJoined)},
        {"ZELOCredIDGetByApplication#2", disagrees(kRules[1].szWhenJoined)},
        {"YLIBCExec#1", done},
        {"ZeloCgiInit#1", Row("", strBoth,
                              strFile + "ZeloCgiInit fail\n" + strFile + "Status Error: [" +
                                  kRules[3].szWhenJoined + ']')},
        {"ZeloCgiSessionExistByIndex", done},
        {"ZELOUserGet#1", disagrees("TRUE == blJoined")},
        {"YLIBGroupIsAdminGroupMem", disagrees("TRUE == blJoined")},
        {"ZELOCredIDGetByApplication#3", undescribed},
        {"ZELOCredAlloc", undescribed},
        {"ZELOCredLoad", undescribed},
        {"ZELOCredItemGetHost", undescribed},
        {"ZELOCredItemGetProtocol", undescribed},
        {"ZELOCredItemGetExtraInfo", undescribed},
        {"ZELOCredItemGetPort", undescribed},
        {"YLIBPluginSDKInit",
         Row("", "",
             "qrm_plugin Fail to do plugin init[E]\n" + strFile + "Plugin init failed.\n" +
                 strFile + "Fail to execute disjoin plugin (PRE)",
             strFile + "Fail to execute disjoin plugin (POST)")},
        {"YLIBPluginHasInit#1", noPre},
        {"YLIBPluginHasInit#2", noPost},
        {"YLIBPluginSetArgByInt#1", noPre},
        {"YLIBPluginSetArgByInt#2", noPost},
        {"YLIBPluginAction#1", noPre},
        {"YLIBPluginAction#2", noPost},
        {"YLIBPluginExit", done},
        {"YLIBCExec#2", stopped(kWhole, strFile + "Stop cache daemon fail")},
        {"ZELOCredIDGetByApplication#4", Row("ZELO.QRM", strBoth, "", "", false)},
        {"ZELOCredIDGetByApplication#5", Row("ZELO.NotificationCenter", strBoth)},
        {"ZELOCredSessRemoveByID#1",
         stopped("ZELO.QRM ZELO.NotificationCenter " + strSessions + strRest,
                 strFile + "Remove zelocredential fail")},
        {"ZELOCredRemoveByID#1",
         stopped("ZELO.QRM ZELO.NotificationCenter " + strSessions + strRest,
                 strFile + "Remove zelocredential fail")},
        {"ZELOCredSessRemoveByID#2", stopped("ZELO.NotificationCenter " + strSessions + strRest,
                                             strFile + "Remove zelocredential fail")},
        {"ZELOCredRemoveByID#2", stopped("ZELO.NotificationCenter " + strSessions + strRest,
                                         strFile + "Remove zelocredential fail")},
        {"ZeloCgiInit#2",
         stopped(strSessions + strRest, strFile + "ZeloCgiInit fail" + strNoSession)},
        {"ZeloCgiRemoveSessionByIndex#1",
         stopped(strSessions + strRest, strFile + "Remove QRM session fail." + strNoSession)},
        {"ZeloCgiRemoveSessionByIndex#2",
         stopped("ZELO.QRM.Client.Machine " + strRest,
                 strFile + "Remove QRM session fail." + strNoSession)},
        {"ZELOUserGet#2", Row("account member folder", strBoth)},
        {"YLIBCMResultAlloc",
         stopped(strRest, "qrm_server_user YLIBCMResultAlloc fail" + strNoUser)},
        {"YLIBCFileLockByFile",
         stopped(strRest, "qrm_server_user YLIBCFileLockByFile fail" + strNoUser)},
        {"calloc", stopped(strRest, "qrm_server_user malloc fail" + strNoUser)},
        {"ZELOUserDelete",
         stopped(strRest, "qrm_server_user ZELOUserDelete fail[123]" + strNoUser)},
        {"ZELOUserGet#3", done},
        {"YLIBServiceTypeReload", done},
        {"system", Row("folder", strBoth)},
        {"YLIBCINFOSetKeyValue", stopped(strFlags, strFile + "Set zeloinfo fail")},
        {"YLIBCSzHashAlloc", noHash},
        {"YLIBCSzHashSetValue", noHash},
        {"ZELOCredListGet", done},
        {"YLIBCSzHashGetValue", done},
        {"ZELOSysNotifySendNotifiction", untold},
        {"YLIBGroupExtraAdminSet",
         Row("rights", strBoth, "", strFile + "Call YLIBGroupExtraAdminSet() failed.")},
    };
    for (int i = 1; i <= 14; ++i) {
        rows["YLIBPluginSetArg#" + std::to_string(i)] = i <= 7 ? noPre : noPost;
    }
    torture::Run(
        {"leave", "", BuildWhole,
         [] { return std::to_string(ZELOQRMClientDeleteServer(false, kAdminCenter, true)); },
         LeaveState, LeaveCalls(false), done, rows});
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
            EXPECT_EQ(torture::Joined(outcome.details, "\n"), LeaveCalls(true));
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
    Forget();
    const seam::Outcome outcome = seam::Observe([] { EXPECT_TRUE(ZELOQRMClientDeleteServer()); });
    EXPECT_EQ(torture::Joined(outcome.details, "\n"), Judge(0, {}).strLookups)
        << "not joined: a look, and nothing else";
}

TEST_F(Membership, ThePlugInInterfaceSurvivesEveryFailingCall) {
    static __tag_ZELO_QRM_SERVER_INFO__ server;
    static __tag_qrmclient_plugin_env__ env;
    const auto text = [](int result) { return std::to_string(result); };
    const Expected refused{"0 -1 0", "", ""};
    const std::string strArguments =
        "YLIBPluginSetArg YLIBPluginSetArg YLIBPluginSetArg YLIBPluginSetArg YLIBPluginSetArg "
        "YLIBPluginSetArg YLIBPluginSetArg ";
    torture::Run(
        {"plug-in",
         "qrm_plugin",
         Forget,
         [&] {
             const int ready = ZELOQRMClientPluginInit(&env, "qrm_client/disjoin", &server);
             const int result = ZELOQRMClientPlugin(SDK_PLUGIN_ACTION_PRE, &env);
             return text(ready) + ' ' + text(result) + ' ' + text(ZELOQRMClientPluginExit(&env));
         },
         [] { return FileText(kTold); },
         "YLIBPluginSDKInit YLIBPluginHasInit YLIBPluginSetArgByInt " + strArguments +
             "YLIBPluginAction YLIBPluginExit",
         {"0 0 0", "", "pre 0 <> <> 0 <> 0 0 0\n"},
         {{"YLIBPluginSDKInit", {"-1 -1 0", "Fail to do plugin init[E]", ""}},
          {"YLIBPluginHasInit", refused},
          {"YLIBPluginSetArgByInt", refused},
          {"YLIBPluginSetArg", refused},
          {"YLIBPluginAction", refused},
          {"YLIBPluginExit", {"0 0 0", "", "pre 0 <> <> 0 <> 0 0 0\n"}}}});

    const auto argument = [](const char *szCondition, const std::function<int()> &call) {
        Forget();
        const seam::Outcome outcome = seam::Observe([&] { EXPECT_EQ(call(), -1); });
        EXPECT_EQ(Messages(outcome), szCondition[0] == '\0' ? std::string()
                                                            : std::string("Invaild Argument (") +
                                                                  szCondition + ")=[0]\n");
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

// The account's state, the system's own checks included.
std::string AccountState() {
    std::string strAll = membership::Remains() + accounts::Findings();
    strAll += std::filesystem::exists(kSettings) ? " hidden" : "";
    return strAll;
}

std::string CreateAccount() {
    return std::to_string(ZELOQRMClientCreateServerUser());
}

TEST_F(Membership, CreatingTheAccountSurvivesEveryFailingCall) {
    const std::string strPassword = Seed();
    const std::string strAll = "account member folder hidden";
    const auto fails = [](const char *szLog, const char *szState) {
        return Expected{"0", szLog, szState};
    };
    const auto goesOn = [](const char *szState) { return Expected{"1", "", szState}; };
    const std::string strGroup =
        "\nZELOGroupGet('administrators', *)\ncalloc(2, 8)\nstrdup('ZelonixQRM')"
        "\nZELOGroupSet('administrators', *)\nZELOUserPreferenceDirGet('ZelonixQRM', buf, 4096)"
        "\naccess('" +
        std::string(kSettings) + "', 4)\nunlink('" + kSettings + ".tmp')\nrename('" + kSettings +
        ".tmp', '" + kSettings +
        "')\nmkdir('/usr/zelo/etc/QRM/', 493)"
        "\nYLIBServiceTypeReload(8)";
    const char *szNotHidden = "Failed to hid welcom page for ZelonixQRM. [ZelonixQRM] [E]";
    const std::string strRename = std::string("Failed to rename [") + kSettings + ".tmp] -> [" +
                                  kSettings + "] Read-only file system\n" + szNotHidden;
    const std::map<std::string, Expected> group = {
        {"strdup#1", fails("Generate random password fail", "")},
        {"ZELOGroupGet", fails("ZELOGroupGet [administrators] failed. [E]", "account")},
        {"calloc", fails("Failed to malloc szNewMembers", "account")},
        {"strdup#2", fails("Failed to strdup member [ZelonixQRM]", "account")},
        {"ZELOGroupSet", fails("ZELOGroupSet failed. [administrators] [E]", "account")},
        {"ZELOUserPreferenceDirGet",
         {"1", std::string("Get preference dir failed. [ZelonixQRM] [E]\n") + szNotHidden,
          "account member folder"}},
        {"access", goesOn("account member folder hidden")},
        {"unlink", goesOn("account member folder hidden")},
        {"rename", {"1", strRename, "account member folder"}},
        {"mkdir", goesOn("account member hidden")},
        {"YLIBServiceTypeReload", goesOn("account member folder hidden")}};

    std::map<std::string, Expected> rows = group;
    rows.insert({{"ZELOUserGet", fails("", "")},
                 {"ZELOUserAlloc", fails("Failed to Alloc USER [ZelonixQRM] [E]", "")},
                 {"YLIBUserNumRemained", fails("YLIBUserNumRemained failed (-1). [E]", "")},
                 {"YLIBCMResultAlloc", fails("YLIBCMResultAlloc failed. [E]", "")},
                 {"ZELOUserSetOne", fails("ZELOUserSet [ZelonixQRM] failed. [E]", "")}});
    rows["ZELOUserGet"] = {"1", "", strAll};
    torture::Run({"new",
                  "qrm_server_user",
                  [] {
                      Reset();
                      Seed();
                  },
                  CreateAccount,
                  AccountState,
                  "strdup('" + strPassword + "')\nZELOUserGet('ZelonixQRM', *)" +
                      "\nZELOUserAlloc(*, 'ZelonixQRM', '" + strPassword +
                      "', 50000, 100, 'This user is used for QRM', "
                      "'/var/services/homes/ZelonixQRM', '/sbin/nologin', -1, 1, null)"
                      "\nYLIBUserNumRemained()\nYLIBCMResultAlloc()\nZELOUserSetOne(null, *, *)" +
                      strGroup,
                  {"1", "", strAll},
                  rows});

    rows = group;
    rows["strdup#1"].strStored = "account";
    rows["ZELOUserGet"] = fails("ZELOUserSet [ZelonixQRM] failed. [E]", "account");
    rows["YLIBCMResultAlloc"] = fails("YLIBCMResultAlloc failed. [E]", "account");
    rows["ZELOUserSetOne"] = fails("ZELOUserSet [ZelonixQRM] failed. [E]", "account");
    const std::string strRefresh = "strdup('" + strPassword +
                                   "')\nZELOUserGet('ZelonixQRM', *)\nYLIBCMResultAlloc()"
                                   "\nZELOUserSetOne('ZelonixQRM', *, *)";
    const auto noMember = [] {
        accounts::Files files = s_with;
        files["group"] = s_without["group"];
        files["gshadow"] = s_without["gshadow"];
        membership::Clear(files);
        Forget();
        Seed();
    };
    torture::Run({"existing",
                  "qrm_server_user",
                  noMember,
                  CreateAccount,
                  AccountState,
                  strRefresh + strGroup,
                  {"1", "", strAll},
                  rows});

    const std::string strMember = "account member";
    torture::Run(
        {"member",
         "qrm_server_user",
         [] {
             membership::Clear(s_with);
             Forget();
             Seed();
         },
         CreateAccount,
         [] {
             return AccountState() +
                    (accounts::ReadFiles()["shadow"] == s_with["shadow"] ? " same password" : "");
         },
         strRefresh + "\nZELOGroupGet('administrators', *)",
         {"1", "", strMember},
         {{"strdup", fails("Generate random password fail", "account member same password")},
          {"ZELOUserGet",
           fails("ZELOUserSet [ZelonixQRM] failed. [E]", "account member same password")},
          {"YLIBCMResultAlloc",
           fails("YLIBCMResultAlloc failed. [E]", "account member same password")},
          {"ZELOUserSetOne",
           fails("ZELOUserSet [ZelonixQRM] failed. [E]", "account member same password")},
          {"ZELOGroupGet", fails("ZELOGroupGet [administrators] failed. [E]", "account member")}}});
}

TEST_F(Membership, DeletingTheAccountSurvivesEveryFailingCall) {
    const auto fails = [](const char *szLog) {
        return Expected{"0", szLog, "account member folder"};
    };
    torture::Run({"delete",
                  "qrm_server_user",
                  [] {
                      membership::Clear(s_with);
                      std::filesystem::create_directories(membership::kFolder);
                      Forget();
                  },
                  [] { return std::to_string(ZELOQRMClientDeleteServerUser()); },
                  AccountState,
                  "ZELOUserGet YLIBCMResultAlloc YLIBCFileLockByFile calloc ZELOUserDelete "
                  "ZELOUserGet YLIBServiceTypeReload system",
                  {"1", "", ""},
                  {{"ZELOUserGet#1", {"1", "", "account member folder"}},
                   {"YLIBCMResultAlloc", fails("YLIBCMResultAlloc fail")},
                   {"YLIBCFileLockByFile", fails("YLIBCFileLockByFile fail")},
                   {"calloc", fails("malloc fail")},
                   {"ZELOUserDelete", fails("ZELOUserDelete fail[123]")},
                   {"ZELOUserGet#2", {"1", "", ""}},
                   {"YLIBServiceTypeReload", {"1", "", ""}},
                   {"system", {"1", "", "folder"}}}});

    membership::Clear(s_with);
    std::filesystem::create_directories(membership::kFolder);
    const seam::Outcome outcome = seam::Observe(
        {"ZELOUserGet", 2, true, 0}, [] { EXPECT_FALSE(ZELOQRMClientDeleteServerUser()); });
    EXPECT_EQ(Messages(outcome), "User delete fail") << "the platform still finds it";
    EXPECT_EQ(membership::Remains(), "folder");
}

TEST_F(Membership, TheMemberListIsRebuiltWithTheAccountAtItsEnd) {
    accounts::Names many;
    for (int i = 0; i < 10'000; ++i) {
        many.push_back("member" + std::to_string(i));
    }
    for (accounts::Names members :
         {accounts::Names(), many, accounts::Names{"ZelonixQRM2", "zelonixqrm", "Zelonix"}}) {
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
    const seam::Outcome outcome =
        seam::Observe([] { EXPECT_FALSE(ZELOQRMClientCreateServerUser()); });
    EXPECT_EQ(Messages(outcome), "The limit of local account has been reached.");
    EXPECT_EQ(membership::Remains(), "");
    accounts::WriteFiles(s_with);
    EXPECT_TRUE(ZELOQRMClientCreateServerUser());
    YLIBCINFOSetKeyValue("max_users", "2048");
}

TEST_F(Membership, TwoCreationsAtOnceMakeOneWholeAccount) {
    const pid_t children[] = {children::Start(ZELOQRMClientCreateServerUser),
                              children::Start(ZELOQRMClientCreateServerUser)};
    int done = 0;
    for (pid_t pid : children) {
        done += children::Ended(pid) ? 1 : 0;
    }
    EXPECT_GE(done, 1) << "the other may find the account added meanwhile";
    EXPECT_TRUE(ZELOQRMClientCreateServerUser());
    EXPECT_EQ(AccountState(), "account member folder hidden");
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
    const std::string strList = "{\"z\":[" + [] {
        std::string strZeros = "0";
        for (int i = 0; i < 100'000; ++i) {
            strZeros += ",0";
        }
        return strZeros;
    }() + "]}";
    const struct {
        std::string strBefore;  // "-": there is none
        bool blShow;
        std::string strAfter;
    } rows[] = {
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
    std::filesystem::create_directories(membership::kPreference);
    for (const auto &row : rows) {
        std::filesystem::remove(kSettings);
        if (row.strBefore != "-") {
            std::ofstream(kSettings) << row.strBefore;
        }
        EXPECT_TRUE(ZELOQRMUserWelcomPage(kUser, row.blShow));
        EXPECT_TRUE(FileText(kSettings) == row.strAfter) << FileText(kSettings).substr(0, 200);
    }
    EXPECT_FALSE(ZELOQRMUserWelcomPage("nobody-here", false));
    EXPECT_FALSE(ZELOQRMUserWelcomPage("../../../../tmp", false));
    EXPECT_FALSE(ZELOQRMUserWelcomPage(nullptr, false));
    EXPECT_FALSE(std::filesystem::exists("/usr/zelo/etc/preference/nobody-here"));

    // A folder in the way of either name, and a link that somebody has left for the program to
    // write through.
    const std::string strTemporary = std::string(kSettings) + ".tmp";
    std::ofstream("/tmp/target") << "kept";
    std::filesystem::create_symlink("/tmp/target", strTemporary);
    EXPECT_TRUE(ZELOQRMUserWelcomPage(kUser, false));
    EXPECT_EQ(FileText("/tmp/target"), "kept");
    std::filesystem::create_directories(strTemporary + "/x");
    seam::Outcome outcome =
        seam::Observe([] { EXPECT_FALSE(ZELOQRMUserWelcomPage(kUser, false)); });
    EXPECT_EQ(Messages(outcome).substr(0, 30), "Failed to write usersettins [{");
    std::filesystem::remove_all(strTemporary);
    std::filesystem::remove(kSettings);
    std::filesystem::create_directory(kSettings);
    outcome = seam::Observe([] { EXPECT_FALSE(ZELOQRMUserWelcomPage(kUser, false)); });
    EXPECT_EQ(Messages(outcome),
              "Failed to rename [" + strTemporary + "] -> [" + kSettings + "] Is a directory");
    EXPECT_TRUE(std::filesystem::exists(strTemporary)) << "the new settings stay for a look";
}

}  // namespace
