// What a Web API request promises about the wire: whom it trusts, where it goes, when it gives up.

#include <gtest/gtest.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <climits>
#include <cstdlib>
#include <memory>
#include <set>
#include <thread>

#include "children.h"
#include "dev_server_process.h"
#include "diagnosis.h"
#include "files.h"
#include "last_error.h"
#include "run_program.h"
#include "web_api_request.h"

namespace {

using namespace files;

constexpr const char *kApi = "ZELO.QRM.RPC";
constexpr const char *kOtherCaFile = "/usr/zelo/etc/ssl/ca.d/other.pem";

using Cred = std::unique_ptr<ZELO_CRED, void (*)(ZELO_CRED *)>;

Cred ServerAt(const char *szProtocol, int port, const char *szHost = "localhost") {
    Cred pCred(ZELOCredAlloc(), ZELOCredFree);
    ZELOCredItemSetProtocol(pCred.get(), szProtocol);
    ZELOCredItemSetHost(pCred.get(), szHost);
    ZELOCredItemSetPort(pCred.get(), port);
    return pCred;
}

std::string PathOf(const char *szProtocol, int port, const char *szHost = "localhost") {
    return ZELO::CredRequestUtil::GetWebAPIPath(ServerAt(szProtocol, port, szHost).get(), kApi);
}

// Whether the server has ended a connection that this process keeps.
bool HasEnded(int port) {
    for (int fd = 3; fd < 64; ++fd) {
        sockaddr_in peer = {};
        socklen_t cb = sizeof(peer);
        pollfd look = {fd, POLLIN, 0};
        if (getpeername(fd, reinterpret_cast<sockaddr *>(&peer), &cb) == 0 &&
            ntohs(peer.sin_port) == port && poll(&look, 1, 0) == 1) {
            return true;
        }
    }
    return false;
}

class Request : public testing::Test {
  protected:
    void SetUp() override {
        Start(devserver::Options());
        Replace(kCaFile, m_pServer->CaPem());
        Replace(kConfig, "");
    }
    void Start(const devserver::Options &options) {
        m_pServer = std::make_unique<DevServerProcess>(options);
        m_pServer->Start();
    }
    // The connections that the server saw, without repeating.
    std::set<std::string> Connections() const {
        std::set<std::string> connections;
        for (const Json::Value &request : m_pServer->Requests()) {
            connections.insert(request["connection"].asString());
        }
        return connections;
    }
    int Port(const std::string &strProtocol) const {
        return strProtocol == "https" ? m_pServer->HttpsPort() : m_pServer->HttpPort();
    }
    std::string Path(const char *szProtocol) const { return PathOf(szProtocol, Port(szProtocol)); }
    std::string Https() const { return Path("https"); }
    std::string Http() const { return Path("http"); }
    // A call that the server answers as it is told to; whether it got a reply.
    bool Call(const char *szProtocol, devserver::NextAnswer answer) {
        const Cred pCred = ServerAt(szProtocol, Port(szProtocol));
        ZELO::CredRequest request;
        EXPECT_TRUE(ZELO::CredRequestUtil::SetWebAPIURL(pCred.get(), kApi, 1, "join", &request));
        answer.method = "join";
        m_pServer->AnswerNext(kApi, answer);
        return request.Process(true, 0);
    }
    void AnswerDiscovery(devserver::NextAnswer answer) {
        answer.method = "discover";
        m_pServer->AnswerNext(kApi, answer);
    }

    std::unique_ptr<DevServerProcess> m_pServer;
};

TEST_F(Request, OnlyAVerifiedServerIsSpokenTo) {
    EXPECT_EQ(Https(), "/qrm/rpc");
    EXPECT_EQ(PathOf("https", m_pServer->HttpsPort(), "127.0.0.1"), "/qrm/rpc");

    // A child process has to connect anew.
    const auto isTrusted = [&] { return children::InOne([&] { return Https() == "/qrm/rpc"; }); };
    fs::remove(kCaFile);
    EXPECT_FALSE(isTrusted());
    Replace(kCaFile, m_pServer->CaPem());
    EXPECT_TRUE(isTrusted());
    Replace(kCaFile, "no certificate");
    EXPECT_FALSE(isTrusted());
    Replace(kCaFile, m_pServer->CaPem());
    Replace(kOtherCaFile, "no certificate");
    EXPECT_FALSE(isTrusted());
    fs::remove(kOtherCaFile);
    EXPECT_TRUE(isTrusted());

    devserver::Options expired;
    expired.certificate.not_after = std::time(nullptr) - 60;
    devserver::Options otherName;
    otherName.certificate.names = {"other.example"};
    for (const devserver::Options &options : {expired, otherName}) {
        Start(options);
        Replace(kCaFile, m_pServer->CaPem());
        EXPECT_FALSE(isTrusted());
        EXPECT_TRUE(m_pServer->Requests().empty());
    }
}

TEST_F(Request, OnlyKnownProtocolsAndPlainHostsAreUsed) {
    const std::tuple<const char *, const char *, bool> rows[] = {
        {"http", "localhost", true},       {"ftp", "localhost", false},
        {"file", "localhost", false},      {"HTTP", "localhost", false},
        {"", "localhost", false},          {"http", "", false},
        {"http", "user@localhost", false}, {"http", "localhost/qrm", false},
        {"http", "localhost?x", false},    {"http", "localhost\r\nX: y", false},
        {"http", "localhost:80", false},   {"fld", "localhost", false},
    };
    for (const auto &[szProtocol, szHost, blAnswers] : rows) {
        EXPECT_EQ(!PathOf(szProtocol, m_pServer->HttpPort(), szHost).empty(), blAnswers)
            << szProtocol << ' ' << szHost;
    }
    EXPECT_EQ(PathOf("http", 0), "");
    EXPECT_EQ(PathOf("http", 65536), "");
    for (int port : {-1, 0, 65535, 65536}) {
        EXPECT_EQ(ZELO::APIValidator::IsPort(port), port == 0 || port == 65535) << port;
    }
}

TEST_F(Request, AnAddressOfIPv6IsAHostToo) {
    if (std::ifstream("/proc/net/if_inet6").peek() == std::ifstream::traits_type::eof()) {
        GTEST_SKIP() << "this machine has no IPv6";
    }
    devserver::Options options;
    options.host = "::1";
    Start(options);
    Replace(kCaFile, m_pServer->CaPem());
    for (const char *szHost : {"::1", "[::1]"}) {
        EXPECT_EQ(PathOf("https", m_pServer->HttpsPort(), szHost), "/qrm/rpc") << szHost;
        ZELO::CredRequest request;
        const Cred pCred = ServerAt("https", m_pServer->HttpsPort(), szHost);
        EXPECT_TRUE(ZELO::CredRequestUtil::SetWebAPIURL(pCred.get(), kApi, 1, "info", &request));
        EXPECT_EQ(request.GetURL(),
                  "https://[::1]:" + std::to_string(m_pServer->HttpsPort()) + "/qrm/rpc");
        EXPECT_TRUE(request.Process(true, 0)) << szHost;
    }
}

TEST_F(Request, ProxyVariablesCountOnlyWhereTheConfigurationSaysSo) {
    for (const char *szName :
         {"http_proxy", "https_proxy", "HTTPS_PROXY", "all_proxy", "ALL_PROXY"}) {
        SCOPED_TRACE(szName);
        const char *szProtocol = szName == std::string("http_proxy") ? "http" : "https";
        setenv(szName, "http://127.0.0.1:1", 1);
        Replace(kConfig, "use_proxy_environment=no\n");
        EXPECT_EQ(Path(szProtocol), "/qrm/rpc");
        Replace(kConfig, "use_proxy_environment=yes\n");
        EXPECT_EQ(Path(szProtocol), "");
        unsetenv(szName);
    }
    Replace(kConfig, "farlink_relay=\"127.0.0.1:1\"\n");
    EXPECT_EQ(PathOf("fld", m_pServer->HttpsPort()), "");
}

TEST_F(Request, UnusableAnswersCountAsNone) {
    const auto body = [](const std::string &strBody, int status = 200) {
        devserver::NextAnswer answer;
        answer.status = status;
        answer.body = strBody;
        return answer;
    };
    const auto path = [&](const std::string &strPath) {
        return body(R"({"success":true,"data":{"path":")" + strPath + "\"}}");
    };
    devserver::NextAnswer redirect = body("", 302);
    redirect.headers["Location"] = "/qrm/discover?api=ZELO.QRM.RPC";
    devserver::NextAnswer cut;
    cut.cut_after = 5;
    devserver::NextAnswer endless;
    endless.endless = true;
    devserver::NextAnswer encoded;
    encoded.headers["Content-Encoding"] = "gzip";
    for (const devserver::NextAnswer &answer :
         {body("<html>"), body(""), body("[]"), body("7"), body(R"({"success":"yes"})"),
          body(R"({"success":true,"data":[]})"), body(R"({"success":true,"data":{"path":1}})"),
          path("relative"), path(""), path("/a b"), path("/a?b"), path("/a\\r\\nX: y"),
          path("/" + std::string(2000, 'a')), endless,
          body(std::string(2000, '[') + std::string(2000, ']')),
          body(R"({"success":true,"data":{"path":"/x"}})", 500), redirect, cut, encoded}) {
        AnswerDiscovery(answer);
        EXPECT_EQ(Http(), "") << answer.body.value_or("").substr(0, 60);
    }
    encoded.headers["Content-Encoding"] = "identity";
    AnswerDiscovery(encoded);
    EXPECT_EQ(Http(), "/qrm/rpc");
    EXPECT_EQ(m_pServer->Requests()[0]["headers"]["Accept-Encoding"], "identity");
}

// Without a length a body ends with its connection. Over TLS that has to be announced.
TEST_F(Request, ACutReplyIsNoReply) {
    devserver::NextAnswer answer;
    answer.no_length = true;
    for (const bool blCut : {false, true}) {
        if (blCut) {
            answer.body = R"({"success":true,"data":{"path":"/x"}})";
            answer.cut_after = answer.body->size();
        }
        AnswerDiscovery(answer);
        EXPECT_EQ(Https(), blCut ? "" : "/qrm/rpc");
        AnswerDiscovery(answer);
        EXPECT_EQ(Http(), blCut ? "/x" : "/qrm/rpc") << "TCP alone does not tell them apart";
    }
}

TEST_F(Request, ACallIsSentOnceAndSurvivesEveryIdlePause) {
    devserver::NextAnswer closes;
    closes.status = 200;
    closes.body = "{}";
    closes.closes = true;
    devserver::NextAnswer drops;
    drops.no_reply = true;
    constexpr int kPauses = 8;  // libcurl's own count of repetitions ends before
    for (const char *szProtocol : {"https", "http"}) {
        SCOPED_TRACE(szProtocol);
        for (int i = 0; i < kPauses; ++i) {
            EXPECT_TRUE(Call(szProtocol, closes));
            EXPECT_TRUE(run_program::Until([&] { return HasEnded(Port(szProtocol)); }));
        }
        EXPECT_EQ(Path(szProtocol), "/qrm/rpc");
        for (int i = 0; i < kPauses; ++i) {
            AnswerDiscovery(drops);
            EXPECT_EQ(Path(szProtocol), "/qrm/rpc") << "only a question, asked again";
        }
        m_pServer->ForgetRequests();
        EXPECT_FALSE(Call(szProtocol, drops));
        EXPECT_EQ(m_pServer->Requests().size(), 1U);
    }
}

TEST_F(Request, ConnectionsAreUsedAgainButNotByAChild) {
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(Https(), "/qrm/rpc");
    }
    EXPECT_EQ(Connections().size(), 1U);
    EXPECT_TRUE(children::InOne([&] { return Https() == "/qrm/rpc"; }));
    EXPECT_EQ(Connections().size(), 2U);
    EXPECT_EQ(Https(), "/qrm/rpc");
    EXPECT_EQ(Connections().size(), 2U) << "the parent goes on with its own connection";
}

TEST_F(Request, PathsAreLearntOnceAndForgottenWhenTheyAreGone) {
    const auto call = [&](int status) {
        devserver::NextAnswer answer;
        answer.status = status;
        EXPECT_TRUE(Call("http", answer));
    };
    call(200);
    call(404);
    EXPECT_EQ(ZELO::LatestExchange().httpStatus, 404);
    EXPECT_EQ(m_pServer->Requests().size(), 3U) << "one discovery, two calls";
    call(200);
    EXPECT_EQ(m_pServer->Requests().size(), 5U) << "asked again after the 404";
}

TEST_F(Request, TheCallersTimeLimitEndsAnExchange) {
    const Cred pCred = ServerAt("http", m_pServer->HttpPort());
    ZELO::CredRequest request;
    ASSERT_TRUE(ZELO::CredRequestUtil::SetWebAPIURL(pCred.get(), kApi, 1, "join", &request));
    devserver::NextAnswer answer;
    answer.delay_ms = 30000;
    m_pServer->AnswerNext(kApi, answer);
    EXPECT_FALSE(request.Process(true, 1));
    EXPECT_EQ(ZELO::LatestExchange().httpStatus, 0) << "none arrived";
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NETWORK));
    // The next one has its own, also one that is longer than the transport can count.
    answer.delay_ms = 1500;
    m_pServer->AnswerNext(kApi, answer);
    EXPECT_TRUE(request.Process(true, INT_MAX));
}

// What a look at the server meets, with and without trust in it.
TEST_F(Request, EachExchangeIsRecorded) {
    EXPECT_EQ(Https(), "/qrm/rpc");
    const ZELO::Exchange discovery = ZELO::LatestExchange();
    EXPECT_EQ(discovery.httpStatus, 200);
    EXPECT_EQ(discovery.strWords, "");

    fs::remove(kCaFile);
    ZELO::Look look{"https", "localhost", m_pServer->HttpsPort(), "/qrm/discover", "api=a b",
                    true,    10000};
    for (const bool blVerify : {true, false}) {
        look.blVerify = blVerify;
        std::string strBody;
        ZELO::Exchange met;
        EXPECT_EQ(ZELO::LookAtServer(look, met, &strBody), !blVerify);
        EXPECT_EQ(met.strUrl, "https://localhost:" + std::to_string(look.port) + "/qrm/discover");
        EXPECT_EQ(met.strAddress, "127.0.0.1:" + std::to_string(look.port));
        EXPECT_EQ(met.addresses.back(), met.strAddress);
        EXPECT_EQ(met.httpStatus, blVerify ? 0 : 200);
        EXPECT_EQ(met.errorCode == 0, blVerify);
        EXPECT_EQ(met.strDate.empty(), blVerify);
        EXPECT_EQ(met.code, unsigned{blVerify ? YLIBC_ERR_NETWORK : YLIBC_ERR_NONE});
        EXPECT_EQ(met.strWords.empty(), !blVerify);
        EXPECT_GE(met.connected_ms, 0);
        EXPECT_EQ(met.answered_ms >= 0, !blVerify);
        EXPECT_EQ(met.strTlsVersion, "TLSv1.3");
        EXPECT_EQ(met.certificate.verifyCode, 20) << met.certificate.strVerifyWords;
        EXPECT_TRUE(met.certificate.blNamesHost);
        EXPECT_EQ(met.certificate.strFingerprint.size(), 64U);
        EXPECT_NE(met.certificate.strChainPem.find("BEGIN CERTIFICATE"), std::string::npos);
        EXPECT_LT(met.certificate.notBefore, met.certificate.notAfter);
    }
    EXPECT_EQ(Https(), "/qrm/rpc") << "over the connection that was verified";
    EXPECT_TRUE(children::InOne([&] { return Https().empty(); })) << "a look lends no trust";

    ZELO::Exchange met;
    look.port = 1;
    EXPECT_FALSE(ZELO::LookAtServer(look, met, nullptr));
    EXPECT_GE(met.resolved_ms, 0);
    EXPECT_EQ(met.connected_ms, -1);
    look.strHost = "nowhere.invalid";
    EXPECT_FALSE(ZELO::LookAtServer(look, met, nullptr));
    EXPECT_EQ(met.resolved_ms, -1);
    look.strHost = "a b";
    EXPECT_FALSE(ZELO::LookAtServer(look, met, nullptr));
    EXPECT_EQ(met.code, unsigned{YLIBC_ERR_INVALID_ARGUMENT});
}

// It may be shown a password.
TEST_F(Request, AProxyIsVerifiedInEveryLook) {
    Replace(kConfig, "use_proxy_environment=yes\n");
    const int port = m_pServer->HttpsPort();
    const auto isSpokenTo = [&] {
        return children::InOne([port] {
            setenv("https_proxy", ("https://localhost:" + std::to_string(port)).c_str(), 1);
            ZELO::Exchange met;
            ZELO::LookAtServer({"https", "localhost", port, "/", "", false, 10000}, met, nullptr);
            return met.relayStatus != 0;
        });
    };
    EXPECT_TRUE(isSpokenTo());
    fs::remove(kCaFile);
    EXPECT_FALSE(isSpokenTo());
}

// A thread holds many a lock while it connects; its child has to connect too.
TEST_F(Request, AChildOfAFirstDiscoveryMakesItsOwn) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
    GTEST_SKIP() << "the sanitizer's own locks do not survive such a fork";
#endif
    constexpr int kRuns = 12;
    EXPECT_TRUE(children::InEach(1, [&](int) {
        for (int run = 0; run < kRuns; ++run) {
            const bool blBoth = children::InOne([&] {
                bool blOwn = false;
                std::thread discovery([&] { blOwn = Https() == "/qrm/rpc"; });
                std::this_thread::sleep_for(std::chrono::milliseconds(run));
                const bool blChild = children::InOne([&] {
                    alarm(10);
                    return Https() == "/qrm/rpc";
                });
                discovery.join();
                return blOwn && blChild;
            });
            if (!blBoth) {
                return false;
            }
        }
        return true;
    }));
}

// What the callback of a response stream has forked.
pid_t g_child = -1;

TEST_F(Request, AForkInTheMiddleOfAReplyLeavesTheConnectionToTheParent) {
    const Cred pCred = ServerAt("https", m_pServer->HttpsPort());
    ZELO::CredRequest request;
    ASSERT_TRUE(ZELO::CredRequestUtil::SetWebAPIURL(pCred.get(), kApi, 1, "join", &request));
    std::FILE *const pStream = std::tmpfile();
    devserver::NextAnswer answer;
    answer.status = 200;
    answer.body = "{}";
    m_pServer->AnswerNext(kApi, answer);
    g_child = -1;
    request.SetRespStream(pStream, [](const char *, std::size_t cb, std::FILE *) {
        g_child = fork();
        return cb;
    });
    const bool blWhole = request.Process(true, 0);
    if (g_child == 0) {
        alarm(10);
        _exit(!blWhole && Https() == "/qrm/rpc" ? 0 : 1);
    }
    EXPECT_TRUE(blWhole);
    EXPECT_TRUE(children::Ended(g_child)) << "fails, and connects anew";
    m_pServer->ForgetRequests();
    EXPECT_EQ(Https(), "/qrm/rpc");
    EXPECT_EQ(Https(), "/qrm/rpc");
    EXPECT_EQ(Connections().size(), 1U);
    std::fclose(pStream);
}

TEST_F(Request, ARequestWithoutMemorySaysSo) {
    const Cred pCred = ServerAt("http", m_pServer->HttpPort());
    EXPECT_FALSE(ZELO::CredRequestUtil::SetWebAPIURL(pCred.get(), kApi, 1, "join", nullptr));
    EXPECT_EQ(YLIBCErrGet(), unsigned{YLIBC_ERR_OUT_OF_MEMORY});
}

}  // namespace
