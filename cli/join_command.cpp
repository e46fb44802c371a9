// qrmctl join: the enrolling program. The library's join stores where the server is; the session
// with the access token is this program's to store, and what is added is its to remove on failure.

#include <algorithm>
#include <cstring>
#include <memory>
#include <vector>

#include "candidates.h"
#include "commands.h"
#include "credential_store.h"
#include "input_file.h"
#include "json_text.h"
#include "platform_handles.h"
#include "serial_number.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

constexpr const char *kApplication = "ZELO.QRM";
constexpr const char *kApi = "ZELO.QRM.RPC";

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

std::string SerialNumber() {
    char sz[36] = {};
    if (YLIBGetCustomSerialNumber(sz, 31) < 0 || sz[0] == '\0') {
        YLIBGetSerialNumber(sz, sizeof(sz));
    }
    return sz;
}

// A filter that keeps the server's credentials but those whose ids are in a text such as " 3 7 ".
int KeepUnlisted(const ZELO_CRED *pCred, const char *szIds) {
    long id = -1;
    return ZELOCredKeepByApplication(pCred, kApplication) != 0 &&
                   ZELOCredItemGetID(&id, pCred) >= 0 &&
                   std::strstr(szIds, (' ' + std::to_string(id) + ' ').c_str()) == nullptr
               ? 1
               : 0;
}

// Looks for a server credential that is not among the known ones; id is negative when there is
// none. Returns false when the store cannot be read.
bool FindUnknown(const std::vector<long> &known, long &id) {
    std::string strIds = " ";
    for (long knownId : known) {
        strIds += std::to_string(knownId) + ' ';
    }
    ZELO_CRED *pFirst = nullptr;
    const int count = ZELOCredListGet(&pFirst, KeepUnlisted, strIds.c_str());
    const CredListHandle list(pFirst);
    id = -1;
    return count == 0 || (count > 0 && ZELOCredItemGetID(&id, pFirst) >= 0);
}

bool FindAll(std::vector<long> &ids) {
    long id = -1;
    while (FindUnknown(ids, id)) {
        if (id < 0) {
            return true;
        }
        ids.push_back(id);
    }
    return false;
}

bool Remove(long id) {
    return ZELOCredSessRemoveByID(id) >= 0 && ZELOCredRemoveByID(id) >= 0;
}

bool RemoveUnknown(const std::vector<long> &known) {
    long id = -1;
    while (FindUnknown(known, id)) {
        if (id < 0) {
            return true;
        }
        if (!Remove(id)) {
            return false;
        }
    }
    return false;
}

bool StoreSession(long id, const std::string &strToken) {
    const CredSessHandle pSess(ZELOCredSessAlloc());
    return pSess != nullptr && ZELOCredSessItemSetID(pSess.get(), id) >= 0 &&
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

// Takes back what a failed join added to the credentials that were stored before.
ExitCode FailAndTakeBack(const std::string &strError, const std::vector<long> &before,
                         Report &report) {
    if (!RemoveUnknown(before)) {
        return report.Fail(strError +
                           "; what it stored could not be removed: run "
                           "'qrmctl credential delete'");
    }
    return report.Fail(strError + (before.empty() ? "; nothing of it stays stored"
                                                  : "; the credential stored before is in force"));
}

// The lowest id is in force, so a credential that is there already stays in force until the new one
// is complete, whenever this program ends.
ExitCode JoinAndStore(const Json::Value &joinInfo, Report &report) {
    std::vector<long> before;
    if (!FindAll(before)) {
        return report.Fail(
            "the credential store cannot be read, nothing was changed; -v shows the reason");
    }
    if (ZELOQRMClientSendCreateClient(joinInfo) != 0) {
        return FailAndTakeBack(
            "the server did not accept the join (check token and serial number; -v shows its "
            "answer), or the appliance's model, version or ports could not be read (check "
            "/etc.defaults/zeloinfo.conf, /etc.defaults/VERSION and /etc/zeloinfo.conf)",
            before, report);
    }
    long id = -1;
    if (!FindUnknown(before, id) || !StoreSession(id, joinInfo["access_token"].asString())) {
        return FailAndTakeBack("the session could not be stored", before, report);
    }
    if (!std::all_of(before.begin(), before.end(), Remove)) {
        return report.Fail(
            "the server accepted the join, but a credential stored before could not be removed "
            "and may be in force: run 'qrmctl credential delete' and join again");
    }
    Json::Value server(Json::objectValue);
    ZELOQRMClientGetServerCredential(server);
    for (const char *szName : {"protocol", "host", "port"}) {
        report.Fact(szName, server[szName]);
    }
    report.Fact("sn", joinInfo["sn"]);
    report.Say("Joined. The server's address and the access token are stored.");
    return report.Done();
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
    // A join without a connection would look to its caller like one that the server refused.
    Json::Value connection;
    if (!ZELOQRMClientTestConnect(candidates, kApi, connection)) {
        return report.Fail("no server answered at '" + options.strServer +
                           "' or any other candidate, nothing was changed: check address, ports "
                           "and certificate; -v shows the reason of each attempt");
    }
    return JoinAndStore(joinInfo, report);
}

}  // namespace

void AddJoin(CLI::App &app, Action &action) {
    auto *const pCommand = app.add_subcommand("join", "Join a QRM server");
    const auto pOptions = std::make_shared<Options>();
    pCommand->add_option("--server", pOptions->strServer, "The server's name or address")
        ->required()
        ->check([](const std::string &strHost) {
            return std::string(strHost.empty() ? "name the server" : "");
        });
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
