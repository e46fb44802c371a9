// The join status and leaving, against a real store, real accounts, a real daemon and real
// programs.

#include <algorithm>
#include <numeric>

#include "indicators.h"
#include "membership.h"
#include "membership_state.h"
#include "torture.h"

namespace {

using namespace files;
using namespace membership;
using seam::Messages;
using seam::MessagesOf;
using torture::Expected;

constexpr const char *kFlagCheck =
    "YLIBCFileCheckKeyValue('/etc/zeloinfo.conf', 'join_nvo_qrm', 'yes', 0)";

using DeleteServer = Membership;

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

TEST_F(DeleteServer, TheFirstRuleThatHoldsDecidesAndTheExplanationAgrees) {
    // One indicator is wrong, those before it are as they should be, and those after it are wrong
    // too; of sessions and of accounts there is another kind that comes to the same.
    const auto check = [](bool blJoined, int wrong, bool blOther) {
        const auto isThere = [&](int indicator) { return blJoined == (indicator < wrong); };
        const int session = isThere(3) ? (blOther ? 2 : 1) : 0;
        const int account = isThere(4) ? 1 : (blOther ? 2 : 0);
        YLIBCINFOSetKeyValue("join_nvo_qrm", blJoined ? "yes" : "no");
        Daemon(isThere(2) ? "start" : "stop");
        accounts::WriteFiles(account == 0 ? s_without : account == 1 ? s_with : WithoutMember());
        stored::Clear();
        for (int i = 0; i < 2; ++i) {
            if (isThere(i)) {
                stored::AddCredential(kApplications[i], "h");
            }
            ForSession(session == 1 + i ? ZeloCgiAddSessionByIndex : ZeloCgiRemoveSessionByIndex,
                       kSessions[i]);
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
    return strAll + " notified=" + std::to_string(FileLines(kJournal).size());
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
    std::string strState = Remains() + " |" + Told();
    EXPECT_TRUE(ZELOQRMClientDeleteServer());
    EXPECT_EQ(ZELOQRMClientStatus(), 0) << "after leaving again";
    return strState;
}

TEST_F(DeleteServer, LeavingGoesOnFromWhereAnyStepFailed) {
    const seam::Outcome outcome = seam::Observe([] { EXPECT_TRUE(ZELOQRMClientDeleteServer()); });
    EXPECT_EQ(torture::Joined(outcome.details, "\n"), LookUps(5, 0, 0))
        << "not joined: a look, and nothing else";
    torture::Run(
        {"leave", "", BuildWhole,
         [] { return std::to_string(ZELOQRMClientDeleteServer(false, kAdminCenter, true)); },
         LeaveState, kDone, LeaveSteps(false)});
}

// To the library's look-ups, what cannot be read and what is not there are the same.
TEST_F(DeleteServer, TheToolSaysThatItHasLeftOnlyWhereItCanSeeThatNothingIsLeft) {
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
        EXPECT_EQ(Remains(), "");
    }
}

TEST_F(DeleteServer, LeavingToJoinAgainKeepsRightsAndQuiet) {
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

}  // namespace
