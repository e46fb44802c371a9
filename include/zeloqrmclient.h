// libzeloqrmclient: makes an appliance a managed client of a central management server, the QRM
// server.
//
// This is the library's one public header. What holds for every function in it:
//   - It runs to completion on the caller's thread. The library starts no thread or process of its
//     own and keeps nothing in memory between calls unless a function says so.
//   - Nothing throws. A caller's JSON value of the wrong type, nested too deeply (1000 levels) or
//     out of range makes the step that reads it fail.
//   - A failure is written to the system log at level LOG_ERR, as "<source file>:<line> <message>",
//     at the place where it is noticed; a function that logs nothing for a failure says so. An
//     access token is never part of a log line.
//   - Text that the platform hands back is cut to 1023 bytes.
//   - Functions may be called in several threads at once, unless one says otherwise, as long as no
//     two of them share a JSON value that one of them writes. They are not ordered against each
//     other: two joins at once make two records.
//   - They work in a child process after fork.

#ifndef ZELOQRMCLIENT_H
#define ZELOQRMCLIENT_H

#include <json/value.h>

#include <string>

#define ZELOQRM_API __attribute__((visibility("default")))

// ------------------------------------------------------------------------------------------------
// Server credential: where the server is, and the token that authenticates the appliance there.
//
// Two records of the platform's credential store: the credential of the application "ZELO.QRM"
// (host, port, protocol, extra information) and, under the same id, its session (access token, csrf
// token). The functions exchange them as a JSON object with these members:
//
//     "host"          string    the server's name or address
//     "port"          integer   its port
//     "protocol"      string    "https", "http" or "fld" (through the relay)
//     "application"   string    "ZELO.QRM"
//     "access_token"  string    the session's access token
//     "csrf_token"    string    the session's csrf token; read only
//     "sn"            any       the appliance's serial number, kept in the extra information
//     "extra_info"    any       the whole extra information; only when a credential is created
//
// Several credentials may be stored; the one stored first is in force. Files: the platform's
// credential store.
// ------------------------------------------------------------------------------------------------

// Stores a new credential and its session.
//
// cred: an object with "protocol", "host", "port", "application" and "access_token"; "extra_info"
// is optional and stored as JSON text ("null" when it is absent). Owner becomes the user id 1024,
// create and modify time become now.
//
// Returns true when both records are stored. Returns false when a member is missing or of another
// type, or the credential could not be saved: nothing is stored. Returns false as well when the
// session could not be saved: the credential then stays stored, without a session.
//
// A credential that exists already is left alone and stays in force.
ZELOQRM_API bool ZELOQRMClientCreateServerCredential(const Json::Value &cred);

// Removes the server's credential and the notification center's (the application
// "ZELO.NotificationCenter"), each with its session; of several records of one application the one
// in force.
//
// Returns true when both are gone, also when neither was there. Returns false, without a log line,
// at the first removal that fails; what is removed by then stays removed.
ZELOQRM_API bool ZELOQRMClientDeleteServerCredential(void);

// Reads the credential: sets "host", "port", "protocol" and "sn" in out, each as far as it is
// stored. Other members of out stay as they are.
//
// out: null or an object; anything else fails.
//
// Returns true when there is a credential, false when there is none.
ZELOQRM_API bool ZELOQRMClientGetServerCredential(Json::Value &out);

// Reads the credential like ZELOQRMClientGetServerCredential and its session: sets "application" to
// "ZELO.QRM", "access_token" as far as it is stored, and "csrf_token" when it is not empty.
//
// Returns true when there are a credential and a session. Returns false otherwise; when only the
// session is missing, out holds the members of the credential.
ZELOQRM_API bool ZELOQRMClientGetServerCredentialWithToken(Json::Value &out);

// Changes the credential of the application that cred names, and its session, member by member.
//
// cred: an object with "application". Optional: "protocol", "host", "port", "access_token" and
// "sn", each of which replaces the stored value; "sn" becomes a member of the extra information,
// whose other members stay. Times, owner and csrf token stay as they are. cred is not changed.
//
// Returns true when both records are saved. Returns false when there is no such credential or it
// has no session, when a member is of another type, or when a save fails. Everything is checked and
// read before the first save, so a failure leaves the store as it was, except that a failing save
// of the session leaves the credential changed. A missing session and a failing setter or save log
// nothing.
ZELOQRM_API bool ZELOQRMClientUpdateServerCredential(Json::Value &cred);

// ------------------------------------------------------------------------------------------------
// Enrolment
// ------------------------------------------------------------------------------------------------

// Finds the first connection at which a server answers for a Web API.
//
// serverConn: an array of candidates, tried in their order. A candidate is an object:
//
//     "host"            string    the server's name or address, not empty
//     "https_port"      integer   0 to 65535; 0: no secure attempt
//     "http_port"       integer   0 to 65535; 0: no attempt over plain HTTP
//     "farlink_direct"  boolean   optional; true: the secure attempt goes through the relay ("fld")
//
// A candidate of any other form is passed over. Each gets at most two attempts, the secure one
// first; the first success ends the test.
//
// api: the Web API that the server has to serve, such as "ZELO.QRM.RPC"; not empty.
// out: null or an object; on success "protocol" ("https", "fld" or "http"), "port" and "host" are
// set in it. On failure it is not touched.
//
// Returns true when a server answered. Returns false otherwise, without a log line. Nothing is
// stored. An unanswered attempt takes up to the platform's connect limit.
ZELOQRM_API bool ZELOQRMClientTestConnect(const Json::Value &serverConn, const std::string &api,
                                          Json::Value &out);

// Joins a server: finds a connection (as ZELOQRMClientTestConnect does for "ZELO.QRM.RPC"), stores
// it as the server credential, and sends "join" with the appliance's description.
//
// joinInfo: an object with
//
//     "sn"                 any       required; sent as it is
//     "access_token"       any       required; sent as it is, stored nowhere
//     "server_host"        string    required; with the two ports the candidate that is tried last
//     "server_http_port"   integer   required
//     "server_https_port"  integer   required
//     "server_conn"        array     optional; candidates that are tried before
//     "id"                 any       optional; sent as it is
//     "host"               any       optional; sent as it is, default the appliance's host name
//     "http_port"          any       optional; sent as it is, default "admin_port"
//     "https_port"         any       optional; sent as it is, default "secure_admin_port" when
//                                    "runHTTPS" is "yes", else 0
//
// Returns 0 when the server accepted the appliance, else -1. A join that failed after a connection
// was found leaves the credential stored; each further join adds one more. The caller removes it
// with ZELOQRMClientDeleteServerCredential. A missing member, a fact that cannot be read (other
// than the host name) and a request that gets no reply log nothing.
//
// Join stores no session and sets no flag: the caller stores the access token in a session under
// the credential's id.
//
// Files read: "/etc/zeloinfo.conf" (admin_port, secure_admin_port, runHTTPS),
// "/etc.defaults/zeloinfo.conf" (upnpmodelname), "/etc.defaults/VERSION". Files written: the
// platform's credential store.
ZELOQRM_API int ZELOQRMClientSendCreateClient(const Json::Value &joinInfo);

#endif
