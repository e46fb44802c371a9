// What there is of a membership on the box, for tests: all of it at once, seen and set through the
// platform's own operations.

#ifndef ZELO_TESTS_MEMBERSHIP_STATE_H
#define ZELO_TESTS_MEMBERSHIP_STATE_H

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <string>

#include "accounts.h"
#include "key_value_file.h"
#include "last_error.h"
#include "process.h"
#include "stored.h"
#include "web_session.h"
#include "zeloqrmclient.h"

namespace membership {

constexpr const char *kUser = "ZelonixQRM";
constexpr const char *kFolder = "/usr/zelo/etc/QRM";
constexpr const char *kPreference = "/usr/zelo/etc/preference/ZelonixQRM";
constexpr const char *kTold = "/tmp/told";
constexpr const char *kPluginFolder = "/usr/zelo/etc/plugins/qrm_client/disjoin";
constexpr const char *kSettings = "/usr/zelo/etc/preference/ZelonixQRM/usersettings";
constexpr const char *kSessions[] = {"ZELO.QRM.Client", "ZELO.QRM.Client.Machine"};
constexpr const char *kApplications[] = {"ZELO.QRM", "ZELO.NotificationCenter"};

inline int Daemon(const char *szCommand) {
    return YLIBCExec("/usr/zelo/etc/rc.d/S99zelocache.sh", szCommand, nullptr, nullptr, nullptr);
}

inline bool ForSession(int (*pfn)(ZELO_CGI_CONTEXT *, int, const char *), const char *szName) {
    ZELO_CGI_CONTEXT context = {};
    const bool blDone = ZeloCgiInit("", &context) != 0 && pfn(&context, 13, szName) != 0;
    ZeloCgiFree(&context);
    return blDone;
}

inline std::string Value(const char *szKey) {
    char sz[256] = {};
    YLIBCFileGetKeyValue(files::kConfig, szKey, sz, sizeof(sz), 0);
    return sz;
}

// One word for each thing that is there; "" on an appliance that has nothing of a membership.
inline std::string Remains() {
    std::string strAll;
    const auto add = [&strAll](bool blThere, const std::string &strWord) {
        strAll += blThere ? (strAll.empty() ? "" : " ") + strWord : "";
    };
    add(Daemon("status") != 1, "daemon");
    for (const char *szApplication : kApplications) {
        add(ZELOCredIDGetByApplication(szApplication) >= 0, szApplication);
    }
    for (const char *szSession : kSessions) {
        add(ForSession(ZeloCgiSessionExistByIndex, szSession), szSession);
    }
    add(accounts::Get(kUser) != nullptr, "account");
    const accounts::Names members = accounts::Members();
    add(std::count(members.begin(), members.end(), kUser) != 0, "member");
    add(std::filesystem::exists(kFolder), "folder");
    const std::string strFlag = Value("join_nvo_qrm");
    add(!strFlag.empty() && strFlag != "no", '\'' + strFlag + '\'');
    add(!Value("extra_admin_QRM").empty(), "rights");
    return strAll;
}

// A whole membership as Remains() shows it; the rights are given by others.
constexpr const char *kJoined =
    "daemon ZELO.QRM ZELO.NotificationCenter ZELO.QRM.Client ZELO.QRM.Client.Machine account "
    "member folder 'yes'";
const std::string kWhole = std::string(kJoined) + " rights";

inline void Clear(const accounts::Files &files) {
    std::filesystem::remove_all(stored::kFolder);
    for (const char *szSession : kSessions) {
        ForSession(ZeloCgiRemoveSessionByIndex, szSession);
    }
    if (Daemon("status") == 0) {
        Daemon("stop");
    }
    accounts::WriteFiles(files);
    if (files.at("passwd").find(kUser) != std::string::npos) {
        std::filesystem::create_directories("/var/services/homes/ZelonixQRM");
    }
    std::filesystem::remove_all(kFolder);
    std::filesystem::remove_all(kPreference);
    YLIBCINFOSetKeyValue("join_nvo_qrm", "no");
    YLIBCINFOSetKeyValue("extra_admin_QRM", "");
}

// All of a membership at once; the files are those with the account.
inline void Build(const accounts::Files &files) {
    Clear(files);
    std::filesystem::create_directories(kFolder);
    for (const char *szApplication : kApplications) {
        stored::AddSession(stored::AddCredential(szApplication, "server.example", R"({"sn":"S1"})"),
                           "t");
    }
    for (const char *szSession : kSessions) {
        ForSession(ZeloCgiAddSessionByIndex, szSession);
    }
    Daemon("start");
    YLIBCINFOSetKeyValue("join_nvo_qrm", "yes");
    YLIBGroupExtraAdminSet("QRM", 1, 2, 3, 4);
}

// An appliance without a membership, and a plug-in that tells what it is told.
class Membership : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        files::fs::create_directories(kPluginFolder);
        files::WriteProgram(std::string(kPluginFolder) + "/50-told",
                            "echo \"$1 $QRM_CLIENT_RESULT <$QRM_CLIENT_HOST> "
                            "<$QRM_CLIENT_PROTOCOL> $QRM_CLIENT_PORT <$QRM_CLIENT_SN> "
                            "$QRM_CLIENT_REJOIN $QRM_CLIENT_FROM "
                            "$QRM_CLIENT_CLEAR_GLUSTER\" >>/tmp/told");
        s_without = accounts::ReadFiles();
        ASSERT_TRUE(ZELOQRMClientCreateServerUser());
        s_with = accounts::ReadFiles();
    }
    static void TearDownTestSuite() { Clear(s_without); }
    void SetUp() override { Reset(); }

    static void Reset() {
        Clear(s_without);
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
        Build(s_with);
        Forget();
    }
    static void Forget() {
        files::fs::remove(kTold);
        files::fs::remove(files::kJournal);
        YLIBCErrSetEx(0x123, "x", 1);
    }

    // The account's state, the system's own checks included.
    static std::string AccountState() {
        return Remains() + accounts::Findings() +
               (accounts::ReadFiles()["shadow"] == s_with["shadow"] ? " same password" : "") +
               (files::fs::exists(kSettings) ? " hidden" : "");
    }

    inline static accounts::Files s_without;
    inline static accounts::Files s_with;
};

}  // namespace membership

#endif
