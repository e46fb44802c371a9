// The deadline of qrmctl: what the program may be blocked in, and what it leaves when it strikes.

#include <fcntl.h>
#include <shadow.h>
#include <sqlite3.h>

#include <sstream>

#include "file_lock.h"
#include "joined.h"
#include "json_text.h"
#include "process.h"
#include "run_program.h"

namespace {

using joined::FileText;
using Arguments = std::vector<std::string>;
namespace fs = std::filesystem;

constexpr const char *kDaemonScript = "/usr/zelo/etc/rc.d/S99zelocache.sh";
constexpr const char *kPlugin = "/usr/zelo/etc/plugins/qrm_client/disjoin/hanging";
constexpr const char *kHook = "/usr/zelo/etc/notify.d/hanging";
constexpr const char *kPath = "/tmp/files/file";

// What a command may wait for. Each is held until it is destroyed.
class Silence {
  public:
    explicit Silence(const DevServerProcess &server) {
        devserver::NextAnswer silent;
        silent.delay_ms = 600'000;
        for (const char *szApi :
             {"ZELO.QRM.RPC", "ZELO.QRM.RPC.File", "ZELO.QRM.RPC.Log", "ZELO.QRM.RPC.ClientInfo"}) {
            server.AnswerNext(szApi, silent);
        }
    }
};

class HeldLock {
  public:
    explicit HeldLock(const char *szPath) {
        EXPECT_EQ(YLIBCFileLockTimeByFile(szPath, 0, 0, &m_handle), 1);
    }
    ~HeldLock() { YLIBCFileUnlockByFile(m_handle); }
    HeldLock(const HeldLock &) = delete;
    HeldLock &operator=(const HeldLock &) = delete;

  private:
    int m_handle = -1;
};

class HeldStore {
  public:
    HeldStore() {
        EXPECT_EQ(sqlite3_open(stored::kDatabase, &m_pDb), SQLITE_OK);
        EXPECT_EQ(sqlite3_exec(m_pDb, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr), SQLITE_OK);
    }
    ~HeldStore() { sqlite3_close(m_pDb); }
    HeldStore(const HeldStore &) = delete;
    HeldStore &operator=(const HeldStore &) = delete;

  private:
    sqlite3 *m_pDb = nullptr;
};

struct HeldAccounts {
    HeldAccounts() { EXPECT_EQ(lckpwdf(), 0); }
    ~HeldAccounts() { ulckpwdf(); }
    HeldAccounts(const HeldAccounts &) = delete;
    HeldAccounts &operator=(const HeldAccounts &) = delete;
};

// A program at the path, which does not come back and tells its process id.
class HangingProgram {
  public:
    explicit HangingProgram(const char *szPath)
        : m_szPath(szPath), m_blThere(fs::exists(szPath)), m_strBefore(FileText(szPath)) {
        fs::create_directories(fs::path(szPath).parent_path());
        std::ofstream(szPath) << "#!/bin/sh\necho $$ > /tmp/pid\nexec sleep 600\n";
        fs::permissions(szPath, fs::perms(0755));
        std::ofstream("/tmp/pid").flush();
    }
    ~HangingProgram() {
        if (m_blThere) {
            std::ofstream(m_szPath) << m_strBefore;
        } else {
            fs::remove(m_szPath);
        }
        int pid = 0;
        std::istringstream(FileText("/tmp/pid")) >> pid;
        EXPECT_GT(pid, 0);
        EXPECT_TRUE(run_program::Until([pid] { return YLIBCProcAlive(pid) == 0; }))
            << "what was started does not outlive the deadline";
        fs::remove("/tmp/pid");
    }
    // Whether one has been started that has not come to telling its process id.
    static bool IsAwaited() { return fs::exists("/tmp/pid") && fs::file_size("/tmp/pid") == 0; }
    HangingProgram(const HangingProgram &) = delete;
    HangingProgram &operator=(const HangingProgram &) = delete;

  private:
    const char *m_szPath;
    bool m_blThere;
    std::string m_strBefore;
};

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
    using Hold = std::function<std::shared_ptr<void>()>;
    const Hold silence = [] { return std::make_shared<Silence>(*s_pServer); };
    const Hold store = [] { return std::make_shared<HeldStore>(); };
    const auto program = [](const char *szPath) -> Hold {
        return [szPath] { return std::make_shared<HangingProgram>(szPath); };
    };
    const Hold accounts = [] { return std::make_shared<HeldAccounts>(); };
    const auto lock = [](const char *szPath) -> Hold {
        return [szPath] { return std::make_shared<HeldLock>(szPath); };
    };
    const std::string strServer = "localhost:" + std::to_string(s_pServer->HttpsPort());
    const std::string strPort = std::to_string(s_pServer->HttpsPort());
    const std::string strStore =
        std::string("waiting for the credential store '") + stored::kDatabase + '\'';
    const char *szAccounts = "waiting for the lock '/etc/.pwd.lock'";
    std::ofstream("/tmp/credential") << R"({"protocol":"https","host":"h","port":1,)"
                                     << R"("application":"ZELO.QRM","access_token":"t"})";
    const struct {
        Arguments arguments;
        Hold hold;
        std::string strStage;  // what its name holds
        const char *szRemedy;
    } rows[] = {
        {{"test-connection", "--api", "ZELO.QRM.RPC", "/tmp/list"}, silence, strServer, ""},
        {{"join", "--server", "localhost", "--http-port", "0", "--https-port", strPort,
          "--token-file", "/tmp/token"},
         silence,
         strServer,
         "nothing was changed"},
        {{"call", "ZELO.QRM.RPC", "info"}, silence, strServer, ""},
        {{"update"}, silence, strServer, ""},
        {{"log", "err", "-", "text"}, silence, strServer, ""},
        {{"get-file", kPath, "ZELO.QRM.RPC.File", "get", "--params", R"({"name":"f","size":9})"},
         silence,
         strServer,
         "is as it was"},
        {{"status"}, store, strStore, ""},
        {{"status", "--explain"}, store, strStore, ""},
        {{"status", "--explain"},
         program(kDaemonScript),
         std::string("running '") + kDaemonScript + " status'",
         ""},
        {{"doctor"}, silence, strServer, ""},
        {{"doctor"}, store, "", ""},
        {{"support", "/tmp/files/archive"}, silence, "qrmctl doctor", ""},
        {{"support", "/tmp/files/archive"}, program(kDaemonScript), "qrmctl status", ""},
        {{"account", "create"}, accounts, szAccounts, "qrmctl leave"},
        {{"account", "delete"}, accounts, szAccounts, "qrmctl leave"},
        {{"leave"},
         lock("/tmp/qrmctl.membership.lock"),
         "waiting for the lock '/tmp/qrmctl.membership.lock'",
         "qrmctl leave"},
        {{"leave"}, store, strStore, "qrmctl leave"},
        {{"leave"}, program(kPlugin), std::string("running '") + kPlugin + " pre'", "qrmctl leave"},
        {{"plugins", "run", "disjoin", "POST"},
         program(kPlugin),
         std::string("running '") + kPlugin + " post'",
         ""},
        {{"notify", "QRMClientConnectFailed"},
         program(kHook),
         std::string("running '") + kHook + " QRMClientConnectFailed'",
         ""},
        {{"info", "set", "key", "value"},
         lock("/tmp/qrm_client.info.lock"),
         "waiting for the lock '/tmp/qrm_client.info.lock'",
         ""},
        {{"idle", "get"},
         lock("/tmp/qrm_idle_time.lock"),
         "waiting for the lock '/tmp/qrm_idle_time.lock'",
         ""},
        {{"idle", "set", "5"},
         lock("/tmp/qrm_idle_time.lock"),
         "waiting for the lock '/tmp/qrm_idle_time.lock'",
         "idle get"},
        {{"credential", "create", "/tmp/credential"}, store, strStore, "credential show"},
        {{"credential", "update", "/tmp/credential"}, store, strStore, "credential show"},
        {{"credential", "delete"}, store, strStore, "credential delete"},
        {{"credential", "show"}, store, strStore, ""}};
    ASSERT_EQ(run_program::Run({QRMCTL, "account", "create"}).status, 0);
    for (const auto &row : rows) {
        SCOPED_TRACE(testing::PrintToString(row.arguments));
        const std::shared_ptr<void> held = row.hold();
        Arguments command = row.arguments;
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
            EXPECT_TRUE(json_text::FromString(outcome.strOut, result)) << outcome.strOut;
            EXPECT_EQ(result["error_id"], "deadline");
            strStage = result["stage"].asString();
            if (strStage.find(row.strStage) != std::string::npos && !HangingProgram::IsAwaited()) {
                break;
            }
        }
        EXPECT_NE(strStage.find(row.strStage), std::string::npos) << strStage;
        EXPECT_EQ(outcome.strErr, "qrmctl: " + result["error"].asString() + '\n');
        EXPECT_NE(outcome.strErr.find('\'' + strStage + '\''), std::string::npos);
        EXPECT_NE(outcome.strErr.find(row.szRemedy), std::string::npos) << outcome.strErr;
        s_pServer->ForgetAnswers();
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
    const HeldStore store;
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
    const struct {
        char fd;
        std::size_t cbFree;
        std::string strKey;
        bool blJson;  // whether the deadline is the JSON object
    } rows[] = {{'2', 0, "none", true}, {'2', kPage, strLong, true}, {'1', 0, "key", false}};
    for (const auto &row : rows) {
        SCOPED_TRACE(row.strKey.substr(0, 4) + row.fd);
        const FullPipe full(row.cbFree);
        const std::string strCommand =
            std::string(R"(exec "$0" "$@" )") + row.fd + ">" + FullPipe::kPipe;
        const run_program::Outcome outcome =
            run_program::Run({"/bin/sh", "-c", strCommand, QRMCTL, "info", "get", row.strKey,
                              "--json", "--deadline", "0.4"});
        EXPECT_EQ(outcome.status, 5);
        Json::Value result;
        EXPECT_EQ(json_text::FromString(outcome.strOut, result), row.blJson) << outcome.strOut;
        EXPECT_EQ(result["error_id"] == "deadline", row.blJson);
        EXPECT_EQ(outcome.strErr.find("qrmctl: the deadline") == 0, !row.blJson) << outcome.strErr;
        EXPECT_EQ(full.Text().find("deadline"), std::string::npos);
    }
}

TEST_F(Deadline, LeavesAloneWhatItDidNotStart) {
    const HeldStore store;
    EXPECT_EQ(run_program::Run(
                  {"/bin/sh", "-c",
                   R"(sleep 600 & echo $! > /tmp/pid; exec "$0" status --deadline 0.4)", QRMCTL})
                  .status,
              5);
    int pid = 0;
    std::istringstream(FileText("/tmp/pid")) >> pid;
    ASSERT_GT(pid, 0);
    EXPECT_EQ(YLIBCProcAlive(pid), 1);
    kill(pid, SIGKILL);
    fs::remove("/tmp/pid");
}

}  // namespace
