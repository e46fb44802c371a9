// qrmctl status and leave.

#include <algorithm>
#include <memory>

#include "commands.h"
#include "deadline.h"
#include "indicators.h"
#include "joined_server.h"
#include "membership.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

const char *VerdictName(int status) {
    return status == 1 ? "joined" : status == 0 ? "not joined" : "inconsistent";
}

std::string Padded(const std::string &strText, std::size_t width) {
    return strText + std::string(width - std::min(width, strText.size()), ' ');
}

// Files of damaged stores stay until somebody looks at them.
void TellSetAside(Report &report) {
    Json::Value paths(Json::arrayValue);
    for (const std::string &strPath : StoresSetAside()) {
        paths.append(strPath);
        report.Say("A damaged credential store was set aside as '" + strPath +
                   "': restore what is needed of it, and remove it.");
    }
    report.Member("set_aside", paths);
}

void Explain(Report &report) {
    constexpr std::size_t kNameWidth = 32;
    constexpr std::size_t kHoldsWidth = 44;
    Json::Value indicators(Json::arrayValue);
    for (const Indicator &indicator : ReadIndicators()) {
        Json::Value entry;
        entry["name"] = indicator.strName;
        entry["holds"] = indicator.strHolds;
        entry["rule"] = indicator.rule == 0 ? Json::Value() : Json::Value(indicator.rule);
        std::string strLine =
            Padded(indicator.strName, kNameWidth) + Padded(indicator.strHolds, kHoldsWidth);
        if (indicator.rule != 0) {
            entry["rule_text"] = indicator.strRule;
            entry["rule_meaning"] = indicator.strMeaning;
            entry["remedy"] = indicator.strRemedy;
            strLine += "breaks rule " + std::to_string(indicator.rule) + ", " +
                       indicator.strMeaning + "; to mend: " + indicator.strRemedy;
        } else if (!indicator.strRemedy.empty()) {
            entry["remedy"] = indicator.strRemedy;
            strLine += "is not known; to mend: " + indicator.strRemedy;
        } else {
            strLine += "agrees";
        }
        indicators.append(entry);
        report.Say(strLine);
    }
    report.Member("indicators", indicators);
    TellSetAside(report);
}

ExitCode Status(bool blExplain, Report &report) {
    Report::Stage("judging the membership");
    int status = ZELOQRMClientStatus();
    if (IsDeadlineOver()) {
        return report.Done(kInconsistent);  // which tells the deadline, and no verdict
    }
    const std::optional<ErrorId> flaw = StoreFlaw();
    // The look-ups that the judgement rests on may succeed in a store that is damaged elsewhere.
    if (flaw == ErrorId::kStoreDamaged) {
        status = -1;
    }
    report.Fact("status", VerdictName(status));
    if (blExplain) {
        Explain(report);
    } else if (flaw) {
        report.Say("The judgement is uncertain: " + StoreFlawText(*flaw) + '.');
    } else if (status < 0) {
        report.Say("The indicators of membership disagree: 'qrmctl status --explain' shows them.");
    }
    return report.Done(status == 1 ? kDone : status == 0 ? kNotJoined : kInconsistent);
}

// Leaving is local: the server learns nothing of it.
void TellEntry(const std::optional<JoinedServer> &server, bool blMember, Report &report) {
    report.Member("entry_remains", blMember);
    if (!blMember) {
        return;
    }
    const std::string strOwn = OwnSerialNumber();
    Json::Value entry;
    entry["host"] = server ? server->host : Json::Value();
    entry["port"] = server ? server->port : Json::Value();
    entry["sn"] = server ? server->sn : Json::Value();
    entry["own_sn"] = strOwn.empty() ? Json::Value() : Json::Value(strOwn);
    report.Member("server", entry);
    std::string strSerial = strOwn.empty() ? "its serial number" : '\'' + strOwn + '\'';
    if (!entry["sn"].isNull()) {
        strSerial = '\'' + AsText(entry["sn"]) + '\'';
    } else {
        strSerial += " (join sends this one, unless --sn gave another)";
    }
    report.Say(server ? "The server's entry for this appliance remains: look on " +
                            server->HostAndPort() + " for the serial number " + strSerial +
                            ", and remove it there."
                      : "The server may still have an entry for this appliance; which server it "
                        "was is not known any more: look on yours for the serial number " +
                            strSerial + ", and remove it there.");
}

ExitCode Leave(const LeaveRequest &request, Report &report) {
    Report::Stage(kTurnStage);
    Report::Remedy("run 'qrmctl leave' again: what was removed stays removed");
    const MembershipTurn turn;
    if (!turn.IsTaken()) {
        return report.Fail(turn.Flaw(), turn.Reason());
    }
    Report::Stage("looking up the joined server in the credential store");
    const std::optional<JoinedServer> server = FindStoredServer();
    bool blServerLost = false;
    if (const auto code = ClearDamagedStores(report, blServerLost)) {
        return *code;
    }
    Report::Stage("leaving");
    const bool blJoined = ZELOQRMClientStatus() != 0;
    if (!LeaveWholly(request)) {
        return report.Fail(ErrorId::kLeaveFailed,
                           "a step of leaving failed, or what is left cannot be read; what came "
                           "before is done: -v shows which; "
                           "run 'qrmctl leave' again when its cause is mended");
    }
    report.Fact("was_joined", blJoined);
    report.Say(blJoined ? "This appliance has left the server."
                        : "This appliance was not joined; nothing of a join is left.");
    TellEntry(server, blJoined || blServerLost, report);
    return report.Done();
}

}  // namespace

void AddStatus(CommandHandle program, Action &action) {
    const CommandHandle command =
        program.Add("status", "Judge whether it is joined (exit 0), not (3) or half (4)");
    const auto pExplain = std::make_shared<bool>(false);
    command.Flag("--explain", *pExplain, "Show what the judgement rests on");
    command.RunsWhenChosen([pExplain, &action] {
        action = [pExplain](Report &report) { return Status(*pExplain, report); };
    });
}

void AddLeave(CommandHandle program, Action &action) {
    const CommandHandle command =
        program.Add("leave", "Leave the server, from any half-way state too");
    const auto pRequest = std::make_shared<LeaveRequest>();
    command.Flag("--rejoin", pRequest->blRejoin, "Leave in order to join again");
    command.Text("--from", pRequest->strFrom, "The application that asks for it").ValueName("APP");
    command.Flag("--clear-gluster", pRequest->blClearGluster, "Told to the plug-ins");
    command.RunsWhenChosen([pRequest, &action] {
        action = [pRequest](Report &report) { return Leave(*pRequest, report); };
    });
}

}  // namespace qrmctl
