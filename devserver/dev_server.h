// A QRM server for development and tests: it speaks the wire protocol (docs/wire-protocol.md) over
// HTTP and HTTPS on loopback, shows what it was asked, and answers with faults on demand.
//
// Everything is kept in memory. All operations but Start and Stop may be called in any thread.

#ifndef ZELO_DEV_SERVER_H
#define ZELO_DEV_SERVER_H

#include <json/value.h>

#include <condition_variable>
#include <deque>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "dev_certificate.h"
#include "log_entries.h"
#include "loopback_listener.h"
#include "next_answer.h"
#include "reply.h"

namespace devserver {

struct Options {
    std::string token;               // the access token that "join" has to bring
    std::string host = "127.0.0.1";  // a loopback address
    int http_port = 0;               // 0 chooses a free port
    int https_port = 0;
    CertificateRequest certificate;
};

class DevServer {
  public:
    explicit DevServer(Options options) : m_options(std::move(options)) {}
    ~DevServer() { Stop(); }
    DevServer(const DevServer &) = delete;
    DevServer &operator=(const DevServer &) = delete;

    // Listens and serves in threads of its own until Stop. Returns false, and says why in one line,
    // when a certificate cannot be made or a port cannot be had; nothing listens then. To be called
    // once.
    bool Start(std::string &strReason);

    // Ends every connection, also one that is idle or whose answer is delayed, and returns when no
    // thread is left. A second call does nothing.
    void Stop();

    // The ports that are listened on, after Start.
    int HttpPort() const { return m_http.Port(); }
    int HttpsPort() const { return m_https.Port(); }

    // The certificate of the authority that issued the server's, as PEM text, after Start.
    const std::string &CaPem() const { return m_authority.Pem(); }

    // Queues an answer for the API, known or not. A request takes the first one in the queue that
    // fits it.
    void AnswerNext(const std::string &strApi, const NextAnswer &answer);
    void ForgetAnswers();

    // Every protocol request so far, the oldest first, as GET /dev/requests shows them.
    Json::Value Requests() const;
    void ForgetRequests();

    // The clients that joined, as GET /dev/clients shows them.
    Json::Value Clients() const;

    // The newest log entries that clients pushed, as GET /dev/log shows them.
    Json::Value Log() const;

  private:
    struct Call;
    struct Route {
        const char *szApi;
        int version;
        const char *szPath;
        const char *szMethod;
        bool blNeedsToken;
        Reply (DevServer::*Carry)(const Json::Value &params);
    };
    static const Route kRoutes[];

    Reply Join(const Json::Value &params);
    Reply Info(const Json::Value &params);
    Reply Update(const Json::Value &params);
    Reply File(const Json::Value &params);
    Reply Push(const Json::Value &params);
    Json::Value *FindClient(const Json::Value &sn, int &id);

    void Handle(const char *szScheme, const httplib::Request &request, httplib::Response &response);
    Reply HandleDevelopment(const httplib::Request &request);
    Reply HandleOrdinarily(const Call &call);
    Reply CarryOut(const Call &call);
    void Record(const char *szScheme, const httplib::Request &request, const Call &call);
    std::optional<NextAnswer> TakeAnswer(const Call &call);
    bool Delay(int delay_ms);

    const Options m_options;
    CertificateAuthority m_authority;

    mutable std::mutex m_mutex;  // guards the members up to the listeners
    std::condition_variable m_ending;
    bool m_blEnding = false;
    std::deque<Json::Value> m_requests;
    std::deque<std::pair<std::string, NextAnswer>> m_answers;  // with the API that each is for
    std::vector<Json::Value> m_descriptions;  // of the clients; number n stands at n - 1
    LogEntries m_log;

    // Last, so that their threads end before what they use.
    LoopbackListener m_http;
    LoopbackListener m_https;
};

}  // namespace devserver

#endif
