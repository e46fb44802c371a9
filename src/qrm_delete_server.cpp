// Membership: the judgement whether this appliance is joined, and leaving the server.

#include <cstdlib>

#include "appliance.h"
#include "fixed_text.h"
#include "guard.h"
#include "json.h"
#include "json_text.h"
#include "key_value_file.h"
#include "log.h"
#include "platform_handles.h"
#include "plugin_sdk.h"
#include "process.h"
#include "user_group.h"
#include "web_session.h"
#include "zeloqrmclient.h"

namespace {

// Released whether or not it could be made ready.
class CgiContext {
  public:
    CgiContext() = default;
    ~CgiContext() { ZeloCgiFree(&m_context); }
    CgiContext(const CgiContext &) = delete;
    CgiContext &operator=(const CgiContext &) = delete;

    bool Init() {
        if (ZeloCgiInit("", &m_context) == 0) {
            ZELO_LOG("ZeloCgiInit fail");
            return false;
        }
        return true;
    }
    ZELO_CGI_CONTEXT *Get() { return &m_context; }

  private:
    ZELO_CGI_CONTEXT m_context = {};
};

// --- Join status --------------------------------------------------------------------------------

// What the join flag says. Where it cannot be judged, nothing disagrees with it.
struct Joined {
    explicit Joined(int flag) : blYes(flag == 1), blNo(flag == 0) {}
    bool blYes;
    bool blNo;
};

int Disagree(const char *szRule, int line) {
    qrm_log::Write(ZELO_SOURCE_STEM, line, "Status Error: [%s]", szRule);
    return -1;
}

#define DISAGREE(szRule) Disagree(szRule, __LINE__)

bool HasClientSession() {
    CgiContext context;
    return context.Init() && (ZeloCgiSessionExistByIndex(context.Get(), appliance::kSessionIndex,
                                                         appliance::kClientSession) != 0 ||
                              ZeloCgiSessionExistByIndex(context.Get(), appliance::kSessionIndex,
                                                         appliance::kMachineSession) != 0);
}

int CheckServiceAccount(const Joined &joined) {
    MovingHandle<ZELO_USER, ZELOUserFree> user;
    const bool blExists = ZELOUserGet(appliance::kServiceAccount, user.Address()) == 0;
    if (joined.blYes && !blExists) {
        return DISAGREE("TRUE == blJoined");
    }
    const bool blAdmin = blExists && YLIBGroupIsAdminGroupMem(user.Get()->szName, 0) == 1;
    if (joined.blYes && !blAdmin) {
        return DISAGREE("TRUE == blJoined");
    }
    return 0;
}

// The indicators in a fixed order; the first that disagrees with the flag ends the walk.
int Status() {
    const Joined joined(
        YLIBCFileCheckKeyValue(appliance::kConfigFile, appliance::kJoinFlag, "yes", 0));
    for (const char *szApplication : {appliance::kQrmServer, appliance::kNotificationCenter}) {
        const long credId = ZELOCredIDGetByApplication(szApplication);
        if (joined.blNo && credId >= 0) {
            return DISAGREE("FALSE == blJoined && 0 <= CredId");
        }
        if (joined.blYes && credId < 0) {
            return DISAGREE("TRUE == blJoined && 0 > CredId");
        }
    }
    const int runRet = YLIBCExec(appliance::kCacheDaemon, "status", nullptr, nullptr, nullptr);
    if (joined.blNo && runRet == 0) {
        return DISAGREE("FALSE == blJoined && 0 == runRet");
    }
    if (joined.blYes && runRet == 1) {
        return DISAGREE("TRUE == blJoined && 1 == runRet");
    }
    const bool blSessionExist = HasClientSession();
    if (joined.blNo && blSessionExist) {
        return DISAGREE("FALSE == blJoined && true == blSessionExist");
    }
    if (joined.blYes && !blSessionExist) {
        return DISAGREE("TRUE == blJoined && false == blSessionExist");
    }
    if (CheckServiceAccount(joined) < 0) {
        return -1;
    }
    return joined.blYes ? 1 : 0;
}

// --- Leave --------------------------------------------------------------------------------------

constexpr const char *kPlugin = "qrm_client/disjoin";
constexpr const char *kAdminCenter = "ZELO.PKV.AdminCenter.Application";
constexpr const char *kDetachSuccess = "QRMClientDetachSuccess";
constexpr int kHashSize = 512;

struct Request {
    bool blRejoin;
    const std::string &strFrom;
    bool blClearGluster;
};

// Copies a text into a field, cut to fit: the platform may fill its buffer without an end.
template <std::size_t N>
bool ReadField(int (*pfnGet)(char *, int, const ZELO_CRED *), const ZELO_CRED *pCred,
               char (&szField)[N]) {
    FixedText<N> text;
    if (pfnGet(text.Buffer(), FixedText<N>::Size(), pCred) < 0) {
        return false;
    }
    CopyToFit(szField, N, text.sz());
    return true;
}

// Host, protocol, extra information and port; false when one of them cannot be read.
bool ReadServer(__tag_ZELO_QRM_SERVER_INFO__ &server, std::string &strExtraInfo) {
    const long id = ZELOCredIDGetByApplication(appliance::kQrmServer);
    if (id < 0) {
        return false;
    }
    const CredHandle pCred(ZELOCredAlloc());
    FixedText<4096> extraInfo;
    if (pCred == nullptr || ZELOCredLoad(id, pCred.get()) < 0 ||
        !ReadField(ZELOCredItemGetHost, pCred.get(), server.szHost) ||
        !ReadField(ZELOCredItemGetProtocol, pCred.get(), server.szProtocol) ||
        ZELOCredItemGetExtraInfo(extraInfo.Buffer(), FixedText<4096>::Size(), pCred.get()) < 0 ||
        ZELOCredItemGetPort(&server.lPort, pCred.get()) < 0) {
        return false;
    }
    strExtraInfo = extraInfo.sz();
    return true;
}

// The server that is being left. Of one that cannot be read whole nothing is told, nor of what the
// caller asked for: the record stays all zero.
void DescribeServer(const Request &request, __tag_ZELO_QRM_SERVER_INFO__ &server) {
    std::string strExtraInfo;
    if (!ReadServer(server, strExtraInfo)) {
        server = {};
        return;
    }
    Json::Value extraInfo;
    if (json_text::FromString(strExtraInfo, extraInfo)) {
        const char *szSn = json::Text(json::Member(extraInfo, "sn"));
        CopyToFit(server.szSn, sizeof(server.szSn), szSn == nullptr ? "" : szSn);
    }
    server.iRejoin = request.blRejoin ? 1 : 0;
    server.iFrom = request.strFrom == kAdminCenter ? 1 : 0;
    server.blClearGluster = request.blClearGluster;
}

bool RemoveSessions() {
    CgiContext context;
    if (!context.Init()) {
        return false;
    }
    if (ZeloCgiRemoveSessionByIndex(context.Get(), appliance::kSessionIndex,
                                    appliance::kClientSession) == 0 ||
        ZeloCgiRemoveSessionByIndex(context.Get(), appliance::kSessionIndex,
                                    appliance::kMachineSession) == 0) {
        ZELO_LOG("Remove QRM session fail.");
        return false;
    }
    return true;
}

bool SetFlag(const char *szKey, const char *szValue) {
    if (YLIBCINFOSetKeyValue(szKey, szValue) < 0) {
        ZELO_LOG("Set zeloinfo fail");
        return false;
    }
    return true;
}

void NotifyDetached(const char *szHost) {
    HashHandle variables(YLIBCSzHashAlloc(kHashSize));
    if (variables.Get() == nullptr ||
        YLIBCSzHashSetValue(variables.Address(), appliance::kServerVariable, szHost) < 0) {
        ZELO_LOG("Failed to execute YLIBCSzHash operations");
        return;
    }
    SendNotification(kDetachSuccess, variables.Address());
}

// Takes away what joining left behind, in a fixed order, and stops at the first failure: what is
// done stays done, and leaving again does the rest.
bool RemoveTraces(bool blRejoin, const char *szHost) {
    if (YLIBCExec(appliance::kCacheDaemon, "stop", nullptr, nullptr, nullptr) < 0) {
        ZELO_LOG("Stop cache daemon fail");
        return false;
    }
    if (!ZELOQRMClientDeleteServerCredential()) {
        ZELO_LOG("Remove zelocredential fail");
        return false;
    }
    if (!RemoveSessions()) {
        ZELO_LOG("Remove session fail");
        return false;
    }
    if (!ZELOQRMClientDeleteServerUser()) {
        ZELO_LOG("Remove User fail");
        return false;
    }
    if (!SetFlag("nvo_qrm_self_join", "no") ||
        !SetFlag(appliance::kJoinFlag, blRejoin ? "rejoin" : "no")) {
        return false;
    }
    if (blRejoin) {
        return true;
    }
    NotifyDetached(szHost);
    if (YLIBGroupExtraAdminSet("QRM", 0, 0, 0, 0) != 0) {
        ZELO_LOG("Call YLIBGroupExtraAdminSet() failed.");
    }
    return true;
}

bool Leave(const Request &request) {
    __tag_ZELO_QRM_SERVER_INFO__ server = {};
    __tag_qrmclient_plugin_env__ env = {};
    if (ZELOQRMClientStatus() == 0) {
        return true;
    }
    DescribeServer(request, server);
    if (ZELOQRMClientPluginInit(&env, kPlugin, &server) < 0) {
        ZELO_LOG("Plugin init failed.");
    }
    if (ZELOQRMClientPlugin(SDK_PLUGIN_ACTION_PRE, &env) < 0) {
        ZELO_LOG("Fail to execute disjoin plugin (PRE)");
    }
    env.nResult = -1;
    const bool blLeft =
        ZELO_GUARD(false, [&] { return RemoveTraces(request.blRejoin, server.szHost); });
    if (blLeft) {
        env.nResult = 0;
    }
    if (ZELOQRMClientPlugin(SDK_PLUGIN_ACTION_POST, &env) < 0) {
        ZELO_LOG("Fail to execute disjoin plugin (POST)");
    }
    ZELOQRMClientPluginExit(&env);
    return blLeft;
}

}  // namespace

int ZELOQRMClientStatus() {
    return ZELO_GUARD(-1, Status);
}

bool ZELOQRMClientDeleteServer(bool blRejoin, const std::string &strFrom, bool blClearGluster) {
    return ZELO_GUARD(false, [&] { return Leave({blRejoin, strFrom, blClearGluster}); });
}

bool ZELOQRMClientDeleteServer(bool blRejoin, const std::string &strFrom) {
    return ZELOQRMClientDeleteServer(blRejoin, strFrom, false);
}

bool ZELOQRMClientDeleteServer() {
    return ZELOQRMClientDeleteServer(false, "", false);
}
