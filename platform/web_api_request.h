// Web API requests: how a program calls a method of a server's Web API.
//
// A server is described by a credential record (credential_store.h) with three fields set:
// protocol, host and port. The protocols are
//     "https"  HTTP over TLS; the server's certificate and name are verified as
//              certificate_authorities.h says
//     "http"   plain HTTP
//     "fld"    HTTPS through the platform's relay
// and any other value fails. A request is built, sent with Process, and read.
//
// What holds for every operation
//   - Only http and https are ever spoken, a redirect is never followed, and a token goes only to
//     the host and port of the record.
//   - A call goes out at most once. When its connection ends before the reply, the request fails,
//     and the server may have carried it out or not. The question for a path may be asked again.
//   - A reply counts when it is there to its end. One whose body ends with the connection, instead
//     of by a length or chunks, has its end announced by TLS; over plain HTTP, nothing tells that
//     it is cut. A body with an encoding fails, since none is asked for.
//   - Every exchange ends by itself: connecting has 10 s from the look-up of the name to the end of
//     the TLS handshake, for all addresses of the name together, a stalled transfer is ended, and a
//     body in memory has a largest size. One that goes to a stream may be of any size and takes as
//     long as it moves; a full disk ends it, or the observer.
//   - No operation throws, except that one which returns a std::string may throw std::bad_alloc.
//   - Connections stay open between requests of one process and are used again within about 3 s,
//     unless the server has closed them. A child process after fork makes its own. Requests may be
//     used in several threads at once, each request by one thread at a time.
//   - A failure sets the last error (last_error.h).

#ifndef ZELO_PLATFORM_WEB_API_REQUEST_H
#define ZELO_PLATFORM_WEB_API_REQUEST_H

#include <json/value.h>

#include <cstddef>
#include <cstdio>
#include <memory>
#include <string>

#include "api.h"
#include "credential_store.h"

namespace ZELO {

// How the request's parameters are protected on top of what the transport does.
enum _tag_CRED_REQ_CRYPTO {
    CRED_REQ_CRYPTO_NONE = 0,
    CRED_REQ_CRYPTO_TRANSPORT = 1,  // the transport's own protection is enough
    CRED_REQ_CRYPTO_PARAMS = 2      // the parameters are to be protected themselves
};

// Why a Process failed.
enum CRED_REQ_ERROR {
    CRED_REQ_ERR_NONE = 0,
    CRED_REQ_ERR_ARGUMENT = 1,  // the request has no URL, or its parameters cannot be written
    CRED_REQ_ERR_NETWORK = 2,   // no whole reply arrived
    CRED_REQ_ERR_REPLY = 3,     // the reply is too large, or its body is encoded
    CRED_REQ_ERR_STATUS = 4,    // a response stream was set, and the reply's HTTP status is not 2xx
    CRED_REQ_ERR_STREAM = 5,    // the response stream could not be written
    CRED_REQ_ERR_STOPPED = 6,   // the progress observer ended the transfer
    CRED_REQ_ERR_MEMORY = 7,
    // A response stream was set, and the server answers that the copy whose digest the request
    // carries as the parameter "md5" is current (HTTP status 304): nothing was written, and nothing
    // is wrong.
    CRED_REQ_ERR_UNCHANGED = 21
};

class CredRequest;

namespace CredRequestUtil {

// Asks the server that pCred describes for the path under which it serves the Web API szApi, in one
// exchange. Returns that path (it begins with "/"), or the empty string when the server cannot be
// reached, does not answer as a server of this kind, or does not know the API.
ZELO_PLATFORM_API std::string GetWebAPIPath(const ZELO_CRED *pCred, const std::string &api);

// Makes the request a call of the method of version ver of the API on the server that pCred
// describes: sets the request's URL. Returns true when it is set. A path that this process learnt
// from the same server before is used again; otherwise the server is asked as by GetWebAPIPath.
ZELO_PLATFORM_API bool SetWebAPIURL(const ZELO_CRED *pCred, const std::string &api, int ver,
                                    const std::string &method, CredRequest *pRequest);

// Called in every exchange of the thread that set it, discoveries included: about once a second or
// more often from the look-up of the name on, and at the end. Not while the response stream keeps a
// write waiting. Gets the bytes written to a response stream so far and, when the server has said
// how long the body is and it is not empty, that length, else -1. Returning false ends the exchange
// and fails it, also at the end. It must not throw.
typedef bool (*ProgressObserver)(void *pContext, long long cbWritten, long long cbExpected);

// Sets the observer of the calling thread's requests; null for none, as at the start of a thread.
ZELO_PLATFORM_API void SetProgressObserver(ProgressObserver pfnObserver, void *pContext);

}  // namespace CredRequestUtil

// One call of a Web API method.
class ZELO_PLATFORM_API CredRequest {
  public:
    // An empty request. Made with new (std::nothrow), it is null when memory is short. The creator
    // owns it.
    CredRequest() noexcept;
    ~CredRequest();
    CredRequest(const CredRequest &) = delete;
    CredRequest &operator=(const CredRequest &) = delete;

    // A call of the method of version ver of the API, authenticated by the session's tokens, on the
    // server that the credential describes; params is an object or null. The records are not needed
    // any more afterwards. The path of the API is found as by SetWebAPIURL, so this may ask the
    // server.
    //
    // Returns a new request, which the caller owns; null when the records are unusable, the server
    // does not tell a path, or memory is short.
    static CredRequest *CreateWebAPIRequest(const ZELO_CRED *pCred, const ZELO_CRED_SESS *pSess,
                                            const std::string &api, int ver,
                                            const std::string &method, const Json::Value &params);

    // The same with the credential and the session that are stored under an id.
    static CredRequest *CreateWebAPIRequest(long id, const std::string &api, int ver,
                                            const std::string &method, const Json::Value &params);

    // Adds the members of an object to the parameters of the call; a member given again replaces
    // the earlier one. Returns false when params is no object.
    bool AddPostParam(const Json::Value &params);

    // Chooses how the parameters are protected. Returns true when the mode is accepted.
    bool SetEncryptMode(_tag_CRED_REQ_CRYPTO mode);

    // Sends the request and takes the whole reply. blKeepConnection: the connection may stay open
    // for later requests. timeout_s: a limit for the whole exchange in seconds, 0 for the
    // platform's own.
    //
    // Returns true when a reply arrived, whatever its HTTP status and body; false when the request
    // has no URL or no whole reply arrived. With a response stream, a reply whose status is not 2xx
    // fails too, and so does a body that could not be written whole; GetError says which.
    bool Process(bool blKeepConnection, int timeout_s);

    // Takes the body of the next reply piece by piece. pStream is the one given to SetRespStream.
    // Returns the number of bytes taken; any other than cb fails the transfer. It must not throw.
    typedef std::size_t (*RespWriteCallback)(const char *pData, std::size_t cb, std::FILE *pStream);

    // Lets the next Process write the body of the reply straight into an open file, through
    // pfnWrite when it is not null; nothing is kept in memory and no size is too large. Only the
    // body of a reply with status 2xx is written, and the stream is flushed before Process
    // succeeds. The stream stays the caller's and must be open until then. Returns false for a null
    // stream.
    bool SetRespStream(std::FILE *pStream, RespWriteCallback pfnWrite);

    // Why the latest Process failed, a value of CRED_REQ_ERROR; CRED_REQ_ERR_NONE when it did not.
    int GetError() const;

    // The body of the reply, empty before a successful Process and when it went to a stream.
    std::string GetResponse() const;

    // The request's URL, empty before it is set.
    std::string GetURL() const;

  private:
    struct Impl;
    friend bool CredRequestUtil::SetWebAPIURL(const ZELO_CRED *pCred, const std::string &api,
                                              int ver, const std::string &method,
                                              CredRequest *pRequest);
    std::unique_ptr<Impl> m_pImpl;
};

namespace APIValidator {

// Whether a number is a port number: 0 to 65535. 0 is valid and says "this port is not used".
ZELO_PLATFORM_API bool IsPort(const int &port);

}  // namespace APIValidator
}  // namespace ZELO

#endif
