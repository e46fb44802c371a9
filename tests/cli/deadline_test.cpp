// The deadline of qrmctl: what the program may be blocked in, and what it leaves when it strikes.

#include <arpa/inet.h>
#include <fcntl.h>
#include <shadow.h>
#include <sqlite3.h>
#include <sys/socket.h>

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

constexpr double kBusy_s = 3;

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
Held HangProgram(const char *szPath, const std::string &strFirst = "") {
    const std::string strBefore = FileText(szPath);
    fs::create_directories(fs::path(szPath).parent_path());
    WriteProgram(szPath, strFirst + "echo $$ > /tmp/pid\nexec sleep 600");
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

// A relay that says nothing; what one says for ever, the platform's own tests show.
Held HangRelay() {
    const int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in address = {AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
    socklen_t cb = sizeof(address);
    auto *const pAddress = reinterpret_cast<sockaddr *>(&address);
    EXPECT_TRUE(bind(fd, pAddress, cb) == 0 && listen(fd, 8) == 0);
    getsockname(fd, pAddress, &cb);
    const std::string strBefore = FileText(kConfig);
    WriteFile(kConfig, strBefore + "farlink_relay=\"127.0.0.1:" +
                           std::to_string(ntohs(address.sin_port)) + "\"\n");
    return {nullptr, [fd, strBefore](void *) {
                close(fd);
                WriteFile(kConfig, strBefore);
            }};
}

// Looking up a name then takes ten minutes.
Held SilenceNameServer() {
    setenv("LD_PRELOAD", SILENT_NAMES, 1);
    return {nullptr, [](void *) { unsetenv("LD_PRELOAD"); }};
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
        const std::string strLocal = R"([{"host":"localhost","http_port":0,"https_port":)" +
                                     std::to_string(s_pServer->HttpsPort());
        std::ofstream("/tmp/list") << strLocal << "}]";
        std::ofstream("/tmp/relayed") << strLocal << R"(,"farlink_direct":true}])";
        std::ofstream("/tmp/unknown")
            << R"([{"host":"qrm.example","http_port":0,"https_port":443}])";
    }
};

// How it is held, and what is said of it.
struct Block {
    std::function<Held()> Hold;
    std::string strSaid;
};

// What is run, what it is blocked in, and what the operator is told to do.
struct Row {
    Arguments arguments;
    Block block;
    const char *szRemedy;
};

void ExpectEnd(const Row &row) {
    const auto &[arguments, block, szRemedy] = row;
    SCOPED_TRACE(testing::PrintToString(arguments));
    const Held held = block.Hold();
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
        // A second, and what a busy machine takes to start a program.
        EXPECT_LT(std::chrono::steady_clock::now() - begin,
                  std::chrono::duration<double>(deadline_s + 1 + kBusy_s));
        EXPECT_EQ(outcome.status, 5) << outcome.strErr;
        EXPECT_TRUE(json::FromString(outcome.strOut, result)) << outcome.strOut;
        EXPECT_EQ(result["error_id"], "deadline");
        strStage = result["stage"].asString();
        if (Holds(strStage, block.strSaid) && !IsProgramAwaited()) {
            break;
        }
    }
    EXPECT_TRUE(Holds(strStage, block.strSaid)) << strStage;
    EXPECT_EQ(outcome.strErr, "qrmctl: " + result["error"].asString() + '\n');
    EXPECT_NE(outcome.strErr.find('\'' + strStage + '\''), std::string::npos);
    EXPECT_NE(outcome.strErr.find(szRemedy), std::string::npos) << outcome.strErr;
}

Block Lock(const char *szPath) {
    return {[szPath] { return HoldLock(szPath); },
            std::string("waiting for the lock '") + szPath + '\''};
}

Block Program(const char *szPath) {
    return {[szPath] { return HangProgram(szPath); }, szPath};
}

TEST_F(Deadline, EndsTheWaitForALock) {
    for (const Row &row : std::initializer_list<Row>{
             {{"leave"}, Lock("/var/run/qrmctl.membership.lock"), "qrmctl leave"},
             {{"info", "set", "key", "value"}, Lock("/tmp/qrm_client.info.lock"), ""},
             {{"idle", "get"}, Lock("/tmp/qrm_idle_time.lock"), ""},
             {{"idle", "set", "5"}, Lock("/tmp/qrm_idle_time.lock"), "idle get"}}) {
        ExpectEnd(row);
    }
}

TEST_F(Deadline, EndsTheWaitForTheAccounts) {
    ASSERT_EQ(run_program::Run({QRMCTL, "account", "create"}).status, 0);
    const Block accounts = {HoldAccounts, "/etc/.pwd.lock"};
    ExpectEnd({{"account", "create"}, accounts, "qrmctl leave"});
    ExpectEnd({{"account", "delete"}, accounts, "qrmctl leave"});
    const Held held = HoldAccounts();
    EXPECT_EQ(run_program::Run({QRMCTL, "status"}).status, 4) << "a look-up waits not";
}

TEST_F(Deadline, EndsTheWaitForAStore) {
    std::ofstream("/tmp/credential") << R"({"protocol":"https","host":"h","port":1,)"
                                     << R"("application":"ZELO.QRM","access_token":"t"})";
    const Block store = {HoldStore, std::string("the credential store '") + stored::kDatabase};
    for (const Row &row : std::initializer_list<Row>{
             {{"status"}, store, ""},
             {{"doctor"}, {HoldStore, ""}, ""},
             {{"leave"}, store, "qrmctl leave"},
             {{"credential", "create", "/tmp/credential"}, store, "credential show"},
             {{"credential", "delete"}, store, "credential delete"},
             {{"credential", "show"}, store, ""}}) {
        ExpectEnd(row);
    }
}

TEST_F(Deadline, EndsTheWaitForAServerARelayAndANameServer) {
    const std::string strPort = std::to_string(s_pServer->HttpsPort());
    const auto silent = [] { return Silence(*s_pServer); };
    const Block silence = {silent, "localhost:" + strPort};
    const Block relay = {HangRelay, "localhost:" + strPort};
    for (const Row &row : std::initializer_list<Row>{
             {{"test-connection", "--api", "ZELO.QRM.RPC", "/tmp/list"}, silence, ""},
             {{"test-connection", "--api", "ZELO.QRM.RPC", "/tmp/relayed"}, relay, ""},
             {{"test-connection", "--api", "ZELO.QRM.RPC", "/tmp/unknown"},
              {SilenceNameServer, "qrm.example:443"},
              ""},
             {{"join", "--server", "localhost", "--http-port", "0", "--https-port", strPort,
               "--token-file", "/tmp/token"},
              silence,
              "nothing was changed"},
             {{"call", "ZELO.QRM.RPC", "info"}, silence, ""},
             {{"update"}, silence, ""},
             {{"doctor"}, {silent, "https://localhost:" + strPort}, ""},
             {{"log", "err", "-", "text"}, silence, ""},
             {{"get-file", kPath, "ZELO.QRM.RPC.File", "get", "--params",
               R"({"name":"f","size":9})"},
              silence,
              "is as it was"},
             {{"support", "/tmp/files/archive"}, {silent, "qrmctl doctor"}, ""}}) {
        ExpectEnd(row);
    }
    EXPECT_EQ(FileText(kPath), "old");
    EXPECT_EQ(std::distance(fs::directory_iterator("/tmp/files"), fs::directory_iterator()), 1)
        << "nothing stays beside the file";
}

TEST_F(Deadline, EndsAProgramThatHangs) {
    ASSERT_EQ(run_program::Run({QRMCTL, "account", "create"}).status, 0);
    const Block daemon = Program(kDaemonScript);
    for (const Row &row : std::initializer_list<Row>{
             {{"status", "--explain"}, daemon, ""},
             {{"support", "/tmp/files/archive"}, {daemon.Hold, "qrmctl status"}, ""},
             {{"leave"}, Program(kPlugin), "qrmctl leave"},
             {{"plugins", "run", "disjoin", "POST"}, Program(kPlugin), ""},
             {{"notify", "QRMClientConnectFailed"}, Program(kHook), ""}}) {
        ExpectEnd(row);
    }
}

// Like one that is killed: the next leave clears what it left.
TEST_F(Deadline, AJoinSaysWhatRemains) {
    const std::string strPort = std::to_string(s_pServer->HttpsPort());
    ASSERT_EQ(run_program::Run({QRMCTL, "leave"}).status, 0);
    ExpectEnd({{"join", "--server", "localhost", "--http-port", "0", "--https-port", strPort,
                "--token-file", "/tmp/token", "--sn", "S"},
               {[] { return HangProgram(kDaemonScript, "[ \"$1\" = start ] || exit 1\n"); },
                kDaemonScript},
               "this remains of the join: "});
    EXPECT_EQ(run_program::Run({QRMCTL, "status"}).status, 4);
    EXPECT_EQ(run_program::Run({QRMCTL, "leave"}).status, 0);
    EXPECT_EQ(run_program::Run({QRMCTL, "status"}).status, 3);
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

// A signal moves the deadline to now; it is told as what it is.
TEST_F(Deadline, AnInterruptionEndsAFetchThatWaits) {
    const Held silence = Silence(*s_pServer);
    run_program::Program fetch(
        {QRMCTL, "get-file", kPath, "ZELO.QRM.RPC.File", "get", "--json", "--deadline", "60"});
    const auto files = [] {
        return std::distance(fs::directory_iterator("/tmp/files"), fs::directory_iterator());
    };
    ASSERT_TRUE(run_program::Until([&] { return files() == 2; })) << "it is made beside the file";
    const auto begin = std::chrono::steady_clock::now();
    fetch.Signal(SIGTERM);
    const run_program::Outcome outcome = fetch.Wait();
    EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::duration<double>(1 + kBusy_s));
    EXPECT_EQ(outcome.status, 1);
    Json::Value result;
    EXPECT_TRUE(json::FromString(outcome.strOut, result)) << outcome.strOut;
    EXPECT_EQ(result["error_id"], "interrupted");
    EXPECT_EQ(files(), 1);
    EXPECT_EQ(FileText(kPath), "old");
}

// A reader that has stopped reading, on one of the streams; the other one is read.
TEST_F(Deadline, EndsThoughNobodyReadsItsOutputAndNeverContradictsIt) {
    constexpr std::size_t kPage = 4096;
    const std::string strLong(2 * kPage, 'k');
    ASSERT_EQ(run_program::Run({QRMCTL, "info", "set", "key", "value"}).status, 0);
    const std::tuple<char, std::size_t, std::string> rows[] = {
        {'2', 0, "none"}, {'2', kPage, strLong}, {'1', 0, "key"}};
    for (const auto &[fd, cbFree, strKey] : rows) {
        SCOPED_TRACE(strKey.substr(0, 4) + fd);
        const FullPipe full(cbFree);
        const std::string strCommand =
            std::string(R"(exec "$0" "$@" )") + fd + ">" + FullPipe::kPipe;
        const auto begin = std::chrono::steady_clock::now();
        const run_program::Outcome outcome =
            run_program::Run({"/bin/sh", "-c", strCommand, QRMCTL, "info", "get", strKey, "--json",
                              "--deadline", "0.4"});
        EXPECT_LT(std::chrono::steady_clock::now() - begin,
                  std::chrono::duration<double>(1.4 + kBusy_s));
        EXPECT_EQ(outcome.status, 5);
        EXPECT_EQ(outcome.strOut, "") << "the failure comes first, and did not come through";
        EXPECT_EQ(Holds(outcome.strErr, "qrmctl: the deadline struck"), fd == '1');
    }
}

TEST_F(Deadline, EndsThoughAnInputDoesNotCome) {
    ASSERT_EQ(mkfifo("/tmp/silent", 0600), 0);
    const run_program::Outcome outcome = run_program::Run(
        {QRMCTL, "credential", "create", "/tmp/silent", "--json", "--deadline", "0.4"});
    EXPECT_EQ(outcome.status, 5);
    Json::Value result;
    EXPECT_TRUE(json::FromString(outcome.strOut, result)) << outcome.strOut;
    EXPECT_EQ(result["error_id"], "deadline");
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
