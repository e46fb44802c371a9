// Diagnosis: what tools ask beyond what the library needs.
//
// Why something failed, what the process waits for and for how long it may, and what to do about a
// damaged store. The library calls none of it. A port may leave all of it out: the symbols are
// weak, and a caller looks whether it is there before it calls:
//
//     if (ZELODiagnosisReason != nullptr) …
//
// A program without it says less. Callers are position-independent.

#ifndef ZELO_PLATFORM_DIAGNOSIS_H
#define ZELO_PLATFORM_DIAGNOSIS_H

#include "api.h"
#include "text_containers.h"

#define ZELO_DIAGNOSIS_API ZELO_PLATFORM_API __attribute__((weak))

extern "C" {

// --- Reasons
// --------------------------------------------------------------------------------------

// Writes the words of the calling thread's latest failure (last_error.h) into the buffer of
// cbReason bytes, cut between characters and zero-terminated, such as "cannot connect to
// qrm.example:5001: connection refused". Returns the length; 0 where the failure has no words, or
// nothing has failed yet; -1 for no buffer.
ZELO_DIAGNOSIS_API int ZELODiagnosisReason(char *szReason, int cbReason);

// --- Damaged stores -----------------------------------------------------------------------------
//
// Nothing but these operations sets the file of a damaged store aside, and they do it for nothing but
// damage: not where the store is busy, out of reach, or cannot be read whole.

// Looks through the whole credential store (credential_store.h); where its file could be read whole,
// and is damaged or of another format, renames it to one in the same folder whose name says when,
// and never replaces another. The store is empty then, and ids count from the beginning.
//
// Returns 1 when it was set aside, 0 when nothing is damaged, a negative value when that could not
// be found out or done; the operation may be called again then. szPath, a buffer of cbPath bytes,
// gets the path at which the file is now, moved or not.
ZELO_DIAGNOSIS_API int ZELOCredStoreSetAside(char *szPath, int cbPath);

// Appends the paths of all files of the credential store that were set aside and are still there,
// the oldest first. Returns their number, negative on failure.
ZELO_DIAGNOSIS_API int ZELOCredStoreListSetAside(YLIBSZLIST **ppslPaths);

// The same as ZELOCredStoreSetAside for the store of the web sessions (web_session.h); it needs no
// context. The store is empty then: who had a session signs in again.
ZELO_DIAGNOSIS_API int ZeloCgiStoreSetAside(char *szPath, int cbPath);

// --- The deadline
// ---------------------------------------------------------------------------------
//
// One point in time for the whole process, at which every wait of the platform ends: for a lock, a
// busy store, a program, a server, a name. An operation that had to give up so fails with
// YLIBC_ERR_DEADLINE, and its words tell what it waited for; a program that it ran is ended. Waits
// that begin later look once and give up. There is no deadline at first.

// Sets the deadline to that many milliseconds from now, or takes it away when the number is
// negative. May be called in any thread and in a signal handler: with 0 all waits end now.
ZELO_DIAGNOSIS_API void ZELODeadlineSet(long long left_ms);

// The milliseconds until the deadline, 0 when it is over; -1 when there is none.
ZELO_DIAGNOSIS_API long long ZELODeadlineLeft(void);

// Called in the waiting thread, about once a second while an operation waits, and when the deadline
// ends the wait: what for, such as "the lock '/tmp/userlock'", and for how long already. It must not
// throw.
typedef void (*ZELO_WAIT_OBSERVER)(void *pContext, const char *szWaitsFor, double waited_s);

// Sets the observer of all waits of the process; null for none, as at the start. Set it while no
// other thread is in an operation.
ZELO_DIAGNOSIS_API void ZELOWaitObserverSet(ZELO_WAIT_OBSERVER pfnObserver, void *pContext);
}

#endif
