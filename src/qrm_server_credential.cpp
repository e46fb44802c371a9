// Server credential: the pair of platform records that says where the QRM server is and holds the
// token that authenticates the appliance there. Five stateless adapters between a JSON object and
// those records.

#include <ctime>

#include "appliance.h"
#include "credential_store.h"
#include "fixed_text.h"
#include "guard.h"
#include "json.h"
#include "json_text.h"
#include "log.h"
#include "platform_handles.h"
#include "zeloqrmclient.h"

namespace {

using json::HasMember;
using json::Member;
using json::Text;

constexpr long kDefaultRecord = -1;

using StoreText = FixedText<1024>;

// A setter that takes a text: fails as well when the value is no text.
template <typename Record>
bool SetText(int (*pfnSet)(Record *, const char *), Record *pRecord, const Json::Value &value) {
    const char *szText = Text(value);
    return szText != nullptr && pfnSet(pRecord, szText) >= 0;
}

bool SetPort(ZELO_CRED *pCred, const Json::Value &value) {
    int port = 0;
    return json::ReadInt(value, port) && ZELOCredItemSetPort(pCred, port) >= 0;
}

bool SetExtraInfo(ZELO_CRED *pCred, const Json::Value &value) {
    std::string strText;
    return json_text::ToString(value, strText) &&
           ZELOCredItemSetExtraInfo(pCred, strText.c_str()) >= 0;
}

bool HasCreateMembers(const Json::Value &cred) {
    return HasMember(cred, "protocol") && HasMember(cred, "host") && HasMember(cred, "port") &&
           HasMember(cred, "application") && HasMember(cred, "access_token");
}

bool SaveCredential(ZELO_CRED *pCred, const Json::Value &cred) {
    const long now_s = std::time(nullptr);
    return pCred != nullptr && ZELOCredItemSetCreateTime(pCred, now_s) >= 0 &&
           ZELOCredItemSetModifyTime(pCred, now_s) >= 0 &&
           ZELOCredItemSetOwner(pCred, appliance::kCredentialOwner) >= 0 &&
           SetPort(pCred, Member(cred, "port")) &&
           SetText(ZELOCredItemSetHost, pCred, Member(cred, "host")) &&
           SetText(ZELOCredItemSetProtocol, pCred, Member(cred, "protocol")) &&
           SetText(ZELOCredItemSetApplication, pCred, Member(cred, "application")) &&
           SetExtraInfo(pCred, Member(cred, "extra_info")) && ZELOCredSave(pCred) >= 0;
}

bool SaveSession(long id, const Json::Value &accessToken) {
    const CredSessHandle pSess(ZELOCredSessAlloc());
    return pSess != nullptr && ZELOCredSessItemSetID(pSess.get(), id) >= 0 &&
           SetText(ZELOCredSessItemSetAccessToken, pSess.get(), accessToken) &&
           ZELOCredSessSave(pSess.get()) >= 0;
}

bool Create(const Json::Value &cred) {
    if (!HasCreateMembers(cred)) {
        ZELO_LOG("Bad parameters");
        return false;
    }
    const CredHandle pCred(ZELOCredAlloc());
    if (!SaveCredential(pCred.get(), cred)) {
        ZELO_LOG("Save Cred Item fail");
        return false;
    }
    long id = -1;
    if (ZELOCredItemGetID(&id, pCred.get()) < 0) {
        ZELO_LOG("Get CredId fail");
        return false;
    }
    if (!SaveSession(id, Member(cred, "access_token"))) {
        ZELO_LOG("Save CredSess Item fail");
        return false;
    }
    return true;
}

// The session goes first: a credential without a session can still be found and removed later, a
// session without its credential could not.
bool RemoveByApplication(const char *szApplication) {
    const long id = ZELOCredIDGetByApplication(szApplication);
    if (id < 0) {
        return true;
    }
    return ZELOCredSessRemoveByID(id) >= 0 && ZELOCredRemoveByID(id) >= 0;
}

CredListHandle ListByApplication(const char *szApplication) {
    ZELO_CRED *pList = nullptr;
    const int count = ZELOCredListGet(&pList, ZELOCredKeepByApplication, szApplication);
    CredListHandle list(pList);
    if (count <= 0) {
        list.reset();
    }
    return list;
}

// Reads the extra information as an object. JSON null, which create writes when it is given none,
// counts as an empty one.
bool ReadExtraInfo(const ZELO_CRED *pCred, Json::Value &extraInfo) {
    StoreText text;
    if (ZELOCredItemGetExtraInfo(text.Buffer(), StoreText::Size(), pCred) != 0 ||
        !json_text::FromString(text.sz(), extraInfo)) {
        return false;
    }
    if (extraInfo.isNull()) {
        extraInfo = Json::Value(Json::objectValue);
    }
    return extraInfo.isObject();
}

// Each field by itself: one that cannot be read is left out.
void ReadServer(const ZELO_CRED *pCred, Json::Value &out) {
    StoreText host;
    if (ZELOCredItemGetHost(host.Buffer(), StoreText::Size(), pCred) == 0) {
        out["host"] = host.sz();
    }
    long port = 0;
    if (ZELOCredItemGetPort(&port, pCred) == 0) {
        out["port"] = static_cast<Json::Int64>(port);
    }
    StoreText protocol;
    if (ZELOCredItemGetProtocol(protocol.Buffer(), StoreText::Size(), pCred) == 0) {
        out["protocol"] = protocol.sz();
    }
    Json::Value extraInfo;
    if (ReadExtraInfo(pCred, extraInfo) && HasMember(extraInfo, "sn")) {
        out["sn"] = Member(extraInfo, "sn");
    }
}

void ReadTokens(const ZELO_CRED_SESS *pSess, Json::Value &out) {
    StoreText accessToken;
    if (ZELOCredSessItemGetAccessToken(accessToken.Buffer(), StoreText::Size(), pSess) == 0) {
        out["access_token"] = accessToken.sz();
    }
    StoreText csrfToken;
    if (ZELOCredSessItemGetCsrfToken(csrfToken.Buffer(), StoreText::Size(), pSess) == 0 &&
        !csrfToken.Empty()) {
        out["csrf_token"] = csrfToken.sz();
    }
}

bool CanHoldMembers(const Json::Value &out) {
    return out.isNull() || out.isObject();
}

bool Get(Json::Value &out) {
    if (!CanHoldMembers(out)) {
        ZELO_LOG("Bad parameters");
        return false;
    }
    const CredListHandle pCred = ListByApplication(appliance::kQrmServer);
    if (pCred == nullptr) {
        ZELO_LOG("cannot find qrm server info");
        return false;
    }
    ReadServer(pCred.get(), out);
    return true;
}

bool GetWithToken(Json::Value &out) {
    if (!CanHoldMembers(out)) {
        ZELO_LOG("Bad parameters");
        return false;
    }
    const CredListHandle pCred = ListByApplication(appliance::kQrmServer);
    if (pCred == nullptr) {
        ZELO_LOG("cannot find qrm server info");
        return false;
    }
    out["application"] = appliance::kQrmServer;
    ReadServer(pCred.get(), out);

    long id = -1;
    if (ZELOCredItemGetID(&id, pCred.get()) < 0) {
        ZELO_LOG("get cred id fail");
        return false;
    }
    const CredSessHandle pSess(ZELOCredSessAlloc());
    if (pSess == nullptr) {
        ZELO_LOG("alloc ZELO_CRED_SESS fail");
        return false;
    }
    if (ZELOCredSessLoad(kDefaultRecord, pSess.get()) < 0 ||
        ZELOCredSessLoad(id, pSess.get()) < 0) {
        ZELO_LOG("cannot find qrm server session[%ld]", id);
        return false;
    }
    ReadTokens(pSess.get(), out);
    return true;
}

bool ChangeCredential(ZELO_CRED *pCred, const Json::Value &cred) {
    if (HasMember(cred, "protocol") &&
        !SetText(ZELOCredItemSetProtocol, pCred, Member(cred, "protocol"))) {
        return false;
    }
    if (HasMember(cred, "host") && !SetText(ZELOCredItemSetHost, pCred, Member(cred, "host"))) {
        return false;
    }
    if (HasMember(cred, "port") && !SetPort(pCred, Member(cred, "port"))) {
        return false;
    }
    return !HasMember(cred, "application") ||
           SetText(ZELOCredItemSetApplication, pCred, Member(cred, "application"));
}

bool ChangeExtraInfo(ZELO_CRED *pCred, const Json::Value &cred) {
    Json::Value extraInfo;
    if (!ReadExtraInfo(pCred, extraInfo)) {
        return true;
    }
    if (HasMember(cred, "sn")) {
        extraInfo["sn"] = Member(cred, "sn");
    }
    return SetExtraInfo(pCred, extraInfo);
}

bool Update(const Json::Value &cred) {
    const char *szApplication = Text(Member(cred, "application"));
    const CredListHandle pCred =
        szApplication == nullptr ? nullptr : ListByApplication(szApplication);
    if (pCred == nullptr) {
        ZELO_LOG("cannot find qrm server info");
        return false;
    }
    if (!ChangeCredential(pCred.get(), cred) || !ChangeExtraInfo(pCred.get(), cred)) {
        return false;
    }
    long id = -1;
    if (ZELOCredItemGetID(&id, pCred.get()) < 0) {
        ZELO_LOG("Get CredId fail");
        return false;
    }
    const CredSessHandle pSess(ZELOCredSessAlloc());
    if (pSess == nullptr || ZELOCredSessLoad(id, pSess.get()) < 0) {
        return false;
    }
    if (HasMember(cred, "access_token") &&
        !SetText(ZELOCredSessItemSetAccessToken, pSess.get(), Member(cred, "access_token"))) {
        return false;
    }
    return ZELOCredSave(pCred.get()) >= 0 && ZELOCredSessSave(pSess.get()) >= 0;
}

}  // namespace

bool ZELOQRMClientCreateServerCredential(const Json::Value &cred) {
    return ZELO_GUARD(false, [&] { return Create(cred); });
}

bool ZELOQRMClientDeleteServerCredential() {
    return ZELO_GUARD(false, [] {
        return RemoveByApplication(appliance::kQrmServer) &&
               RemoveByApplication(appliance::kNotificationCenter);
    });
}

bool ZELOQRMClientGetServerCredential(Json::Value &out) {
    return ZELO_GUARD(false, [&] { return Get(out); });
}

bool ZELOQRMClientGetServerCredentialWithToken(Json::Value &out) {
    return ZELO_GUARD(false, [&] { return GetWithToken(out); });
}

bool ZELOQRMClientUpdateServerCredential(Json::Value &cred) {
    return ZELO_GUARD(false, [&] { return Update(cred); });
}
