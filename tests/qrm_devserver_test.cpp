// qrm-devserver as a program: what it says about itself, and how it ends.

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "json_text.h"
#include "run_program.h"

namespace {

using run_program::Outcome;
using Arguments = std::vector<std::string>;

class QrmDevserver : public testing::Test {
  protected:
    void SetUp() override {
        std::filesystem::current_path("/tmp");
        std::ofstream("token") << "s3cret\r\n";
        std::ofstream("two") << "one\ntwo\n";
        std::ofstream("empty") << "";
    }
};

TEST_F(QrmDevserver, ServesWhatItsFilesNameUntilItIsToldToEnd) {
    for (int signal : {SIGTERM, SIGINT}) {
        run_program::Program server({DEVSERVER, "--token-file", "token", "--ports-file", "ports",
                                     "--ca-file", "/usr/zelo/etc/ssl/ca.d/devserver.pem"});
        ASSERT_TRUE(run_program::Until([] { return std::filesystem::exists("ports"); }));
        std::string strPorts;
        std::getline(std::ifstream("ports"), strPorts);
        Json::Value ports;
        ASSERT_TRUE(json_text::FromString(strPorts, ports));
        const std::string strHttp = ports["http_port"].asString();
        const std::string strHttps = ports["https_port"].asString();

        const Outcome joined =
            run_program::Run({QRMCTL, "join", "-v", "--server", "localhost", "--http-port", "0",
                              "--https-port", strHttps, "--token-file", "token"});
        EXPECT_EQ(joined.status, 0) << joined.strErr;
        EXPECT_EQ(run_program::Run({QRMCTL, "leave"}).status, 0);
        const Outcome second =
            run_program::Run({DEVSERVER, "--token-file", "token", "--http-port", strHttp});
        EXPECT_EQ(second.status, 1);
        EXPECT_NE(second.strErr.find("port " + strHttp), std::string::npos) << second.strErr;
        const Outcome third =
            run_program::Run({DEVSERVER, "--token-file", "token", "--ports-file", "ports"});
        EXPECT_EQ(third.status, 1);
        EXPECT_NE(third.strErr.find("'ports'"), std::string::npos) << third.strErr;

        EXPECT_TRUE(std::filesystem::exists("ports"));
        server.Signal(signal);
        const Outcome outcome = server.Wait();
        EXPECT_EQ(outcome.status, 0) << outcome.strErr;
        for (const std::string &strUrl :
             {"http://127.0.0.1:" + strHttp, "s://127.0.0.1:" + strHttps}) {
            EXPECT_NE(outcome.strOut.find(strUrl), std::string::npos) << outcome.strOut;
        }
        EXPECT_FALSE(std::filesystem::exists("ports"));
    }
}

TEST_F(QrmDevserver, RemovesThePortsOfAKilledServerBeforeItListens) {
    run_program::Program killed({DEVSERVER, "--token-file", "token", "--ports-file", "ports"});
    ASSERT_TRUE(run_program::Until([] { return std::filesystem::exists("ports"); }));
    killed.Signal(SIGKILL);
    killed.Wait();
    ASSERT_TRUE(std::filesystem::exists("ports"));

    // This one never gets as far as listening.
    const Outcome next =
        run_program::Run({DEVSERVER, "--token-file", "missing", "--ports-file", "ports"});
    EXPECT_EQ(next.status, 1);
    EXPECT_FALSE(std::filesystem::exists("ports"));
}

TEST_F(QrmDevserver, SaysWhatItCannotUse) {
    const struct {
        int status;
        Arguments arguments;
        const char *szNamed;
    } rows[] = {
        {2, {DEVSERVER}, "--token-file"},
        {2, {DEVSERVER, "--token-file", "token", "surplus"}, "surplus"},
        {2, {DEVSERVER, "--token-file", "token", "--http-port", "65536"}, "65536"},
        {2, {DEVSERVER, "--token-file", "token", "--host", "192.0.2.1"}, "'192.0.2.1' is no"},
        {1, {DEVSERVER, "--token-file", "missing"}, "'missing'"},
        {1, {DEVSERVER, "--token-file", "empty"}, "'empty'"},
        {1, {DEVSERVER, "--token-file", "two"}, "one line"},
        {1, {DEVSERVER, "--token-file", "token", "--ports-file", "no/ports"}, "'no/ports'"},
        {1, {DEVSERVER, "--token-file", "token", "--ca-file", "no/ca"}, "'no/ca'"},
    };
    for (const auto &row : rows) {
        const Outcome outcome = run_program::Run(row.arguments);
        EXPECT_EQ(outcome.status, row.status) << outcome.strErr;
        EXPECT_EQ(outcome.strOut, "");
        EXPECT_EQ(outcome.strErr.rfind("qrm-devserver: ", 0), 0U) << outcome.strErr;
        EXPECT_NE(outcome.strErr.find(row.szNamed), std::string::npos) << outcome.strErr;
    }
}

}  // namespace
