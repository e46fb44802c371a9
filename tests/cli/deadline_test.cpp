// The deadline of qrmctl: what the program may be blocked in, and what it leaves when it strikes.

#include <fcntl.h>
#include <shadow.h>
#include <sqlite3.h>

#include "file_lock.h"
#include "joined.h"
#include "json.h"
#include "process.h"
#include "run_program.h"

namespace {

using Arguments = std::vector<std::string>;
using namespace files;

constexpr const char *kDaemonScript = "/usr/zelo/etc/rc.d/S99zelocache.sh";
constexpr const char *kPlugin = "/usr/zelo/etc/plugins/qrm_client/disjoin/hanging";
constexpr const char *kHook = "/usr/zelo/etc/notify.d/hanging";
constexpr const char *kPath = "/tmp/files/file";

// What a command may wait for, held until this is gone.
using Held = std::shared_ptr<void>;

Held Silence(const DevServerProcess &server) {
    devserver::NextAnswer silent;
    silent.delay_ms = 600'000;
    for (const char *szApi :
         {"ZELO.QRM.RPC", "ZELO.QRM.RPC.File", "ZELO.QRM.RPC.Log", "ZELO.QRM.RPC.ClientInfo"}) {
        server.AnswerNext(szApi, silent);
    }
    return {nullptr, [&server](void *) { server.ForgetAnswers(); }};
}

Held HoldLock(const char *szPath) {
    int handle = -1;
    EXPECT_EQ(YLIBCFileLockTimeByFile(szPath, 0, 0, &handle), 1);
    return {nullptr, [handle](void *) { YLIBCFileUnlockByFile(handle); }};
}

Held HoldStore() {
    sqlite3 *pDb = nullptr;
    EXPECT_EQ(sqlite3_open(stored::kDatabase, &pDb), SQLITE_OK);
    EXPECT_EQ(sqlite3_exec(pDb, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    return {pDb, sqlite3_close};
}

Held HoldAccounts() {
    EXPECT_EQ(lckpwdf(), 0);
    return {nullptr, [](void *) { ulckpwdf(); }};
}

// A program at the path, which does not come back and tells its process id.
Held HangProgram(const char *szPath) {
    const std::string strBefore = FileText(szPath);
    fs::create_directories(fs::path(szPath).parent_path());
    WriteProgram(szPath, "echo $$ > /tmp/pid\nexec sleep 600");
    WriteFile("/tmp/pid", "");
    return {nullptr, [szPath, strBefore](void *) {
                strBefore.empty() ? void(fs::remove(szPath)) : WriteFile(szPath, strBefore);
                const int pid = std::atoi(FileText("/tmp/pid").c_str());
                EXPECT_GT(pid, 0);
                EXPECT_TRUE(run_program::Until([pid] { return YLIBCProcAlive(pid) == 0; }))
                    << "what was started does not outlive the deadline";
                fs::remove("/tmp/pid");
            }};
}

// Whether one has been started that has not come to telling its process id.
bool IsProgramAwaited() {
    return fs::exists("/tmp/pid") && fs::file_size("/tmp/pid") == 0;
}

// A pipe that is full but for some bytes, and that nobody reads until its text is asked for.
class FullPipe {
  public:
    static constexpr const char *kPipe = "/tmp/full";
    explicit FullPipe(std::size_t cbFree) {
        EXPECT_EQ(mkfifo(kPipe, 0600), 0);
        m_fd = open(kPipe, O_RDWR | O_NONBLOCK | O_CLOEXEC);
        const std::string strPage(4096, 'x');
        while (write(m_fd, strPage.data(), strPage.size()) > 0) {
        }
        std::string strFreed(cbFree, ' ');
        EXPECT_EQ(read(m_fd, strFreed.data(), cbFree), static_cast<ssize_t>(cbFree));
    }
    ~FullPipe() {
        close(m_fd);
        fs::remove(kPipe);
    }
    FullPipe(const FullPipe &) = delete;
    FullPipe &operator=(const FullPipe &) = delete;

    std::string Text() const {
        std::string strText(std::size_t{1024} * 1024, ' ');
        const ssize_t cb = read(m_fd, strText.data(), strText.size());
        return strText.substr(0, cb < 0 ? 0 : static_cast<std::size_t>(cb));
    }

  private:
    int m_fd = -1;
};

class Deadline : public joined::Joined {
  protected:
    void SetUp() override {
        Joined::SetUp();
        fs::create_directories("/tmp/files");
        std::ofstream(kPath) << "old";
        std::ofstream("/tmp/token") << joined::kToken;
        std::ofstream("/tmp/list") << R"([{"host":"localhost","http_port":0,"https_port":)"
                                   << s_pServer->HttpsPort() << "}]";
    }
};

TEST_F(Deadline, EndsWhateverACommandIsBlockedInAndNamesIt) {
    // How it is held, and what is said of it.
    using Block = std::pair<std::function<Held()>, std::string>;
    const std::string strPort = std::to_string(s_pServer->HttpsPort());
    const Block silence = {[] { return Silence(*s_pServer); }, "localhost:" + strPort};
    const Block store = {
        HoldStore, std::string("waiting for the credential store '") + stored::kDatabase + '\''};
    const Block accounts = {HoldAccounts, "waiting for the lock '/etc/.pwd.lock'"};
    const auto lock = [](const char *szPath) -> Block {
        return {[szPath] { return HoldLock(szPath); },
                std::string("waiting for the lock '") + szPath + '\''};
    };
    const auto program = [](const char *szPath, const char *szArguments) -> Block {
        return {[szPath] { return HangProgram(szPath); },
                std::string("running '") + szPath + ' ' + szArguments + '\''};
    };
    const Block daemon = program(kDaemonScript, "status");
    std::ofstream("/tmp/credential") << R"({"protocol":"https","host":"h","port":1,)"
                                     << R"("application":"ZELO.QRM","access_token":"t"})";
    const std::tuple<Arguments, Block, const char *> rows[] = {
        {{"test-connection", "--api", "ZELO.QRM.RPC", "/tmp/list"}, silence, ""},
        {{"join", "--server", "localhost", "--http-port", "0", "--https-port", strPort,
          "--token-file", "/tmp/token"},
         silence,
         "nothing was changed"},
        {{"call", "ZELO.QRM.RPC", "info"}, silence, ""},
        {{"update"}, silence, ""},
        {{"log", "err", "-", "text"}, silence, ""},
        {{"get-file", kPath, "ZELO.QRM.RPC.File", "get", "--params", R"({"name":"f","size":9})"},
         silence,
         "is as it was"},
        {{"status"}, store, ""},
        {{"status", "--explain"}, store, ""},
        {{"status", "--explain"}, daemon, ""},
        {{"doctor"}, silence, ""},
        {{"doctor"}, {store.first, ""}, ""},
        {{"support", "/tmp/files/archive"}, {silence.first, "qrmctl doctor"}, ""},
        {{"support", "/tmp/files/archive"}, {daemon.first, "qrmctl status"}, ""},
        {{"account", "create"}, accounts, "qrmctl leave"},
        {{"account", "delete"}, accounts, "qrmctl leave"},
        {{"leave"}, lock("/tmp/qrmctl.membership.lock"), "qrmctl leave"},
        {{"leave"}, store, "qrmctl leave"},
        {{"leave"}, program(kPlugin, "pre"), "qrmctl leave"},
        {{"plugins", "run", "disjoin", "POST"}, program(kPlugin, "post"), ""},
        {{"notify", "QRMClientConnectFailed"}, program(kHook, "QRMClientConnectFailed"), ""},
        {{"info", "set", "key", "value"}, lock("/tmp/qrm_client.info.lock"), ""},
        {{"idle", "get"}, lock("/tmp/qrm_idle_time.lock"), ""},
        {{"idle", "set", "5"}, lock("/tmp/qrm_idle_time.lock"), "idle get"},
        {{"credential", "create", "/tmp/credential"}, store, "credential show"},
        {{"credential", "update", "/tmp/credential"}, store, "credential show"},
        {{"credential", "delete"}, store, "credential delete"},
        {{"credential", "show"}, store, ""}};
    ASSERT_EQ(run_program::Run({QRMCTL, "account", "create"}).status, 0);
    for (const auto &[arguments, block, szRemedy] : rows) {
        SCOPED_TRACE(testing::PrintToString(arguments));
        const Held held = block.first();
        Arguments command = arguments;
        command.insert(command.begin(), QRMCTL);
        run_program::Outcome outcome;
        Json::Value result;
        std::string strStage;
        // On a busy machine a command may not have come there in the first time.
        for (const double deadline_s : {0.4, 5.0}) {
            Arguments limited = command;
            limited.insert(limited.end(), {"--deadline", std::to_string(deadline_s), "--json"});
            const auto begin = std::chrono::steady_clock::now();
            outcome = run_program::Run(limited);
            EXPECT_LT(std::chrono::steady_clock::now() - begin,
                      std::chrono::duration<double>(deadline_s + 8));
            EXPECT_EQ(outcome.status, 5) << outcome.strErr;
            EXPECT_TRUE(json::FromString(outcome.strOut, result)) << outcome.strOut;
            EXPECT_EQ(result["error_id"], "deadline");
            strStage = result["stage"].asString();
            if (Holds(strStage, block.second) && !IsProgramAwaited()) {
                break;
            }
        }
        EXPECT_TRUE(Holds(strStage, block.second)) << strStage;
        EXPECT_EQ(outcome.strErr, "qrmctl: " + result["error"].asString() + '\n');
        EXPECT_NE(outcome.strErr.find('\'' + strStage + '\''), std::string::npos);
        EXPECT_NE(outcome.strErr.find(szRemedy), std::string::npos) << outcome.strErr;
    }
    EXPECT_EQ(FileText(kPath), "old");
    EXPECT_EQ(std::distance(fs::directory_iterator("/tmp/files"), fs::directory_iterator()), 1)
        << "nothing stays beside the file";
}

TEST_F(Deadline, IsANumberOfSecondsAboveZeroAndStatusHasOne) {
    for (const char *szSeconds : {"0", "-1", "1x", "", "nan", "inf", "1e10"}) {
        EXPECT_EQ(run_program::Run({QRMCTL, "status", "--deadline", szSeconds}).status, 2)
            << szSeconds;
    }
    for (const Arguments &command :
         {Arguments{QRMCTL, "--deadline", "20", "credential", "show"},
          Arguments{QRMCTL, "credential", "show", "--deadline", "2e1"}}) {
        EXPECT_EQ(run_program::Run(command).status, 0);
    }
    const Held store = HoldStore();
    const auto begin = std::chrono::steady_clock::now();
    const run_program::Outcome outcome = run_program::Run({QRMCTL, "status"});
    EXPECT_EQ(outcome.status, 5);
    EXPECT_NE(outcome.strErr.find(stored::kDatabase), std::string::npos) << outcome.strErr;
    EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::seconds(10));
}

// A reader that has stopped reading, on one of the streams; the other one is read.
TEST_F(Deadline, EndsThoughNobodyReadsItsOutputAndNeverContradictsIt) {
    constexpr std::size_t kPage = 4096;
    const std::string strLong(2 * kPage, 'k');
    ASSERT_EQ(run_program::Run({QRMCTL, "info", "set", "key", "value"}).status, 0);
    // At last, whether the JSON object tells of the deadline.
    const std::tuple<char, std::size_t, std::string, bool> rows[] = {
        {'2', 0, "none", true}, {'2', kPage, strLong, true}, {'1', 0, "key", false}};
    for (const auto &[fd, cbFree, strKey, blJson] : rows) {
        SCOPED_TRACE(strKey.substr(0, 4) + fd);
        const FullPipe full(cbFree);
        const std::string strCommand =
            std::string(R"(exec "$0" "$@" )") + fd + ">" + FullPipe::kPipe;
        const run_program::Outcome outcome =
            run_program::Run({"/bin/sh", "-c", strCommand, QRMCTL, "info", "get", strKey, "--json",
                              "--deadline", "0.4"});
        EXPECT_EQ(outcome.status, 5);
        Json::Value result;
        EXPECT_EQ(json::FromString(outcome.strOut, result), blJson) << outcome.strOut;
        EXPECT_EQ(result["error_id"] == "deadline", blJson);
        EXPECT_EQ(outcome.strErr.find("qrmctl: the deadline") == 0, !blJson) << outcome.strErr;
        EXPECT_EQ(full.Text().find("deadline"), std::string::npos);
    }
}

TEST_F(Deadline, LeavesAloneWhatItDidNotStart) {
    const Held store = HoldStore();
    EXPECT_EQ(run_program::Run(
                  {"/bin/sh", "-c",
                   R"(sleep 600 & echo $! > /tmp/pid; exec "$0" status --deadline 0.4)", QRMCTL})
                  .status,
              5);
    const int pid = std::atoi(FileText("/tmp/pid").c_str());
    ASSERT_GT(pid, 0);
    EXPECT_EQ(YLIBCProcAlive(pid), 1);
    kill(pid, SIGKILL);
    fs::remove("/tmp/pid");
}

}  // namespace
