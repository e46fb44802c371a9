#include "indicators.h"

#include "credential_store.h"
#include "deadline.h"
#include "fixed_text.h"
#include "joined_server.h"
#include "key_value_file.h"
#include "last_error.h"
#include "membership.h"
#include "platform_handles.h"
#include "process.h"
#include "user_group.h"
#include "web_session.h"

namespace qrmctl {
namespace {

constexpr const char *kLeave = "qrmctl leave";
constexpr const char *kJoinAgain = "qrmctl leave, then qrmctl join";
constexpr const char *kStartDaemon = "/usr/zelo/etc/rc.d/S99zelocache.sh start";
constexpr const char *kCreateAccount = "qrmctl account create";

struct Rule {
    const char *szText;     // as the library logs it
    const char *szMeaning;  // what is wrong when it is broken
    const char *szRemedy;
};

// In the order of their numbers, from 1. The table in docs/qrmctl.md is this one.
constexpr Rule kRules[] = {
    {"FALSE == blJoined && 0 <= CredId", "not joined, but a server credential is stored", kLeave},
    {"TRUE == blJoined && 0 > CredId", "joined, but no server credential is stored", kJoinAgain},
    {"FALSE == blJoined && 0 <= CredId",
     "not joined, but a notification-center credential is stored", kLeave},
    {"TRUE == blJoined && 0 > CredId", "joined, but no notification-center credential is stored",
     kJoinAgain},
    {"FALSE == blJoined && 0 == runRet", "not joined, but the cache daemon runs", kLeave},
    {"TRUE == blJoined && 1 == runRet", "joined, but the cache daemon is stopped", kStartDaemon},
    {"FALSE == blJoined && true == blSessionExist", "not joined, but there are web sessions",
     kLeave},
    {"TRUE == blJoined && false == blSessionExist", "joined, but there is no web session",
     kJoinAgain},
    {"TRUE == blJoined", "joined, but there is no service account", kCreateAccount},
    {"TRUE == blJoined", "joined, but the service account is no administrator", kCreateAccount}};

// What the flag says: nothing disagrees with a flag that cannot be judged.
struct Flag {
    bool blYes;
    bool blNo;
};

void Break(Indicator &indicator, int number) {
    const Rule &rule = kRules[number - 1];
    indicator.rule = number;
    indicator.strRule = rule.szText;
    indicator.strMeaning = rule.szMeaning;
    indicator.strRemedy = rule.szRemedy;
}

Indicator ReadFlag(Flag &flag) {
    const int result = YLIBCFileCheckKeyValue(kConfigFile, kJoinFlag, "yes", 0);
    flag = {result == 1, result == 0};
    FixedText<1024> value;
    const int cb =
        YLIBCFileGetKeyValue(kConfigFile, kJoinFlag, value.Buffer(), FixedText<1024>::Size(), 0);
    Indicator indicator;
    indicator.strName = "join flag";
    indicator.strHolds = cb > 0 ? std::string("\"") + value.sz() + '"' : "not set";
    if (!flag.blYes && !flag.blNo) {
        indicator.strHolds = std::string(kConfigFile) + " cannot be read";
    }
    return indicator;
}

// A look-up takes a store that another program holds for one without the credential.
long FindId(const char *szApplication, std::optional<ErrorId> &flaw) {
    if (flaw == ErrorId::kStoreUnreadable) {
        return -1;
    }
    const long id = ZELOCredIDGetByApplication(szApplication);
    if (id >= 0 || flaw || (flaw = StoreFlaw())) {
        return id;
    }
    return ZELOCredIDGetByApplication(szApplication);
}

std::string StoredFor(long id) {
    const CredHandle pCred(ZELOCredAlloc());
    FixedText<1024> host;
    const bool blHost =
        pCred != nullptr && ZELOCredLoad(id, pCred.get()) >= 0 &&
        ZELOCredItemGetHost(host.Buffer(), FixedText<1024>::Size(), pCred.get()) == 0;
    return blHost ? std::string("stored, for ") + host.sz() : "stored";
}

// What is told of a store that does not say what it holds.
void TellFlaw(Indicator &indicator, ErrorId flaw) {
    if (flaw == ErrorId::kStoreDamaged) {
        indicator.strHolds = "damaged store; 'qrmctl leave' sets it aside";
        indicator.strRemedy = "qrmctl leave, which sets the store aside, then qrmctl join";
    } else {
        // Nothing is known of what it holds: leaving might end a good membership.
        indicator.rule = 0;
        indicator.strHolds = "cannot be read now (-v shows the reason)";
        indicator.strRemedy =
            "wait for the program that holds the store, or mend its mode; then try again";
    }
}

Indicator ReadCredential(const Flag &flag, std::optional<ErrorId> &flaw, const char *szName,
                         const char *szApplication, int rule) {
    Indicator indicator;
    indicator.strName = szName;
    const long id = FindId(szApplication, flaw);
    if (flag.blNo && id >= 0) {
        Break(indicator, rule);
    } else if (flag.blYes && id < 0) {
        Break(indicator, rule + 1);
    }
    indicator.strHolds = id < 0 ? "not stored" : StoredFor(id);
    if (flaw) {
        TellFlaw(indicator, *flaw);
    }
    return indicator;
}

Indicator ReadDaemon(const Flag &flag) {
    Indicator indicator;
    indicator.strName = "cache daemon";
    const int status = YLIBCExec(kCacheDaemon, "status", nullptr, nullptr, nullptr);
    indicator.strHolds = status == 0   ? "running"
                         : status == 1 ? "stopped"
                         : status < 0  ? "its script cannot be run"
                                       : "status " + std::to_string(status);
    if (flag.blNo && status == 0) {
        Break(indicator, 5);
    } else if (flag.blYes && status == 1) {
        Break(indicator, 6);
    }
    return indicator;
}

Indicator ReadSessions(const Flag &flag) {
    ZELO_CGI_CONTEXT context = {};
    const bool blReady = ZeloCgiInit("", &context) != 0;
    const ErrorId flaw = LastStoreFlaw();
    bool blExists = false;
    std::string strSessions;
    for (const char *szSession : kClientSessions) {
        if (blReady && ZeloCgiSessionExistByIndex(&context, kSessionIndex, szSession) != 0) {
            blExists = true;
            strSessions += (strSessions.empty() ? "" : ", ") + std::string(szSession);
        }
    }
    ZeloCgiFree(&context);

    Indicator indicator;
    indicator.strName = "web sessions";
    indicator.strHolds = blExists ? strSessions : "none";
    if (flag.blNo && blExists) {
        Break(indicator, 7);
    } else if (flag.blYes && !blExists) {
        Break(indicator, 8);
    }
    if (!blReady) {
        TellFlaw(indicator, flaw);
    }
    return indicator;
}

Indicator ReadAccount(const Flag &flag) {
    MovingHandle<ZELO_USER, ZELOUserFree> user;
    const bool blExists = ZELOUserGet(kServiceAccount, user.Address()) == 0;
    const bool blUnknown = !blExists && YLIBCErrGet() != YLIBC_ERR_NOT_FOUND;
    const bool blAdmin = blExists && YLIBGroupIsAdminGroupMem(user.Get()->szName, 0) == 1;

    Indicator indicator;
    indicator.strName = "service account";
    indicator.strHolds = blAdmin     ? "exists, an administrator"
                         : blExists  ? "exists, no administrator"
                         : blUnknown ? "cannot be read now (-v shows the reason)"
                                     : "does not exist";
    if (flag.blYes && !blAdmin) {
        Break(indicator, blExists ? 10 : 9);
    }
    return indicator;
}

}  // namespace

std::vector<Indicator> ReadIndicators() {
    Flag flag = {};
    std::vector<Indicator> indicators;
    EnterStage("reading the join flag");
    indicators.push_back(ReadFlag(flag));
    EnterStage("reading the credential store");
    std::optional<ErrorId> flaw = StoreFlaw();
    indicators.push_back(ReadCredential(flag, flaw, "server credential", kQrmServer, 1));
    indicators.push_back(
        ReadCredential(flag, flaw, "notification-center credential", kNotificationCenter, 3));
    EnterStage("asking the cache daemon's script for its status");
    indicators.push_back(ReadDaemon(flag));
    EnterStage("reading the web sessions");
    indicators.push_back(ReadSessions(flag));
    EnterStage("reading the service account");
    indicators.push_back(ReadAccount(flag));
    return indicators;
}

}  // namespace qrmctl
