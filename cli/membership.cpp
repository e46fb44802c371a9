#include "membership.h"

#include <sys/random.h>

#include <csignal>
#include <cstdlib>
#include <ctime>
#include <filesystem>

#include "credential_store.h"
#include "file_lock.h"
#include "fixed_text.h"
#include "json.h"
#include "key_value_file.h"
#include "last_error.h"
#include "platform_handles.h"
#include "process.h"
#include "user_group.h"
#include "web_session.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

// More credentials of one application than this are no accident.
constexpr int kMaxLeaves = 100;

bool StoreSession(long id, const std::string &strToken) {
    const CredSessHandle pSess(ZELOCredSessAlloc());
    return id >= 0 && pSess != nullptr && ZELOCredSessItemSetID(pSess.get(), id) >= 0 &&
           ZELOCredSessItemSetAccessToken(pSess.get(), strToken.c_str()) >= 0 &&
           ZELOCredSessSave(pSess.get()) >= 0;
}

// Copies protocol, host and port.
bool CopyServer(const ZELO_CRED *pFrom, ZELO_CRED *pTo) {
    FixedText<1024> protocol;
    FixedText<1024> host;
    long port = 0;
    return ZELOCredItemGetProtocol(protocol.Buffer(), FixedText<1024>::Size(), pFrom) == 0 &&
           ZELOCredItemGetHost(host.Buffer(), FixedText<1024>::Size(), pFrom) == 0 &&
           ZELOCredItemGetPort(&port, pFrom) == 0 &&
           ZELOCredItemSetProtocol(pTo, protocol.sz()) >= 0 &&
           ZELOCredItemSetHost(pTo, host.sz()) >= 0 &&
           ZELOCredItemSetPort(pTo, static_cast<int>(port)) >= 0;
}

// The generator is the C library's and takes a seed of 32 bits; it comes from the kernel.
bool SeedGenerator() {
    unsigned int seed = 0;
    if (getrandom(&seed, sizeof(seed), 0) != static_cast<ssize_t>(sizeof(seed))) {
        return false;
    }
    std::srand(seed);
    return true;
}

// What join status does not look at: the account of a killed leave, its folder, and, where no join
// is to follow, the account's rights and a flag that announces one.
bool RemoveRemains(bool blRejoin) {
    std::error_code error;
    if (!ZELOQRMClientDeleteServerUser()) {
        return false;
    }
    std::filesystem::remove_all(appliance::kAccountFolder, error);
    if (error || blRejoin) {
        return !error;
    }
    if (YLIBGroupExtraAdminSet("QRM", 0, 0, 0, 0) != 0) {
        return false;
    }
    return YLIBCFileCheckKeyValue(kConfigFile, kJoinFlag, "rejoin", 0) == 0 || SetJoinFlag("no");
}

// --- What is gone for certain: what cannot be read may be there ---------------------------------

bool AreCredentialsGone() {
    for (const char *szApplication : {kQrmServer, kNotificationCenter}) {
        ZELO_CRED *pList = nullptr;
        const int count = ZELOCredListGet(&pList, ZELOCredKeepByApplication, szApplication);
        const CredListHandle list(pList);
        if (count != 0) {
            return false;
        }
    }
    return true;
}

bool AreSessionsGone() {
    ZELO_CGI_CONTEXT context = {};
    bool blGone = ZeloCgiInit("", &context) != 0;
    for (const char *szSession : kClientSessions) {
        YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
        blGone = blGone && ZeloCgiSessionExistByIndex(&context, kSessionIndex, szSession) == 0 &&
                 YLIBCErrGet() == YLIBC_ERR_NONE;
    }
    ZeloCgiFree(&context);
    return blGone;
}

bool IsFlagGone(bool blRejoin) {
    return YLIBCFileCheckKeyValue(kConfigFile, kJoinFlag, "yes", 0) == 0 &&
           (blRejoin || YLIBCFileCheckKeyValue(kConfigFile, kJoinFlag, "rejoin", 0) == 0);
}

}  // namespace

bool StoreSerial(const std::string &strSerial) {
    Json::Value extraInfo;
    extraInfo["sn"] = strSerial;
    std::string strText;
    const CredHandle pCred(ZELOCredAlloc());
    const long id = ZELOCredIDGetByApplication(kQrmServer);
    return pCred != nullptr && id >= 0 && json::ToString(extraInfo, strText) &&
           ZELOCredLoad(id, pCred.get()) >= 0 &&
           ZELOCredItemSetExtraInfo(pCred.get(), strText.c_str()) >= 0 &&
           ZELOCredSave(pCred.get()) >= 0;
}

MembershipTurn::MembershipTurn() {
    constexpr const char *kLock = "/tmp/qrmctl.membership.lock";
    constexpr int kTimeout_s = 120;
    // Waiting can be interrupted; only the change itself cannot.
    static_cast<void>(YLIBCFileLockTimeByFile(kLock, 1, kTimeout_s, &m_handle));
    sigset_t ends;
    sigemptyset(&ends);
    for (int signal : {SIGINT, SIGTERM, SIGHUP}) {
        sigaddset(&ends, signal);
    }
    pthread_sigmask(SIG_BLOCK, &ends, &m_before);
}

MembershipTurn::~MembershipTurn() {
    if (m_handle >= 0) {
        YLIBCFileUnlockByFile(m_handle);
    }
    pthread_sigmask(SIG_SETMASK, &m_before, nullptr);
}

bool IsStoreReadable() {
    ZELO_CRED *pList = nullptr;
    const int count = ZELOCredListGet(&pList, ZELOCredKeepByApplication, kQrmServer);
    const CredListHandle list(pList);
    return count >= 0;
}

std::vector<std::string> StoresSetAside() {
    constexpr int kListSize = 1024;
    std::vector<std::string> paths;
    ListHandle list(YLIBCSzListAlloc(kListSize));
    if (list.Get() == nullptr || ZELOCredStoreListSetAside(list.Address()) < 0) {
        return paths;
    }
    for (int i = 0; i < list.Get()->nItem; ++i) {
        paths.emplace_back(YLIBCSzListGet(list.Get(), i));
    }
    return paths;
}

bool StoreServerSession(const std::string &strToken) {
    return StoreSession(ZELOCredIDGetByApplication(kQrmServer), strToken);
}

bool StoreNotificationCenter(const std::string &strToken) {
    const CredHandle pServer(ZELOCredAlloc());
    const CredHandle pCred(ZELOCredAlloc());
    const long serverId = ZELOCredIDGetByApplication(kQrmServer);
    const long now_s = std::time(nullptr);
    long id = -1;
    return pServer != nullptr && pCred != nullptr && serverId >= 0 &&
           ZELOCredLoad(serverId, pServer.get()) >= 0 && CopyServer(pServer.get(), pCred.get()) &&
           ZELOCredItemSetApplication(pCred.get(), kNotificationCenter) >= 0 &&
           ZELOCredItemSetOwner(pCred.get(), appliance::kCredentialOwner) >= 0 &&
           ZELOCredItemSetCreateTime(pCred.get(), now_s) >= 0 &&
           ZELOCredItemSetModifyTime(pCred.get(), now_s) >= 0 && ZELOCredSave(pCred.get()) >= 0 &&
           ZELOCredItemGetID(&id, pCred.get()) >= 0 && StoreSession(id, strToken);
}

bool StartCacheDaemon() {
    return YLIBCExec(kCacheDaemon, "start", nullptr, nullptr, nullptr) == 0 &&
           YLIBCExec(kCacheDaemon, "status", nullptr, nullptr, nullptr) == 0;
}

bool AddClientSessions() {
    ZELO_CGI_CONTEXT context = {};
    bool blAdded = ZeloCgiInit("", &context) != 0;
    for (const char *szSession : kClientSessions) {
        blAdded = blAdded && ZeloCgiAddSessionByIndex(&context, kSessionIndex, szSession) != 0;
    }
    ZeloCgiFree(&context);
    return blAdded;
}

bool CreateServiceAccount() {
    return SeedGenerator() && ZELOQRMClientCreateServerUser();
}

bool SetJoinFlag(const char *szValue) {
    return YLIBCINFOSetKeyValue(kJoinFlag, szValue) >= 0;
}

bool LeaveWholly(const LeaveRequest &request) {
    if (!IsStoreReadable()) {
        return false;
    }
    // A flag that cannot be judged counts as not joined whatever else there is.
    if (YLIBCFileCheckKeyValue(kConfigFile, kJoinFlag, "yes", 0) < 0 && !SetJoinFlag("no")) {
        return false;
    }
    for (int i = 0; i < kMaxLeaves && ZELOQRMClientStatus() != 0; ++i) {
        if (!ZELOQRMClientDeleteServer(request.blRejoin, request.strFrom, request.blClearGluster)) {
            return false;
        }
    }
    // To the library's other look-ups, what cannot be read and what is not there are the same.
    return ZELOQRMClientStatus() == 0 && RemoveRemains(request.blRejoin) && AreCredentialsGone() &&
           AreSessionsGone() && IsFlagGone(request.blRejoin);
}

}  // namespace qrmctl
