// qrmctl's requests to the joined server as its user makes them: calls, updates, files.

#include <sys/stat.h>

#include "joined.h"
#include "json_text.h"
#include "run_program.h"

DevServerProcess *joined::Joined::s_pServer = nullptr;

namespace {

using joined::FileText;
using Arguments = std::vector<std::string>;
namespace fs = std::filesystem;

constexpr const char *kFileApi = "ZELO.QRM.RPC.File";
constexpr const char *kPath = "/tmp/files/file";

class QrmctlCall : public joined::Joined {
  protected:
    void SetUp() override {
        Joined::SetUp();
        fs::remove_all("/tmp/files");
        fs::create_directory("/tmp/files");
    }
    static Json::Value Run(Arguments arguments, int status) {
        arguments.insert(arguments.begin(), QRMCTL);
        arguments.emplace_back("--json");
        const run_program::Outcome outcome = run_program::Run(arguments);
        EXPECT_EQ(outcome.status, status) << outcome.strErr;
        EXPECT_EQ((outcome.strOut + outcome.strErr).find(joined::kToken), std::string::npos);
        Json::Value result;
        EXPECT_TRUE(json_text::FromString(outcome.strOut, result)) << outcome.strOut;
        return result;
    }
    static Arguments GetFile(const std::string &strParams = R"({"name":"f","size":300000})") {
        return {"get-file", kPath, kFileApi, "get", "--params", strParams};
    }
    // Nothing but the file itself is left beside it.
    static void ExpectAlone() {
        EXPECT_EQ(std::distance(fs::directory_iterator("/tmp/files"), fs::directory_iterator()), 1);
    }
};

TEST_F(QrmctlCall, ACallPrintsTheReplyAndSaysWhetherItSucceeded) {
    EXPECT_EQ(Run({"call", "ZELO.QRM.RPC", "info"}, 0)["reply"]["data"]["name"], "qrm-devserver");
    EXPECT_EQ(Run({"info", "get", "status"}, 0)["value"], "success");
    EXPECT_EQ(Run({"call", "ZELO.QRM.RPC", "info", "--version", "2"}, 1)["reply"]["error"]["code"],
              104);
    const Json::Value unknown = Run({"call", "NO.SUCH", "info"}, 1);
    EXPECT_EQ(unknown["error_id"], "refused");
    EXPECT_EQ(unknown["server_error"], "no-such-api");
    std::ofstream("/tmp/files/params") << R"({"sn":"S","x":1})";
    EXPECT_EQ(Run({"call", "ZELO.QRM.RPC.ClientInfo", "update", "--params", "@/tmp/files/params"},
                  1)["reply"]["error"]["code"],
              120);
    for (const char *szParams : {"[1]", "{", "@/tmp/absent", "7"}) {
        const std::string strError =
            Run({"call", "ZELO.QRM.RPC", "info", "--params", szParams}, 1)["error"].asString();
        EXPECT_NE(strError.find("arameters"), std::string::npos) << strError;
    }
    Run({"update"}, 1);
    EXPECT_EQ(Run({"info", "get", "status"}, 0)["value"], "error");
    Run({"info", "set", "key", "value"}, 0);
    EXPECT_EQ(Run({"info", "get", "key"}, 0)["value"], "value");
    EXPECT_EQ(Run({"info", "get", "absent"}, 1)["error_id"], "no-such-key");
    Run({"info", "set", "a=b", "value"}, 1);
    Run({"notify", "QRMClientDetachSuccess", "QRM_SERVER=other"}, 0);
    EXPECT_NE(FileText(joined::kJournal).find("other"), std::string::npos);
    Run({"notify", "QRMClientDetachSuccess", "novalue"}, 1);
}

TEST_F(QrmctlCall, ARefusalIsToldWithTheServersCodeAndStatus) {
    std::ofstream("/tmp/token") << joined::kToken;
    Arguments join = {"join",         "--server",   "localhost", "--http-port", "0",
                      "--token-file", "/tmp/token", "--again",   "--https-port"};
    join.push_back(std::to_string(s_pServer->HttpsPort()));
    const std::string strRefusal = R"({"success":false,"error":{"code":105}})";
    const Arguments call = {"call", "ZELO.QRM.RPC", "info"};
    const Arguments log = {"log", "err", "-", "text"};
    const struct {
        Arguments arguments;
        const char *szApi;
        const char *szMethod;
        int status;
        std::string strBody;
        const char *szErrorId;
        Json::Value serverCode;  // null: none
    } rows[] = {
        {call, "ZELO.QRM.RPC", "info", 403, "<html>", "no-reply", {}},
        {call, "ZELO.QRM.RPC", "info", 500, "{}", "refused", 0},
        {call, "ZELO.QRM.RPC", "info", 200, "<html>", "no-reply", {}},
        {call, "ZELO.QRM.RPC", "discover", 503, "", "no-reply", {}},
        {log, "ZELO.QRM.RPC.Log", "push", 200, strRefusal, "log-not-confirmed", 105},
        {log, "ZELO.QRM.RPC.Log", "push", 403, "", "log-not-confirmed", {}},
        {GetFile(), kFileApi, "get", 403, strRefusal, "fetch-failed", 105},
        {GetFile(), kFileApi, "get", 500, std::string(70000, ' '), "fetch-failed", {}},
        {{"update"}, "ZELO.QRM.RPC.ClientInfo", "update", 200, strRefusal, "update-failed", 105},
        {join, "ZELO.QRM.RPC", "join", 200, strRefusal, "join-failed", 105}};
    for (const auto &row : rows) {
        SCOPED_TRACE(testing::PrintToString(row.arguments) + std::to_string(row.status));
        devserver::NextAnswer answer;
        answer.method = row.szMethod;
        answer.status = row.status;
        answer.body = row.strBody;
        s_pServer->AnswerNext(row.szApi, answer);
        const Json::Value result = Run(row.arguments, 1);
        EXPECT_EQ(result["error_id"], row.szErrorId);
        EXPECT_EQ(result["server_code"], row.serverCode);
        EXPECT_EQ(result["http_status"], row.status == 200 ? Json::Value() : row.status);
        const std::string strCode = result["server_code"].asString();
        EXPECT_NE(result["error"].asString().find(strCode), std::string::npos);
    }
}

TEST_F(QrmctlCall, WithoutAServerEveryRequestSaysToJoin) {
    fs::remove_all(stored::kFolder);
    for (const Arguments &arguments :
         {Arguments{"call", "ZELO.QRM.RPC", "info"}, Arguments{"update"},
          Arguments{"log", "err", "-", "text"}, GetFile()}) {
        const Json::Value result = Run(arguments, 1);
        EXPECT_EQ(result["error_id"], "not-joined");
        EXPECT_NE(result["error"].asString().find("qrmctl join"), std::string::npos);
    }
    EXPECT_FALSE(fs::exists(joined::kMarker)) << "nobody is told of a server that there is not";
}

TEST_F(QrmctlCall, ALogEntryAndAnIdleTimeAreTakenAsTheyAreTyped) {
    Run({"log", "warning", "-", "{0}|{1}|{2}", "[a,b]", "", "x", "--extra-info", "[e,f]"}, 0);
    const Json::Value entries = s_pServer->Log();
    EXPECT_EQ(entries[0]["level"], "warning");
    EXPECT_EQ(entries[0]["extra_info"], "[e,f]");
    EXPECT_EQ(entries[0]["log"]["jpn"], "[a,b]||x");
    const Json::Value rendered =
        Run({"log", "3", "qrm_log", "volume_degraded", "1", "_T(volume,disk_missing)", "--render"},
            0)["log"];
    EXPECT_EQ(rendered.size(), 20U);
    EXPECT_EQ(rendered["enu"], "Volume 1 is degraded: a disk is missing.");
    Run({"log", "9", "-", "text"}, 1);
    EXPECT_EQ(Run({"log", "err", "nosuch", "text"}, 1)["error_id"], "no-such-text");
    EXPECT_EQ(s_pServer->Log().size(), 1U);
    const std::string strLong(3000, 'x');
    for (const Arguments &texts :
         {Arguments{strLong + strLong}, {"{0}", strLong + strLong}, {"{0}{0}", strLong}}) {
        Arguments command = {"log", "err", "-"};
        command.insert(command.end(), texts.begin(), texts.end());
        const Json::Value warnings = Run(command, 0)["warnings"];
        EXPECT_NE(warnings[0].asString().find("6000 bytes"), std::string::npos);
        EXPECT_EQ(warnings.size(), 1U);
    }

    for (const char *szTime : {"0", "525600"}) {
        Run({"idle", "set", szTime}, 0);
        EXPECT_EQ(Run({"idle", "get"}, 0)["idle_minutes"].asString(), szTime);
    }
    for (const char *szTime : {"-1", "18446744073709551616", "525601", "1x", ""}) {
        EXPECT_EQ(run_program::Run({QRMCTL, "idle", "set", szTime}).status, 2) << szTime;
    }
}

TEST_F(QrmctlCall, AFileIsReplacedOnlyByAWholeOne) {
    EXPECT_EQ(Run(GetFile(), 0)["bytes"], 300000);
    EXPECT_EQ(fs::file_size(kPath), 300000U);
    chmod(kPath, 0640);
    EXPECT_EQ(Run(GetFile(), 0)["unchanged"], true);
    EXPECT_EQ(fs::file_size(kPath), 300000U);
    EXPECT_EQ(Run(GetFile(R"({"name":"f","size":300001})"), 0)["unchanged"], false);
    struct stat status = {};
    stat(kPath, &status);
    EXPECT_EQ(status.st_size, 300001);
    EXPECT_EQ(status.st_mode & 07777U, 0640U);
    const std::string strBefore = FileText(kPath);

    devserver::NextAnswer cut;
    cut.cut_after = 1000;
    devserver::NextAnswer error;
    error.status = 500;
    for (const devserver::NextAnswer &answer : {cut, error}) {
        devserver::NextAnswer next = answer;
        next.method = "get";
        s_pServer->AnswerNext(kFileApi, next);
        Run(GetFile(), 1);
        EXPECT_EQ(FileText(kPath), strBefore);
    }
    ExpectAlone();

    fs::create_symlink(kPath, "/tmp/link");
    Arguments throughLink = GetFile();
    throughLink[1] = "/tmp/link";
    Run(throughLink, 0);
    EXPECT_TRUE(fs::is_symlink("/tmp/link"));
    EXPECT_EQ(fs::file_size(kPath), 300000U);
    fs::remove("/tmp/link");
    Arguments folder = GetFile();
    folder[1] = "/tmp/files";
    Run(folder, 1);

    Arguments inPlace = GetFile();
    inPlace.emplace_back("--in-place");
    Run(inPlace, 0);
    EXPECT_EQ(fs::file_size(kPath), 0U) << "the copy was current, and emptied first";
}

TEST_F(QrmctlCall, AnInterruptedFetchLeavesTheFileAsItWas) {
    std::ofstream(kPath) << "old";
    devserver::NextAnswer slow;
    slow.method = "get";
    slow.bytes_per_s = 2000;
    s_pServer->AnswerNext(kFileApi, slow);
    Arguments command = GetFile();
    command.insert(command.begin(), QRMCTL);
    run_program::Program program(command);
    const auto isWriting = [] {
        for (const auto &entry : fs::recursive_directory_iterator("/tmp/files")) {
            if (entry.path().filename() == "file" && entry.path() != kPath &&
                s_pServer->Requests().size() == 2) {
                return true;
            }
        }
        return false;
    };
    ASSERT_TRUE(run_program::Until(isWriting));
    program.Signal(SIGINT);
    EXPECT_EQ(program.Wait().status, 1);
    EXPECT_EQ(FileText(kPath), "old");
    ExpectAlone();
}

TEST_F(QrmctlCall, APrivateAuthorityServesEveryPathAndABadOneIsNamed) {
    const std::string strPort = std::to_string(s_pServer->HttpsPort());
    std::ofstream("/tmp/token") << joined::kToken;
    std::ofstream("/tmp/list") << R"([{"host":"localhost","http_port":0,"https_port":)" << strPort
                               << "}]";
    const Arguments commands[] = {{"call", "ZELO.QRM.RPC", "info"},
                                  {"log", "err", "-", "text"},
                                  GetFile(),
                                  {"test-connection", "--api", "ZELO.QRM.RPC", "/tmp/list"},
                                  {"join", "--server", "localhost", "--http-port", "0",
                                   "--https-port", strPort, "--token-file", "/tmp/token"},
                                  {"update"}};
    for (const Arguments &command : commands) {
        SCOPED_TRACE(testing::PrintToString(command));
        Run(command, 0);
    }
    const std::string strBad = std::string(joined::kCaFile) + ".crt";
    const std::function<void()> faults[] = {
        [&] { std::ofstream(strBad) << "no certificate"; },
        [&] { std::ofstream(strBad) << FileText(joined::kCaFile).substr(0, 300); },
        [&] { fs::create_symlink("/tmp/absent", strBad); }, [&] { mkfifo(strBad.c_str(), 0644); },
        [&] {  // one that is encrypted asks nobody for its password
            std::string strText = FileText(joined::kCaFile);
            std::ofstream(strBad) << strText.insert(
                strText.find('\n') + 1,
                "Proc-Type: 4,ENCRYPTED\nDEK-Info: "
                "AES-128-CBC,00112233445566778899AABBCCDDEEFF\n\n");
        }};
    for (const auto &fault : faults) {
        fault();
        for (const Arguments &command : commands) {
            SCOPED_TRACE(testing::PrintToString(command));
            const Json::Value result = Run(command, 1);
            EXPECT_EQ(result["error_id"], "ca-unreadable");
            EXPECT_NE(result["error"].asString().find('\'' + strBad + '\''), std::string::npos);
        }
        std::ofstream("/tmp/both")
            << R"([{"host":"localhost","http_port":)" << s_pServer->HttpPort()
            << R"(,"https_port":)" << strPort << "}]";
        EXPECT_EQ(
            Run({"test-connection", "--api", "ZELO.QRM.RPC", "/tmp/both"}, 0)["warnings"].size(),
            1U)
            << "plain http in its place does not go unnoticed";
        fs::remove(strBad);
    }
    Run({"leave"}, 0);
}

}  // namespace
