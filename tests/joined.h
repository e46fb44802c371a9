// A joined appliance for tests: a development server that is trusted, and a stored credential.

#ifndef ZELO_TESTS_JOINED_H
#define ZELO_TESTS_JOINED_H

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "dev_server_process.h"
#include "seam.h"
#include "stored.h"

namespace joined {

constexpr const char *kToken = "secret-0123456789";
constexpr const char *kMarker = "/tmp/qrmclientconnectfailed";
constexpr const char *kInfoFile = "/tmp/qrm_client.info";
constexpr const char *kJournal = "/var/log/notifications.jsonl";
constexpr const char *kCaFile = "/usr/zelo/etc/ssl/ca.d/server.pem";

inline std::string FileText(const std::string &strPath) {
    std::ifstream file(strPath);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
}

inline int CountLines(const std::string &strPath) {
    const std::string strText = FileText(strPath);
    return static_cast<int>(std::count(strText.begin(), strText.end(), '\n'));
}

// All messages of an outcome, one line each.
inline std::string Messages(const seam::Outcome &outcome) {
    std::string strAll;
    for (const seam::LogLine &log : outcome.logs) {
        strAll += (strAll.empty() ? "" : "\n") + log.strMessage;
    }
    return strAll;
}

class Joined : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        devserver::Options options;
        options.token = kToken;
        s_pServer = new DevServerProcess(options);
        std::string strReason;
        ASSERT_TRUE(s_pServer->Start(strReason)) << strReason;
        std::filesystem::create_directories(std::filesystem::path(kCaFile).parent_path());
        std::ofstream(kCaFile) << s_pServer->CaPem();
    }
    static void TearDownTestSuite() {
        delete s_pServer;
        s_pServer = nullptr;
    }
    void SetUp() override {
        Reset();
        s_pServer->ForgetRequests();
        s_pServer->ForgetAnswers();
    }

    // A credential with the id 1, nothing else.
    static void Reset(const char *szProtocol = "https") {
        std::filesystem::remove_all(stored::kFolder);
        for (const char *szPath : {kMarker, kInfoFile, kJournal}) {
            std::filesystem::remove(szPath);
        }
        const bool blHttps = std::string(szProtocol) == "https";
        const long id =
            stored::AddCredential("ZELO.QRM", "localhost", nullptr, szProtocol,
                                  blHttps ? s_pServer->HttpsPort() : s_pServer->HttpPort());
        stored::AddSession(id, kToken, "csrf-9876543210");
    }

    // Such as "status=success marker=no notified=0".
    static std::string State() {
        const std::string strInfo = FileText(kInfoFile);
        const std::size_t quote = strInfo.find('"');
        return "status=" +
               (quote == std::string::npos
                    ? std::string()
                    : strInfo.substr(quote + 1, strInfo.rfind('"') - quote - 1)) +
               " marker=" + (std::filesystem::exists(kMarker) ? "yes" : "no") +
               " notified=" + std::to_string(CountLines(kJournal));
    }

    static DevServerProcess *s_pServer;
};

}  // namespace joined

#endif
