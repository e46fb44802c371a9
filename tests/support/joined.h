// A joined appliance for tests: a development server that is trusted, and a stored credential.

#ifndef ZELO_TESTS_JOINED_H
#define ZELO_TESTS_JOINED_H

#include <gtest/gtest.h>

#include <string>

#include "dev_server_process.h"
#include "files.h"
#include "seam.h"
#include "stored.h"

namespace joined {

constexpr const char *kToken = "secret-0123456789";

using namespace files;
using seam::Messages;

inline int CountLines(const std::string &strPath) {
    return static_cast<int>(FileLines(strPath).size());
}

class Joined : public testing::Test {
  protected:
    static void SetUpTestSuite() { Serve(kToken); }
    static void Serve(const char *szToken) {
        devserver::Options options;
        options.token = szToken;
        s_pServer = new DevServerProcess(options);
        s_pServer->Start();
        fs::create_directories(fs::path(kCaFile).parent_path());
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

    // A credential with the id 1, nothing else; for the server of the test unless there is a port.
    static void Reset(const char *szProtocol = "https", int port = 0) {
        fs::remove_all(stored::kFolder);
        for (const char *szPath : {kMarker, kInfoFile, kJournal}) {
            fs::remove(szPath);
        }
        const bool blHttps = std::string(szProtocol) == "https";
        if (port == 0) {
            port = blHttps ? s_pServer->HttpsPort() : s_pServer->HttpPort();
        }
        const long id = stored::AddCredential("ZELO.QRM", "localhost", nullptr, szProtocol, port);
        stored::AddSession(id, kToken, "csrf-9876543210");
    }

    // What the server answers to the next request; any one of the API for the method "".
    static void Answer(const char *szApi, const char *szMethod, const std::string &strBody,
                       int status = 200) {
        devserver::NextAnswer answer;
        answer.method = szMethod;
        answer.status = status;
        answer.body = strBody;
        s_pServer->AnswerNext(szApi, answer);
    }

    // Such as "status=success marker=no notified=0".
    static std::string State() {
        const std::string strInfo = FileText(kInfoFile);
        const std::size_t quote = strInfo.find('"');
        return "status=" +
               (quote == std::string::npos
                    ? std::string()
                    : strInfo.substr(quote + 1, strInfo.rfind('"') - quote - 1)) +
               " marker=" + (fs::exists(kMarker) ? "yes" : "no") +
               " notified=" + std::to_string(CountLines(kJournal));
    }

    inline static DevServerProcess *s_pServer = nullptr;
};

}  // namespace joined

#endif
