// Log entries: the levels, the message with its references in every language, and the push to a
// real server.

#include "joined.h"
#include "json.h"
#include "last_error.h"
#include "platform_handles.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

using namespace files;
using joined::Messages;
using seam::MessagesOf;
using torture::Expected;

constexpr const char *kFile = "qrm_send_log";
constexpr const char *kLogApi = "ZELO.QRM.RPC.Log";
constexpr const char *kTexts = "/usr/zelo/zeloman/webman/texts/";
const std::vector<std::string> kLanguages = {"chs", "cht", "csy", "dan", "enu", "fre", "ger",
                                             "hun", "ita", "jpn", "krn", "nld", "nor", "plk",
                                             "ptb", "ptg", "rus", "spn", "sve", "trk"};

std::string PathOf(const std::string &strLanguage) {
    return kTexts + strLanguage + "/strings";
}

void WriteTexts(const std::string &strText) {
    for (const std::string &strLanguage : kLanguages) {
        std::ofstream(PathOf(strLanguage)) << strText;
    }
}

struct TextList {
    explicit TextList(const std::vector<std::string> &texts) : list(YLIBCSzListAlloc(0)) {
        for (const std::string &strText : texts) {
            YLIBCSzListPush(list.Address(), strText.c_str());
        }
    }
    YLIBSZLIST *Get() const { return list.Get(); }
    ListHandle list;
};

// Such as "19 text; 1 other".
std::string Counted(const std::map<std::string, int> &counts) {
    std::string strAll;
    for (const auto &[strText, count] : counts) {
        if (count > 0) {
            strAll += (strAll.empty() ? "" : "; ") + std::to_string(count) + ' ' + strText;
        }
    }
    return strAll;
}

std::string CountedTexts(const Json::Value &log) {
    std::map<std::string, int> counts;
    for (const std::string &strLanguage : log.getMemberNames()) {
        ++counts[log[strLanguage].asString()];
    }
    return Counted(counts);
}

// What is logged without a list of languages: file and line stand in it twice.
std::string NoList() {
    Json::Value out;
    std::string strLine =
        MessagesOf({"YLIBCSzListAlloc"}, [&] { ConvertLog(nullptr, "text", nullptr, out); });
    const std::string strEnd = "(ConvertLog) pslList calloc failure\n";
    EXPECT_EQ(strLine.compare(0, 13, "qrm_send_log:"), 0) << strLine;
    EXPECT_GT(std::atoi(strLine.c_str() + 13), 0) << strLine;
    EXPECT_EQ(strLine.substr(strLine.find('(')), strEnd);
    return strLine;
}

class SendLog : public joined::Joined {
  protected:
    void SetUp() override {
        Joined::SetUp();
        // The first request of a process leaves records behind, which later ones exchange.
        Json::Value reply;
        ZELOQRMClientSendWebapi(reply, "ZELO.QRM.RPC", 1, "info", Json::Value(), false);
        s_pServer->ForgetRequests();
    }

    // The parameters of the last push, with the time as "now" where it is.
    static std::string Sent() {
        Json::Value params;
        for (const Json::Value &request : s_pServer->Requests()) {
            Json::Value call;
            json::FromString(request["body"].asString(), call);
            params = call["method"] == "push" ? call["params"] : params;
        }
        if (params.isNull()) {
            return "nothing";
        }
        const std::string strTexts = CountedTexts(params["log"]);
        const long age = std::time(nullptr) - params["happen_time"].asInt64();
        if (age >= 0 && age < 60) {
            params["happen_time"] = "now";
        }
        params.removeMember("log");
        return json::ToLogText(params) + ' ' + strTexts;
    }
};

TEST(LogLevels, OnlyTheEightNamesAndNumbersStandForThemselves) {
    const char *const names[] = {"emerg",   "alert",  "crit", "err",
                                 "warning", "notice", "info", "debug"};
    for (int level = 0; level < 8; ++level) {
        EXPECT_EQ(gZELOQRMClientLogLevelTable[level].level, level);
        EXPECT_EQ(ZELOQRMClientLogLevelIntToStr(level), names[level]);
        EXPECT_EQ(ZELOQRMClientLogLevelStrToInt(names[level]), level);
    }
    EXPECT_EQ(gZELOQRMClientLogLevelTable[8].level, -1);
    EXPECT_EQ(gZELOQRMClientLogLevelTable[8].name, "");
    for (int level : {-1, 8, 100, -2147483647}) {
        EXPECT_EQ(ZELOQRMClientLogLevelIntToStr(level), "info");
    }
    for (const char *szName : {"WARNING", "warn", " err", "error", "err ", ""}) {
        EXPECT_EQ(ZELOQRMClientLogLevelStrToInt(szName), 6) << szName;
    }
    EXPECT_EQ(ZELOQRMClientLogLevelStrToInt(std::string("err\0", 4)), 6);
}

// --- References ---------------------------------------------------------------------------------

std::string Expand(const std::string &strParam, std::size_t cb = 4096) {
    constexpr const char *kStrings = "/tmp/strings";
    std::ofstream(kStrings) << "[s]\nk=\"VAL\"\nutf=\"" + Repeated("é", 1200) + "\"\nlong=\"" +
                                   std::string(600, 'l') +
                                   "\"\nself=\"{s:self}\"\n"
                                   "place=\"{s:k}\"\ntoken=\"_T(s,k)\"\n[]\nk=\"NAMELESS\"\n";
    // Exactly as large as it is said to be, so that a sanitizer sees what goes past it.
    std::vector<char> out(cb, '?');
    ParamGet(TextList({strParam}).Get(), 0, kStrings, out.data(), static_cast<int>(cb));
    return {out.data()};
}

TEST(References, AreReplacedByTextsOrByTheirKeys) {
    const std::string strX(505, 'x');
    const std::string strS(511, 's');
    const std::string strK(511, 'k');
    const std::pair<std::string, std::string> rows[] = {
        {"", ""},
        {"plain", "plain"},
        {"{s:k}", "VAL"},
        {"}{s:k} and {s:k}{s:none}", "}VAL and VALnone"},
        {"{:k}", "NAMELESS"},
        {"{s:}|{:}", "|"},
        {"{ s:k}{s: k}", "k k"},
        {"{0} x {a:b}", "b"},
        {"{s:k", "{s:k"},
        {"{s k} {", "{s k} {"},
        {"{" + strS + ":" + strK + "}", strK},
        {"{" + strS + "s:k}{s:k}", "{" + strS + "s:k}{s:k}"},
        {"{s:" + strK + "k}{s:k}", "{s:" + strK + "k}{s:k}"},
        {"_T(s,k)", "VAL"},
        {"a_T( \"s\" ,\t'k'\r\n)b", "aVALb"},
        {"_T(s,none)_T(s,k)", "noneVAL"},
        {"_T(s,k,k)", "k,k"},
        {"_T(s k)_T(s,k)", "_T(s k)_T(s,k)"},
        {"_T( ' ,k)", "_T( ' ,k)"},
        {"_T(s,\")", "_T(s,\")"},
        {"_T(s,k", "_T(s,k"},
        {"_T(s," + strX + ")", strX},
        // A text is looked through for the forms in turn, so only the second may bring in more.
        {"{s:token}", "VAL"},
        {"_T(s,token)", "VAL"},
        {"_T(s,place)", "{s:k}"},
        {"_T({s:none},{s:k})", "VAL"},
        // What cannot be replaced ends its form, not the other one.
        {"_T(s,k){s:self}", "VAL{s:self}"},
        {std::string(3500, 'x') + "{s:long}_T(s,k)", std::string(3500, 'x') + "{s:long}VAL"},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(MessagesOf([&] { EXPECT_EQ(Expand(row.first), row.second); }), "");
    }
    // What a replacement did counts, not what it answers.
    EXPECT_EQ(MessagesOf({"YLIBCStrReplace", 1, true, 0},
                         [] { EXPECT_EQ(Expand("{s:k}{s:none}_T(s,k)"), "VALnoneVAL"); }),
              "");
    const std::string strTooLong = "_T(s," + strX + "x)_T(s,k)";
    EXPECT_EQ(MessagesOf([&] { EXPECT_EQ(Expand(strTooLong), strTooLong); }),
              "Char string length not enough");
    // Different ones, as many as fit.
    std::string strMany;
    for (int i = 100; i < 700; ++i) {
        strMany += "{:" + std::to_string(i) + '}';
    }
    EXPECT_EQ(Expand(strMany).substr(0, 12), "100101102103");
    EXPECT_EQ(Expand(strMany).size(), 1800U);
}

TEST(References, CheckedAloneFillTheBuffersAndNoMore) {
    const std::tuple<const char *, int, int> rows[] = {
        {"{abc:def}", 0, -1}, {"{abcd:e}", -1, -1}, {"{a:bcde}", -1, -1},
        {"_T(a,b)", -1, 0},   {"_T(a,bc)", -1, -1}, {"x{:}_T(a,b)", 0, 0},
        {"_T(", -1, -1},      {"", -1, -1},         {nullptr, -1, -1}};
    for (const auto &[szText, tpl1, tpl2] : rows) {
        std::vector<char> section(8, '?');
        std::vector<char> key(8, '?');
        std::vector<char> token(8, '?');
        EXPECT_EQ(CheckSectionKey_tpl1(szText, section.data(), key.data(), 4), tpl1);
        EXPECT_EQ(section[4], '?');
        EXPECT_EQ(key[4], '?');
        EXPECT_EQ(CheckSectionKey_tpl2(szText, section.data(), key.data(), token.data(), 8), tpl2);
        if (tpl2 == 0) {
            EXPECT_STREQ(token.data(), "_T(a,b)");
        }
    }
}

TEST(References, TextIsCutBetweenCharacters) {
    for (const auto &[cb, strText] : std::vector<std::pair<std::size_t, std::string>>{
             {1, ""}, {2, "a"}, {3, "a"}, {4, "a"}, {5, "a€"}, {6, "a€"}, {8, "a€"}, {9, "a€😀"}}) {
        EXPECT_EQ(Expand("a€😀b", cb), strText) << cb;
    }
    EXPECT_EQ(Expand("{s:utf}"), Repeated("é", 1023));
    Json::Value log;
    EXPECT_EQ(ConvertLog(nullptr, ("a" + Repeated("€", 5000)).c_str(), nullptr, log), 0);
    EXPECT_EQ(log["jpn"], "a" + Repeated("€", 4094));
}

// --- The message in every language --------------------------------------------------------------

TEST_F(SendLog, RenderingSurvivesEveryFailingCall) {
    WriteTexts("[m]\nmsg=\"A {0} B {1}\"\n[s]\nk=\"VAL\"\nt=\"TOK\"\n");
    const std::string strWhole = "A VAL B TOK";
    const Expected whole{"0", "", Counted({{strWhole, 20}})};
    const auto with = [&](const char *szText) {
        return Expected{"0", "", Counted({{strWhole, 19}, {szText, 1}})};
    };
    std::vector<torture::Step> steps = {{"YLIBCSzListAlloc(512)", {"-1", NoList(), ""}},
                                        {"YLIBCStrTok", {"-1", "", ""}}};
    for (int i = 0; i < 20; ++i) {
        const std::string strRead =
            "YLIBCFileGetSectionValue('" + PathOf(kLanguages[static_cast<std::size_t>(i)]) + "', ";
        steps.insert(steps.end(),
                     {{"YLIBCSzListGet", {"-1", "", Counted({{strWhole, i}})}},
                      // Without a message of its own a language gets the English one.
                      {strRead + "'m', 'msg', buf, 4096)", whole},
                      {"YLIBCSzListGet(*, 0)", with("A  B TOK")},
                      {strRead + "'s', 'k', buf, 1024)", with("A k B TOK")},
                      {"YLIBCStrReplace(buf, '{s:k}', 'VAL', 0, 4096)", with("A {s:k} B TOK")},
                      {"YLIBCStrReplace(buf, '{0}', 'VAL', 0, 4096)", with("A {0} B TOK")},
                      {"YLIBCSzListGet(*, 1)", with("A VAL B ")},
                      {"YLIBCStrTokIndex YLIBCStrTrim YLIBCStrTrim", with("A VAL B _T(s, t)")},
                      {strRead + "'s', 't', buf, 1024)", with("A VAL B t")},
                      {"YLIBCStrReplace", with("A VAL B _T(s, t)")},
                      {"YLIBCStrReplace", with("A VAL B {1}")}});
    }
    const TextList params({"{s:k}", "_T(s, t)"});
    Json::Value out;
    torture::Run({"ConvertLog", kFile, [&] { out = Json::objectValue; },
                  [&] { return std::to_string(ConvertLog("m", "msg", params.Get(), out)); },
                  [&] { return CountedTexts(out); }, whole, steps});
}

TEST_F(SendLog, ALanguageWithoutTheMessageSpeaksEnglish) {
    WriteTexts("[m]\nmsg=\"eigen {0} {0} {1} {2}\"\n[s]\nk=\"W\"\n");
    std::ofstream(PathOf("enu")) << "[m]\nmsg=\"own {0} {0} {1} {2}\"\n[s]\nk=\"E\"\n";
    std::ofstream(PathOf("fre")) << "[s]\nk=\"F\"\n";
    std::ofstream(PathOf("trk")) << "[m]\nmsg=\"{0}\"\n";
    Json::Value out;
    out["other"] = "stays";
    const TextList params({"{s:k}", "{1}"});
    EXPECT_EQ(ConvertLog("m", "msg", params.Get(), out), 0);
    EXPECT_EQ(CountedTexts(out), "17 eigen W W {1} {2}; 1 k; 2 own E E {1} {2}; 1 stays");
    EXPECT_EQ(out["fre"], "own E E {1} {2}");

    out = Json::Value();
    EXPECT_EQ(ConvertLog(nullptr, "{0}/{1}", TextList({"{s:k}", "_T(s,k)"}).Get(), out), 0);
    EXPECT_EQ(CountedTexts(out), "1 E/E; 1 F/F; 17 W/W; 1 k/k");
    EXPECT_EQ(ConvertLog(nullptr, "{0}", nullptr, out), 0);
    EXPECT_EQ(CountedTexts(out), "20 {0}");
    EXPECT_EQ(ConvertLog(nullptr, nullptr, nullptr, out), -1);
    EXPECT_EQ(ConvertLog("m", nullptr, nullptr, out), -1);
    Json::Value array(Json::arrayValue);
    EXPECT_EQ(ConvertLog(nullptr, "text", nullptr, array), -1);

    // In every file but the English one, and then in one file less.
    std::ofstream(PathOf("enu")) << "[m]\n";
    std::ofstream(PathOf("fre")) << "[m]\nmsg=\"ma\"\n";
    out = Json::Value();
    EXPECT_EQ(ConvertLog("m", "msg", nullptr, out), -1);
    EXPECT_EQ(CountedTexts(out), "4 eigen {0} {0} {1} {2}") << "what was done by then";
}

// --- Push ---------------------------------------------------------------------------------------

TEST_F(SendLog, TextsThatThePlatformDoesNotEndAreSentToTheirEnd) {
    const std::string strX(100, 'x');
    WriteTexts("[m]\nmsg=\"" + strX + "{0}\"\n[s]\nk=\"" + strX + "\"\n");
    const auto all = [&](const std::string &strOther) {
        return Counted({{strX + strX + "a", 19}, {strOther, 1}});
    };
    const auto full = [](std::size_t cb) { return std::string(cb, 'f'); };
    const std::tuple<const char *, int, std::string, std::string> rows[] = {
        {"YLIBCFileGetSectionValue", 4, "message value", all("message value")},
        {"YLIBCFileGetSectionValue", 4, full(4096), all(full(4095))},
        {"YLIBCFileGetSectionValue", 5, "v", all(strX + "va")},
        {"YLIBCFileGetSectionValue", 5, full(1024), all(strX + full(1023) + "a")},
        {"YLIBCFileGetSectionValue", 6, "v", all(strX + strX + "v")},
        {"ZELOLnxGetHostname", 1, full(64), Counted({{strX + strX + "a", 20}})},
    };
    for (const auto &[szOperation, nth, strFill, strTexts] : rows) {
        s_pServer->ForgetRequests();
        const std::string strHost = nth == 1 ? strFill : "zelobox";
        const seam::Outcome outcome = seam::Observe({szOperation, nth, true, 0, 0, strFill}, [] {
            EXPECT_EQ(ZELOQRMClientLog(6, "m", "msg", "{s:k}{s:a}", nullptr, nullptr), 0);
        });
        EXPECT_EQ(Messages(outcome), "");
        EXPECT_EQ(Sent(), R"({"happen_time":"now","level":"info","username":"[)" + strHost +
                              "]\"} " + strTexts);
    }
}

// It calls the overload for lists. What follows these calls belongs to the Web API call.
TEST_F(SendLog, TheTextOverloadSurvivesEveryFailingCall) {
    const auto sent = [](const std::string &strTexts, const char *szTime = "\"now\"") {
        return Expected{"0", "",
                        std::string(R"({"happen_time":)") + szTime +
                            R"(,"level":"info","username":"[zelobox]"} )" + strTexts};
    };
    const Expected unread{"-1", "conver (null):{0}-{1} string failed. ", "nothing"};
    std::vector<torture::Step> steps = {
        {"YLIBCSzListAlloc", {"-1", "Failed to allocate list", "nothing"}},
        {"YLIBCSzListPush", sent("20 b-{1}")},
        {"YLIBCSzListPush", sent("20 a-{1}")},
        {"ZELOLnxGetHostname", {"-1", "get hostname failed ", "nothing"}},
        {"time", sent("20 a-b", "-1")},
        {"YLIBCSzListAlloc", {"-1", NoList() + "\n" + unread.strLog, "nothing"}},
        {"YLIBCStrTok", unread}};
    for (int i = 0; i < 20; ++i) {
        steps.insert(steps.end(), {{"YLIBCSzListGet", unread},
                                   {"YLIBCSzListGet", sent("1 -b; 19 a-b")},
                                   {"YLIBCStrReplace", sent("19 a-b; 1 {0}-b")},
                                   {"YLIBCSzListGet", sent("1 a-; 19 a-b")},
                                   {"YLIBCStrReplace", sent("19 a-b; 1 a-{1}")}});
    }
    torture::Run(
        {"texts", kFile, [] { s_pServer->ForgetRequests(); },
         [] { return std::to_string(ZELOQRMClientLog(9, nullptr, "{0}-{1}", "a", nullptr, "b")); },
         Sent, sent("20 a-b"), steps, false, true});
}

TEST_F(SendLog, TheServerGetsWhatTheCallerSays) {
    WriteTexts("[m]\nmsg=\"{0} {1}\"\n");
    YLIBSZLIST *const pslNone = nullptr;
    const std::string strHead = R"("happen_time":"now","level":)";
    const std::string strTail = R"(,"username":"[zelobox]"})";
    EXPECT_EQ(ZELOQRMClientLog(3, "m", "msg", TextList({"ä\"\n"}).Get(), nullptr), 0);
    EXPECT_EQ(Sent(), "{" + strHead + "\"err\"" + strTail + " 20 ä\"\n {1}");
    EXPECT_EQ(ZELOQRMClientLog(-1, nullptr, "t", pslNone, ""), 0);
    EXPECT_EQ(Sent(), R"({"extra_info":"",)" + strHead + "\"info\"" + strTail + " 20 t");
    EXPECT_EQ(ZELOQRMClientLog(0, "m", "msg", nullptr, "a", nullptr), 0);
    EXPECT_EQ(Sent(), "{" + strHead + "\"emerg\"" + strTail + " 20 a {1}");
    EXPECT_EQ(ZELOQRMClientLog(7, "m", "msg", nullptr, nullptr, nullptr), 0);
    EXPECT_EQ(Sent(), "{" + strHead + "\"debug\"" + strTail + " 20 {0} {1}");
    const Json::Value log = s_pServer->Log();
    EXPECT_EQ(log[log.size() - 1]["level"], "debug");
    // Bytes that are no UTF-8 do not break the request.
    EXPECT_EQ(ZELOQRMClientLog(7, nullptr, "a\xE4\xC3", pslNone, "\xFF"), 0);

    s_pServer->ForgetRequests();
    YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
    const seam::Outcome null =
        seam::Observe([&] { EXPECT_EQ(ZELOQRMClientLog(3, "m", nullptr, pslNone, ""), -1); });
    EXPECT_EQ(Messages(null), "Invaild Argument (__null != szKey)=[0]\n");
    EXPECT_TRUE(null.calls.empty());
    EXPECT_EQ(YLIBCErrGet(), 0x0D00U);
    EXPECT_EQ(MessagesOf([] { EXPECT_EQ(ZELOQRMClientLog(3, "m\n", "ä\x1B", "a", "b", "c"), -1); }),
              "conver m\\n:ä\\x1B string failed. ");
    EXPECT_EQ(Sent(), "nothing");
}

TEST_F(SendLog, OnlyBooleanTrueConfirmsAnEntry) {
    YLIBSZLIST *const pslNone = nullptr;
    const char *szUnconfirmed = "push log webapi response failed, jsReq={";
    const std::pair<const char *, std::string> rows[] = {
        {R"({"success":true})", ""},
        {R"({"success":"true"})", szUnconfirmed},
        {R"({"success":1})", szUnconfirmed},
        {R"({"success":false})", szUnconfirmed},
        {"{}", szUnconfirmed},
        {"[true]", szUnconfirmed},
        {"no json", "push log webapi failed, jsReq={"},
    };
    // The message is too long for a line.
    const std::string strMessage(3000, 'm');
    for (const auto &[szBody, strLog] : rows) {
        SCOPED_TRACE(szBody);
        Answer(kLogApi, "", szBody);
        int result = 1;
        const seam::Outcome outcome = seam::Observe(
            [&] { result = ZELOQRMClientLog(3, nullptr, strMessage.c_str(), pslNone, nullptr); });
        EXPECT_EQ(result, strLog.empty() ? 0 : -1);
        const std::string strLast = outcome.logs.empty() ? "" : outcome.logs.back().strMessage;
        EXPECT_EQ(strLast.substr(0, strLast.find('{') + 1), strLog);
        EXPECT_EQ(Holds(strLast, " bytes in all]"), !strLog.empty());
        EXPECT_EQ(outcome.recordsLeft, 0);
    }
}

TEST_F(SendLog, TheServerRefusesWhatIsNoEntry) {
    const auto push = [](const Json::Value &params) {
        Json::Value reply;
        EXPECT_EQ(ZELOQRMClientSendWebapi(reply, kLogApi, 1, "push", params, false), 0);
        return json::ErrorCode(reply);
    };
    Json::Value entry;
    json::FromString(R"({"happen_time":1,"level":"err","username":"[h]","log":{"enu":"text"}})",
                     entry);
    EXPECT_EQ(push(entry), 0);
    const std::pair<const char *, Json::Value> rows[] = {
        {"happen_time", 1.0}, {"happen_time", "1"},
        {"level", "error"},   {"level", 3},
        {"username", 1},      {"extra_info", Json::Value()},
        {"log", "text"},      {"log", Json::Value(Json::objectValue)}};
    for (const auto &[szMember, value] : rows) {
        Json::Value changed = entry;
        changed[szMember] = value;
        EXPECT_EQ(push(changed), 101) << szMember;
    }
    entry["log"]["enu"] = 1;
    EXPECT_EQ(push(entry), 101);
    stored::AddSession(1, "wrong");
    EXPECT_EQ(push(entry), 105);
}

TEST(JsonText, WhatIsNoUtf8GoesOutAsReplacementCharacters) {
    const std::pair<const char *, const char *> texts[] = {
        {"caf\xE9 \"x\"", R"(["caf\ufffd \"x\""])"},
        {"\xC3"
         "A",
         R"(["\ufffdA"])"},
        {"\xF0\"abc", R"(["\ufffd\"abc"])"},
        {"\xED\xA0\x80", R"(["\ufffd\ufffd\ufffd"])"},  // half of a surrogate pair
        {"\xC0\xAF", R"(["\ufffd\ufffd"])"},            // longer than it may be
        {"é\xF0\x9F\x98\x80", R"(["\u00e9\ud83d\ude00"])"},
    };
    for (const auto &[szText, szWritten] : texts) {
        Json::Value list(Json::arrayValue);
        list.append(szText);
        std::string strWritten;
        EXPECT_TRUE(json::ToString(list, strWritten));
        EXPECT_EQ(strWritten, szWritten);
    }
    Json::Value object;
    object["\xFF"]["b"] = "c\xFF";
    std::string strWritten;
    EXPECT_TRUE(json::ToString(object, strWritten));
    EXPECT_EQ(strWritten, R"({"\ufffd":{"b":"c\ufffd"}})");
}

}  // namespace
