// Client info update: the joined server's entry for this appliance is brought up to date.

#include "guard.h"
#include "json.h"
#include "log.h"
#include "qrm_client_description.h"
#include "zeloqrmclient.h"

namespace {

using json::HasMember;
using json::Member;

constexpr const char *kApi = "ZELO.QRM.RPC.ClientInfo";
constexpr const char *kMethod = "update";
constexpr int kVersion = 1;

// Logged where no code came from a server.
constexpr int kNoReply = 500;

bool Describe(const Json::Value &info, Json::Value &description) {
    std::string strSerial;
    if (!client_description::ReadSerialNumber(strSerial)) {
        ZELO_LOG("Failed to get serial number from flash. [0x%04X %s:%d]", ZELO_LAST_ERROR);
    }
    description["sn"] = strSerial;
    if (HasMember(info, "host")) {
        description["host"] = Member(info, "host");
    }

    std::string strHostName;
    if (!client_description::ReadHostName(strHostName)) {
        return false;
    }
    description["name"] = strHostName;
    if (!client_description::ReadVersion(description)) {
        return false;
    }

    long port = 0;
    if (!client_description::ReadAdminPort(port)) {
        return false;
    }
    description["http_port"] = static_cast<Json::Int64>(port);
    if (!client_description::ReadSecureAdminPort(port)) {
        return false;
    }
    description["https_port"] = static_cast<Json::Int64>(port);
    return true;
}

int Update(const Json::Value &info) {
    Json::Value description(Json::objectValue);
    if (!Describe(info, description)) {
        return -1;
    }
    Json::Value reply;
    if (ZELOQRMClientSendWebapi(reply, kApi, kVersion, kMethod, description, false) < 0) {
        ZELO_LOG("Send create client failed. (%d)", kNoReply);
        return -1;
    }
    if (json::IsTrue(Member(reply, "success"))) {
        return 0;
    }
    ZELO_LOG("Send create client failed. (%d)", json::ErrorCode(reply));
    return -1;
}

}  // namespace

int ZELOQRMClientSendSetClient(const Json::Value &info) {
    return ZELO_GUARD(-1, [&] { return Update(info); });
}
