// qrmctl info and notify: what the library tells other programs and the appliance's users.

#include <memory>
#include <vector>

#include "appliance.h"
#include "commands.h"
#include "joined_server.h"
#include "key_value_file.h"
#include "last_error.h"
#include "notification.h"
#include "platform_handles.h"
#include "zeloqrmclient.h"

namespace qrmctl {
namespace {

// Whether a key that has no value is there all the same.
bool HasInfoKey(const std::string &strKey) {
    return YLIBCFileCheckKeyValue(appliance::kClientInfoFile, strKey.c_str(), "", 0) == 1;
}

ExitCode Get(const std::string &strKey, Report &report) {
    Report::Stage("reading the client info file");
    std::string strValue;
    if (!ZELOQRMClientGetInfo(strKey, strValue)) {
        return report.Fail(ErrorId::kInfoUnreadable,
                           "the client info file cannot be read: no call to the server has had a "
                           "reply since this appliance was started, or it is damaged");
    }
    // The library gives an empty value for a key that is not there.
    if (strValue.empty() && !HasInfoKey(strKey)) {
        return report.Fail(ErrorId::kNoSuchKey, "the client info file has no key '" + strKey + "'");
    }
    if (report.IsJson()) {
        report.Member("key", strKey);
        report.Member("value", strValue);
    } else {
        report.Fact(strKey, strValue);
    }
    return report.Done();
}

ExitCode Set(const std::string &strKey, const std::string &strValue, Report &report) {
    Report::Stage("writing the client info file, with its lock");
    Report::Remedy("'qrmctl info get' tells what is set; run this again");
    if (!ZELOQRMClientSetInfo(strKey, strValue)) {
        return report.Fail(ErrorId::kInfoNotWritten,
                           "cannot set '" + strKey +
                               "': neither key nor value may hold a line feed, the key no '=', and "
                               "/tmp/qrm_client.info has to be writable");
    }
    report.Say("'" + strKey + "' is set.");
    return report.Done();
}

// "NAME=VALUE" sets the variable %NAME%.
bool SetVariable(const std::string &strText, YLIBSZHASH **ppHash) {
    const std::size_t equals = strText.find('=');
    if (equals == std::string::npos || equals == 0) {
        return false;
    }
    std::string strName = strText.substr(0, equals);
    if (strName.front() != '%') {
        strName = '%' + strName + '%';
    }
    return YLIBCSzHashSetValue(ppHash, strName.c_str(), strText.substr(equals + 1).c_str()) >= 0;
}

// As the library does, which keeps to itself whether a notification was sent.
int Send(const std::string &strTag, YLIBSZHASH **ppHash) {
    if (YLIBCSzHashGetValue(*ppHash, appliance::kServerVariable) == nullptr) {
        const std::optional<JoinedServer> server = FindJoinedServer();
        const bool blKnown = server && server->host.isString();
        const std::string strHost = blKnown ? server->host.asString() : "Unknown";
        if (YLIBCSzHashSetValue(ppHash, appliance::kServerVariable, strHost.c_str()) < 0) {
            return -1;
        }
    }
    return ZELOSysNotifySendNotifiction(strTag.c_str(), ppHash);
}

std::string WhyNotSent() {
    const std::string strJournal = "the journal '/var/log/notifications.jsonl' ";
    switch (YLIBCErrGet()) {
        case YLIBC_ERR_OUT_OF_MEMORY:
            return "out of memory";
        case YLIBC_ERR_BUSY:
            return strJournal + "is held by another program: wait for that one and try again";
        case YLIBC_ERR_UNSAFE_FILE:
            return strJournal + "is a link or no regular file: remove what stands there";
        default:
            return strJournal +
                   "cannot be written: see to what stands there, its rights and the disk; -v "
                   "shows the reason";
    }
}

ExitCode Notify(const std::string &strTag, const std::vector<std::string> &variables,
                Report &report) {
    constexpr int kHashSize = 512;
    if (strTag.empty()) {
        return report.Fail(ErrorId::kBadInput,
                           "the tag is empty: name the event, such as QRMClientConnectFailed");
    }
    HashHandle hash(YLIBCSzHashAlloc(kHashSize));
    for (const std::string &strVariable : variables) {
        if (!SetVariable(strVariable, hash.Address())) {
            return report.Fail(ErrorId::kBadInput,
                               "cannot use variable '" + strVariable +
                                   "': write it as NAME=VALUE, such as QRM_SERVER=qrm.example");
        }
    }
    Report::Stage("handing over the notification, with its hooks");
    if (Send(strTag, hash.Address()) < 0) {
        return report.Fail(ErrorId::kNotificationNotSent,
                           "cannot send the notification '" + strTag + "': " + WhyNotSent());
    }
    report.Say("The notification '" + strTag + "' is handed to the notification service.");
    return report.Done();
}

}  // namespace

void AddInfo(CommandHandle program, Action &action) {
    const CommandHandle info =
        program.Add("info", "Read or write the client info file, such as its key 'status'");
    info.RequireCommand();
    const auto pKey = std::make_shared<std::string>();
    const auto pValue = std::make_shared<std::string>();

    const CommandHandle get = info.Add("get", "Show the value of a key");
    get.Text("KEY", *pKey, "The key; the library's own").Suggests("KEY", {"status"}).Required();
    get.RunsWhenChosen(
        [pKey, &action] { action = [pKey](Report &report) { return Get(*pKey, report); }; });

    const CommandHandle set = info.Add("set", "Set the value of a key");
    set.Text("KEY", *pKey, "The key").Required();
    set.Text("VALUE", *pValue, "Its value").Required().MayBeEmpty();
    set.RunsWhenChosen([pKey, pValue, &action] {
        action = [pKey, pValue](Report &report) { return Set(*pKey, *pValue, report); };
    });
}

void AddNotify(CommandHandle program, Action &action) {
    const CommandHandle command =
        program.Add("notify", "Send a notification to this appliance's users");
    const auto pTag = std::make_shared<std::string>();
    const auto pVariables = std::make_shared<std::vector<std::string>>();
    command.Text("TAG", *pTag, "The event, such as QRMClientConnectFailed").Required();
    command.Texts("VARIABLE", *pVariables, "NAME=VALUE, set in place of %NAME%");
    command.RunsWhenChosen([pTag, pVariables, &action] {
        action = [pTag, pVariables](Report &report) { return Notify(*pTag, *pVariables, report); };
    });
}

}  // namespace qrmctl
