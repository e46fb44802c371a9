// What ends an exchange with a server, or a relay, that goes on and on.

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <string>
#include <thread>

#include "diagnosis.h"
#include "files.h"
#include "last_error.h"
#include "web_api_request.h"

namespace {

using namespace files;
using Clock = std::chrono::steady_clock;

// Answers one request with a beginning, and then with the same piece again and again.
class EndlessServer {
  public:
    EndlessServer(std::string strBegin, std::string strPiece, std::chrono::milliseconds pause)
        : m_listener(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in own = {};
        own.sin_family = AF_INET;
        own.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t cb = sizeof(own);
        EXPECT_EQ(bind(m_listener, reinterpret_cast<sockaddr *>(&own), cb), 0);
        EXPECT_EQ(listen(m_listener, 4), 0);
        getsockname(m_listener, reinterpret_cast<sockaddr *>(&own), &cb);
        m_port = ntohs(own.sin_port);
        m_thread = std::thread([this, strBegin, strPiece, pause] {
            const int fd = accept4(m_listener, nullptr, nullptr, SOCK_CLOEXEC);
            char request[4096];
            static_cast<void>(recv(fd, request, sizeof(request), 0));
            bool blTaken = Send(fd, strBegin);
            while (blTaken && !m_blOver) {
                std::this_thread::sleep_for(pause);
                blTaken = Send(fd, strPiece);
            }
            close(fd);
        });
    }
    ~EndlessServer() {
        m_blOver = true;
        shutdown(m_listener, SHUT_RDWR);
        m_thread.join();
        close(m_listener);
    }
    EndlessServer(const EndlessServer &) = delete;
    EndlessServer &operator=(const EndlessServer &) = delete;
    int Port() const { return m_port; }

  private:
    static bool Send(int fd, const std::string &strText) {
        return send(fd, strText.data(), strText.size(), MSG_NOSIGNAL) ==
               static_cast<ssize_t>(strText.size());
    }
    int m_listener;
    int m_port = 0;
    std::atomic<bool> m_blOver{false};
    std::thread m_thread;
};

struct Row {
    const char *szWhat;
    bool blRelay;  // the relay answers so to CONNECT; else a server to a request
    std::string strBegin;
    std::string strPiece;
};

std::vector<Row> Rows() {
    const std::string strHeader = "X-Filler: " + std::string(80, 'x') + "\r\n";
    const std::string strChunk = "400\r\n" + std::string(1024, 'x') + "\r\n";
    const std::string strChunked = "Transfer-Encoding: chunked\r\n\r\n";
    const std::string strHint = "HTTP/1.1 103 Early Hints\r\n" + strHeader + "\r\n";
    return {
        {"a relay's headers", true, "HTTP/1.1 200 OK\r\n", strHeader},
        {"a relay's chunks", true, "HTTP/1.1 407 No\r\n" + strChunked, strChunk},
        {"a relay's body", true, "HTTP/1.1 407 No\r\nContent-Length: 99999999999\r\n\r\n",
         strChunk},
        {"headers", false, "HTTP/1.1 200 OK\r\n", strHeader},
        {"hints", false, "", strHint},
        {"trailers", false, "HTTP/1.1 200 OK\r\n" + strChunked + "0\r\n", strHeader},
    };
}

bool Ask(const Row &row, std::chrono::milliseconds pause, Clock::duration &duration) {
    const EndlessServer server(row.strBegin, row.strPiece, pause);
    Replace(kConfig, "farlink_relay=\"127.0.0.1:" + std::to_string(server.Port()) + "\"\n");
    ZELO::Look look;
    look.strProtocol = row.blRelay ? "fld" : "http";
    look.strHost = "127.0.0.1";
    look.port = server.Port();
    ZELO::Exchange exchange;
    const Clock::time_point begin = Clock::now();
    const bool blWhole = ZELO::LookAtServer(look, exchange, nullptr);
    duration = Clock::now() - begin;
    return blWhole;
}

long PeakMemory_KiB() {
    rusage usage = {};
    getrusage(RUSAGE_SELF, &usage);
    return usage.ru_maxrss;
}

TEST(ExchangeLimits, WhatComesBesidesTheBodyIsBounded) {
    for (const Row &row : Rows()) {
        SCOPED_TRACE(row.szWhat);
        const long before_KiB = PeakMemory_KiB();
        Clock::duration duration{};
        EXPECT_FALSE(Ask(row, std::chrono::milliseconds(0), duration));
        EXPECT_LT(duration, std::chrono::seconds(20));
        EXPECT_LT(PeakMemory_KiB() - before_KiB, 20 * 1024);
        EXPECT_EQ(YLIBCErrGet(), unsigned{YLIBC_ERR_REPLY});
        EXPECT_EQ(ZELO::LatestExchange().error, ZELO::CRED_REQ_ERR_REPLY);
        EXPECT_NE(ZELO::LatestExchange().strWords.find("300 KB"), std::string::npos)
            << ZELO::LatestExchange().strWords;
    }
}

TEST(ExchangeLimits, TheDeadlineHoldsWhateverArrives) {
    std::vector<Row> rows = Rows();
    rows.push_back({"silence", false, "", ""});
    rows.push_back({"a relay's silence", true, "", ""});
    rows.push_back({"a body", false, "HTTP/1.1 200 OK\r\n\r\n", "x"});
    for (const Row &row : rows) {
        SCOPED_TRACE(row.szWhat);
        ZELODeadlineSet(300);
        Clock::duration duration{};
        EXPECT_FALSE(Ask(row, std::chrono::milliseconds(10), duration));
        EXPECT_LT(duration, std::chrono::seconds(1));
        EXPECT_EQ(YLIBCErrGet(), unsigned{YLIBC_ERR_DEADLINE});
        EXPECT_NE(ZELO::LatestExchange().strWords.find("the reply of 127.0.0.1:"),
                  std::string::npos)
            << ZELO::LatestExchange().strWords;
    }
    ZELODeadlineSet(-1);
}

TEST(ExchangeLimits, ALimitThatEndsALookIsTold) {
    const EndlessServer server("", "", std::chrono::milliseconds(10));
    ZELO::Look look;
    look.strProtocol = "http";
    look.strHost = "127.0.0.1";
    look.port = server.Port();
    look.limit_ms = 300;
    ZELO::Exchange exchange;
    EXPECT_FALSE(ZELO::LookAtServer(look, exchange, nullptr));
    EXPECT_TRUE(exchange.blTimedOut) << exchange.strWords;
    EXPECT_EQ(exchange.code, unsigned{YLIBC_ERR_NETWORK});
}

TEST(ExchangeLimits, TheObserverOfWaitsIsCalledMeanwhile) {
    int calls = 0;
    ZELOWaitObserverSet(
        [](void *pCalls, const char *szWaitsFor, double /*waited_s*/) {
            *static_cast<int *>(pCalls) +=
                std::string(szWaitsFor).rfind("the reply of 127.0.0.1:", 0) == 0 ? 1 : 0;
        },
        &calls);
    ZELODeadlineSet(2500);
    Clock::duration duration{};
    EXPECT_FALSE(Ask({"silence", false, "", ""}, std::chrono::milliseconds(50), duration));
    ZELODeadlineSet(-1);
    ZELOWaitObserverSet(nullptr, nullptr);
    EXPECT_GE(calls, 2);
}

}  // namespace
