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
#include <plugin_sdk.h>

#include <string>

// Marks what the shared library exports.
#define ZELOQRM_API __attribute__((visibility("default")))

// The platform's text containers (text_containers.h).
struct YLIBSZHASH;
struct YLIBSZLIST;

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
// Returns true when both records are stored. Returns false when a member is missing, one of the
// credential's is of another type, or the credential could not be saved: nothing is stored. Returns
// false as well when "access_token" is no text or the session could not be saved: the credential
// then stays stored, without a session.
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
// out: null or an object; anything else fails.
//
// Returns true when there are a credential and a session. Returns false otherwise; when only the
// session is missing, out holds the members of the credential.
ZELOQRM_API bool ZELOQRMClientGetServerCredentialWithToken(Json::Value &out);

// Changes the credential of the application that cred names, and its session, member by member.
//
// cred: an object with "application". Optional: "protocol", "host", "port", "access_token" and
// "sn", each of which replaces the stored value; "sn" becomes a member of the extra information,
// whose other members stay. Extra information that is no JSON object, or is longer than 1023 bytes,
// stays as it is: "sn" is then left out. Times, owner and csrf token stay as they are. cred is not
// changed.
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
// stored. An unanswered attempt takes up to the platform's connect limit of 10 s, one at which a
// server is silent 30 s.
//
// Files read: the certificates in "/usr/zelo/etc/ssl/ca.d/", for the secure attempts, besides the
// system's; "/etc/zeloinfo.conf" (farlink_relay, for the relay; use_proxy_environment, where the
// environment names a proxy).
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
// "/etc.defaults/zeloinfo.conf" (upnpmodelname), "/etc.defaults/VERSION", and what
// ZELOQRMClientTestConnect reads. Files written: the platform's credential store.
ZELOQRM_API int ZELOQRMClientSendCreateClient(const Json::Value &joinInfo);

// Brings the joined server's entry for this appliance up to date: sends "update" of
// "ZELO.QRM.RPC.ClientInfo" with serial number, host name, version and administration ports,
// through ZELOQRMClientSendWebapi.
//
// info: an object; its "host" is sent as it is when there is one, everything else in it is ignored.
//
// Returns 0 when the server took the update, else -1. A serial number that cannot be read is logged
// and goes as an empty text; the other facts are needed, and one that is missing ends the update
// without a log line and without a request.
//
// Files read: "/etc/zeloinfo.conf" (admin_port, secure_admin_port), "/etc.defaults/VERSION";
// besides them what ZELOQRMClientSendWebapi touches. Calls take turns with it.
ZELOQRM_API int ZELOQRMClientSendSetClient(const Json::Value &info);

// ------------------------------------------------------------------------------------------------
// Requests to the joined server
// ------------------------------------------------------------------------------------------------

// Calls a Web API method on the joined server with the stored credential and session.
//
// resp: receives the whole reply, of whatever JSON type it is; left as it was on -1.
// api, ver, method: the method, such as "ZELO.QRM.RPC.Log", 1, "push".
// params: its parameters, an object or null.
// useCache: true sends with the credential and session that an earlier call of this process loaded,
// without a look at the store; false, and the first call of a process, loads them.
//
// Returns 0 when a reply arrived and is JSON, also when the server reports a failure: look at its
// "success" and "error"."code". A reply that is no success is logged, with the tokens blanked out.
// Returns -1 when there is no credential or session, no reply, or one that is not JSON.
//
// What else it does: the key "status" of the client info file becomes "success", "no_permission"
// (codes 105, 106, 107), "error" or, for a reply that is not JSON, "no_connection"; a call without
// a reply leaves it. On -1 the notification "QRMClientConnectFailed" goes out, unless one has gone
// out within the last 7200 seconds and no call has been replied to since.
//
// Threads: the cached records belong to the process and have no lock. Calls of this function, of
// ZELOQRMClientSendSetClient and of ZELOQRMClientLog within one process have to take turns. A load
// that fails half-way leaves the cached records as far as it got: after a -1 call with useCache
// false.
//
// Time: an exchange takes at most 300 s, and the first call of a process may need two; a server
// that is silent is given up after 30 s, one that cannot be connected to after 10 s. A failed call
// may run the notification's hooks, 10 s each.
//
// Files: the platform's credential store and what ZELOQRMClientTestConnect reads (read);
// "/tmp/qrm_client.info" with its lock; "/tmp/qrmclientconnectfailed", whose time is that of the
// latest notification. What others put in that file's place silences no notification, is removed as
// far as the caller may, and nothing is created or changed through it.
ZELOQRM_API int ZELOQRMClientSendWebapi(Json::Value &resp, const std::string &api, int ver,
                                        const std::string &method, const Json::Value &params,
                                        bool useCache);

// Fetches a file: calls a Web API method whose reply is a file, and writes it to the path as it
// arrives.
//
// path: the destination. Its directory is created as needed (mode 0755); a path without one stands
// in the current directory. A slash or a backslash ends the directory. Links are followed, except
// for those in a directory that everybody can write to which belong neither to the caller nor to
// the directory's owner: one on the way is a failure, and the file that it leads to stays as it is.
// api, ver, method: the method.
// params: its parameters, an object or null. When there is a file at the path, its MD5 digest is
// added as "md5", 32 digits, and stays there afterwards: a null becomes an object.
//
// Returns 0 when the file has been fetched, and also when the server answers that the caller's copy
// is current: the file is then empty, as in the next case. Returns -1 otherwise. The file at the
// path is emptied before the server is asked, so a failure leaves it empty or cut: fetch beside the
// file that matters, and rename. Only a directory that cannot be created is logged.
//
// Calls may overlap, but not for one path. There is no limit on the size, nor on the time as long
// as the transfer moves: a server that never ends fills the disk, which is a failure. Files: the
// path; the platform's credential store and what ZELOQRMClientTestConnect reads (read).
ZELOQRM_API int ZELOQRMClientGetFile(const std::string &path, const std::string &api, int ver,
                                     const std::string &method, Json::Value &params);

// The MD5 digest of a file as text: 32 lower-case hexadecimal digits and a line feed, cut to
// size - 1 characters and zero-terminated. A buffer of 33 bytes takes the digits alone.
//
// path: the file; links are followed.
// buffer, size: the caller's buffer, and its size in bytes.
//
// Returns 0 when the file could be read, else -1, with the buffer as it was. Only a regular file
// has a digest: a pipe or a device may never end.
ZELOQRM_API int GetFileMd5String(const char *path, char *buffer, int size);

// ------------------------------------------------------------------------------------------------
// Client info file
// ------------------------------------------------------------------------------------------------

// How the latest dealings with the server went, as keys and values in "/tmp/qrm_client.info"; the
// library itself writes the key "status" (see ZELOQRMClientSendWebapi). The file is shared by all
// processes and empty after a restart of the appliance.

// Reads a key.
//
// key: its name.
// value: receives the text, cut to 1023 bytes; empty for a key that is not there.
//
// Returns true when the file was read; false, with value as it was, when there is no file yet or it
// cannot be read. Logs nothing.
ZELOQRM_API bool ZELOQRMClientGetInfo(const std::string &key, std::string &value);

// Writes a key, holding "/tmp/qrm_client.info.lock", which is waited for, 30 s at most.
//
// key, value: the key and its new text; no line feed in either, no "=" in the key.
//
// Returns true when it is written; false when the lock cannot be had, the file cannot be written,
// or a key or value cannot stand in it. Logs nothing.
ZELOQRM_API bool ZELOQRMClientSetInfo(const std::string &key, const std::string &value);

// ------------------------------------------------------------------------------------------------
// Notifications
// ------------------------------------------------------------------------------------------------

// Tells the appliance's own users of an event, through the platform's notification service.
//
// szTag: the event, such as "QRMClientConnectFailed" or "QRMClientDetachSuccess".
// ppHash: the address of the caller's variables, or null; a hash that it designates stays the
// caller's. The variable "%QRM_SERVER%" is added to it when it is not there: the stored server's
// host, "Unknown" without one.
//
// Whether the service took the notification is not reported. Logs when memory is short, and (by
// ZELOQRMClientGetServerCredential) when no credential is stored.
ZELOQRM_API void SendNotification(const char *szTag, YLIBSZHASH **ppHash);

// ------------------------------------------------------------------------------------------------
// Membership
// ------------------------------------------------------------------------------------------------

// Judges whether this appliance is joined. Six indicators are read in this order and compared with
// the first: the join flag ("join_nvo_qrm" of "/etc/zeloinfo.conf"), the server's credential, the
// notification center's credential, the cache daemon's status, the client web sessions
// ("ZELO.QRM.Client" or "ZELO.QRM.Client.Machine", index 13), and the service account as an
// administrator.
//
// Returns 1 when the flag is "yes" and all agree; 0 when it is anything else and all agree, or when
// it cannot be read; -1 at the first one that disagrees, which is logged and ends the look. Nothing
// is changed. The cache daemon's script "/usr/zelo/etc/rc.d/S99zelocache.sh" is run with "status".
//
// Time: milliseconds as a rule. A store that another program holds is waited for, 10 s for each of
// two looks, and a script that hangs 60 s: a web page asks in a thread or a process of its own.
ZELOQRM_API int ZELOQRMClientStatus(void);

// Leaves the server: takes away what joining left behind, also from a half-joined appliance. Does
// nothing when ZELOQRMClientStatus answers 0. Otherwise, in this order: the plug-ins of
// "qrm_client/disjoin" run with the action PRE; the cache daemon is stopped; both credentials, both
// client web sessions and the service account are removed; "nvo_qrm_self_join" becomes "no" and the
// join flag "no" (or "rejoin"); the notification "QRMClientDetachSuccess" goes out and the
// extra-administrator setting for "QRM" is cleared (neither for a re-join); the plug-ins run with
// the action POST and the result.
//
// blRejoin: the appliance leaves in order to join again.
// strFrom: the application that asks; "ZELO.PKV.AdminCenter.Application" is told to the plug-ins.
// blClearGluster: told to the plug-ins.
//
// Returns true when the appliance has left, or was not joined. Returns false when a step failed,
// with one line or two that say which: what is done by then stays done, the steps after it are left
// out, POST is told -1, and leaving again does the rest. Plug-ins that fail, and a notification
// that cannot be built, are logged and change nothing.
//
// Leaving is local: the server is not told. One record of each application is removed; where
// several are stored, leaving again removes the next.
//
// Files: "/etc/zeloinfo.conf" (join_nvo_qrm, nvo_qrm_self_join); the platform's credential store,
// web sessions and account files; what ZELOQRMClientStatus and ZELOQRMClientDeleteServerUser touch.
//
// Threads: join, leave and status are not ordered against each other; callers see to that. Plug-ins
// run in the caller's thread, each within the platform's time limit.
ZELOQRM_API bool ZELOQRMClientDeleteServer(bool blRejoin, const std::string &strFrom,
                                           bool blClearGluster);

// The same; blClearGluster is false.
//
// blRejoin, strFrom: as above.
//
// Returns what the one above returns.
ZELOQRM_API bool ZELOQRMClientDeleteServer(bool blRejoin, const std::string &strFrom);

// The same, not for a re-join and with no application that asks.
//
// Returns what the one above returns.
ZELOQRM_API bool ZELOQRMClientDeleteServer(void);

// ------------------------------------------------------------------------------------------------
// Plug-in hooks
// ------------------------------------------------------------------------------------------------

// The server that a change of membership is about. Texts are zero-terminated.
struct __tag_ZELO_QRM_SERVER_INFO__ {
    long lPort;             // the server's port
    char szHost[1024];      // its name or address
    char szProtocol[1024];  // "https", "http" or "fld"
    char szSn[128];         // the serial number recorded with the server's credential
    int iRejoin;            // 1: the appliance leaves in order to join again
    int iFrom;              // 1: the admin center application asked for the change
    bool blClearGluster;    // the caller's request, passed on
};

// A plug-in that is made ready. Its owner is the caller, for the length of one change.
struct __tag_qrmclient_plugin_env__ {
    int nResult;  // told to the plug-in as RESULT; the caller sets it before an action
    const __tag_ZELO_QRM_SERVER_INFO__ *pServerInfo;  // not owned; valid until the release
    YLIBPLUGIN *pHandle;  // the platform's; null while no plug-in is ready
};

// Makes a plug-in of the family "qrm_client" ready: nResult becomes 0. No program runs yet.
//
// pstEnvVar: the caller's, filled in here; call ZELOQRMClientPluginExit for it in either case.
// szPlugin: the plug-in, such as "qrm_client/disjoin".
// pServerInfo: what the programs are told; the caller's, it has to live until the release.
//
// Returns 0 on success, -1 with a log line on failure; a null argument sets the platform's last
// error to 0x0D00.
ZELOQRM_API int ZELOQRMClientPluginInit(__tag_qrmclient_plugin_env__ *pstEnvVar,
                                        const char *szPlugin,
                                        const __tag_ZELO_QRM_SERVER_INFO__ *pServerInfo);

// Runs an action in the caller's thread with the arguments RESULT, HOST, PROTOCOL, PORT, SN,
// REJOIN, FROM and CLEAR_GLUSTER, each cut to 31 bytes, never inside a UTF-8 character. It waits
// for each program, which has the platform's time limit.
//
// action: SDK_PLUGIN_ACTION_PRE before the change, SDK_PLUGIN_ACTION_POST after it.
// pstEnvVar: made ready by ZELOQRMClientPluginInit.
//
// Returns the platform's result, negative when a plug-in failed; -1 when the action could not be
// prepared, without a log line unless the server info is missing.
ZELOQRM_API int ZELOQRMClientPlugin(_tag_sdk_plugin_action_ action,
                                    __tag_qrmclient_plugin_env__ *pstEnvVar);

// Releases the plug-in. One that is not ready is no error.
//
// pstEnvVar: what ZELOQRMClientPluginInit was given; its pHandle becomes null.
//
// Returns 0; -1 with a log line for a null argument.
ZELOQRM_API int ZELOQRMClientPluginExit(__tag_qrmclient_plugin_env__ *pstEnvVar);

// ------------------------------------------------------------------------------------------------
// Service account
// ------------------------------------------------------------------------------------------------

// Creates the local administrator "ZelonixQRM" (uid 50000, gid 100), or gives the one that exists a
// new password and its other fields again; adds it to "administrators", and then hides its welcome
// pages, creates "/usr/zelo/etc/QRM/" (mode 0755) and reloads the service of type 8. When it is an
// administrator already, the account alone is refreshed.
//
// Returns true on success, false with a log line otherwise; an account that was saved by then
// stays.
//
// The password, 101 characters, comes from rand() and is kept nowhere. The generator is the
// caller's to seed: call srand() with a number from the kernel's generator before. It is no
// stronger than that seed, 32 bits. rand() is shared by the process's threads.
//
// Files: the platform's account files, under the system's lock, which is waited for; the new
// account's preferences; "/usr/zelo/etc/QRM/".
ZELOQRM_API bool ZELOQRMClientCreateServerUser(void);

// Deletes the account, holding "/tmp/userlock", then reloads the service of type 8 and removes
// "/usr/zelo/etc/QRM/" with all that is in it.
//
// Returns true on success, and at once when there is no such account (the directory is then left
// alone); false with a log line otherwise, also when the accounts cannot be read. The lock is
// waited for, 30 s at most.
//
// Files: the platform's account files; "/tmp/userlock"; "/usr/zelo/etc/QRM/".
ZELOQRM_API bool ZELOQRMClientDeleteServerUser(void);

// Shows or hides a user's welcome pages: sets "welcome_nvo40_hide" and "welcome_nvo50_hide" of
// "ZELO.PKV.App.WelcomeApp.Instance" in the file "usersettings" of the user's preference directory.
// Everything else in that file stays. One that is no JSON object is replaced, and so is one beyond
// what is read: 64 MiB, 1000 levels, two million values, numbers that a double holds.
//
// szUser: the user's name.
// blShow: true shows the pages, false hides them.
//
// The file keeps its mode, and its owner as far as the process may give files away.
//
// Returns true when the file has been replaced; false with a log line, and the file as it was,
// otherwise. A reader sees the old file or the new one. Calls for one user take turns: each waits
// up to 10 s for its own, and then holds the file "usersettings.tmp" beside the settings, so that
// none undoes another's change. That file stays only where it cannot take the settings' place, and
// keeps no later call waiting.
ZELOQRM_API bool ZELOQRMUserWelcomPage(const char *szUser, bool blShow);

// ------------------------------------------------------------------------------------------------
// Log
// ------------------------------------------------------------------------------------------------

// A level of log entries.
struct QRMCLIENT_LOG_LEVEL {
    int level;         // a syslog severity, 0 the most severe; negative only in the last entry
    std::string name;  // what the server calls it, such as "warning"
};

// The eight levels, "emerg" (0) to "debug" (7), and an entry with level -1 and an empty name that
// ends a scan. Filled when the library is loaded, never changed; any thread may read it.
extern ZELOQRM_API const QRMCLIENT_LOG_LEVEL gZELOQRMClientLogLevelTable[9];

// The name of a level. Never fails, logs nothing.
//
// level: 0 to 7.
//
// Returns its name; "info" for any other number.
ZELOQRM_API std::string ZELOQRMClientLogLevelIntToStr(int level);

// The level of a name. Never fails, logs nothing.
//
// name: compared exactly.
//
// Returns 0 to 7; 6 for any other name.
ZELOQRM_API int ZELOQRMClientLogLevelStrToInt(const std::string &name);

// Pushes an entry to the server's log: "push" of "ZELO.QRM.RPC.Log", with the time, the level's
// name, the host name (cut to 63 characters) and the message in every language of the interface.
//
// level: 0 to 7; any other is sent as "info".
// szSection, szKey: the message in the interface strings files; without a section (null) szKey is
// the message itself. szKey is required.
// pslParams: what fills the message's markers "{0}", "{1}" and so on, see ConvertLog; null for
// none. The list stays the caller's.
// szExtraInfo: sent as "extra_info"; null for none.
//
// Returns 0 when the server has confirmed the entry ("success" is boolean true), else -1 with a log
// line. Nothing is tried again or kept. Calls take turns with ZELOQRMClientSendWebapi and do what
// it does. Files read: "/usr/zelo/zeloman/webman/texts/<language>/strings".
ZELOQRM_API int ZELOQRMClientLog(int level, const char *szSection, const char *szKey,
                                 YLIBSZLIST *pslParams, const char *szExtraInfo);

// The same with up to three texts for the markers, and without "extra_info".
//
// level, szSection, szKey: as above.
// szParam1, szParam2, szParam3: what fills the markers; a null one is left out.
//
// Returns what the one above returns.
ZELOQRM_API int ZELOQRMClientLog(int level, const char *szSection, const char *szKey,
                                 const char *szParam1, const char *szParam2, const char *szParam3);

// Renders a message in the twenty languages of the interface.
//
// szSection, szKey: the message in the interface strings files; without a section (null) szKey is
// the message itself.
// pslParams: what fills the message's markers; null for none. The list stays the caller's.
// out: null or an object; receives one text for each language code, "chs" to "trk". A language
// whose strings file does not have the message gets the English one, parameters included.
//
// A parameter may name interface texts, as "{section:key}" or "_T(section,key)" (trimmed of blanks
// and quotes); what names no text is replaced by its key. Texts are cut to 4095 bytes, values to
// 1023, never inside a UTF-8 character. A marker that stands in a message twice is filled twice;
// one without a parameter stays.
//
// Returns 0 on success; -1, with the languages done by then in out, when the message is in neither
// file, szKey is null or memory is short. May be called in any number of threads.
ZELOQRM_API int ConvertLog(const char *szSection, const char *szKey, YLIBSZLIST *pslParams,
                           Json::Value &out);

// Writes a text of a list to a buffer, its references expanded from a strings file. What a text
// brings in is expanded too, the first form before the second; at most 1,024 replacements of each
// form are made, so that texts that name each other come to an end. A replacement that changes
// nothing, such as one that does not fit, ends the expansion of its form. Any thread may call it.
//
// pslParams, index: the list, which stays the caller's, and which of its texts.
// szStringsFile: the path of the strings file.
// szOut, cbOut: the buffer, and its size in bytes; the text is cut to fit and zero-terminated.
ZELOQRM_API void ParamGet(YLIBSZLIST *pslParams, int index, const char *szStringsFile, char *szOut,
                          int cbOut);

// Finds the first reference of the form "{section:key}" in a text.
//
// szText: the text.
// szSection, szKey: receive its parts.
// limit: the size of each of the buffers in bytes.
//
// Returns 0 when there is one; -1 when the text from the first "{" on is no reference that fits. A
// null buffer is logged.
ZELOQRM_API int CheckSectionKey_tpl1(const char *szText, char *szSection, char *szKey, int limit);

// Finds the first reference of the form "_T(section,key)" in a text.
//
// szText: the text.
// szSection, szKey: receive its parts, without the blanks and quotes around them.
// szToken: receives the whole reference.
// limit: the size of each of the buffers in bytes.
//
// Returns 0 when there is one; -1 when the text from the first "_T(" on is no reference that fits.
// A token that does not fit, and a null buffer, are logged.
ZELOQRM_API int CheckSectionKey_tpl2(const char *szText, char *szSection, char *szKey,
                                     char *szToken, int limit);

// ------------------------------------------------------------------------------------------------
// Disk idle time
// ------------------------------------------------------------------------------------------------

// Reads the disks' idle time in minutes for a process that is going to change it, and records it
// under the process's id in "/tmp/qrm_idle_time". While a process that has recorded a time lives,
// every later reader gets that time, not the one now in force. Records of processes that have ended
// go when they are met; a process id that the system uses again cannot be told apart.
//
// idleTime: receives the minutes; 0: the disks never sleep. On failure it may hold them already.
//
// Returns 0 on success, -1 with a log line otherwise. Holds "/tmp/qrm_idle_time.lock", waiting for
// it at most 30 s.
ZELOQRM_API int ZELOQRMIdleTimeGet(unsigned long &idleTime);

// Sets the disks' idle time and drops the caller's record of "/tmp/qrm_idle_time", under the same
// lock. When the record cannot be removed the idle time is not changed.
//
// idleTime: minutes; 0: the disks never sleep.
//
// Returns 0 on success, -1 with a log line otherwise.
ZELOQRM_API int ZELOQRMIdleTimeSet(unsigned long idleTime);

#endif
