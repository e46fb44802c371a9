#include "joined_server.h"

#include "diagnosis.h"
#include "fixed_text.h"
#include "json.h"
#include "last_error.h"
#include "membership.h"
#include "serial_number.h"
#include "zeloqrmclient.h"

namespace qrmctl {

ErrorId LastStoreFlaw() {
    return YLIBCErrGet() == YLIBC_ERR_STORE_DAMAGED ? ErrorId::kStoreDamaged
                                                    : ErrorId::kStoreUnreadable;
}

std::optional<ErrorId> StoreFlaw() {
    return IsStoreReadable() ? std::nullopt : std::optional(LastStoreFlaw());
}

std::string StoreFlawText(ErrorId flaw) {
    return flaw == ErrorId::kStoreDamaged
               ? "the credential store is damaged or of another format, and is left as it is: "
                 "restore a copy, or run 'qrmctl leave', which sets it aside"
               : "the credential store cannot be read; -v shows the reason";
}

namespace {

struct StoreOfMembership {
    const char *szName;
    const char *szMember;  // of the report: where it was set aside
    int (*SetAside)(char *, int);
};

constexpr StoreOfMembership kCredentials = {"the credential store", "set_aside",
                                            ZELOCredStoreSetAside};
constexpr StoreOfMembership kSessions = {"the web session store", "sessions_set_aside",
                                         ZeloCgiStoreSetAside};

// As ClearDamagedStores, for one store; blDamaged tells whether it was set aside.
std::optional<ExitCode> ClearDamaged(const StoreOfMembership &store, Report &report,
                                     bool &blDamaged) {
    FixedText<1024> path;
    const int result = store.SetAside(path.Buffer(), FixedText<1024>::Size());
    const std::string strPath = path.sz();
    blDamaged = result == 1;
    if (result < 0) {
        const char *szRemedy =
            YLIBCErrGet() == YLIBC_ERR_STORE_BUSY
                ? "another program keeps it locked, wait for that one and try again"
                : "see to what stands there, its rights and the disk, and try again; -v shows the "
                  "reason";
        return report.Fail(ErrorId::kStoreUnreadable,
                           std::string(store.szName) + " '" + strPath +
                               "' can neither be used nor set aside: " + szRemedy);
    }
    if (blDamaged) {
        report.Member(store.szMember, strPath);
        report.Warn(std::string(store.szName) +
                    " was damaged or of another format: it is set aside as '" + strPath +
                    "', an empty one takes its place");
    }
    return std::nullopt;
}

}  // namespace

std::optional<ExitCode> ClearDamagedStores(Report &report, bool &blServerLost) {
    bool blSessionsLost = false;
    if (ZELOCredStoreSetAside == nullptr || ZeloCgiStoreSetAside == nullptr) {
        // A platform that sets nothing aside.
        const std::optional<ErrorId> flaw = StoreFlaw();
        return flaw ? std::optional(report.Fail(
                          *flaw, "the credential store can neither be used nor set aside"))
                    : std::nullopt;
    }
    const auto code = ClearDamaged(kCredentials, report, blServerLost);
    return code ? code : ClearDamaged(kSessions, report, blSessionsLost);
}

std::string AsText(const Json::Value &value) {
    return value.isString() ? value.asString() : json::ToLogText(value);
}

std::string OwnSerialNumber() {
    char sz[36] = {};
    if (YLIBGetCustomSerialNumber(sz, 31) < 0 || sz[0] == '\0') {
        YLIBGetSerialNumber(sz, sizeof(sz));
    }
    return sz;
}

std::string JoinedServer::HostAndPort() const {
    return AsText(host) + ':' + AsText(port);
}

std::string JoinedServer::Address() const {
    return AsText(protocol) + "://" + HostAndPort();
}

namespace {

JoinedServer ServerOf(const Json::Value &cred) {
    using json::Member;
    return {Member(cred, "host"), Member(cred, "port"), Member(cred, "protocol"),
            Member(cred, "sn")};
}

}  // namespace

std::optional<JoinedServer> FindJoinedServer() {
    Json::Value cred(Json::objectValue);
    return ZELOQRMClientGetServerCredential(cred) ? std::optional(ServerOf(cred)) : std::nullopt;
}

std::optional<JoinedServer> FindStoredServer() {
    Json::Value cred(Json::objectValue);
    // Without a session the operation fails, and has filled in the rest.
    static_cast<void>(ZELOQRMClientGetServerCredential(cred));
    const JoinedServer server = ServerOf(cred);
    return server.host.isString() ? std::optional(server) : std::nullopt;
}

std::optional<JoinedServer> RequireJoinedServer(Report &report, ExitCode &code) {
    Report::Stage("looking up the joined server in the credential store");
    std::optional<JoinedServer> server = FindJoinedServer();
    if (server) {
        return server;
    }
    const std::optional<ErrorId> flaw = StoreFlaw();
    // A store that can be read now may have been held by another program a moment ago.
    if (!flaw && (server = FindJoinedServer())) {
        return server;
    }
    code = flaw ? report.Fail(*flaw, StoreFlawText(*flaw))
                : report.Fail(ErrorId::kNotJoined,
                              "this appliance is not joined, there is no server to ask: run "
                              "'qrmctl join'");
    return std::nullopt;
}

}  // namespace qrmctl
