// What the credential store holds, as text to compare, and putting things there.

#ifndef ZELO_TESTS_STORED_H
#define ZELO_TESTS_STORED_H

#include <memory>
#include <string>

#include "credential_store.h"

namespace stored {

constexpr const char *kFolder = "/usr/zelo/etc/credentials";
constexpr const char *kDatabase = "/usr/zelo/etc/credentials/credentials.db";

using Session = std::unique_ptr<ZELO_CRED_SESS, decltype(&ZELOCredSessFree)>;

// Empties the store.
inline void Clear() {
    for (const char *szApplication : {"ZELO.QRM", "ZELO.NotificationCenter", "Other"}) {
        long id = -1;
        while ((id = ZELOCredIDGetByApplication(szApplication)) >= 0) {
            ZELOCredSessRemoveByID(id);
            ZELOCredRemoveByID(id);
        }
    }
}

// Adds a credential without a session; returns its id.
inline long AddCredential(const char *szApplication, const char *szHost,
                          const char *szExtraInfo = nullptr, const char *szProtocol = "https",
                          int port = 443) {
    const std::unique_ptr<ZELO_CRED, void (*)(ZELO_CRED *)> pCred(ZELOCredAlloc(), ZELOCredFree);
    ZELOCredItemSetApplication(pCred.get(), szApplication);
    ZELOCredItemSetHost(pCred.get(), szHost);
    ZELOCredItemSetProtocol(pCred.get(), szProtocol);
    ZELOCredItemSetPort(pCred.get(), port);
    if (szExtraInfo != nullptr) {
        ZELOCredItemSetExtraInfo(pCred.get(), szExtraInfo);
    }
    long id = -1;
    ZELOCredSave(pCred.get());
    ZELOCredItemGetID(&id, pCred.get());
    return id;
}

inline int Count(const char *szApplication = "ZELO.QRM") {
    ZELO_CRED *pList = nullptr;
    const int count = ZELOCredListGet(&pList, ZELOCredKeepByApplication, szApplication);
    ZELOCredListFree(&pList);
    return count;
}

inline void AddSession(long id, const char *szToken, const char *szCsrf = nullptr) {
    const Session pSess(ZELOCredSessAlloc(), ZELOCredSessFree);
    ZELOCredSessItemSetID(pSess.get(), id);
    ZELOCredSessItemSetAccessToken(pSess.get(), szToken);
    if (szCsrf != nullptr) {
        ZELOCredSessItemSetCsrfToken(pSess.get(), szCsrf);
    }
    ZELOCredSessSave(pSess.get());
}

// "" without a credential, else such as "https://host:443 {} token=t csrf=c"; "?" stands for a
// field that is not set.
inline std::string Describe(const char *szApplication = "ZELO.QRM") {
    const std::unique_ptr<ZELO_CRED, void (*)(ZELO_CRED *)> pCred(ZELOCredAlloc(), ZELOCredFree);
    const long id = ZELOCredIDGetByApplication(szApplication);
    if (id < 0 || ZELOCredLoad(id, pCred.get()) < 0) {
        return "";
    }
    char sz[4096];
    const auto text = [&](int result) { return std::string(result == 0 ? sz : "?"); };
    long port = -1;
    ZELOCredItemGetPort(&port, pCred.get());
    std::string strAll = text(ZELOCredItemGetProtocol(sz, sizeof(sz), pCred.get())) + "://";
    strAll += text(ZELOCredItemGetHost(sz, sizeof(sz), pCred.get())) + ':' + std::to_string(port);
    strAll += ' ' + text(ZELOCredItemGetExtraInfo(sz, sizeof(sz), pCred.get()));
    const Session pSess(ZELOCredSessAlloc(), ZELOCredSessFree);
    if (ZELOCredSessLoad(id, pSess.get()) < 0) {
        return strAll;
    }
    strAll += " token=" + text(ZELOCredSessItemGetAccessToken(sz, sizeof(sz), pSess.get()));
    return strAll + " csrf=" + text(ZELOCredSessItemGetCsrfToken(sz, sizeof(sz), pSess.get()));
}

}  // namespace stored

#endif
