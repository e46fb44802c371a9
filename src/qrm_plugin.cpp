// Plug-in hooks: runs the plug-ins that other packages have installed for a change of membership,
// with the server's description as their arguments.

#include "fixed_text.h"
#include "guard.h"
#include "log.h"
#include "plugin_sdk.h"
#include "zeloqrmclient.h"

namespace {

constexpr const char *kFamily = "qrm_client";

int Init(__tag_qrmclient_plugin_env__ *pstEnvVar, const char *szPlugin,
         const __tag_ZELO_QRM_SERVER_INFO__ *pServerInfo) {
    if (pstEnvVar == nullptr) {
        ZELO_LOG_NULL_ARGUMENT("__null != pstEnvVar");
        return -1;
    }
    if (szPlugin == nullptr) {
        ZELO_LOG_NULL_ARGUMENT("__null != szPlugin");
        return -1;
    }
    if (pServerInfo == nullptr) {
        ZELO_LOG_NULL_ARGUMENT("NULL != pServerInfo");
        return -1;
    }
    *pstEnvVar = {};
    pstEnvVar->pServerInfo = pServerInfo;
    if (YLIBPluginSDKInit(kFamily, szPlugin, &pstEnvVar->pHandle) < 0) {
        ZELO_LOG("Fail to do plugin init[0x%04X %s:%d]", ZELO_LAST_ERROR);
        return -1;
    }
    return 0;
}

// Every value reaches a plug-in through a buffer of this size, and so cut to 31 characters.
using ArgumentText = FixedText<32>;

bool SetText(YLIBPLUGIN *pHandle, const char *szName, const char *szValue) {
    ArgumentText text;
    CopyToFit(text.Buffer(), ArgumentText::Size(), szValue);
    return YLIBPluginSetArg(pHandle, szName, text.sz()) >= 0;
}

bool SetNumber(YLIBPLUGIN *pHandle, const char *szName, long value) {
    ArgumentText text;
    text.Format("%ld", value);
    return YLIBPluginSetArg(pHandle, szName, text.sz()) >= 0;
}

bool SetArguments(const __tag_qrmclient_plugin_env__ *pstEnvVar) {
    YLIBPLUGIN *pHandle = pstEnvVar->pHandle;
    const __tag_ZELO_QRM_SERVER_INFO__ &server = *pstEnvVar->pServerInfo;
    return YLIBPluginSetArgByInt(pHandle, "RESULT", pstEnvVar->nResult) >= 0 &&
           SetText(pHandle, "HOST", server.szHost) &&
           SetText(pHandle, "PROTOCOL", server.szProtocol) &&
           SetNumber(pHandle, "PORT", server.lPort) && SetText(pHandle, "SN", server.szSn) &&
           SetNumber(pHandle, "REJOIN", server.iRejoin) &&
           SetNumber(pHandle, "FROM", server.iFrom) &&
           SetNumber(pHandle, "CLEAR_GLUSTER", server.blClearGluster ? 1 : 0);
}

int RunAction(_tag_sdk_plugin_action_ action, __tag_qrmclient_plugin_env__ *pstEnvVar) {
    if (pstEnvVar == nullptr || YLIBPluginHasInit(pstEnvVar->pHandle) == 0) {
        return -1;
    }
    if (pstEnvVar->pServerInfo == nullptr) {
        ZELO_LOG_NULL_ARGUMENT("NULL != pstEnvVar->pServerInfo");
        return -1;
    }
    if (!SetArguments(pstEnvVar)) {
        return -1;
    }
    return YLIBPluginAction(action, pstEnvVar->pHandle);
}

int Exit(__tag_qrmclient_plugin_env__ *pstEnvVar) {
    if (pstEnvVar == nullptr) {
        ZELO_LOG_NULL_ARGUMENT("__null != pstEnvVar");
        return -1;
    }
    static_cast<void>(YLIBPluginExit(pstEnvVar->pHandle));
    pstEnvVar->pHandle = nullptr;
    return 0;
}

}  // namespace

int ZELOQRMClientPluginInit(__tag_qrmclient_plugin_env__ *pstEnvVar, const char *szPlugin,
                            const __tag_ZELO_QRM_SERVER_INFO__ *pServerInfo) {
    return ZELO_GUARD(-1, [&] { return Init(pstEnvVar, szPlugin, pServerInfo); });
}

int ZELOQRMClientPlugin(_tag_sdk_plugin_action_ action, __tag_qrmclient_plugin_env__ *pstEnvVar) {
    return ZELO_GUARD(-1, [&] { return RunAction(action, pstEnvVar); });
}

int ZELOQRMClientPluginExit(__tag_qrmclient_plugin_env__ *pstEnvVar) {
    return ZELO_GUARD(-1, [&] { return Exit(pstEnvVar); });
}
