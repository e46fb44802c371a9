// The deadline of qrmctl: what the program may be blocked in, and what it leaves when it strikes.

#include <shadow.h>
#include <sqlite3.h>

#include <sstream>

#include "file_lock.h"
#include "joined.h"
#include "json_text.h"
#include "process.h"
#include "run_program.h"

DevServerProcess *joined::Joined::s_pServer = nullptr;

namespace {

using joined::FileText;
using Arguments = std::vector<std::string>;
namespace fs = std::filesystem;

constexpr const char *kDaemonScript = "/usr/zelo/etc/rc.d/S99zelocache.sh";
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

// The cache daemon's script, which does not come back and tells its process id.
class HangingScript {
  public:
    HangingScript() : m_strBefore(FileText(kDaemonScript)) {
        std::ofstream(kDaemonScript) << "#!/bin/sh\necho $$ > /tmp/pid\nexec sleep 600\n";
    }
    ~HangingScript() {
        std::ofstream(kDaemonScript) << m_strBefore;
        int pid = 0;
        std::istringstream(FileText("/tmp/pid")) >> pid;
        EXPECT_GT(pid, 0);
        EXPECT_TRUE(run_program::Until([pid] { return YLIBCProcAlive(pid) == 0; }))
            << "what was started does not outlive the deadline";
        fs::remove("/tmp/pid");
    }
    HangingScript(const HangingScript &) = delete;
    HangingScript &operator=(const HangingScript &) = delete;

  private:
    std::string m_strBefore;
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
    const Hold script = [] { return std::make_shared<HangingScript>(); };
    const Hold accounts = [] { return std::make_shared<HeldAccounts>(); };
    const auto lock = [](const char *szPath) -> Hold {
        return [szPath] { return std::make_shared<HeldLock>(szPath); };
    };
    const std::string strServer = "localhost:" + std::to_string(s_pServer->HttpsPort());
    const std::string strPort = std::to_string(s_pServer->HttpsPort());
    const char *szJudging = "judging the membership";
    const char *szTurn = "waiting for another program";
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
        {{"status"}, store, szJudging, ""},
        {{"status", "--explain"}, store, szJudging, ""},
        {{"status", "--explain"}, script, "cache daemon", ""},
        {{"doctor"}, silence, strServer, ""},
        {{"doctor"}, store, "", ""},
        {{"support", "/tmp/files/archive"}, silence, "qrmctl doctor", ""},
        {{"support", "/tmp/files/archive"}, script, "qrmctl status", ""},
        {{"account", "create"}, accounts, "service account", "qrmctl leave"},
        {{"leave"}, lock("/tmp/qrmctl.membership.lock"), szTurn, "qrmctl leave"},
        {{"leave"}, store, "credential store", "qrmctl leave"},
        {{"info", "set", "key", "value"}, lock("/tmp/qrm_client.info.lock"), "client info", ""},
        {{"idle", "set", "5"}, lock("/tmp/qrm_idle_time.lock"), "idle time", "idle get"},
        {{"credential", "show"}, store, "credential store", ""}};
    for (const auto &row : rows) {
        SCOPED_TRACE(testing::PrintToString(row.arguments));
        const std::shared_ptr<void> held = row.hold();
        Arguments command = row.arguments;
        command.insert(command.begin(), QRMCTL);
        command.insert(command.end(), {"--deadline", "0.5", "--json"});
        const auto begin = std::chrono::steady_clock::now();
        const run_program::Outcome outcome = run_program::Run(command);
        EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(2));
        EXPECT_EQ(outcome.status, 5) << outcome.strErr;
        Json::Value result;
        EXPECT_TRUE(json_text::FromString(outcome.strOut, result)) << outcome.strOut;
        EXPECT_EQ(result["error_id"], "deadline");
        const std::string strStage = result["stage"].asString();
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
    const HangingScript script;
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EQ(run_program::Run({QRMCTL, "status", "--explain"}).status, 5);
    EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::seconds(10));
}

}  // namespace
