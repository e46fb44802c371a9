// Every failure that qrmctl can end with: a stable identifier for programs, and the exit code. The
// table in docs/qrmctl.md is this one.

#ifndef QRMCTL_ERROR_IDS_H
#define QRMCTL_ERROR_IDS_H

#include <vector>

namespace qrmctl {

enum ExitCode {
    kDone = 0,
    kFailed = 1,
    kUsage = 2,
    kNotJoined = 3,
    kInconsistent = 4,
    kDeadline = 5
};

enum class ErrorId {
    kAccountNotCreated,
    kAccountNotDeleted,
    kArchiveNotWritten,
    kBadDestination,
    kBadInput,
    kBusy,
    kCaUnreadable,
    kCheckFailed,
    kCredentialNotChanged,
    kCredentialNotRemoved,
    kCredentialNotStored,
    kDeadline,
    kFactMissing,
    kFetchFailed,
    kIdleNotSet,
    kIdleUnreadable,
    kInfoNotWritten,
    kInfoUnreadable,
    kInternal,
    kInterrupted,
    kJoinFailed,
    kJoinNotUndone,
    kJoinedElsewhere,
    kLeaveFailed,
    kLockUnavailable,
    kLogNotConfirmed,
    kNoCredential,
    kNoReply,
    kNoSecurePort,
    kNoServer,
    kNoSession,
    kNoSuchKey,
    kNoSuchLevel,
    kNoSuchText,
    kNotJoined,
    kNotReplaced,
    kNotificationNotSent,
    kOutOfMemory,
    kOutput,
    kPluginFailed,
    kPluginsNotReady,
    kRefused,
    kRemainsNotRemoved,
    kStoreDamaged,
    kStoreUnreadable,
    kUpdateFailed,
    kUsage,
    kWelcomeNotChanged
};

struct ErrorEntry {
    ErrorId id;
    const char *szId;  // "error_id" of the JSON object; never changes its meaning
    ExitCode exitCode;
    const char *szMeaning;
};

// All failures, in the order of their identifiers.
const std::vector<ErrorEntry> &AllErrors();

const ErrorEntry &ErrorOf(ErrorId id);

struct ExitCodeEntry {
    ExitCode exitCode;
    const char *szMeaning;
};

// All exit codes, in their order.
const std::vector<ExitCodeEntry> &AllExitCodes();

// The name of an error code of a server's response envelope; "unknown" for one that the wire
// protocol does not have.
const char *ServerErrorName(int code);

}  // namespace qrmctl

#endif
