#include "joined_server.h"

#include "credential_store.h"
#include "json_text.h"
#include "last_error.h"
#include "membership.h"
#include "serial_number.h"
#include "zeloqrmclient.h"

namespace qrmctl {

std::optional<ErrorId> StoreFlaw() {
    if (IsStoreReadable()) {
        return std::nullopt;
    }
    return YLIBCErrGet() == YLIBC_ERR_STORE_DAMAGED ? ErrorId::kStoreDamaged
                                                    : ErrorId::kStoreUnreadable;
}

std::string StoreFlawText(ErrorId flaw) {
    return flaw == ErrorId::kStoreDamaged
               ? "the credential store is damaged or of another format, and is left as it is: "
                 "restore a copy, or run 'qrmctl leave', which sets it aside"
               : "the credential store cannot be read; -v shows the reason";
}

bool ClearDamagedStore(Report &report) {
    std::string strPath;
    if (!SetAsideDamagedStore(strPath)) {
        return false;
    }
    report.Member("set_aside", strPath);
    report.Warn("the credential store was damaged or of another format: it is set aside as '" +
                strPath + "', an empty one takes its place");
    return true;
}

std::string AsText(const Json::Value &value) {
    return value.isString() ? value.asString() : json_text::ToLogText(value);
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
    using json_text::Member;
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
