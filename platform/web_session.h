// Web sessions: who may use the appliance's web interface without signing in again.
//
// A session has an index and a name. The index says which of the platform's kinds of session it is:
// 13 is for sessions of other machines, among them "ZELO.QRM.Client" and "ZELO.QRM.Client.Machine",
// with which a QRM server reaches the appliances that it manages. The name is any text that is not
// empty, compared byte for byte; the same name under two indexes is two sessions.
//
// Every operation takes a context, a record of the caller's own. A context belongs to one thread at
// a time; different threads and processes may use contexts of their own at once, and see each
// other's changes. A change reaches the store as a whole, durably, or not at all. An operation that
// meets another process's write waits for it, within a bound.
//
// Results: non-zero for yes or done, 0 for no or failed. A failure sets the last error
// (last_error.h); a session that is not there is no failure and leaves it as it was. A store that
// others have rights over, or own, or that is damaged, is treated as the credential store is
// (credential_store.h).

#ifndef ZELO_PLATFORM_WEB_SESSION_H
#define ZELO_PLATFORM_WEB_SESSION_H

#include "api.h"

// Filled with zeros by its owner before ZeloCgiInit; what stands in it after that is the port's,
// and it is not copied until ZeloCgiFree.
struct ZELO_CGI_CONTEXT {
    int blReady;  // not 0 when the context is ready
    void *pPort;  // the port's
};

extern "C" {

// Makes the context ready, and sees to it that the sessions can be read: it fails where they
// cannot. szRequest is reserved for programs that serve a request of the web interface; others pass
// "".
//
// Returns non-zero on success. Whatever it returns, the caller ends with ZeloCgiFree.
ZELO_PLATFORM_API int ZeloCgiInit(const char *szRequest, ZELO_CGI_CONTEXT *pContext);

// Whether there is a session with this index (0 or more) and name: non-zero when there is, 0 when
// there is none or the answer cannot be had.
ZELO_PLATFORM_API int ZeloCgiSessionExistByIndex(ZELO_CGI_CONTEXT *pContext, int index,
                                                 const char *szName);

// Adds the session; one that is there already counts as added. Returns non-zero on success.
ZELO_PLATFORM_API int ZeloCgiAddSessionByIndex(ZELO_CGI_CONTEXT *pContext, int index,
                                               const char *szName);

// Removes the session; one that is not there counts as removed, so that a half-joined appliance can
// be repaired. Returns non-zero on success.
ZELO_PLATFORM_API int ZeloCgiRemoveSessionByIndex(ZELO_CGI_CONTEXT *pContext, int index,
                                                  const char *szName);

// Releases what the context holds and fills it with zeros. A context that was never made ready, or
// was released before, and null are no errors. The sessions stay.
ZELO_PLATFORM_API void ZeloCgiFree(ZELO_CGI_CONTEXT *pContext);
}

#endif
