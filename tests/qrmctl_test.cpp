// qrmctl as its user runs it, against the development server and the box's own store.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <ctime>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "dev_server_process.h"
#include "json_text.h"
#include "run_program.h"
#include "stored.h"

namespace {

using run_program::Outcome;
using Arguments = std::vector<std::string>;

constexpr const char *kToken = "s3cret-0123456789";
constexpr const char *kApi = "ZELO.QRM.RPC";
constexpr const char *kBefore = "https://before:443 {\"sn\":7,\"x\":1} token=t csrf=c";

void Write(const std::string &strFile, const std::string &strText) {
    std::ofstream(strFile) << strText;
}

bool Holds(const std::string &strText, const std::string &strPart) {
    return strText.find(strPart) != std::string::npos;
}

Arguments operator+(Arguments left, const Arguments &right) {
    left.insert(left.end(), right.begin(), right.end());
    return left;
}

class Qrmctl : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        devserver::Options options;
        options.token = kToken;
        s_pServer = new DevServerProcess(options);
        std::string strReason;
        ASSERT_TRUE(s_pServer->Start(strReason)) << strReason;
        s_strHttp = std::to_string(s_pServer->HttpPort());
        s_strHttps = std::to_string(s_pServer->HttpsPort());
        Write("/usr/zelo/etc/ssl/ca.d/server.pem", s_pServer->CaPem());
        std::filesystem::current_path("/tmp");
        Write("token", std::string(kToken) + '\n');
        Write("wrong", std::string(kToken) + 'x');
        Write("plain", List(s_strHttp, "0"));
    }
    static void TearDownTestSuite() {
        Run({"leave"});
        delete s_pServer;
        s_pServer = nullptr;
    }
    void SetUp() override {
        stored::Clear();
        s_pServer->ForgetRequests();
    }

    // Whatever it says, the token is not in it.
    static Outcome Run(const Arguments &arguments, const std::string &strInput = {}) {
        Outcome outcome = run_program::Run(Arguments{QRMCTL} + arguments, strInput);
        EXPECT_FALSE(Holds(outcome.strOut + outcome.strErr, kToken));
        return outcome;
    }
    // For a program: standard output is one line with one JSON object.
    static Json::Value RunForJson(const Arguments &arguments, int status,
                                  const std::string &strInput = {}) {
        const Outcome outcome = Run(arguments + Arguments{"--json"}, strInput);
        EXPECT_EQ(outcome.status, status) << outcome.strErr;
        EXPECT_EQ(outcome.strOut.find('\n') + 1, outcome.strOut.size()) << outcome.strOut;
        Json::Value result;
        EXPECT_TRUE(json_text::FromString(outcome.strOut, result));
        EXPECT_EQ(json_text::Member(result, "success"), status != 1 && status != 2)
            << outcome.strOut;
        return result;
    }
    static void StoreBefore() {
        stored::AddSession(stored::AddCredential("ZELO.QRM", "before", R"({"sn":7,"x":1})"), "t",
                           "c");
    }
    // A candidate list whose second entry cannot be used.
    static std::string List(const std::string &strHttpPort, const std::string &strHttpsPort) {
        return R"([{"host":"localhost","http_port":)" + strHttpPort + R"(,"https_port":)" +
               strHttpsPort + "}, {\"host\":5}]";
    }
    static Arguments Join(const std::string &strHttpPort, const std::string &strHttpsPort,
                          const std::string &strTokenFile = "token") {
        return {"join",         "--server",   "localhost",    "--http-port", strHttpPort,
                "--https-port", strHttpsPort, "--token-file", strTokenFile};
    }
    // All requests so far, such as "https:discover https:join ". The connection is tested once for
    // the user and once by the library's join; that counts as one.
    static std::string Requests() {
        std::string strAll;
        for (const Json::Value &request : s_pServer->Requests()) {
            const std::string strOne =
                request["scheme"].asString() + ':' + request["api_method"].asString() + ' ';
            strAll += Holds(strAll, strOne) ? "" : strOne;
        }
        return strAll;
    }

    static DevServerProcess *s_pServer;
    static std::string s_strHttp;
    static std::string s_strHttps;
};

DevServerProcess *Qrmctl::s_pServer = nullptr;
std::string Qrmctl::s_strHttp;
std::string Qrmctl::s_strHttps;

TEST_F(Qrmctl, WrongUsageIsToldToPeopleAndPrograms) {
    const struct {
        Arguments arguments;
        const char *szNamed;
    } rows[] = {{{}, "'qrmctl' needs a command;"},
                {{"credential"}, "needs a command: show, create, update, delete;"},
                {{"jion"}, "jion"},
                {{"credential", "shwo"}, "shwo"},
                {{"credential", "show", "surplus"}, "surplus"},
                {{"credential", "create"}, "FILE"},
                {{"test-connection", "c.json"}, "--api"},
                {{"join", "--sever", "h"}, "--sever"},
                {Join("65536", "1"), "65536"},
                {Join("0", "https"), "https"},
                {{"join", "--server", "", "--http-port", "0"}, "--server"},
                {Join("0", "1") + Arguments{"--sn", ""}, "--sn: it is empty"},
                {{"call", "a", "b", "--params", ""}, "--params: it is empty"},
                {{"info", "set", "", "c"}, "KEY: it is empty"},
                {{"call", "a", "b", "--version", "-1"}, "range 1 to 2147483647"},
                {{"call", "a", "b", "--version", "99999999999999"}, "range 1 to 2147483647"},
                {{"doctor", "--server", "https://h", "--http-port", "0", "--https-port", "1"},
                 "leave out 'https://'"},
                {{std::string(100'000, 'x')}, "xxx...' is no command"}};
    for (const auto &row : rows) {
        const Outcome outcome = Run(row.arguments);
        EXPECT_EQ(outcome.status, 2);
        EXPECT_EQ(outcome.strOut, "");
        EXPECT_TRUE(Holds(outcome.strErr, row.szNamed)) << outcome.strErr;
        const Json::Value result = RunForJson(row.arguments, 2);
        EXPECT_EQ(result["error_id"], "usage");
        EXPECT_EQ(outcome.strErr, "qrmctl: " + result["error"].asString() + '\n');
    }
}

TEST_F(Qrmctl, AMisspeltWordIsToldWithTheOneThatWasMeant) {
    const struct {
        Arguments arguments;
        const char *szSaid;
    } rows[] = {{{"stats"}, "'stats' is no command of 'qrmctl'; did you mean 'status'?"},
                {{"jion"}, "did you mean 'join'?"},
                {{"--jsno", "status"}, "'--jsno' is no option of 'qrmctl'; did you mean '--json'?"},
                {{"cred"}, "did you mean 'credential'?"},
                {{"credential", "shwo"}, "of 'qrmctl credential'; did you mean 'show'?"},
                {{"join", "--sever=h"}, "of 'qrmctl join'; did you mean '--server'?"},
                {{"credential", "show", "--with"}, "did you mean '--with-token'?"},
                {{"xq"}, "'xq' is no command of 'qrmctl'; 'qrmctl --help'"},
                {{"status", "-x"}, "'-x' is no option of 'qrmctl status'; 'qrmctl --help'"},
                {{"leave", "now"}, "'now' is one argument too many"}};
    for (const auto &row : rows) {
        const Outcome outcome = Run(row.arguments);
        EXPECT_EQ(outcome.status, 2);
        EXPECT_TRUE(Holds(outcome.strErr, row.szSaid)) << outcome.strErr;
    }
}

// How many lines a command's help has; none is wider than a screen.
int HelpLines(Arguments command) {
    command.insert(command.begin(), QRMCTL);
    command.emplace_back("--help");
    std::istringstream help(run_program::Run(command).strOut);
    int lines = 0;
    for (std::string strLine; std::getline(help, strLine); ++lines) {
        EXPECT_LE(strLine.size(), 80U) << strLine;
    }
    return lines;
}

TEST_F(Qrmctl, HelpFitsAScreen) {
    const int lines = HelpLines({});
    EXPECT_LE(lines, 24);
    EXPECT_GT(lines, 15) << "every command is in it";
    for (const char *szCommand : {"join", "call", "log", "credential", "get-file"}) {
        EXPECT_GT(HelpLines({szCommand}), 5);
    }
}

TEST_F(Qrmctl, UnusableInputFailsBeforeAnythingIsSentOrStored) {
    StoreBefore();
    const std::string strCred =
        R"({"protocol":"https","host":"h","application":"ZELO.QRM","access_token":")";
    const Arguments join = Join("0", s_strHttps, "in");
    const Arguments candidates = Join("0", s_strHttps) + Arguments{"--candidates", "in"};
    const Arguments test = {"test-connection", "--api", kApi, "in"};
    const Arguments create = {"credential", "create", "in"};
    const auto call = [](const std::string &strParams) {
        return Arguments{"call", kApi, "info", "--params", strParams};
    };
    const Arguments update = {"credential", "update", "in"};
    const struct {
        Arguments arguments;
        std::string strFile;  // what the file "in" holds; "-" when there is none
        const char *szSaid;
    } rows[] = {
        {join, "-", "'in': No such file or directory; name a file"},
        {join, "\n", "'in': it is empty; write the access token into it"},
        {join, "one\ntwo\n", "on one line"},
        {join, std::string(1024, 'a'), "at most 1023 bytes"},
        {Join("0", s_strHttps, "."), "", "'.': Is a directory; name a file"},
        {test, "-", "name a file"},
        {test, "[{\"host\":\n]", "'in': Line 2"},
        {test, "{}", "an array"},
        {test, std::string(5000, '['), "nested too deeply"},
        {candidates, "-", "name a file"},
        {candidates, "[]", "it is empty"},
        {candidates, "[{}] {}", "something follows the end"},
        {call(R"({"a":1} trailing)"), "-", "something follows the end"},
        {call(R"({"a":1}})"), "-", "something follows the end"},
        {call("@in"), "-", "or @- for standard input"},
        {call("x" + std::string(100'000, 'a')), "-", "aaa...'"},
        {create, "", "'in': Line 1"},
        {create, "[]", "an object"},
        {create, strCred + R"(t","port":"443"})", "\"port\" has to be an integer"},
        {create, strCred + std::string(1024, 'a') + R"(","port":443})", "at most 1023 bytes"},
        {update, "{}", "\"application\" has to be a text"},
        {update, R"({"application":"Other","host":"h"})", "'Other'"},
        {update, R"({"application":"ZELO.QRM","host":[]})", "\"host\" has to be a text"},
    };
    for (const auto &row : rows) {
        std::filesystem::remove("in");
        if (row.strFile != "-") {
            Write("in", row.strFile);
        }
        const Outcome outcome = Run(row.arguments);
        EXPECT_EQ(outcome.status, 1);
        EXPECT_EQ(outcome.strOut, "");
        EXPECT_TRUE(Holds(outcome.strErr, row.szSaid)) << outcome.strErr;
        const std::string strError = RunForJson(row.arguments, 1)["error"].asString();
        EXPECT_EQ(outcome.strErr, "qrmctl: " + strError + '\n');
    }
    EXPECT_EQ(Requests(), "");
    EXPECT_EQ(stored::Describe(), kBefore);
}

TEST_F(Qrmctl, ConnectionTestNamesTheConnectionAndWhatItPassedOver) {
    const std::string strList = List(s_strHttp, s_strHttps);
    const Outcome outcome = Run({"test-connection", "--api", kApi, "-"}, strList);
    EXPECT_EQ(outcome.status, 0);
    EXPECT_EQ(outcome.strOut, "protocol: https\nhost: localhost\nport: " + s_strHttps + '\n');
    EXPECT_TRUE(Holds(outcome.strErr, "candidate 2 of '-'")) << outcome.strErr;
    EXPECT_TRUE(RunForJson({"test-connection", "--api", kApi, "-"}, 0, strList)["warnings"].size());

    const Arguments unknown = {"test-connection", "--api", "ZELO.Unknown", "-"};
    const char *szReason = "does not serve the Web API";
    EXPECT_FALSE(Holds(Run(unknown, strList).strErr, szReason));
    const Outcome verbose = Run(unknown + Arguments{"-v"}, strList);
    EXPECT_EQ(verbose.status, 1);
    EXPECT_TRUE(Holds(verbose.strErr, szReason)) << verbose.strErr;
}

TEST_F(Qrmctl, AJoinIsStoredWholeOrNotAtAll) {
    const std::string strRest = std::string(" {\"sn\":\"SN1\"} token=") + kToken;
    const std::string strSecure = "https://localhost:" + s_strHttps + strRest;
    const std::string strPlain = "http://localhost:" + s_strHttp + strRest;
    const char *szSecure = "https:discover https:join ";
    const char *szPlain = "http:discover http:join ";
    const Arguments plainFirst = {"--candidates", "plain"};
    const Arguments allow = {"--allow-http"};
    const struct {
        Arguments arguments;
        const char *szSaid;     // when it fails
        std::string strStored;  // when it succeeds; without the csrf token
        const char *szRequests;
    } rows[] = {
        {Join(s_strHttp, s_strHttps), "", strSecure, szSecure},
        {Join("0", s_strHttps, "wrong"), "(wrong-token); check token", "", szSecure},
        {Join("0", "1"), "nothing was changed", "", ""},
        {Join(s_strHttp, "0"), "--allow-http", "", ""},
        {Join(s_strHttp, s_strHttp), "check address", "", ""},
        {Join("0", s_strHttps) + plainFirst, "", strSecure, szSecure},
        {Join(s_strHttp, "0") + allow, "", strPlain, szPlain},
        {Join("0", s_strHttps) + plainFirst + allow, "", strPlain, szPlain},
    };
    for (const auto &row : rows) {
        for (const bool blBefore : {false, true}) {
            SCOPED_TRACE(testing::PrintToString(row.arguments) + (blBefore ? " joined" : ""));
            SetUp();
            if (blBefore) {
                StoreBefore();
            }
            const bool blJoins = !row.strStored.empty();
            const Outcome outcome = Run(row.arguments + Arguments{"-v", "--sn", "SN1"});
            EXPECT_EQ(outcome.status, blJoins ? 0 : 1);
            EXPECT_TRUE(Holds(outcome.strErr, row.szSaid)) << outcome.strErr;
            EXPECT_EQ(Holds(outcome.strOut, "\nsn: SN1\nJoined."), blJoins) << outcome.strOut;
            EXPECT_EQ(Requests(), row.szRequests);
            // What was stored before goes when a server has answered.
            const bool blKept = blBefore && Requests().empty();
            EXPECT_EQ(stored::Describe(),
                      blJoins ? row.strStored + " csrf=?" : std::string(blKept ? kBefore : ""));
            EXPECT_EQ(Run({"status"}).status, blJoins ? 0 : blKept ? 4 : 3);
            Run({"leave"});
        }
    }
}

TEST_F(Qrmctl, JoinTellsTheServerWhoTheApplianceIs) {
    std::string strSerial;
    std::getline(std::ifstream("/etc.defaults/serial_number"), strSerial);
    ASSERT_FALSE(strSerial.empty());
    for (const auto &[strId, id] : {std::pair<std::string, Json::Value>("7", 7), {"007", "007"}}) {
        const Arguments join = Join("0", s_strHttps, "-") + Arguments{"--id", strId, "--again"};
        EXPECT_EQ(RunForJson(join, 0, kToken)["sn"], strSerial);
        const Json::Value clients = s_pServer->Clients();
        const Json::Value &description = clients[clients.size() - 1]["description"];
        EXPECT_EQ(description["sn"], strSerial);
        EXPECT_EQ(description["id"], id);
    }
}

TEST_F(Qrmctl, PluginsCanBeTriedWithoutLeaving) {
    EXPECT_EQ(RunForJson({"plugins", "run", "disjoin", "PRE"}, 0)["result"], 0);
    EXPECT_EQ(RunForJson({"plugins", "run", "disjoin", "POST"}, 0)["result"], 0);
}

TEST_F(Qrmctl, TwoJoinsAtOnceMakeOneMembership) {
    run_program::Program first(Arguments{QRMCTL} + Join("0", s_strHttps));
    run_program::Program second(Arguments{QRMCTL} + Join("0", s_strHttps));
    EXPECT_EQ(first.Wait().status, 0);
    EXPECT_EQ(second.Wait().status, 0);
    EXPECT_EQ(Run({"status"}).status, 0);
}

TEST_F(Qrmctl, ADamagedStoreIsSetAsideByLeavingAndJoiningAlone) {
    const auto read = [] {
        std::ifstream file(stored::kDatabase, std::ios::binary);
        return std::string(std::istreambuf_iterator<char>(file), {});
    };
    const Arguments joinAgain = Join("0", s_strHttps);
    const struct {
        const char *szDamage;
        std::function<std::string(std::string)> damage;
        Arguments mend;
    } rows[] = {
        {"text", [](const std::string &) { return std::string(5000, 'x'); }, {"leave"}},
        {"another format", [](std::string strFile) { return strFile.replace(60, 4, 4, '\7'); },
         joinAgain},
        {"cut", [](const std::string &strFile) { return strFile.substr(0, 4096); }, {"leave"}},
        {"a page", [](std::string strFile) { return strFile.replace(4096, 4096, 4096, '\x55'); },
         joinAgain}};
    std::size_t cAside = 0;
    for (const auto &row : rows) {
        SCOPED_TRACE(row.szDamage);
        ASSERT_EQ(Run(joinAgain).status, 0);
        const std::string strDamaged = row.damage(read());
        Write(stored::kDatabase, strDamaged);
        Write(std::string(stored::kDatabase) + "-shm", "beside it");
        for (const Arguments &arguments : {Arguments{"status"},
                                           {"status", "--explain"},
                                           {"credential", "show"},
                                           {"call", kApi, "info"}}) {
            Run(arguments);
            EXPECT_EQ(read(), strDamaged) << "reading leaves it as it is";
        }
        const Outcome explained = Run({"status", "--explain"});
        EXPECT_EQ(explained.status, 4);
        EXPECT_TRUE(Holds(explained.strOut, "qrmctl leave, which sets the store aside"));
        EXPECT_FALSE(Holds(explained.strOut, "sets it aside agrees"));
        for (const Arguments &arguments :
             {Arguments{"call", kApi, "info"}, {"credential", "delete"}}) {
            EXPECT_EQ(RunForJson(arguments, 1)["error_id"], "store-damaged");
        }
        EXPECT_EQ(read(), strDamaged);

        const Json::Value mended = RunForJson(row.mend, 0);
        const std::string strAside = mended["set_aside"].asString();
        EXPECT_EQ(strAside.rfind(std::string(stored::kDatabase) + ".damaged-2", 0), 0U) << strAside;
        EXPECT_TRUE(std::filesystem::exists(strAside + "-shm"));
        EXPECT_FALSE(std::filesystem::exists(std::string(stored::kDatabase) + "-shm"));
        std::ifstream aside(strAside, std::ios::binary);
        EXPECT_EQ(std::string(std::istreambuf_iterator<char>(aside), {}), strDamaged);
        EXPECT_EQ(
            RunForJson({"status", "--explain"}, row.mend == joinAgain ? 0 : 3)["set_aside"].size(),
            ++cAside);
        EXPECT_EQ(Run(joinAgain).status, 0);
        EXPECT_EQ(Run({"leave"}).status, 0);
    }

    // Others have taken the names of the next seconds, and a move has broken off after the journal.
    const std::string strBegin = std::string(stored::kDatabase) + ".damaged-";
    Write(strBegin + "20200101T000000Z-journal", "alone");
    std::size_t cTaken = 0;
    for (int i = 0; i < 20; ++i) {
        const std::time_t second = std::time(nullptr) + i;
        char sz[32] = {};
        std::strftime(sz, sizeof(sz), "%Y%m%dT%H%M%SZ", std::gmtime(&second));
        // The latest of the rows above may have the name of this second.
        cTaken += std::filesystem::exists(strBegin + sz) ? 0 : 1;
        Write(strBegin + sz, "another's");
    }
    Write(stored::kDatabase, std::string(5000, 'x'));
    Write(std::string(stored::kDatabase) + "-shm", "beside it");
    const std::string strAside = RunForJson({"leave"}, 0)["set_aside"].asString();
    EXPECT_TRUE(Holds(strAside, "Z.")) << strAside;
    EXPECT_TRUE(std::filesystem::exists(strAside + "-shm"));
    EXPECT_EQ(RunForJson({"status", "--explain"}, 3)["set_aside"].size(), cAside + cTaken + 2);
}

TEST_F(Qrmctl, ADamagedWebSessionStoreIsNoDeadEnd) {
    constexpr const char *kSessions = "/usr/zelo/etc/sessions/sessions.db";
    const auto read = [](const std::string &strFile) {
        std::ifstream file(strFile, std::ios::binary);
        return std::string(std::istreambuf_iterator<char>(file), {});
    };
    const auto inSchema = [](const std::string &strFile) { return strFile.find("CREATE TABLE"); };
    const struct {
        const char *szDamage;
        std::function<std::string(std::string)> damage;
        bool blSetAside;
    } rows[] = {
        {"text", [](const std::string &) { return std::string("no database"); }, true},
        {"cut", [](const std::string &strFile) { return strFile.substr(0, 4000); }, true},
        {"the schema",
         [&](std::string strFile) { return strFile.replace(inSchema(strFile), 6, "CREASE"); },
         true},
        {"empty", [](const std::string &) { return std::string(); }, false}};
    const Arguments join = Join("0", s_strHttps);
    for (const auto &row : rows) {
        for (const Arguments &mend : {Arguments{"leave"}, join}) {
            SCOPED_TRACE(row.szDamage + (' ' + mend.front()));
            ASSERT_EQ(Run(join).status, 0);
            const std::string strDamaged = row.damage(read(kSessions));
            Write(kSessions, strDamaged);
            const Outcome explained = Run({"status", "--explain"});
            EXPECT_EQ(explained.status, 4);
            EXPECT_EQ(Holds(explained.strOut, "qrmctl leave, which sets the store aside"),
                      row.blSetAside)
                << explained.strOut;
            EXPECT_EQ(read(kSessions), strDamaged) << "reading leaves it as it is";

            const Json::Value mended = RunForJson(mend, 0);
            EXPECT_EQ(mended.isMember("sessions_set_aside"), row.blSetAside);
            const std::string strAside = mended["sessions_set_aside"].asString();
            EXPECT_EQ(read(strAside), strDamaged);
            EXPECT_TRUE(Holds(mended["warnings"].toStyledString(), strAside));
            EXPECT_EQ(Run({"status"}).status, mend == join ? 0 : 3);
        }
    }

    // What is no damage stays, and nothing is left or joined.
    ASSERT_EQ(Run(join).status, 0);
    const std::string strKept = std::string(kSessions) + ".kept";
    std::filesystem::rename(kSessions, strKept);
    std::filesystem::create_directory(kSessions);
    for (const Arguments &arguments : {Arguments{"leave"}, join}) {
        const Json::Value failed = RunForJson(arguments, 1);
        EXPECT_EQ(failed["error_id"], "store-unreadable");
        EXPECT_TRUE(Holds(failed["error"].asString(), kSessions));
    }
    std::filesystem::remove(kSessions);
    std::filesystem::rename(strKept, kSessions);
    // SQLite's own locks: no other process may begin to read.
    struct flock lock = {};
    lock.l_type = F_WRLCK;
    lock.l_start = 0x40000000;
    lock.l_len = 512;
    const int database = open(kSessions, O_RDWR | O_CLOEXEC);
    ASSERT_EQ(fcntl(database, F_SETLK, &lock), 0);
    EXPECT_TRUE(Holds(RunForJson({"leave"}, 1)["error"].asString(), "keeps it locked"));
    ASSERT_EQ(close(database), 0);
    EXPECT_EQ(Run({"status"}).status, 0);
}

TEST_F(Qrmctl, LeavingTellsWhatItCannotUndo) {
    EXPECT_EQ(Run(Join("0", s_strHttps) + Arguments{"--sn", "SN7"}).status, 0);
    const Outcome outcome = Run({"leave"});
    EXPECT_TRUE(Holds(outcome.strOut, "localhost:" + s_strHttps)) << outcome.strOut;
    EXPECT_TRUE(Holds(outcome.strOut, "'SN7'")) << outcome.strOut;
    EXPECT_EQ(RunForJson({"leave"}, 0)["entry_remains"], false);

    // The server is gone.
    const long id = stored::AddCredential("ZELO.QRM", "203.0.113.1", R"({"sn":"SN8"})");
    stored::AddSession(id, "t");
    const Json::Value left = RunForJson({"leave", "--deadline", "5"}, 0);
    EXPECT_EQ(left["server"]["host"], "203.0.113.1");
    EXPECT_EQ(left["server"]["port"], 443);
    EXPECT_EQ(left["server"]["sn"], "SN8");
    EXPECT_EQ(left["entry_remains"], true);

    // Nothing is known of the server, and yet what to look for.
    const Json::Value joined = RunForJson(Join("0", s_strHttps), 0);
    Write(stored::kDatabase, std::string(5000, 'x'));
    const Json::Value lost = RunForJson({"leave"}, 0);
    EXPECT_TRUE(lost["server"]["host"].isNull());
    EXPECT_EQ(lost["server"]["own_sn"], joined["sn"]);
}

TEST_F(Qrmctl, AStoreThatCannotBeReadNowIsNoReasonToLeave) {
    ASSERT_EQ(Run(Join("0", s_strHttps)).status, 0);
    const std::string strKept = std::string(stored::kDatabase) + ".kept";
    std::filesystem::rename(stored::kDatabase, strKept);
    std::filesystem::create_directory(stored::kDatabase);
    const Json::Value indicators = RunForJson({"status", "--explain"}, 4)["indicators"];
    for (const Json::ArrayIndex i : {1U, 2U}) {
        EXPECT_TRUE(indicators[i]["rule"].isNull());
        EXPECT_TRUE(Holds(indicators[i]["holds"].asString(), "cannot be read now"));
        EXPECT_FALSE(Holds(indicators[i]["remedy"].asString(), "leave"));
    }
    std::filesystem::remove(stored::kDatabase);
    std::filesystem::rename(strKept, stored::kDatabase);
    EXPECT_EQ(Run({"status"}).status, 0);
    EXPECT_EQ(Run({"leave"}).status, 0);
}

TEST_F(Qrmctl, TheNextJoinClearsAwayAKilledOne) {
    devserver::NextAnswer late;
    late.method = "join";
    late.delay_ms = 600'000;
    s_pServer->AnswerNext(kApi, late);
    run_program::Program program(Arguments{QRMCTL} + Join("0", s_strHttps));
    ASSERT_TRUE(run_program::Until([] { return Holds(Requests(), "join"); }));
    program.Signal(SIGKILL);
    EXPECT_EQ(program.Wait().status, -SIGKILL);
    EXPECT_EQ(Run({"status"}).status, 4);

    EXPECT_FALSE(RunForJson(Join("0", s_strHttps), 0)["was_joined"].asBool());
    EXPECT_FALSE(RunForJson({"credential", "delete"}, 0).isMember("warnings"))
        << "the next join leaves one credential";
}

TEST_F(Qrmctl, AJoinedApplianceJoinsAnewOnlyWhenTold) {
    EXPECT_EQ(Run(Join("0", s_strHttps)).status, 0);
    s_pServer->ForgetRequests();
    const Outcome outcome = Run(Join("0", s_strHttps));
    EXPECT_EQ(outcome.status, 0);
    EXPECT_TRUE(Holds(outcome.strOut, "joined already")) << outcome.strOut;
    EXPECT_EQ(Requests(), "https:discover ");
    s_pServer->ForgetRequests();
    const Json::Value other = RunForJson(Join("0", s_strHttp), 1);
    EXPECT_EQ(other["error_id"], "joined-elsewhere");
    EXPECT_TRUE(Holds(other["error"].asString(), "localhost:" + s_strHttps));
    EXPECT_EQ(Requests(), "") << "it is told before anything is asked";
    std::filesystem::rename("/etc.defaults/VERSION", "/etc.defaults/away");
    EXPECT_EQ(RunForJson(Join("0", s_strHttps) + Arguments{"--again"}, 1)["error_id"],
              "fact-missing");
    std::filesystem::rename("/etc.defaults/away", "/etc.defaults/VERSION");
    EXPECT_EQ(Run({"status"}).status, 0) << "the old membership stays";
    EXPECT_TRUE(RunForJson(Join("0", s_strHttps) + Arguments{"--again"}, 0)["was_joined"].asBool());
    EXPECT_TRUE(Holds(Requests(), "join"));
}

TEST_F(Qrmctl, MembershipCommandsTellTheStateByTheirExitStatus) {
    EXPECT_EQ(Run(Join("0", s_strHttps)).status, 0);
    EXPECT_EQ(Run({"status"}).strOut, "status: joined\n");
    EXPECT_EQ(Run({"account", "delete"}).status, 0);
    EXPECT_EQ(Run({"status"}).status, 4);
    const Json::Value indicators = RunForJson({"status", "--explain"}, 4)["indicators"];
    EXPECT_EQ(indicators.size(), 6U);
    EXPECT_EQ(indicators[5]["rule"], 9);
    EXPECT_EQ(indicators[5]["remedy"], "qrmctl account create");
    EXPECT_EQ(Run({"account", "create"}).status, 0);
    EXPECT_EQ(Run({"status"}).status, 0) << "the remedy mends it";
    EXPECT_TRUE(RunForJson({"leave"}, 0)["was_joined"].asBool());
    EXPECT_FALSE(RunForJson({"leave"}, 0)["was_joined"].asBool());
    EXPECT_EQ(Run({"status"}).status, 3);
    EXPECT_EQ(Run({"welcome", "hide", "nobody-here"}).status, 1);
}

TEST_F(Qrmctl, CredentialCommandsSayWhatIsInForce) {
    const Arguments show = {"credential", "show"};
    const Arguments withToken = {"credential", "show", "--with-token"};
    const Arguments create = {"credential", "create", "-"};
    const std::string strRest =
        R"(","protocol":"https","port":443,"application":"ZELO.QRM","access_token":"t0"})";
    EXPECT_TRUE(Holds(RunForJson(show, 1)["error"].asString(), "join first"));
    for (const char *szFlawed : {R"("port":0)", R"("port":65536)", R"("host":"")",
                                 R"("protocol":"ftp")", R"("hots":"h")"}) {
        const std::string strFlawed = R"({"application":"ZELO.QRM",)" + std::string(szFlawed) + '}';
        EXPECT_EQ(RunForJson({"credential", "update", "-"}, 1, strFlawed)["error_id"], "bad-input")
            << szFlawed;
    }

    EXPECT_EQ(Run(create, R"({"host":"one\u001b)" + strRest).status, 0);
    EXPECT_EQ(Run(show).strOut, "protocol: https\nhost: one\\x1B\nport: 443\n");
    EXPECT_EQ(Run({"--json", "credential", "show"}).strOut, Run(show + Arguments{"--json"}).strOut);
    EXPECT_FALSE(RunForJson(show, 0).isMember("access_token"));
    EXPECT_TRUE(Holds(Run(withToken).strOut, "access_token: t0\n"));
    EXPECT_EQ(RunForJson(withToken, 0)["access_token"], "t0");

    EXPECT_TRUE(RunForJson(create, 0, R"({"host":"two)" + strRest).isMember("warnings"));
    EXPECT_EQ(Run({"credential", "update", "-"}, R"({"application":"ZELO.QRM","port":8443,"sn":9})")
                  .status,
              0);
    EXPECT_EQ(stored::Describe(), "https://one\x1b:8443 {\"sn\":9} token=t0 csrf=?");

    EXPECT_TRUE(RunForJson({"credential", "delete"}, 0).isMember("warnings"));
    EXPECT_EQ(RunForJson(show, 0)["host"], "two");
    EXPECT_EQ(Run({"credential", "delete"}).strOut, "No server credential is stored any more.\n");
    EXPECT_EQ(Run(show).status, 1);
}

}  // namespace
