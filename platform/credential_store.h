// Credential store: where the appliance keeps how to reach a server (a credential) and what
// authenticates it there (a session).
//
// Two kinds of record. A credential (ZELO_CRED) has an id, an application name by which programs
// find it, host, port, protocol, owner, create and modify time, and free extra information. A
// session (ZELO_CRED_SESS) holds an access token and a csrf token and is stored under the id of the
// credential that it belongs to. Records in memory are copies: nothing reaches the store before a
// save, and a save or removal reaches it as a whole or not at all.
//
// What holds for every operation
//   - Text set on a record is copied and stored whole, whatever its length. A getter copies it into
//     the caller's buffer, cut to the buffer's size less one, and zero-terminates it.
//   - A field that was never set is not the same as an empty one: its getter fails.
//   - The default record (id -1) always loads and has no field set; it serves to bring a record
//     that is used again back to its empty state.
//   - Results: setters, loads, saves and removals return 0 on success and a negative value on
//     failure; text and number getters return 0 on success and a negative value on failure. A
//     caller may rely on "0 or not" as well as on "negative or not". Every failure sets the last
//     error (last_error.h). A null record fails.
//   - The store is shared by all processes. An operation that meets another process's write waits
//     for it, within a bound, and fails with YLIBC_ERR_STORE_BUSY past it. It works in a child
//     process after fork as it did in the parent.
//   - Operations on different records may run in different threads at once; one record belongs to
//     one thread at a time.
//   - Neither token ever appears in a log line, and the store is readable for its owner alone. One
//     that others have rights over, as a copy that was put back may be, loses those rights when it
//     is next used, be it for a look. Where they cannot be taken away, or the store, or its folder,
//     belongs to somebody else (root excepted), operations fail with YLIBC_ERR_UNSAFE_FILE.
//   - A store whose file is damaged or of another format is left as it is: operations on it fail
//     with YLIBC_ERR_STORE_DAMAGED until somebody restores a copy or sets it aside (diagnosis.h). No
//     other failure (a busy store, missing rights, a full disk, a disk that cannot read) counts as
//     damage.

#ifndef ZELO_PLATFORM_CREDENTIAL_STORE_H
#define ZELO_PLATFORM_CREDENTIAL_STORE_H

#include "api.h"

// Both records are opaque; each port lays them out as it likes.
struct ZELO_CRED;
struct ZELO_CRED_SESS;

extern "C" {

// --- Credential records in memory ---------------------------------------------------------------

// A new record with no field set and no id. Null when memory is short. The caller owns it and
// releases it with ZELOCredFree.
ZELO_PLATFORM_API ZELO_CRED *ZELOCredAlloc(void);

// Releases a record from ZELOCredAlloc; null is no error. Not for a listed record: those go with
// their list (ZELOCredListFree).
ZELO_PLATFORM_API void ZELOCredFree(ZELO_CRED *pCred);

// Setters: the record first, then the value. Times are seconds since the epoch; the owner is a user
// id. A null text is refused.
ZELO_PLATFORM_API int ZELOCredItemSetCreateTime(ZELO_CRED *pCred, long time_s);
ZELO_PLATFORM_API int ZELOCredItemSetModifyTime(ZELO_CRED *pCred, long time_s);
ZELO_PLATFORM_API int ZELOCredItemSetOwner(ZELO_CRED *pCred, int uid);
ZELO_PLATFORM_API int ZELOCredItemSetPort(ZELO_CRED *pCred, int port);
ZELO_PLATFORM_API int ZELOCredItemSetHost(ZELO_CRED *pCred, const char *szHost);
ZELO_PLATFORM_API int ZELOCredItemSetProtocol(ZELO_CRED *pCred, const char *szProtocol);
ZELO_PLATFORM_API int ZELOCredItemSetApplication(ZELO_CRED *pCred, const char *szApplication);
ZELO_PLATFORM_API int ZELOCredItemSetExtraInfo(ZELO_CRED *pCred, const char *szExtraInfo);

// Getters: the output first (for text with the buffer's size in bytes), the record last. On failure
// the output is left as it was.
ZELO_PLATFORM_API int ZELOCredItemGetHost(char *szHost, int cbHost, const ZELO_CRED *pCred);
ZELO_PLATFORM_API int ZELOCredItemGetProtocol(char *szProtocol, int cbProtocol,
                                              const ZELO_CRED *pCred);
ZELO_PLATFORM_API int ZELOCredItemGetExtraInfo(char *szExtraInfo, int cbExtraInfo,
                                               const ZELO_CRED *pCred);
ZELO_PLATFORM_API int ZELOCredItemGetPort(long *pPort, const ZELO_CRED *pCred);

// The record's id. Fails while the record has none, that is, before its first save.
ZELO_PLATFORM_API int ZELOCredItemGetID(long *pId, const ZELO_CRED *pCred);

// --- Credential records in the store ------------------------------------------------------------

// Writes the record to the store, durably. A record without an id is added and gets an id that is
// higher than every id that the store has given before, also to records that have been removed. A
// store that was set aside, or replaced by an older copy, takes what it knew of this with it: the
// one in its place may give an id anew. A record with an id replaces the stored one; it fails with
// YLIBC_ERR_NOT_FOUND when that has been removed meanwhile.
ZELO_PLATFORM_API int ZELOCredSave(ZELO_CRED *pCred);

// Replaces the record's content by that of the stored record with this id. Id -1 is the default
// record. An id that is not in the store fails and leaves the record as it was.
ZELO_PLATFORM_API int ZELOCredLoad(long id, ZELO_CRED *pCred);

// A filter for ZELOCredListGet: non-zero keeps the record.
typedef int (*ZELO_CRED_KEEP)(const ZELO_CRED *pCred, const char *szValue);

// The filter that keeps the records whose application is exactly szApplication.
ZELO_PLATFORM_API int ZELOCredKeepByApplication(const ZELO_CRED *pCred, const char *szApplication);

// Lists the stored records that the filter keeps, in the order of their ids, lowest first.
//
// Returns their number; 0 when there are none, negative on failure. When it is greater than 0,
// *ppList designates the first kept record, which all getters and setters and ZELOCredSave take as
// a record; the caller owns the list and releases it with ZELOCredListFree. Otherwise *ppList is
// null. The other kept records are counted but cannot be reached through the list.
ZELO_PLATFORM_API int ZELOCredListGet(ZELO_CRED **ppList, ZELO_CRED_KEEP pfnKeep,
                                      const char *szValue);

// Releases a list and sets *ppList to null. A null list is no error.
ZELO_PLATFORM_API void ZELOCredListFree(ZELO_CRED **ppList);

// The id of the record with this application, of several the lowest: the one that ZELOCredListGet
// lists first. Negative when there is none (YLIBC_ERR_NOT_FOUND, and no other last error says so)
// or the store cannot be read.
ZELO_PLATFORM_API long ZELOCredIDGetByApplication(const char *szApplication);

// Removes the record with this id and its session, durably and as a whole: no token outlives the
// record that it belongs to. A record that is not there counts as removed, and a session that stands
// under its id goes all the same. Removing the session first is allowed.
ZELO_PLATFORM_API int ZELOCredRemoveByID(long id);

// --- Sessions -----------------------------------------------------------------------------------

// A new session with no field set and no id. Null when memory is short. The caller owns it and
// releases it with ZELOCredSessFree.
ZELO_PLATFORM_API ZELO_CRED_SESS *ZELOCredSessAlloc(void);

// Releases a session; null is no error.
ZELO_PLATFORM_API void ZELOCredSessFree(ZELO_CRED_SESS *pSess);

// Sets the id under which the session is saved: that of its credential, 0 or more.
ZELO_PLATFORM_API int ZELOCredSessItemSetID(ZELO_CRED_SESS *pSess, long id);
ZELO_PLATFORM_API int ZELOCredSessItemSetAccessToken(ZELO_CRED_SESS *pSess, const char *szToken);
ZELO_PLATFORM_API int ZELOCredSessItemSetCsrfToken(ZELO_CRED_SESS *pSess, const char *szToken);

// Getters, as of a credential.
ZELO_PLATFORM_API int ZELOCredSessItemGetAccessToken(char *szToken, int cbToken,
                                                     const ZELO_CRED_SESS *pSess);
ZELO_PLATFORM_API int ZELOCredSessItemGetCsrfToken(char *szToken, int cbToken,
                                                   const ZELO_CRED_SESS *pSess);

// Writes the session under its id, durably, replacing the one that is there. Fails while it has no
// id.
ZELO_PLATFORM_API int ZELOCredSessSave(ZELO_CRED_SESS *pSess);

// Replaces the session's content by the one stored under this id. Id -1 is the default session. An
// id without a session in the store fails and leaves the record as it was.
ZELO_PLATFORM_API int ZELOCredSessLoad(long id, ZELO_CRED_SESS *pSess);

// Removes the session under this id, durably. One that is not there counts as removed.
ZELO_PLATFORM_API int ZELOCredSessRemoveByID(long id);
}

#endif
