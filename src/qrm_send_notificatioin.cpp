// Notifications of the server link to the appliance's own users.

#include "appliance.h"
#include "guard.h"
#include "json.h"
#include "log.h"
#include "notification.h"
#include "platform_handles.h"
#include "zeloqrmclient.h"

namespace {

constexpr int kHashSize = 512;

void SetServerVariable(YLIBSZHASH **ppHash) {
    Json::Value server(Json::objectValue);
    ZELOQRMClientGetServerCredential(server);
    if (YLIBCSzHashGetValue(*ppHash, appliance::kServerVariable) != nullptr) {
        return;
    }
    const char *szHost = json::Text(json::Member(server, "host"));
    if (YLIBCSzHashSetValue(ppHash, appliance::kServerVariable,
                            szHost == nullptr ? "Unknown" : szHost) < 0) {
        ZELO_LOG("Failed to YLIBCSzHashSetValue[0x%04X %s:%d]", ZELO_LAST_ERROR);
    }
}

void Send(const char *szTag, YLIBSZHASH **ppHash) {
    HashHandle own;
    if (ppHash == nullptr || *ppHash == nullptr) {
        own.Reset(YLIBCSzHashAlloc(kHashSize));
        if (own.Get() == nullptr) {
            ZELO_LOG("Failed to YLIBCSzHashAlloc[0x%04X %s:%d]", ZELO_LAST_ERROR);
            return;
        }
        ppHash = own.Address();
    }
    SetServerVariable(ppHash);
    static_cast<void>(ZELOSysNotifySendNotifiction(szTag, ppHash));
}

}  // namespace

void SendNotification(const char *szTag, YLIBSZHASH **ppHash) {
    ZELO_GUARD(0, [&] {
        Send(szTag, ppHash);
        return 0;
    });
}
