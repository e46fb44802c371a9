// What plug-ins are told of the server and of leaving it.

#include "membership_state.h"
#include "torture.h"

namespace {

using namespace files;
using namespace membership;
using seam::MessagesOf;

constexpr const char *kAdminCenter = "ZELO.PKV.AdminCenter.Application";

using Plugin = Membership;

TEST_F(Plugin, PlugInsAreToldTheServerCutTo31Bytes) {
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
        EXPECT_EQ(Remains(), row.blRejoin ? "'rejoin'" : "");
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
}

TEST_F(Plugin, ThePlugInInterfaceNamesWhatItIsNotGiven) {
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

}  // namespace
