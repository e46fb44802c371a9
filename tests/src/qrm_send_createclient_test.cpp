// Finding a connection and joining, over real HTTPS against the development server.

#include <chrono>
#include <cstdlib>
#include <new>
#include <utility>

#include "joined.h"
#include "json.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

using namespace files;
using joined::Messages;
using torture::Expected;

constexpr const char *kFile = "qrm_send_createclient";
constexpr const char *kApi = "ZELO.QRM.RPC";
constexpr const char *kDefaults = "/etc.defaults/zeloinfo.conf";
constexpr const char *kVersion = "/etc.defaults/VERSION";
constexpr const char *kToken = "se/cr\"et-0123456789";

// The allocations of this thread, and which one of them fails, counted from 1.
thread_local int t_allocations = 0;
thread_local int t_failing = 0;

class Join : public joined::Joined {
  protected:
    static void SetUpTestSuite() { Serve(kToken); }
    void SetUp() override {
        WriteFile(kConfig, "admin_port=\"5000\"\nsecure_admin_port=\"5001\"\nrunHTTPS=\"yes\"\n");
        WriteFile(kDefaults, "upnpmodelname=\"NVO-918\"\n");
        WriteFile(kVersion,
                  "majorversion=\"6\"\nminorversion=\"2\"\nbuildnumber=\"123\"\n"
                  "smallfixnumber=\"4\"\n");
        stored::Clear();
        s_pServer->ForgetRequests();
    }

    static Json::Value Candidate(int httpPort, int httpsPort) {
        Json::Value candidate;
        candidate["host"] = "localhost";
        candidate["http_port"] = httpPort;
        candidate["https_port"] = httpsPort;
        return candidate;
    }
    static Json::Value JoinInfo() {
        Json::Value info;
        info["sn"] = "SN1";
        info["access_token"] = kToken;
        info["server_host"] = "localhost";
        info["server_http_port"] = s_pServer->HttpPort();
        info["server_https_port"] = s_pServer->HttpsPort();
        return info;
    }
    static std::string Stored(const char *szProtocol = "https") {
        const int port = szProtocol[4] == 's' ? s_pServer->HttpsPort() : s_pServer->HttpPort();
        return std::string(szProtocol) + "://localhost:" + std::to_string(port) + " ?";
    }
};

TEST_F(Join, TheFirstAnsweringConnectionWins) {
    const int http = s_pServer->HttpPort();
    const int https = s_pServer->HttpsPort();
    const auto with = [&](const char *szMember, const Json::Value &value) {
        Json::Value candidate = Candidate(http, https);
        candidate[szMember] = value;
        return candidate;
    };
    const std::string strHttps = "https " + std::to_string(https);
    const std::string strHttp = "http " + std::to_string(http);
    const std::tuple<const char *, std::vector<Json::Value>, std::string> rows[] = {
        {"secure before plain", {Candidate(http, https)}, strHttps},
        {"plain when the secure port is 0", {Candidate(http, 0)}, strHttp},
        {"plain when the secure attempt fails", {Candidate(http, http)}, strHttp},
        {"no plain attempt at port 0", {Candidate(0, http)}, ""},
        {"ports whose fraction is zero", {with("https_port", https + 0.0)}, strHttps},
        {"the earlier one", {Candidate(http, 0), Candidate(0, https)}, strHttp},
        {"a relay without a relay named falls back", {with("farlink_direct", true)}, strHttp},
        {"passed over, however usable the rest is",
         {with("host", ""), with("host", 5), with("host", std::string(2000, 'h')),
          with("host", "localhost/x?"), with("https_port", std::to_string(https)),
          with("http_port", http + 0.5), with("https_port", true),
          with("https_port", Json::Value()), with("http_port", -1), with("https_port", 65536),
          Json::Value(7), Json::Value()},
         ""},
        {"the good one behind bad ones", {with("host", 5), Candidate(0, https)}, strHttps},
    };
    for (const auto &[szFact, candidates, strWinner] : rows) {
        SCOPED_TRACE(szFact);
        Json::Value list(Json::arrayValue);
        for (const Json::Value &candidate : candidates) {
            list.append(candidate);
        }
        Json::Value out;
        out["own"] = 1;
        bool blFound = false;
        const seam::Outcome outcome =
            seam::Observe([&] { blFound = ZELOQRMClientTestConnect(list, kApi, out); });
        EXPECT_EQ(blFound, !strWinner.empty());
        EXPECT_TRUE(outcome.logs.empty());
        EXPECT_EQ(outcome.recordsLeft, 0);
        EXPECT_EQ(out.size(), blFound ? 4U : 1U);
        if (blFound) {
            EXPECT_EQ(out["protocol"].asString() + ' ' + out["port"].asString(), strWinner);
            EXPECT_EQ(out["host"], "localhost");
        }
    }
    Json::Value out;
    Json::Value object;
    object["a"] = 1;
    for (const Json::Value &list : {Json::Value(), Json::Value(Json::arrayValue), object}) {
        const seam::Outcome outcome =
            seam::Observe([&] { EXPECT_FALSE(ZELOQRMClientTestConnect(list, kApi, out)); });
        EXPECT_TRUE(outcome.calls.empty());
    }
    Json::Value list(Json::arrayValue);
    list.append(Candidate(http, https));
    EXPECT_FALSE(ZELOQRMClientTestConnect(list, "", out));
    EXPECT_FALSE(ZELOQRMClientTestConnect(list, "ZELO.Unknown", out));
    EXPECT_TRUE(out.isNull());
    // Any result of a setter but 0 ends the attempt.
    const std::pair<const char *, bool> faults[] = {{"ZELOCredItemSetHost", true},
                                                    {"ZELOCredItemSetProtocol", false},
                                                    {"ZELOCredItemSetHost", false},
                                                    {"ZELOCredItemSetPort", false},
                                                    {"GetWebAPIPath", false}};
    for (const auto &[szOperation, blForced] : faults) {
        const seam::Outcome outcome = seam::Observe({szOperation, 1, blForced, 1}, [&] {
            EXPECT_TRUE(ZELOQRMClientTestConnect(list, kApi, out));
        });
        EXPECT_EQ(out["protocol"], "http");
        EXPECT_TRUE(outcome.logs.empty() && outcome.recordsLeft == 0);
    }
    for (const char *szOperation : {"ZELOCredAlloc", "IsPort"}) {
        seam::Observe({szOperation},
                      [&] { EXPECT_FALSE(ZELOQRMClientTestConnect(list, kApi, out)); });
    }
}

TEST_F(Join, ShortMemoryLeavesTheWholeConnectionOrNothing) {
    Json::Value list(Json::arrayValue);
    list.append(Candidate(s_pServer->HttpPort(), s_pServer->HttpsPort()));
    int failures = 0;
    // The last allocations fill the output.
    for (int before = 0; before < 12; ++before) {
        Json::Value out;
        out["own"] = 1;
        const Json::Value own = out;
        Json::Value other = out;
        t_allocations = 0;
        EXPECT_TRUE(ZELOQRMClientTestConnect(list, kApi, other));
        t_failing = std::exchange(t_allocations, 0) - before;
        const bool blFound = ZELOQRMClientTestConnect(list, kApi, out);
        t_failing = 0;
        EXPECT_EQ(out, blFound ? other : own) << before;
        failures += blFound ? 0 : 1;
    }
    EXPECT_GE(failures, 6);
}

TEST_F(Join, SurvivesEveryFailingCall) {
    std::string strList;
    Json::Value list(Json::arrayValue);
    list.append(Candidate(0, s_pServer->HttpsPort()));
    json::ToString(list, strList);
    const Expected noConnection{"-1", "Cannot find available Connection[" + strList + ']', ""};
    const Expected silent{"-1", "", Stored()};
    const Expected joined{"0", "", Stored()};
    const auto refused = [&](const char *szReply) {
        return Expected{"-1", std::string("send create client fail: ") + szReply, Stored()};
    };
    torture::Run({"join",
                  kFile,
                  stored::Clear,
                  [] {
                      Json::Value info = JoinInfo();
                      info["server_http_port"] = 0;
                      return std::to_string(ZELOQRMClientSendCreateClient(info));
                  },
                  [] { return stored::Describe(); },
                  joined,
                  {{"ZELOCredAlloc", {"-1", "", ""}},
                   {"CredRequestNew", {"-1", "create cred request fail", ""}},
                   {"ZELOCredAlloc IsPort IsPort ZELOCredItemSetProtocol ZELOCredItemSetHost "
                    "ZELOCredItemSetPort GetWebAPIPath ZELOCredItemSetProtocol ZELOCredItemSetHost "
                    "ZELOCredItemSetPort SetWebAPIURL",
                    noConnection},
                   {"ZELOCredItemSetApplication ZELOCredItemSetOwner ZELOCredSave",
                    {"-1", "Cannot save server credential", ""}},
                   {"gethostname", {"-1", "get hostname fail", Stored()}},
                   {"YLIBCFileGetKeyValue YLIBCFileGetKeyValue YLIBCFileGetKeyValue", silent},
                   {"YLIBCFileGetKeyValue", joined},  // the small fix number
                   {"YLIBCFileGetKeyValue YLIBCFileGetKeyValue", silent},
                   {"YLIBCFileCheckKeyValue", joined},
                   {"YLIBCFileGetKeyValue", silent},
                   {"AddPostParam", refused(R"({"error":{"code":101},"success":false})")},
                   {"SetEncryptMode", joined},
                   {"Process", silent},
                   {"GetResponse", refused(R"({"data":{"id":1},"success":true})")}}});
}

TEST_F(Join, DescribesTheApplianceByItsFactsOverOneConnection) {
    Json::Value usual;
    ASSERT_TRUE(json::FromString(
        R"({"sn":"SN1","name":"zelobox","host":"zelobox","model":"NVO-918","build_number":123,)"
        R"("nvo_version":"NVO 6.2-123 Update 4","http_port":5000,"https_port":5001})",
        usual));
    usual["access_token"] = kToken;
    // The version file and the configuration ("" keeps the usual one), the members added to the
    // caller's, and what differs from the usual description ("" when join fails).
    using Row = std::tuple<const char *, const char *, const char *, const char *, const char *>;
    const Row rows[] = {
        {"the usual ones", "", "", "{}", "{}"},
        {"no small fix", "majorversion=7\nminorversion=0\nbuildnumber=9x", "", "{}",
         R"({"nvo_version":"NVO 7.0-9x","build_number":9})"},
        {"small fix 0", "majorversion=7\nminorversion=0\nbuildnumber=9\nsmallfixnumber=0", "", "{}",
         R"({"nvo_version":"NVO 7.0-9","build_number":9})"},
        {"small fix 00", "majorversion=7\nminorversion=0\nbuildnumber=9\nsmallfixnumber=00", "",
         "{}", R"({"nvo_version":"NVO 7.0-9 Update 00","build_number":9})"},
        {"no build", "majorversion=7\nminorversion=0", "", "{}", ""},
        {"no minor version", "majorversion=7\nbuildnumber=9", "", "{}", ""},
        {"ports that are no numbers", "", "admin_port=80x\nsecure_admin_port=x\nrunHTTPS=yes", "{}",
         R"({"http_port":80,"https_port":0})"},
        {"https not served", "", "admin_port=80\nrunHTTPS=no", "{}",
         R"({"http_port":80,"https_port":0})"},
        {"https served without a port", "", "admin_port=80\nrunHTTPS=yes", "{}", ""},
        {"the caller's values go as they are", "", "#",
         R"({"http_port":"1","https_port":[2],"host":null,"id":"I","sn":"S2"})",
         R"({"http_port":"1","https_port":[2],"host":null,"id":"I","sn":"S2"})"},
    };
    for (const auto &[szFact, szVersion, szConfig, szJoinInfo, szExpected] : rows) {
        SCOPED_TRACE(szFact);
        SetUp();
        if (szVersion[0] != '\0') {
            WriteFile(kVersion, szVersion);
        }
        if (szConfig[0] != '\0') {
            WriteFile(kConfig, szConfig);
        }
        Json::Value info = JoinInfo();
        Json::Value added;
        ASSERT_TRUE(json::FromString(szJoinInfo, added));
        for (const std::string &strName : added.getMemberNames()) {
            info[strName] = added[strName];
        }
        Json::Value differing;
        const bool blJoins = json::FromString(szExpected, differing);
        Json::Value expected = usual;
        for (const std::string &strName : differing.getMemberNames()) {
            expected[strName] = differing[strName];
        }
        if (blJoins) {
            Answer(kApi, "join", R"({"success":true})");
        }
        EXPECT_EQ(ZELOQRMClientSendCreateClient(info), blJoins ? 0 : -1);
        EXPECT_EQ(stored::Describe(), Stored());
        const Json::Value requests = s_pServer->Requests();
        ASSERT_EQ(requests.size(), blJoins ? 2U : 1U);
        if (blJoins) {
            EXPECT_EQ(requests[0]["connection"], requests[1]["connection"]);
            EXPECT_EQ(requests[1]["scheme"], "https");
            Json::Value call;
            json::FromString(requests[1]["body"].asString(), call);
            EXPECT_EQ(json::ToLogText(call["params"]), json::ToLogText(expected));
            EXPECT_EQ(call["api"].asString() + call["method"].asString(), "ZELO.QRM.RPCjoin");
            EXPECT_EQ(call["version"], 1);
        }
    }
}

TEST_F(Join, RefusedRepliesAreLoggedWithoutTheToken) {
    const std::string strDeep = std::string(2000, '[') + std::string(2000, ']');
    // What is logged; null where the reply is accepted.
    const std::pair<std::string, const char *> rows[] = {
        {R"({"success":true})", nullptr},
        {R"({"success":1})", nullptr},
        {R"({"success":false,"error":{"code":105}})", R"({"success":false,"error":{"code":105}})"},
        {R"({"success":"true"})", R"({"success":"true"})"},
        {R"({"success":[true]})", R"({"success":[true]})"},
        {"<html>\r\n\x01</html>", "<html>\\r\\n\\x01</html>"},
        {"", ""},
        {R"({"success":tr)", R"({"success":tr)"},
        {"[true]", "[true]"},
        {"1", "1"},
        {strDeep, strDeep.c_str()},
        {std::string("token ") + kToken + " se\\/cr\\\"et-0123456789", "token *** ***"},
        {"se\\u002fcr\\u0022et-0123456789 se%2Fcr%22et-0123456789.", "*** ***."},
        {"se&#47;cr&quot;et-0123456789 se&#x2f;cr\\u0026#34et-&#48;123456789.", "*** ***."},
        {"se/cr\"et-012345678", "se/cr\"et-012345678"},
        {"\xC2\x9B"
         "2J \x9B \xC3\x9B\x9B\xE2\x80\xAE",
         "\\xC2\\x9B"
         "2J \\x9B \xC3\x9B\\x9B\\xE2\\x80\\xAE"},
    };
    for (const auto &[strBody, szLogged] : rows) {
        stored::Clear();
        Answer(kApi, "join", strBody);
        int result = 1;
        const seam::Outcome outcome =
            seam::Observe([&] { result = ZELOQRMClientSendCreateClient(JoinInfo()); });
        EXPECT_EQ(result, szLogged == nullptr ? 0 : -1) << strBody;
        EXPECT_EQ(Messages(outcome), szLogged == nullptr
                                         ? std::string()
                                         : std::string("send create client fail: ") + szLogged);
        EXPECT_EQ(stored::Describe(), Stored());
        EXPECT_EQ(outcome.recordsLeft, 0);
    }
}

// Each of these would take minutes, or most of the memory, if it were taken as it comes.
TEST_F(Join, RepliesMadeToBeExpensiveAreCheapAndCutInTheLog) {
    for (const std::string &strBody :
         {"{\"success\":0" + Repeated("/**/", 4U << 20U) + "}",
          "[0" + Repeated(",0", 15U << 20U) + "]", Repeated(kToken, 15U << 20U),
          "/*\"*/[0" + Repeated(",0", 15U << 20U) + "]",
          "//\"\n[0" + Repeated(",0", 15U << 20U) + "]", std::string(100000, 'x')}) {
        Answer(kApi, "join", strBody);
        const auto start = std::chrono::steady_clock::now();
        const seam::Outcome outcome =
            seam::Observe([&] { EXPECT_EQ(ZELOQRMClientSendCreateClient(JoinInfo()), -1); });
        EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(60));
        EXPECT_LT(Messages(outcome).size(), 8100U);
        EXPECT_NE(Messages(outcome).find(std::to_string(strBody.size()) + " bytes in all"),
                  std::string::npos);
    }
}

TEST_F(Join, IncompleteInputTouchesNothing) {
    for (const char *szMember :
         {"sn", "access_token", "server_host", "server_http_port", "server_https_port"}) {
        Json::Value info = JoinInfo();
        info.removeMember(szMember);
        const seam::Outcome outcome =
            seam::Observe([&] { EXPECT_EQ(ZELOQRMClientSendCreateClient(info), -1); });
        EXPECT_TRUE(outcome.calls.empty() && outcome.logs.empty()) << szMember;
    }
    EXPECT_EQ(ZELOQRMClientSendCreateClient(Json::Value("text")), -1);
    EXPECT_EQ(s_pServer->Requests().size(), 0U);
    EXPECT_EQ(stored::Describe(), "");
}

TEST_F(Join, OtherConnectionsComeFirstAndTheExplicitOneLast) {
    Json::Value info = JoinInfo();
    info["server_conn"].append(Candidate(s_pServer->HttpPort(), 0));
    EXPECT_EQ(ZELOQRMClientSendCreateClient(info), 0);
    EXPECT_EQ(stored::Describe(), Stored("http"));

    stored::Clear();
    info["server_conn"] = "no array";
    EXPECT_EQ(ZELOQRMClientSendCreateClient(info), 0);
    EXPECT_EQ(stored::Describe(), Stored());

    // A second join adds a record; the first stays in force.
    info["server_conn"] = Json::Value(Json::arrayValue);
    info["server_conn"].append(Candidate(s_pServer->HttpPort(), 0));
    EXPECT_EQ(ZELOQRMClientSendCreateClient(info), 0);
    EXPECT_EQ(stored::Describe(), Stored());
    EXPECT_EQ(stored::Count(), 2);

    info = JoinInfo();
    info["server_http_port"] = "80";
    info["server_https_port"] = "443";
    EXPECT_EQ(seam::MessagesOf([&] { EXPECT_EQ(ZELOQRMClientSendCreateClient(info), -1); }),
              R"(Cannot find available Connection[[{"host":"localhost","http_port":"80",)"
              R"("https_port":"443"}]])");
}

}  // namespace

void *operator new(std::size_t cb) {
    void *const p = ++t_allocations == t_failing ? nullptr : std::malloc(cb);
    return p == nullptr ? throw std::bad_alloc() : p;
}

void *operator new(std::size_t cb, const std::nothrow_t & /*tag*/) noexcept {
    return std::malloc(cb);
}

void operator delete(void *p) noexcept {
    std::free(p);
}

void operator delete(void *p, std::size_t /*cb*/) noexcept {
    std::free(p);
}
