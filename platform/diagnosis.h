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

#include <ctime>
#include <string>
#include <vector>

#include "api.h"
#include "text_containers.h"

// Exports an operation that a port may leave out.
#define ZELO_DIAGNOSIS_API ZELO_PLATFORM_API __attribute__((weak))

extern "C" {

// --- Reasons ------------------------------------------------------------------------------------

// Writes the words of the calling thread's latest failure (last_error.h) into the buffer of
// cbReason bytes, cut between characters and zero-terminated, such as "cannot connect to
// qrm.example:5001: connection refused". Returns the length; 0 where the failure has no words, or
// nothing has failed yet; -1 for no buffer.
ZELO_DIAGNOSIS_API int ZELODiagnosisReason(char *szReason, int cbReason);

// --- Damaged stores -----------------------------------------------------------------------------
//
// These operations alone set the file of a damaged store aside, and for damage alone: not where the
// store is busy, out of reach, or cannot be read whole.

// Looks through the whole credential store (credential_store.h). Where its file could be read
// whole, and is damaged or of another format, renames it within its folder to a name that says
// when, and never replaces another file. The store is empty then, and ids count from the beginning.
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

// --- The deadline -------------------------------------------------------------------------------
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
// ends the wait. Gets what is waited for, such as "the lock '/tmp/userlock'", and for how long
// already. It must not throw.
typedef void (*ZELO_WAIT_OBSERVER)(void *pContext, const char *szWaitsFor, double waited_s);

// Sets the observer of all waits of the process; null for none, as at the start. Set it while no
// other thread is in an operation.
ZELO_DIAGNOSIS_API void ZELOWaitObserverSet(ZELO_WAIT_OBSERVER pfnObserver, void *pContext);
}

// --- Exchanges ----------------------------------------------------------------------------------
//
// What an exchange with a server met (web_api_request.h). These are C++ and may throw
// std::bad_alloc.

namespace ZELO {

// The certificate that a server showed.
struct ServerCertificate {
    bool blShown = false;    // there was one
    std::string strSubject;  // such as "CN=qrm.example,O=Example"
    std::string strIssuer;
    std::string strNames;  // for which hosts it is, such as "DNS:qrm.example, IP Address:192.0.2.7"
    std::time_t notBefore = 0;
    std::time_t notAfter = 0;
    std::string strFingerprint;  // SHA-256 of the certificate, 64 lower-case hexadecimal digits
    std::string strChainPem;     // it and what the server sent with it, in the order of sending
    bool blNamesHost = false;    // it is for the host that was asked for
    // Whether it leads to a trusted authority and is valid now: the number that OpenSSL has for the
    // reason why not (X509_V_ERR_...), 0 when it does; which certificate of the chain it is about,
    // 0 for the server's own; and the reason in words.
    int verifyCode = 0;
    int verifyDepth = 0;
    std::string strVerifyWords;
    std::time_t verifyNotBefore = 0;  // since when, and until when, that certificate is valid
    std::time_t verifyNotAfter = 0;
};

// One exchange. A stage that was not reached has the time -1; over a connection that was kept
// from an earlier exchange there are no stages up to TLS, and no certificate.
struct Exchange {
    std::string strUrl;      // without a query
    bool blRelayed = false;  // through the platform's relay: addresses and TCP are the relay's

    std::vector<std::string> addresses;  // that were tried, such as "192.0.2.7:5001", "[::1]:5001"
    std::string strAddress;              // the one that was connected to
    // Milliseconds from the beginning to the end of each stage.
    long resolved_ms = -1;    // the name has addresses
    long connected_ms = -1;   // TCP
    long secured_ms = -1;     // TLS; through a relay that is behind its tunnel
    long answered_ms = -1;    // the first byte of the answer
    long whole_ms = -1;       // the end of the exchange, whatever came of it
    bool blTimedOut = false;  // a limit of its time ended it

    int relayStatus = 0;              // what the relay, or a proxy, answered; 0: nothing
    std::string strTlsVersion;        // such as "TLSv1.3"
    ServerCertificate certificate;    // that was shown
    bool blCertificateAsked = false;  // the server asked for one of this client, which has none

    int httpStatus = 0;         // 0: no answer arrived
    int errorCode = 0;          // of a reply that says why there is no success; 0 without one
    std::string strDate;        // the answer's header "Date", as it is
    std::string strRetryAfter;  // the answer's header "Retry-After", as it is
    std::time_t ownTime = 0;    // this appliance's clock as the exchange ended

    // Why it failed, or, for a discovery, why the answer tells no path: a value of CRED_REQ_ERROR,
    // 0 when a whole reply arrived; the last error's code (last_error.h); and the reason in words,
    // without the server's name.
    int error = 0;
    unsigned int code = 0;
    std::string strWords;
    // What mends it, where the platform knows; also for a reply that refuses.
    std::string strRemedy;
};

// The calling thread's latest exchange, discovery, call or look, also where it failed: for a
// program that tells its user why a server refused. It is empty at the start of a thread, and stays
// as it was for a request whose arguments are refused. Of an error page to a request with a
// response stream, an error code in the first 64 KiB counts.
ZELO_DIAGNOSIS_API Exchange LatestExchange();

// What to look at.
struct Look {
    std::string strProtocol;  // "https", "http", or "fld" for HTTPS through the relay
    std::string strHost;
    int port = 0;
    std::string strPath = "/";
    std::string strQuery;  // "name=value", whose value is encoded here; empty for none
    // False: the server's certificate and name are not verified, nor is the platform's list of
    // authorities needed. What comes back is a hint then, not a fact: whoever answers may lie. For
    // clocks, and for certificates that are not trusted yet.
    bool blVerify = true;
    long limit_ms = 10'000;  // for all of it
};

// Asks for the path, over a connection of its own and without any token. Returns true when a whole
// reply arrived, whatever its HTTP status. `exchange` gets what was met in any case, and *pBody the
// body of the reply, unless it is null. It is the thread's latest exchange too.
ZELO_DIAGNOSIS_API bool LookAtServer(const Look &look, Exchange &exchange, std::string *pBody);

}  // namespace ZELO

#endif
