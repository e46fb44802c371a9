// Credential store: the records in memory, and the operations that pass them to the database.

#include "credential_store.h"

#include <new>
#include <utility>
#include <vector>

#include "credential_database.h"
#include "credential_record.h"
#include "fixed_text.h"
#include "status.h"

namespace {

constexpr const char *kFile = "credential_store";
constexpr long kDefaultRecord = -1;

using host::credential_database::Result;
namespace database = host::credential_database;

// The operations have C linkage: short memory becomes a failure here.
template <typename Body>
int NoThrow(Body &&body) {
    try {
        return std::forward<Body>(body)();
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

// For operations that fail on what is not there.
int ToInt(Result result) {
    if (result == Result::kAbsent) {
        return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
    }
    return result == Result::kDone ? 0 : -1;
}

template <typename Record>
int SetText(Record *pRecord, std::optional<std::string> Record::*pField, const char *szText) {
    if (pRecord == nullptr || szText == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        pRecord->*pField = szText;
        return 0;
    });
}

int SetNumber(ZELO_CRED *pCred, std::optional<long> ZELO_CRED::*pField, long value) {
    if (pCred == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    pCred->*pField = value;
    return 0;
}

template <typename Record>
int GetText(char *szBuffer, int cbBuffer, const Record *pRecord,
            std::optional<std::string> Record::*pField) {
    if (szBuffer == nullptr || cbBuffer <= 0 || pRecord == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    const auto &field = pRecord->*pField;
    if (!field) {
        return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
    }
    CopyToFit(szBuffer, cbBuffer, *field);
    return 0;
}

// The first record that the filter keeps, and how many it keeps.
Result ListKept(ZELO_CRED_KEEP pfnKeep, const char *szValue, ZELO_CRED &first, int &count) {
    if (pfnKeep == ZELOCredKeepByApplication) {
        return database::ReadFirst(szValue, first, count);
    }
    std::vector<ZELO_CRED> creds;
    const Result result = database::ReadAll(creds);
    for (ZELO_CRED &cred : creds) {
        if (pfnKeep(&cred, szValue) != 0 && count++ == 0) {
            first = std::move(cred);
        }
    }
    return result;
}

}  // namespace

ZELO_CRED *ZELOCredAlloc() {
    auto *const pCred = new (std::nothrow) ZELO_CRED;
    if (pCred == nullptr) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
    return pCred;
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
    if (pPort == nullptr || pCred == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    if (!pCred->port) {
        return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
    }
    *pPort = *pCred->port;
    return 0;
}

int ZELOCredItemGetID(long *pId, const ZELO_CRED *pCred) {
    if (pId == nullptr || pCred == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    if (pCred->id < 0) {
        return HOST_FAIL(YLIBC_ERR_NOT_FOUND);
    }
    *pId = pCred->id;
    return 0;
}

int ZELOCredSave(ZELO_CRED *pCred) {
    if (pCred == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] { return ToInt(database::WriteCredential(*pCred)); });
}

int ZELOCredLoad(long id, ZELO_CRED *pCred) {
    if (pCred == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    if (id == kDefaultRecord) {
        *pCred = ZELO_CRED();
        return 0;
    }
    return NoThrow([&] { return ToInt(database::ReadCredential(id, *pCred)); });
}

int ZELOCredKeepByApplication(const ZELO_CRED *pCred, const char *szApplication) {
    return pCred != nullptr && szApplication != nullptr && pCred->application == szApplication;
}

int ZELOCredListGet(ZELO_CRED **ppList, ZELO_CRED_KEEP pfnKeep, const char *szValue) {
    if (ppList == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    *ppList = nullptr;
    if (pfnKeep == nullptr || szValue == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        ZELO_CRED first;
        int count = 0;
        if (ListKept(pfnKeep, szValue, first, count) == Result::kFailed) {
            return -1;
        }
        if (count > 0) {
            *ppList = new ZELO_CRED(std::move(first));
        }
        return count;
    });
}

void ZELOCredListFree(ZELO_CRED **ppList) {
    if (ppList != nullptr) {
        delete *ppList;
        *ppList = nullptr;
    }
}

long ZELOCredIDGetByApplication(const char *szApplication) {
    if (szApplication == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    long id = -1;
    NoThrow([&] { return ToInt(database::FindId(szApplication, id)); });
    return id;
}

int ZELOCredRemoveByID(long id) {
    return NoThrow([&] { return ToInt(database::RemoveCredential(id)); });
}

int ZELOCredStoreSetAside(char *szPath, int cbPath) {
    return database::SetAsideIfDamaged(szPath, cbPath);
}

int ZELOCredStoreListSetAside(YLIBSZLIST **ppslPaths) {
    if (ppslPaths == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] {
        std::vector<std::string> paths;
        if (!database::ListSetAside(paths)) {
            return HOST_FAIL(YLIBC_ERR_FILE);
        }
        for (const std::string &strPath : paths) {
            if (YLIBCSzListPush(ppslPaths, strPath.c_str()) < 0) {
                return -1;
            }
        }
        return static_cast<int>(paths.size());
    });
}

ZELO_CRED_SESS *ZELOCredSessAlloc() {
    auto *const pSess = new (std::nothrow) ZELO_CRED_SESS;
    if (pSess == nullptr) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
    return pSess;
}

void ZELOCredSessFree(ZELO_CRED_SESS *pSess) {
    delete pSess;
}

int ZELOCredSessItemSetID(ZELO_CRED_SESS *pSess, long id) {
    if (pSess == nullptr || id < 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    pSess->id = id;
    return 0;
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

int ZELOCredSessSave(ZELO_CRED_SESS *pSess) {
    if (pSess == nullptr || pSess->id < 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    return NoThrow([&] { return ToInt(database::WriteSession(*pSess)); });
}

int ZELOCredSessLoad(long id, ZELO_CRED_SESS *pSess) {
    if (pSess == nullptr) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    if (id == kDefaultRecord) {
        *pSess = ZELO_CRED_SESS();
        return 0;
    }
    return NoThrow([&] { return ToInt(database::ReadSession(id, *pSess)); });
}

int ZELOCredSessRemoveByID(long id) {
    return NoThrow([&] { return ToInt(database::RemoveSession(id)); });
}
