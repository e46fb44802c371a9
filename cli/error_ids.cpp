#include "error_ids.h"

#include <algorithm>

namespace qrmctl {

const std::vector<ErrorEntry> &AllErrors() {
    static const std::vector<ErrorEntry> errors = {
        {ErrorId::kAccountNotCreated, "account-not-created", kFailed,
         "the service account could not be created"},
        {ErrorId::kAccountNotDeleted, "account-not-deleted", kFailed,
         "the service account could not be deleted, or it cannot be told whether there is one"},
        {ErrorId::kArchiveNotWritten, "archive-not-written", kFailed,
         "the archive for support could not be written"},
        {ErrorId::kBadDestination, "bad-destination", kFailed,
         "the file that was fetched cannot be put where it was asked for"},
        {ErrorId::kBadInput, "bad-input", kFailed,
         "a file or a text that was given cannot be read or used; nothing was done"},
        {ErrorId::kBusy, "busy", kFailed, "another program is joining or leaving"},
        {ErrorId::kCaUnreadable, "ca-unreadable", kFailed,
         "a file in the folder of certificate authorities cannot be read as certificates"},
        {ErrorId::kCheckFailed, "check-failed", kFailed,
         "a check of what is stored failed; `credential_checks` has its remedy"},
        {ErrorId::kCredentialNotChanged, "credential-not-changed", kFailed,
         "the stored credential could not be changed"},
        {ErrorId::kCredentialNotRemoved, "credential-not-removed", kFailed,
         "the stored credential could not be removed whole"},
        {ErrorId::kCredentialNotStored, "credential-not-stored", kFailed,
         "the credential could not be stored"},
        {ErrorId::kDeadline, "deadline", kDeadline,
         "the deadline struck; `stage` names what used the time"},
        {ErrorId::kFactMissing, "fact-missing", kFailed,
         "a fact that a join tells the server cannot be read; nothing was changed"},
        {ErrorId::kFetchFailed, "fetch-failed", kFailed, "the file could not be fetched"},
        {ErrorId::kIdleNotSet, "idle-not-set", kFailed, "the disks' idle time could not be set"},
        {ErrorId::kIdleUnreadable, "idle-unreadable", kFailed,
         "the disks' idle time could not be read"},
        {ErrorId::kInfoNotWritten, "info-not-written", kFailed,
         "the client info file could not be written, or cannot hold the key or the value"},
        {ErrorId::kInfoUnreadable, "info-unreadable", kFailed,
         "the client info file is not there, or damaged"},
        {ErrorId::kInternal, "internal", kFailed, "a fault of the program itself"},
        {ErrorId::kInterrupted, "interrupted", kFailed, "a signal ended the transfer"},
        {ErrorId::kJoinFailed, "join-failed", kFailed,
         "a step of the join failed; nothing of it stays stored"},
        {ErrorId::kJoinNotUndone, "join-not-undone", kFailed,
         "a step of the join failed, and what came before could not be undone wholly"},
        {ErrorId::kJoinedElsewhere, "joined-elsewhere", kFailed,
         "another server than the one named is joined already; nothing was changed"},
        {ErrorId::kLeaveFailed, "leave-failed", kFailed,
         "a step of leaving failed, or it cannot be told what is left; what came before is done"},
        {ErrorId::kLockUnavailable, "lock-unavailable", kFailed,
         "the lock of the programs that join or leave cannot be had; nothing was changed"},
        {ErrorId::kLogNotConfirmed, "log-not-confirmed", kFailed,
         "the server has not confirmed the log entry"},
        {ErrorId::kNoCredential, "no-credential", kFailed, "no server credential is stored"},
        {ErrorId::kNoReply, "no-reply", kFailed, "no usable reply came from the server"},
        {ErrorId::kNoSecurePort, "no-secure-port", kFailed,
         "the access token would have to go over plain HTTP"},
        {ErrorId::kNoServer, "no-server", kFailed, "no connection reached a server"},
        {ErrorId::kNoSession, "no-session", kFailed, "the server credential has no session"},
        {ErrorId::kNoSuchKey, "no-such-key", kFailed, "the client info file does not have the key"},
        {ErrorId::kNoSuchLevel, "no-such-level", kFailed, "there is no such log level"},
        {ErrorId::kNoSuchText, "no-such-text", kFailed,
         "no strings file has the section with the key"},
        {ErrorId::kNotJoined, "not-joined", kFailed,
         "this appliance is not joined: there is no server to ask"},
        {ErrorId::kNotReplaced, "not-replaced", kFailed,
         "the fetched file could not take the old one's place, which is as it was"},
        {ErrorId::kNotificationNotSent, "notification-not-sent", kFailed,
         "the notification could not be handed to the notification service"},
        {ErrorId::kOutOfMemory, "out-of-memory", kFailed, "memory is short"},
        {ErrorId::kOutput, "output", kFailed,
         "the result could not be written to standard output; told on standard error alone"},
        {ErrorId::kPluginFailed, "plugin-failed", kFailed, "a plug-in failed"},
        {ErrorId::kPluginsNotReady, "plugins-not-ready", kFailed,
         "the plug-ins could not be made ready"},
        {ErrorId::kRefused, "refused", kFailed,
         "the server refused the call; `server_code` and `server_error` say why"},
        {ErrorId::kRemainsNotRemoved, "remains-not-removed", kFailed,
         "what is left of an earlier membership could not be removed; no join was begun"},
        {ErrorId::kStoreDamaged, "store-damaged", kFailed,
         "the credential store is damaged or of another format; it is left as it is"},
        {ErrorId::kStoreUnreadable, "store-unreadable", kFailed,
         "a store cannot be read now, damage apart, or cannot be set aside"},
        {ErrorId::kUpdateFailed, "update-failed", kFailed,
         "the server did not take the update, or a fact of the appliance is missing"},
        {ErrorId::kUsage, "usage", kUsage, "the command line is wrong; nothing was done"},
        {ErrorId::kWelcomeNotChanged, "welcome-not-changed", kFailed,
         "the user's welcome pages could not be shown or hidden"}};
    return errors;
}

const ErrorEntry &ErrorOf(ErrorId id) {
    const std::vector<ErrorEntry> &errors = AllErrors();
    return *std::find_if(errors.begin(), errors.end(),
                         [id](const ErrorEntry &entry) { return entry.id == id; });
}

const std::vector<ExitCodeEntry> &AllExitCodes() {
    static const std::vector<ExitCodeEntry> codes = {
        {kDone, "done; of `status`: joined"},
        {kFailed, "the operation failed"},
        {kUsage, "wrong usage, nothing was done"},
        {kNotJoined, "of `status` alone: not joined"},
        {kInconsistent, "of `status` alone: the indicators of membership disagree"},
        {kDeadline, "the deadline struck"}};
    return codes;
}

const char *ServerErrorName(int code) {
    switch (code) {
        case 101:
            return "bad-parameter";
        case 102:
            return "no-such-api";
        case 103:
            return "no-such-method";
        case 104:
            return "no-such-version";
        case 105:
            return "wrong-token";
        case 106:
            return "token-expired";
        case 107:
            return "no-right";
        case 120:
            return "no-such-client";
        default:
            return "unknown";
    }
}

}  // namespace qrmctl
