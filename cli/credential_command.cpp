// qrmctl credential: show, create, update and delete the stored server credential.

#include <algorithm>
#include <cstring>
#include <iterator>
#include <memory>

#include "appliance.h"
#include "commands.h"
#include "credential_store.h"
#include "input_file.h"
#include "joined_server.h"
#include "json.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

using json::HasMember;
using json::Member;

ExitCode Show(bool blWithToken, Report &report) {
    Report::Stage("reading the credential store");
    Json::Value cred(Json::objectValue);
    const auto find = [&] {
        return blWithToken ? ZELOQRMClientGetServerCredentialWithToken(cred)
                           : ZELOQRMClientGetServerCredential(cred);
    };
    // A store that can be read now may have been held by another program a moment ago.
    const bool blFound = find() || (!HasMember(cred, "host") && !StoreFlaw() && find());
    if (!blFound && HasMember(cred, "host")) {
        return report.Fail(ErrorId::kNoSession, "the server credential has no session: join again");
    }
    if (!blFound) {
        const std::optional<ErrorId> flaw = StoreFlaw();
        return flaw ? report.Fail(*flaw, StoreFlawText(*flaw))
                    : report.Fail(ErrorId::kNoCredential,
                                  "no server credential is stored: join first, with 'qrmctl join'");
    }
    for (const char *szName :
         {"protocol", "host", "port", "application", "sn", "access_token", "csrf_token"}) {
        if (HasMember(cred, szName)) {
            report.Fact(szName, cred[szName]);
        }
    }
    return report.Done();
}

// What the library would store, and no request could use.
std::string FlawOfValues(const Json::Value &cred, bool blComplete) {
    const std::string strOwn = blComplete ? "extra_info" : "sn";
    for (const std::string &strName : cred.getMemberNames()) {
        const auto isName = [&](const std::string &strKnown) { return strName == strKnown; };
        const std::string known[] = {"protocol",    "host",         "port",
                                     "application", "access_token", strOwn};
        if (std::none_of(std::begin(known), std::end(known), isName)) {
            return "there is no member \"" + strName + '"';
        }
    }
    const char *szProtocol = json::Text(Member(cred, "protocol"));
    const std::string strProtocol = szProtocol == nullptr ? "https" : szProtocol;
    if (strProtocol != "http" && strProtocol != "https" && strProtocol != "fld") {
        return "\"protocol\" has to be http, https or fld";
    }
    const char *szHost = json::Text(Member(cred, "host"));
    if (szHost != nullptr && szHost[0] == '\0') {
        return "\"host\" is empty";
    }
    int port = 0;
    if (json::ReadInt(Member(cred, "port"), port) && (port < 1 || port > 65535)) {
        return "\"port\" has to be 1 to 65535";
    }
    return {};
}

// What the library would refuse, as a sentence; empty when there is nothing.
std::string Flaw(const Json::Value &cred, bool blComplete) {
    if (!cred.isObject()) {
        return "it has to be an object";
    }
    for (const char *szName : {"protocol", "host", "application", "access_token"}) {
        const bool blNeeded = blComplete || std::string(szName) == "application";
        const char *szText = json::Text(Member(cred, szName));
        if (szText == nullptr && (blNeeded || HasMember(cred, szName))) {
            return std::string("\"") + szName + "\" has to be a text";
        }
        if (szText != nullptr && std::strlen(szText) > kMaxStoredText) {
            return std::string("\"") + szName + "\" has to be a text of at most 1023 bytes";
        }
    }
    int port = 0;
    if (!HasMember(cred, "port") ? blComplete : !json::ReadInt(Member(cred, "port"), port)) {
        return "\"port\" has to be an integer";
    }
    return FlawOfValues(cred, blComplete);
}

ExitCode Change(const std::string &strFile, bool blCreate, Report &report) {
    Json::Value cred;
    std::string strError;
    Report::Stage("reading the credential '" + strFile + "'");
    if (!ReadJsonFile("credential", strFile, cred, strError)) {
        return report.Fail(ErrorId::kBadInput, strError);
    }
    const std::string strFlaw = Flaw(cred, blCreate);
    if (!strFlaw.empty()) {
        return report.Fail(ErrorId::kBadInput,
                           "cannot use credential '" + strFile + "': " + strFlaw);
    }
    Report::Stage("changing the credential store");
    Report::Remedy("'qrmctl credential show' tells what is stored; run this again");
    const std::string strApplication = cred["application"].asString();
    const bool blBehind = blCreate && ZELOCredIDGetByApplication(strApplication.c_str()) >= 0;
    if (blCreate && !ZELOQRMClientCreateServerCredential(cred)) {
        return report.Fail(ErrorId::kCredentialNotStored,
                           "the credential could not be stored; -v shows the reason");
    }
    if (!blCreate && !ZELOQRMClientUpdateServerCredential(cred)) {
        return report.Fail(
            ErrorId::kCredentialNotChanged,
            "the credential could not be changed: is one stored for the application '" +
                strApplication + "', with a session? -v shows more");
    }
    if (blBehind) {
        report.Warn("the credential that was stored for '" + strApplication +
                    "' before stays in force: 'qrmctl credential delete' removes it");
    }
    report.Say(blCreate ? "The credential is stored." : "The credential is changed.");
    return report.Done();
}

ExitCode Delete(Report &report) {
    Report::Stage("changing the credential store");
    Report::Remedy("run 'qrmctl credential delete' again");
    if (const std::optional<ErrorId> flaw = StoreFlaw()) {
        return report.Fail(*flaw, StoreFlawText(*flaw));
    }
    if (!ZELOQRMClientDeleteServerCredential()) {
        return report.Fail(ErrorId::kCredentialNotRemoved,
                           "the credential could not be removed whole; -v shows the reason");
    }
    if (ZELOCredIDGetByApplication(appliance::kQrmServer) >= 0) {
        report.Warn("a server credential that was stored later is in force now: delete again");
        return report.Done();
    }
    report.Say("No server credential is stored any more.");
    return report.Done();
}

void AddChange(CommandHandle parent, Action &action, const char *szName, const char *szDescription,
               bool blCreate) {
    const CommandHandle command = parent.Add(szName, szDescription);
    const auto pFile = std::make_shared<std::string>();
    command.Text("FILE", *pFile, "JSON file with the credential, - for standard input")
        .ValueName("FILE")
        .Required();
    command.RunsWhenChosen([pFile, blCreate, &action] {
        action = [pFile, blCreate](Report &report) { return Change(*pFile, blCreate, report); };
    });
}

}  // namespace

void AddCredential(CommandHandle program, Action &action) {
    const CommandHandle credential =
        program.Add("credential", "Show or change the stored server credential");
    credential.RequireCommand();

    const CommandHandle show = credential.Add("show", "Show the server credential");
    const auto pWithToken = std::make_shared<bool>(false);
    show.Flag("--with-token", *pWithToken, "Show the tokens too");
    show.RunsWhenChosen([pWithToken, &action] {
        action = [pWithToken](Report &report) { return Show(*pWithToken, report); };
    });
    AddChange(credential, action, "create", "Store a server credential and its session", true);
    AddChange(credential, action, "update", "Change the stored server credential", false);
    credential.Add("delete", "Remove the server credential").RunsWhenChosen([&action] {
        action = Delete;
    });
}

}  // namespace qrmctl
