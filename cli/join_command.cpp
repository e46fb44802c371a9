// qrmctl join: the enrolling program. The library's join stores where the server is; every other
// step of a membership is this program's to take, in order, and to undo when one fails.

#include <strings.h>

#include <algorithm>
#include <cstring>
#include <functional>
#include <memory>
#include <vector>

#include "appliance.h"
#include "candidates.h"
#include "commands.h"
#include "deadline.h"
#include "input_file.h"
#include "joined_server.h"
#include "json.h"
#include "key_value_file.h"
#include "membership.h"
#include "server_request.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

constexpr const char *kClearRemains =
    "run 'qrmctl leave', which removes what was begun, or 'qrmctl join' again, which removes it "
    "first";

struct Options {
    std::string strServer;
    int httpPort = 0;
    int httpsPort = 0;
    std::string strSerial;
    std::string strTokenFile;
    std::string strCandidates;
    std::string strId;
    bool blAllowHttp = false;
    bool blAgain = false;
};

// An id that reads as a number goes as one.
Json::Value IdValue(const std::string &strId) {
    Json::Value value;
    int id = 0;
    return json::FromString(strId, value) && json::ReadInt(value, id) && std::to_string(id) == strId
               ? Json::Value(id)
               : Json::Value(strId);
}

bool BuildJoinInfo(const Options &options, Report &report, Json::Value &joinInfo,
                   std::string &strError) {
    std::string strToken;
    if (!ReadTokenFile(options.strTokenFile, strToken, strError)) {
        return false;
    }
    const std::string strSerial = options.strSerial.empty() ? OwnSerialNumber() : options.strSerial;
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

// The first fact that the server has to be told and that cannot be read, as "'key' in 'file'";
// empty when all can.
std::string MissingFact() {
    constexpr struct {
        const char *szFile;
        const char *szKey;
    } facts[] = {{appliance::kDefaultsFile, "upnpmodelname"},
                 {appliance::kVersionFile, "majorversion"},
                 {appliance::kVersionFile, "minorversion"},
                 {appliance::kVersionFile, "buildnumber"},
                 {kConfigFile, "admin_port"},
                 {kConfigFile, "secure_admin_port"}};
    const bool blSecure = YLIBCFileCheckKeyValue(kConfigFile, "runHTTPS", "yes", 0) == 1;
    for (const auto &fact : facts) {
        char szValue[64];
        const bool blNeeded = blSecure || std::strcmp(fact.szKey, "secure_admin_port") != 0;
        if (blNeeded &&
            YLIBCFileGetKeyValue(fact.szFile, fact.szKey, szValue, sizeof(szValue), 0) <= 0) {
            return std::string("'") + fact.szKey + "' in '" + fact.szFile + "'";
        }
    }
    return {};
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

struct Step {
    const char *szStage;
    const char *szFailed;
    std::function<bool()> Take;
};

// The join flag comes last: "yes" is only ever written over a complete state.
std::vector<Step> Steps(const Json::Value &joinInfo) {
    const std::string strToken = joinInfo["access_token"].asString();
    const std::string strSerial = joinInfo["sn"].asString();
    return {
        {"joining: the server's answer",
         "the server gave no usable reply to the join (see 'qrmctl doctor'), or its address could "
         "not be stored; -v shows which",
         [&joinInfo] { return ZELOQRMClientSendCreateClient(joinInfo) == 0; }},
        {"storing the serial number", "the serial number could not be stored",
         [strSerial] { return StoreSerial(strSerial); }},
        {"storing the session", "the session could not be stored",
         [strToken] { return StoreServerSession(strToken); }},
        {"storing the notification center's credential",
         "the notification center's credential could not be stored",
         [strToken] { return StoreNotificationCenter(strToken); }},
        {"starting the cache daemon", "the cache daemon could not be started", StartCacheDaemon},
        {"adding the web sessions", "the web sessions could not be added", AddClientSessions},
        {"creating the service account", "the service account could not be created",
         CreateServiceAccount},
        {"setting the join flag", "the join flag could not be set",
         [] { return SetJoinFlag("yes"); }},
        {"judging the membership", "the indicators of membership disagree after the join",
         [] { return ZELOQRMClientStatus() == 1; }}};
}

// Leaves as if to join again, so that nobody is told of the end of a membership that never began.
bool Undo() {
    Report::Stage("undoing what was begun");
    LeaveRequest request;
    request.blRejoin = true;
    return LeaveWholly(request) && LeaveWholly(LeaveRequest());
}

ExitCode FailAndUndo(const char *szFailed, bool blJoined, Report &report) {
    std::string strError = szFailed;
    if (IsDeadlineOver()) {
        return report.Fail(ErrorId::kJoinNotUndone, strError);  // which tells of the deadline
    }
    std::string strAnswer;
    // The join itself is the one step that asks the server.
    if (FindRefusal(report, strAnswer)) {
        strError = "the server did not accept the join: it answered with " + strAnswer;
        if (LatestExchange().errorCode != 0) {
            strError += "; check token and serial number";
        }
    }
    if (blJoined) {
        strError += "; the membership before has ended";
    }
    return Undo() ? report.Fail(ErrorId::kJoinFailed, strError + "; nothing of it stays stored")
                  : report.Fail(ErrorId::kJoinNotUndone,
                                strError +
                                    "; what came before could not be undone wholly: run "
                                    "'qrmctl leave'");
}

void TellServer(const Json::Value &sn, Report &report) {
    Json::Value server(Json::objectValue);
    ZELOQRMClientGetServerCredential(server);
    for (const char *szName : {"protocol", "host", "port"}) {
        report.Fact(szName, server[szName]);
    }
    report.Fact("sn", sn);
}

// A server has answered. What is left of an earlier membership goes first: a credential that is
// stored already would hide the new one.
ExitCode Enrol(const Json::Value &joinInfo, bool blJoined, Report &report) {
    Report::Stage("removing what is left of a membership before");
    Report::Remedy(kClearRemains);
    LeaveRequest before;
    before.blRejoin = true;
    if (!LeaveWholly(before)) {
        return report.Fail(
            ErrorId::kRemainsNotRemoved,
            "what is left of a membership before could not be removed, no join was begun: -v shows "
            "the reason; run 'qrmctl leave' when its cause is mended");
    }
    std::string strDone;
    for (const Step &step : Steps(joinInfo)) {
        Report::Stage(step.szStage);
        if (!step.Take()) {
            return FailAndUndo(step.szFailed, blJoined, report);
        }
        strDone += (strDone.empty() ? "" : ", ") + std::string(step.szStage);
        Report::Remedy("this remains of the join: " + strDone + "; " + kClearRemains);
    }
    TellServer(joinInfo["sn"], report);
    report.Say("Joined. The server's address and the access token are stored.");
    return report.Done();
}

bool IsSameName(const Json::Value &one, const Json::Value &other) {
    return one.isString() && other.isString() &&
           strcasecmp(one.asCString(), other.asCString()) == 0;
}

// Whether one of the candidates is that server.
bool Holds(const Json::Value &candidates, const JoinedServer &server) {
    using json::Member;
    return std::any_of(candidates.begin(), candidates.end(), [&](const Json::Value &candidate) {
        return IsSameName(Member(candidate, "host"), server.host) &&
               (Member(candidate, "https_port") == server.port ||
                Member(candidate, "http_port") == server.port);
    });
}

// The server that is joined already, where it is none of those asked for.
std::optional<JoinedServer> JoinedElsewhere(const Json::Value &candidates) {
    Report::Stage("comparing with the server that is joined already");
    std::optional<JoinedServer> server = FindJoinedServer();
    const bool blElsewhere = server && !Holds(candidates, *server) && ZELOQRMClientStatus() == 1;
    return blElsewhere ? server : std::nullopt;
}

void TellAddress(const JoinedServer &server, Report &report) {
    report.Fact("host", server.host);
    report.Fact("port", server.port);
}

ExitCode Join(const Options &options, Report &report) {
    Json::Value joinInfo(Json::objectValue);
    std::string strError;
    Report::Stage("reading the token file and the candidate list");
    Report::Remedy("nothing was changed; mend what it waited for, or give it more time");
    if (!BuildJoinInfo(options, report, joinInfo, strError)) {
        return report.Fail(ErrorId::kBadInput, strError);
    }
    const Json::Value candidates = AllCandidates(joinInfo);
    if (const auto server = options.blAgain ? std::nullopt : JoinedElsewhere(candidates)) {
        report.Member("host", server->host);
        report.Member("port", server->port);
        return report.Fail(ErrorId::kJoinedElsewhere,
                           "this appliance is joined already, to the server at " +
                               server->Address() +
                               ", nothing was changed: run 'qrmctl leave' first, or join with "
                               "--again");
    }
    if (!options.blAllowHttp && !HasSecurePort(candidates)) {
        return report.Fail(
            ErrorId::kNoSecurePort,
            "no candidate has an https port, and the access token does not go over plain http: "
            "give --https-port, or accept the risk with --allow-http");
    }
    const std::string strMissing = MissingFact();
    if (!strMissing.empty()) {
        return report.Fail(ErrorId::kFactMissing,
                           "this appliance has no " + strMissing +
                               ", which the server has to be told; nothing was changed");
    }
    // Nothing is left, nor removed, for a server that cannot be had.
    Report::Stage("asking " + CandidateNames(candidates) + " for the API '" + appliance::kQrmApi +
                  '\'');
    Json::Value connection;
    if (!ZELOQRMClientTestConnect(candidates, appliance::kQrmApi, connection)) {
        return FailExchange(
            ErrorId::kNoServer,
            "no server answered at '" + options.strServer +
                "' or any other candidate, nothing was changed: check address, ports "
                "and certificate, with 'qrmctl doctor'; -v shows the reason of each attempt",
            report);
    }
    WarnOfAuthority(report);
    Report::Stage(kTurnStage);
    const MembershipTurn turn;
    if (!turn.IsTaken()) {
        return report.Fail(turn.Flaw(), turn.Reason());
    }
    Report::Stage("looking for damage in the stores");
    bool blServerLost = false;
    if (const auto code = ClearDamagedStores(report, blServerLost)) {
        return *code;
    }
    Report::Stage("judging the membership");
    const bool blJoined = ZELOQRMClientStatus() == 1;
    report.Member("was_joined", blJoined);
    if (blJoined && !options.blAgain) {
        if (const auto server = FindJoinedServer()) {
            TellAddress(*server, report);
        }
        report.Say("This appliance is joined already, nothing was changed; --again joins anew.");
        return report.Done();
    }
    return Enrol(joinInfo, blJoined, report);
}

}  // namespace

void AddJoin(CommandHandle program, Action &action) {
    const CommandHandle command = program.Add("join", "Join a QRM server");
    const auto pOptions = std::make_shared<Options>();
    command.Text("--server", pOptions->strServer, "The server's name or address")
        .ValueName("HOST")
        .Required()
        .Checked([](const std::string &strHost) {
            return std::string(strHost.empty() ? "name the server" : "");
        });
    command.Number("--http-port", pOptions->httpPort, "Its port for plain HTTP; 0: none")
        .ValueName("N")
        .Required()
        .Between(0, 65535);
    command.Number("--https-port", pOptions->httpsPort, "Its port for HTTPS; 0: none")
        .ValueName("N")
        .Required()
        .Between(0, 65535);
    command.Text("--sn", pOptions->strSerial, "Serial number (default: this appliance's own)")
        .ValueName("SERIAL");
    command
        .Text("--token-file", pOptions->strTokenFile,
              "File with the access token, - for standard input")
        .ValueName("FILE")
        .Required();
    command
        .Text("--candidates", pOptions->strCandidates, "JSON file with connections to try before")
        .ValueName("FILE");
    command.Text("--id", pOptions->strId, "What the server calls this appliance").ValueName("ID");
    command.Flag("--allow-http", pOptions->blAllowHttp, "Let the access token go over plain HTTP");
    command.Flag("--again", pOptions->blAgain, "Leave first where a server is joined already");
    command.RunsWhenChosen([pOptions, &action] {
        action = [pOptions](Report &report) { return Join(*pOptions, report); };
    });
}

}  // namespace qrmctl
