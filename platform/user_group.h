// Users and groups: the appliance's local accounts.
//
// The records in memory are copies: nothing reaches the account store before ZELOUserSetOne,
// ZELOGroupSet or ZELOUserDelete, and what one call changes reaches it as a whole or, when the call
// fails, not at all. Only local accounts are meant; those of a directory service are neither found
// nor changed. Names are compared exactly: upper and lower case differ.
//
// What holds for every operation
//   - Any thread and any process may call them at any time; a record belongs to one thread at a
//     time. Changes exclude each other, those of the system's own account tools included; one that
//     meets another waits for it, 15 s at most, and then fails with YLIBC_ERR_BUSY. Look-ups wait
//     for nobody and see the accounts as they are before a change or after it.
//   - Unless stated otherwise they return 0 on success and a negative value on failure. A failure
//     sets the last error (last_error.h); a null or unusable argument is
//     YLIBC_ERR_INVALID_ARGUMENT, accounts that cannot be read or written are YLIBC_ERR_FILE.
//   - A password is stored as a hash of all its characters, by which the system's own sign-in
//     checks it; no operation here reads or checks it. It appears in no log line, no argument of a
//     program and no environment.

#ifndef ZELO_PLATFORM_USER_GROUP_H
#define ZELO_PLATFORM_USER_GROUP_H

#include <sys/types.h>

#include "api.h"

// A user. All texts stand in the record itself, zero-terminated: whoever holds a record reads and
// writes its fields directly, and there is nothing to own or to release but the record.
struct ZELO_USER {
    char szName[256];  // letters, digits, "_", "-" and "."; begins with a letter or "_"; up to 32
    char szPassword[512];  // a new password; "" leaves the stored one as it is
    uid_t uid;
    gid_t gid;                 // the user's first group, which has to exist
    char szDescription[1024];  // like the next two, without ":" and control characters
    char szHome[4096];         // an absolute path
    char szShell[4096];        // an absolute path, or ""
    int nExpireDay;  // the day, counted from 1 January 1970, on which the account closes; -1: none
    int blEnabled;   // not 0: the password lets the user in; 0: the account is locked
};

// A group.
//
// The member list ends with a null and belongs to the record: list and names come from malloc (or
// strdup), and ZELOGroupFree releases with free() whatever list the record holds by then, each name
// and the list itself. A caller who puts a list of its own there hands it over in the same form and
// takes over the list that was there, to be released in the same way, once. Exchanging the two
// pointers does both. Null stands for no members.
//
// The port notes in the record who the members were when they were read. A record of a caller's own
// making is filled with zeros first, and released with ZELOGroupFree too.
struct ZELO_GROUP {
    char szName[256];  // as of a user
    gid_t gid;
    char **ppszMembers;
    void *pPort;  // for the platform alone: the members as they were read
};

// What became of a change to several users.
struct YLIBCM_RESULT {
    int nDone;           // how many were changed
    int nFailed;         // how many were not
    char szFailed[256];  // the name of the first of those, or ""
};

extern "C" {

// --- Records ------------------------------------------------------------------------------------

// A new user record with these fields, in *ppUser. Null for a text stands for "", but for the name,
// which must be there. Fails, with *ppUser null, when a text does not fit its field or memory is
// short. The caller owns the record and releases it with ZELOUserFree. pReserved is for ports:
// callers pass null.
ZELO_PLATFORM_API int ZELOUserAlloc(ZELO_USER **ppUser, const char *szName, const char *szPassword,
                                    uid_t uid, gid_t gid, const char *szDescription,
                                    const char *szHome, const char *szShell, int nExpireDay,
                                    int blEnabled, const void *pReserved);

// Wipes the record, the password in it above all, and releases it; null is no error.
ZELO_PLATFORM_API void ZELOUserFree(ZELO_USER *pUser);

// Releases a group record with the member list that it holds; null is no error.
ZELO_PLATFORM_API void ZELOGroupFree(ZELO_GROUP *pGroup);

// A new result record, all zero; null when memory is short. The caller owns it and releases it with
// YLIBCMResultFree. Operations that take the address of its pointer fill it on success and on
// failure; null for either pointer stands for a caller who does not want to know.
ZELO_PLATFORM_API YLIBCM_RESULT *YLIBCMResultAlloc(void);

// Releases a result record; null is no error.
ZELO_PLATFORM_API void YLIBCMResultFree(YLIBCM_RESULT *pResult);

// --- Users --------------------------------------------------------------------------------------

// Looks a user up. On success *ppUser is a new record with the stored fields and an empty password;
// the caller owns it and releases it with ZELOUserFree. On failure *ppUser is null.
// YLIBC_ERR_NOT_FOUND says that there is no such user, and no other last error does: after any
// other there may be one.
ZELO_PLATFORM_API int ZELOUserGet(const char *szName, ZELO_USER **ppUser);

// Stores a user: a new one when szCurrentName is null, else the one with that name, which must be
// the record's. uid and gid are stored as they are. A new user without a password cannot sign in. A
// home directory that is missing is created (mode 0700, and the user's as far as the process may
// give directories away).
//
// Fails, with nothing stored, with YLIBC_ERR_EXISTS when a new user's name, or the uid, is another
// user's; with YLIBC_ERR_LIMIT when no user may be added; with YLIBC_ERR_NOT_FOUND when there is no
// user szCurrentName or no group gid.
ZELO_PLATFORM_API int ZELOUserSetOne(const char *szCurrentName, const ZELO_USER *pUser,
                                     YLIBCM_RESULT **ppResult);

// Deletes nNames users, all of them or none, with their membership of groups and their preference
// directories. Of the home directories go those that are empty and stand below
// "/var/services/homes". A user who is not there counts as deleted.
//
// Returns 0 on success and exactly -1 on failure, with YLIBC_ERR_INVALID_ARGUMENT also when one of
// them has the uid 0: the superuser stays.
ZELO_PLATFORM_API int ZELOUserDelete(const char *const *ppszNames, int nNames,
                                     YLIBCM_RESULT **ppResult);

// How many more users may be added, 0 or more: the key "max_users" of "/etc/zeloinfo.conf" (2048
// where it is absent) less the users with a uid of 1024 and above, not counting 65534 ("nobody").
// Negative on failure, also when the key holds no number.
ZELO_PLATFORM_API int YLIBUserNumRemained(void);

// Writes the path of a user's preference directory, without a slash at its end, to szPath, a buffer
// of cbPath bytes. Each user has a directory of its own, which is created when it is missing (mode
// 0700); no name leads out of the folder of them all. Fails, creating nothing, when there is no
// such user (YLIBC_ERR_NOT_FOUND) or the path does not fit.
ZELO_PLATFORM_API int ZELOUserPreferenceDirGet(const char *szName, char *szPath, int cbPath);

// --- Groups -------------------------------------------------------------------------------------

// Looks a group up. On success *ppGroup is a new record whose list has the members in the stored
// order, and is never null; the caller owns it and releases it with ZELOGroupFree. On failure
// *ppGroup is null; YLIBC_ERR_NOT_FOUND alone says that there is no such group.
ZELO_PLATFORM_API int ZELOGroupGet(const char *szName, ZELO_GROUP **ppGroup);

// Makes the record's members the members of the group szName, in their order; name and gid of the
// group stay. Where the group has changed since ZELOGroupGet read the record, only the difference
// is written: who was put on the record's list is added, who was taken off it is removed, and what
// others have changed meanwhile stays. A record of the caller's own making is written as it is.
//
// The record and its list stay the caller's; after a success its members count as read. A member's
// name is refused when it is empty or holds ":", "," or a line feed; whether it is a user's is not
// asked.
ZELO_PLATFORM_API int ZELOGroupSet(const char *szName, const ZELO_GROUP *pGroup);

// Whether a user is a member of the group "administrators", as one of its listed members or because
// it is the user's first group. Returns 1 for a member; 0 for anybody else, also for a name that is
// no user's and when there is no such group; negative on failure. flags is reserved: callers pass
// 0, a port ignores it.
ZELO_PLATFORM_API int YLIBGroupIsAdminGroupMem(const char *szName, int flags);

// Keeps the extra-administrator setting of the application szName: four numbers, which mean what
// the application makes of them. Four zeros clear it.
ZELO_PLATFORM_API int YLIBGroupExtraAdminSet(const char *szName, int n1, int n2, int n3, int n4);
}

#endif
