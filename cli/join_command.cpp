// qrmctl join: the enrolling program. The library's join stores where the server is; the session
// with the access token is this program's to store, and what is added is its to remove on failure.

#include <memory>

#include "candidates.h"
#include "commands.h"
#include "credential_store.h"
#include "input_file.h"
#include "json_text.h"
#include "serial_number.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

constexpr const char *kApplication = "ZELO.QRM";
constexpr const char *kApi = "ZELO.QRM.RPC";
constexpr int kMaxRecords = 1000;

struct Options {
    std::string strServer;
    int httpPort = 0;
    int httpsPort = 0;
    std::string strSerial;
    std::string strTokenFile;
    std::string strCandidates;
    std::string strId;
    bool blAllowHttp = false;
};

struct FreeSession {
    void operator()(ZELO_CRED_SESS *pSess) const { ZELOCredSessFree(pSess); }
};
using SessionHandle = std::unique_ptr<ZELO_CRED_SESS, FreeSession>;

std::string SerialNumber() {
    char sz[36] = {};
    if (YLIBGetCustomSerialNumber(sz, 31) < 0 || sz[0] == '\0') {
        YLIBGetSerialNumber(sz, sizeof(sz));
    }
    return sz;
}

// Only the server's records: the notification center's have an owner of their own.
bool RemoveServerCredentials() {
    for (int i = 0; i < kMaxRecords; ++i) {
        const long id = ZELOCredIDGetByApplication(kApplication);
        if (id < 0) {
            return true;
        }
        if (ZELOCredSessRemoveByID(id) < 0 || ZELOCredRemoveByID(id) < 0) {
            return false;
        }
    }
    return false;
}

bool StoreSession(const std::string &strToken) {
    const long id = ZELOCredIDGetByApplication(kApplication);
    const SessionHandle pSess(ZELOCredSessAlloc());
    return id >= 0 && pSess != nullptr && ZELOCredSessItemSetID(pSess.get(), id) >= 0 &&
           ZELOCredSessItemSetAccessToken(pSess.get(), strToken.c_str()) >= 0 &&
           ZELOCredSessSave(pSess.get()) >= 0;
}

// An id that reads as a number goes as one.
Json::Value IdValue(const std::string &strId) {
    Json::Value value;
    int id = 0;
    return json_text::FromString(strId, value) && json_text::ReadInt(value, id) &&
                   std::to_string(id) == strId
               ? Json::Value(id)
               : Json::Value(strId);
}

bool BuildJoinInfo(const Options &options, Report &report, Json::Value &joinInfo,
                   std::string &strError) {
    std::string strToken;
    if (!ReadTokenFile(options.strTokenFile, strToken, strError)) {
        return false;
    }
    const std::string strSerial = options.strSerial.empty() ? SerialNumber() : options.strSerial;
    if (strSerial.empty()) {
        strError = "this appliance has no serial number: give one with --sn";
        return false;
    }
    joinInfo["sn"] = strSerial;
    joinInfo["access_token"] = strToken;
    joinInfo["server_host"] = options.strServer;
    joinInfo["server_http_port"] = options.blAllowHttp ? options.httpPort : 0;
    joinInfo["server_https_port"] = options.httpsPort;
    if (!options.strId.empty()) {
        joinInfo["id"] = IdValue(options.strId);
    }
    if (options.strCandidates.empty()) {
        return true;
    }
    Json::Value &candidates = joinInfo["server_conn"];
    if (!ReadCandidates(options.strCandidates, report, candidates, strError)) {
        return false;
    }
    if (!options.blAllowHttp) {
        ForbidHttp(candidates);
    }
    return true;
}

// The list that join tries: the candidates, then the address given explicitly.
Json::Value AllCandidates(const Json::Value &joinInfo) {
    Json::Value all =
        joinInfo.isMember("server_conn") ? joinInfo["server_conn"] : Json::Value(Json::arrayValue);
    Json::Value last;
    last["host"] = joinInfo["server_host"];
    last["http_port"] = joinInfo["server_http_port"];
    last["https_port"] = joinInfo["server_https_port"];
    all.append(last);
    return all;
}

// Takes back what a failed join added, and puts the credential back that stood before.
ExitCode FailAndRestore(const std::string &strError, const Json::Value &before, Report &report) {
    if (!RemoveServerCredentials()) {
        return report.Fail(strError +
                           "; what it stored could not be removed: run "
                           "'qrmctl credential delete'");
    }
    if (before.isMember("access_token")) {
        return ZELOQRMClientCreateServerCredential(before)
                   ? report.Fail(strError + "; the credential stored before is in force again")
                   : report.Fail(strError + "; the credential stored before is lost");
    }
    return report.Fail(strError + "; nothing of it stays stored");
}

ExitCode Join(const Options &options, Report &report) {
    Json::Value joinInfo(Json::objectValue);
    std::string strError;
    if (!BuildJoinInfo(options, report, joinInfo, strError)) {
        return report.Fail(strError);
    }
    const Json::Value candidates = AllCandidates(joinInfo);
    if (!options.blAllowHttp && !HasSecurePort(candidates)) {
        return report.Fail(
            "no candidate has an https port, and the access token does not go over plain http: "
            "give --https-port, or accept the risk with --allow-http");
    }
    Json::Value connection;
    if (!ZELOQRMClientTestConnect(candidates, kApi, connection)) {
        return report.Fail("no server answered at '" + options.strServer +
                           "' or any other candidate, nothing was changed: check address, ports "
                           "and certificate; -v shows the reason of each attempt");
    }

    // The lowest id is in force, so a credential that is there already has to go first.
    Json::Value before(Json::objectValue);
    if (ZELOCredIDGetByApplication(kApplication) >= 0) {
        ZELOQRMClientGetServerCredentialWithToken(before);
        if (before.isMember("sn")) {
            before["extra_info"]["sn"] = before["sn"];
        }
    }
    if (!RemoveServerCredentials()) {
        return FailAndRestore("the credential stored before could not be removed", before, report);
    }
    if (ZELOQRMClientSendCreateClient(joinInfo) != 0) {
        return FailAndRestore(
            "the server did not accept the join: check token and serial number; -v shows its "
            "answer",
            before, report);
    }
    if (!StoreSession(joinInfo["access_token"].asString())) {
        return FailAndRestore("the session could not be stored", before, report);
    }
    report.Fact("protocol", connection["protocol"]);
    report.Fact("host", connection["host"]);
    report.Fact("port", connection["port"]);
    report.Fact("sn", joinInfo["sn"]);
    report.Say("Joined. The server's address and the access token are stored.");
    return report.Done();
}

}  // namespace

void AddJoin(CLI::App &app, Action &action) {
    auto *const pCommand = app.add_subcommand("join", "Join a QRM server");
    const auto pOptions = std::make_shared<Options>();
    pCommand->add_option("--server", pOptions->strServer, "The server's name or address")
        ->required();
    pCommand->add_option("--http-port", pOptions->httpPort, "Its port for plain HTTP")
        ->required()
        ->check(CLI::Range(0, 65535));
    pCommand->add_option("--https-port", pOptions->httpsPort, "Its port for HTTPS")
        ->required()
        ->check(CLI::Range(0, 65535));
    pCommand->add_option("--sn", pOptions->strSerial,
                         "Serial number (default: this appliance's own)");
    pCommand
        ->add_option("--token-file", pOptions->strTokenFile,
                     "File with the access token, - for standard input")
        ->required();
    pCommand->add_option("--candidates", pOptions->strCandidates,
                         "JSON file with connections to try before");
    pCommand->add_option("--id", pOptions->strId, "What the server calls this appliance");
    pCommand->add_flag("--allow-http", pOptions->blAllowHttp,
                       "Let the access token go over plain HTTP");
    pCommand->callback([pOptions, &action] {
        action = [pOptions](Report &report) { return Join(*pOptions, report); };
    });
}

}  // namespace qrmctl
