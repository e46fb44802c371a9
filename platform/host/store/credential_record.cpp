// The records of the credential store in memory: credentials and sessions.

#include "credential_record.h"

#include "fixed_text.h"
#include "status.h"

namespace {

using host::Status;

template <typename Record>
Record *Alloc() {
    Record *pRecord = nullptr;
    return HOST_OPERATION(pRecord, pRecord, [&]() -> Status {
        pRecord = new Record;
        return {};
    });
}

template <typename Record>
int SetText(Record *pRecord, std::optional<std::string> Record::*pField, const char *szText) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pRecord != nullptr && szText != nullptr);
        pRecord->*pField = szText;
        return {};
    });
}

int SetNumber(ZELO_CRED *pCred, std::optional<long> ZELO_CRED::*pField, long value) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pCred != nullptr);
        pCred->*pField = value;
        return {};
    });
}

Status NotSet() {
    return HOST_ERROR(YLIBC_ERR_NOT_FOUND, "the field is not set");
}

template <typename Record>
int GetText(char *szBuffer, int cbBuffer, const Record *pRecord,
            std::optional<std::string> Record::*pField) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(szBuffer != nullptr && cbBuffer > 0 && pRecord != nullptr);
        const std::optional<std::string> &field = pRecord->*pField;
        if (!field) {
            return NotSet();
        }
        CopyToFit(szBuffer, cbBuffer, *field);
        return {};
    });
}

}  // namespace

ZELO_CRED *ZELOCredAlloc() {
    return Alloc<ZELO_CRED>();
}

void ZELOCredFree(ZELO_CRED *pCred) {
    delete pCred;
}

int ZELOCredItemSetCreateTime(ZELO_CRED *pCred, long time_s) {
    return SetNumber(pCred, &ZELO_CRED::createTime_s, time_s);
}

int ZELOCredItemSetModifyTime(ZELO_CRED *pCred, long time_s) {
    return SetNumber(pCred, &ZELO_CRED::modifyTime_s, time_s);
}

int ZELOCredItemSetOwner(ZELO_CRED *pCred, int uid) {
    return SetNumber(pCred, &ZELO_CRED::owner, uid);
}

int ZELOCredItemSetPort(ZELO_CRED *pCred, int port) {
    return SetNumber(pCred, &ZELO_CRED::port, port);
}

int ZELOCredItemSetHost(ZELO_CRED *pCred, const char *szHost) {
    return SetText(pCred, &ZELO_CRED::host, szHost);
}

int ZELOCredItemSetProtocol(ZELO_CRED *pCred, const char *szProtocol) {
    return SetText(pCred, &ZELO_CRED::protocol, szProtocol);
}

int ZELOCredItemSetApplication(ZELO_CRED *pCred, const char *szApplication) {
    return SetText(pCred, &ZELO_CRED::application, szApplication);
}

int ZELOCredItemSetExtraInfo(ZELO_CRED *pCred, const char *szExtraInfo) {
    return SetText(pCred, &ZELO_CRED::extraInfo, szExtraInfo);
}

int ZELOCredItemGetHost(char *szHost, int cbHost, const ZELO_CRED *pCred) {
    return GetText(szHost, cbHost, pCred, &ZELO_CRED::host);
}

int ZELOCredItemGetProtocol(char *szProtocol, int cbProtocol, const ZELO_CRED *pCred) {
    return GetText(szProtocol, cbProtocol, pCred, &ZELO_CRED::protocol);
}

int ZELOCredItemGetExtraInfo(char *szExtraInfo, int cbExtraInfo, const ZELO_CRED *pCred) {
    return GetText(szExtraInfo, cbExtraInfo, pCred, &ZELO_CRED::extraInfo);
}

int ZELOCredItemGetPort(long *pPort, const ZELO_CRED *pCred) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pPort != nullptr && pCred != nullptr);
        if (!pCred->port) {
            return NotSet();
        }
        *pPort = *pCred->port;
        return {};
    });
}

int ZELOCredItemGetID(long *pId, const ZELO_CRED *pCred) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pId != nullptr && pCred != nullptr);
        if (pCred->id < 0) {
            return NotSet();
        }
        *pId = pCred->id;
        return {};
    });
}

int ZELOCredKeepByApplication(const ZELO_CRED *pCred, const char *szApplication) {
    return pCred != nullptr && szApplication != nullptr && pCred->application == szApplication;
}

void ZELOCredListFree(ZELO_CRED **ppList) {
    if (ppList != nullptr) {
        delete *ppList;
        *ppList = nullptr;
    }
}

ZELO_CRED_SESS *ZELOCredSessAlloc() {
    return Alloc<ZELO_CRED_SESS>();
}

void ZELOCredSessFree(ZELO_CRED_SESS *pSess) {
    delete pSess;
}

int ZELOCredSessItemSetID(ZELO_CRED_SESS *pSess, long id) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pSess != nullptr && id >= 0);
        pSess->id = id;
        return {};
    });
}

int ZELOCredSessItemSetAccessToken(ZELO_CRED_SESS *pSess, const char *szToken) {
    return SetText(pSess, &ZELO_CRED_SESS::accessToken, szToken);
}

int ZELOCredSessItemSetCsrfToken(ZELO_CRED_SESS *pSess, const char *szToken) {
    return SetText(pSess, &ZELO_CRED_SESS::csrfToken, szToken);
}

int ZELOCredSessItemGetAccessToken(char *szToken, int cbToken, const ZELO_CRED_SESS *pSess) {
    return GetText(szToken, cbToken, pSess, &ZELO_CRED_SESS::accessToken);
}

int ZELOCredSessItemGetCsrfToken(char *szToken, int cbToken, const ZELO_CRED_SESS *pSess) {
    return GetText(szToken, cbToken, pSess, &ZELO_CRED_SESS::csrfToken);
}
