#include "credential_checks.h"

#include "fixed_text.h"
#include "json.h"
#include "key_value_file.h"
#include "last_error.h"
#include "membership.h"
#include "platform_handles.h"

namespace qrmctl {
namespace {

constexpr const char *kJoinAgain = "run 'qrmctl leave', then 'qrmctl join'";
constexpr int kStep_s = kStep_ms / 1000;

// The records that are in force.
struct Stored {
    CredHandle pCred{ZELOCredAlloc()};
    CredSessHandle pSess{ZELOCredSessAlloc()};
    Way way;
};

bool ReadWay(const ZELO_CRED *pCred, Way &way) {
    FixedText<1024> protocol;
    FixedText<1024> host;
    long port = 0;
    if (ZELOCredItemGetProtocol(protocol.Buffer(), FixedText<1024>::Size(), pCred) != 0 ||
        ZELOCredItemGetHost(host.Buffer(), FixedText<1024>::Size(), pCred) != 0 ||
        ZELOCredItemGetPort(&port, pCred) != 0) {
        return false;
    }
    way = {protocol.sz(), host.sz(), static_cast<int>(port)};
    return !host.Empty() && port > 0 && port <= 65535 &&
           (way.strProtocol == "https" || way.strProtocol == "http" || way.IsRelayed());
}

bool HasToken(const ZELO_CRED_SESS *pSess) {
    FixedText<1024> token;
    return ZELOCredSessItemGetAccessToken(token.Buffer(), FixedText<1024>::Size(), pSess) == 0 &&
           !token.Empty();
}

Check StoreUnreadable() {
    switch (YLIBCErrGet()) {
        case YLIBC_ERR_STORE_DAMAGED:
            return {
                "credential", Outcome::kFailed, 0,
                "the credential store is damaged or of another format",
                "restore a copy, or run 'qrmctl leave', which sets it aside, then 'qrmctl join'"};
        case YLIBC_ERR_STORE_BUSY:
        case YLIBC_ERR_DEADLINE:
            return {"credential", Outcome::kFailed, 0,
                    "another program keeps the credential store locked",
                    "wait for that program, or find and end it; then try again"};
        case YLIBC_ERR_UNSAFE_FILE:
            return {"credential", Outcome::kFailed, 0,
                    "the credential store, or its folder, belongs to another user",
                    "look what it holds, and make it root's; -v names it"};
        default:
            return {"credential", Outcome::kFailed, 0, "the credential store cannot be read",
                    "run this as root; -v shows the reason"};
    }
}

Check NothingStored() {
    if (YLIBCFileCheckKeyValue(kConfigFile, kJoinFlag, "yes", 0) == 1) {
        return {"credential", Outcome::kFailed, 0,
                "none is stored, though this appliance counts as joined", kJoinAgain};
    }
    return {"credential", Outcome::kOk, 0, "none is stored: this appliance is not joined", ""};
}

// Fills `stored`; blFound tells whether it can be used.
Check CheckStored(Stored &stored, bool &blFound) {
    if (!IsStoreReadable()) {
        return StoreUnreadable();
    }
    const long id = ZELOCredIDGetByApplication(kQrmServer);
    if (id < 0) {
        return NothingStored();
    }
    if (stored.pCred == nullptr || ZELOCredLoad(id, stored.pCred.get()) < 0 ||
        !ReadWay(stored.pCred.get(), stored.way)) {
        return {"credential", Outcome::kFailed, 0, "the server's record is not whole", kJoinAgain};
    }
    const std::string strServer = "stored for " + WayText(stored.way);
    if (stored.pSess == nullptr || ZELOCredSessLoad(id, stored.pSess.get()) < 0 ||
        !HasToken(stored.pSess.get())) {
        return {"credential", Outcome::kFailed, 0, strServer + ", without an access token",
                kJoinAgain};
    }
    blFound = true;
    return {"credential", Outcome::kOk, 0, strServer, ""};
}

Check Judge(const std::string &strResponse, long duration_ms) {
    Json::Value reply;
    if (!json::FromString(strResponse, reply)) {
        return {"token", Outcome::kFailed, duration_ms,
                "the server does not answer as a QRM server would",
                "check that the stored server is still the QRM server"};
    }
    if (json::IsTrue(json::Member(reply, "success"))) {
        return {"token", Outcome::kOk, duration_ms, "the server accepts it", ""};
    }
    const int code = json::ErrorCode(reply);
    const std::string strCode = " (error code " + std::to_string(code) + ")";
    if (code >= 105 && code <= 107) {
        const char *szWhy = code == 105   ? "it is wrong"
                            : code == 106 ? "it has expired"
                                          : "the right is missing";
        return {"token", Outcome::kFailed, duration_ms,
                std::string("the server refuses it: ") + szWhy + strCode,
                "join again with a new token: 'qrmctl join --again'"};
    }
    return {"token", Outcome::kWarning, duration_ms, "the server does not say" + strCode,
            "look at the server's own log"};
}

bool GoesOn(void *pLimit, long long /*cbWritten*/, long long /*cbExpected*/) {
    return !static_cast<const TimeLimit *>(pLimit)->IsOver();
}

// A call that changes nothing at the server, with the very records that were checked.
Check CheckToken(const Stored &stored) {
    const Stopwatch watch;
    TimeLimit step(std::chrono::milliseconds{2 * kStep_ms});
    ZELO::CredRequestUtil::SetProgressObserver(GoesOn, &step);
    const RequestHandle pRequest(ZELO::CredRequest::CreateWebAPIRequest(
        stored.pCred.get(), stored.pSess.get(), appliance::kQrmApi, 1, "info", Json::Value()));
    const bool blAnswered = pRequest != nullptr && pRequest->Process(false, kStep_s);
    ZELO::CredRequestUtil::SetProgressObserver(nullptr, nullptr);
    if (!blAnswered) {
        return {
            "token", Outcome::kFailed, watch.Elapsed_ms(), "the stored server does not answer",
            "mend what the checks of its connection say, which 'qrmctl doctor' without candidates "
            "makes; where they succeed, look at the server's own log"};
    }
    return Judge(pRequest->GetResponse(), watch.Elapsed_ms());
}

}  // namespace

bool ReadStoredServer(Way &way) {
    Stored stored;
    const long id = ZELOCredIDGetByApplication(kQrmServer);
    return id >= 0 && stored.pCred != nullptr && ZELOCredLoad(id, stored.pCred.get()) >= 0 &&
           ReadWay(stored.pCred.get(), way);
}

Checks CheckCredential(bool blReachable) {
    Stored stored;
    bool blFound = false;
    const Stopwatch watch;
    Check credential = CheckStored(stored, blFound);
    credential.duration_ms = watch.Elapsed_ms();
    const auto notChecked = [](const std::string &strWhy, const std::string &strRemedy) {
        return Check{"token", Outcome::kSkipped, 0, "not checked: " + strWhy, strRemedy};
    };
    if (!blFound) {
        return {credential, credential.outcome == Outcome::kOk
                                ? notChecked("none is stored", "join first")
                                : notChecked("'credential' failed", "mend 'credential' first")};
    }
    if (!stored.way.IsSecure()) {
        return {credential, notChecked("it is not sent over plain HTTP",
                                       "join over HTTPS; 'qrmctl update' tries it as it is")};
    }
    if (!blReachable) {
        return {credential, notChecked("the stored server cannot be reached",
                                       "mend the stored connection first")};
    }
    return {credential, CheckToken(stored)};
}

}  // namespace qrmctl
