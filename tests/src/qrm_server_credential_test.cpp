// The server credential's five functions: what they read, write, log and leave behind.

#include <new>

#include "guard.h"
#include "json.h"
#include "stored.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

using json::ToLogText;
using testing::PrintToString;
using torture::Expected;

constexpr const char *kFile = "qrm_server_credential";
constexpr const char *kCred =
    R"({"protocol":"https","host":"qrm","port":443.0,"application":"ZELO.QRM","access_token":"t"})";

Json::Value Parse(const std::string &strText) {
    Json::Value value;
    EXPECT_TRUE(json::FromString(strText, value)) << strText;
    return value;
}

std::string State() {
    return stored::Describe();
}

void AddServer(const char *szExtraInfo) {
    stored::Clear();
    stored::AddSession(stored::AddCredential("ZELO.QRM", "qrm", szExtraInfo), "t", "c");
}

// An array that holds an array, and so on.
Json::Value Nest(int depth) {
    Json::Value value = 1;
    for (int i = 0; i < depth; ++i) {
        Json::Value outer(Json::arrayValue);
        outer.append(std::move(value));
        value = std::move(outer);
    }
    return value;
}

TEST(ServerCredential, CreateSurvivesEveryFailingCall) {
    const Expected done{"true", "", "https://qrm:443 null token=t csrf=?"};
    const Expected nothing{"false", "Save Cred Item fail", ""};
    const Expected half{"false", "Save CredSess Item fail", "https://qrm:443 null"};
    torture::Run({"create",
                  kFile,
                  stored::Clear,
                  [] { return PrintToString(ZELOQRMClientCreateServerCredential(Parse(kCred))); },
                  State,
                  done,
                  {{"ZELOCredAlloc", nothing},
                   {"time", done},
                   {"ZELOCredItemSetCreateTime ZELOCredItemSetModifyTime ZELOCredItemSetOwner "
                    "ZELOCredItemSetPort ZELOCredItemSetHost ZELOCredItemSetProtocol "
                    "ZELOCredItemSetApplication ZELOCredItemSetExtraInfo ZELOCredSave",
                    nothing},
                   {"ZELOCredItemGetID", {"false", "Get CredId fail", "https://qrm:443 null"}},
                   {"ZELOCredSessAlloc ZELOCredSessItemSetID ZELOCredSessItemSetAccessToken "
                    "ZELOCredSessSave",
                    half}}});
}

TEST(ServerCredential, DeleteSurvivesEveryFailingCall) {
    const std::string strQrm = "https://qrm:443 ?";
    const std::string strCenter = " | https://center:443 ?";
    const std::string strTokens = " token=t csrf=c";
    torture::Run(
        {"delete",
         kFile,
         [] {
             AddServer(nullptr);
             stored::AddSession(stored::AddCredential("ZELO.NotificationCenter", "center"), "t",
                                "c");
         },
         [] { return PrintToString(ZELOQRMClientDeleteServerCredential()); },
         [] { return State() + " | " + stored::Describe("ZELO.NotificationCenter"); },
         {"true", "", " | "},
         {{"ZELOCredIDGetByApplication", {"true", "", strQrm + strTokens + " | "}},
          {"ZELOCredSessRemoveByID", {"false", "", strQrm + strTokens + strCenter + strTokens}},
          {"ZELOCredRemoveByID", {"false", "", strQrm + strCenter + strTokens}},
          {"ZELOCredIDGetByApplication", {"true", "", strCenter + strTokens}},
          {"ZELOCredSessRemoveByID", {"false", "", strCenter + strTokens}},
          {"ZELOCredRemoveByID", {"false", "", strCenter}}}});
    stored::Clear();
    EXPECT_TRUE(ZELOQRMClientDeleteServerCredential());
}

TEST(ServerCredential, BothGettersSurviveEveryFailingCall) {
    AddServer(R"({"sn":[7]})");
    const std::string strKept = State();
    Json::Value all = Parse(R"({"host":"qrm","own":1,"port":443,"protocol":"https","sn":[7]})");
    // Each member is read by itself.
    const auto without = [&](const char *szMember) {
        Json::Value read = all;
        read.removeMember(szMember);
        return Expected{"true " + ToLogText(read), "", strKept};
    };
    const auto run = [&](bool (*pfnGet)(Json::Value &), const std::vector<torture::Step> &more) {
        std::vector<torture::Step> steps = {
            {"ZELOCredListGet", {R"(false {"own":1})", "cannot find qrm server info", strKept}},
            {"ZELOCredItemGetHost", without("host")},
            {"ZELOCredItemGetPort", without("port")},
            {"ZELOCredItemGetProtocol", without("protocol")},
            {"ZELOCredItemGetExtraInfo", without("sn")}};
        steps.insert(steps.end(), more.begin(), more.end());
        const auto get = [pfnGet] {
            Json::Value out = Parse(R"({"own":1})");
            const bool blDone = pfnGet(out);
            return PrintToString(blDone) + ' ' + ToLogText(out);
        };
        torture::Run({"get", kFile, [] {}, get, State, without(""), steps});
    };
    run(ZELOQRMClientGetServerCredential, {});

    all["application"] = "ZELO.QRM";
    const std::string strFailed = "false " + ToLogText(all);
    all["access_token"] = "t";
    all["csrf_token"] = "c";
    const std::string strNoSession = "cannot find qrm server session[" +
                                     std::to_string(ZELOCredIDGetByApplication("ZELO.QRM")) + ']';
    run(ZELOQRMClientGetServerCredentialWithToken,
        {{"ZELOCredItemGetID", {strFailed, "get cred id fail", strKept}},
         {"ZELOCredSessAlloc", {strFailed, "alloc ZELO_CRED_SESS fail", strKept}},
         {"ZELOCredSessLoad ZELOCredSessLoad", {strFailed, strNoSession, strKept}},
         {"ZELOCredSessItemGetAccessToken", without("access_token")},
         {"ZELOCredSessItemGetCsrfToken", without("csrf_token")}});
}

TEST(ServerCredential, UpdateSurvivesEveryFailingCall) {
    const std::string strOld = R"(https://qrm:443 {"a":1} token=t csrf=c)";
    const Expected silent{"false", "", strOld};
    torture::Run(
        {"update",
         kFile,
         [] { AddServer(R"({"a":1})"); },
         [] {
             Json::Value cred = Parse(
                 R"({"application":"ZELO.QRM","protocol":"http","host":"new","port":8e1,)"
                 R"("sn":"S","access_token":"u","csrf_token":"ignored","extra_info":"ignored"})");
             return PrintToString(ZELOQRMClientUpdateServerCredential(cred));
         },
         State,
         {"true", "", R"(http://new:80 {"a":1,"sn":"S"} token=u csrf=c)"},
         {{"ZELOCredListGet", {"false", "cannot find qrm server info", strOld}},
          {"ZELOCredItemSetProtocol ZELOCredItemSetHost ZELOCredItemSetPort "
           "ZELOCredItemSetApplication",
           silent},
          {"ZELOCredItemGetExtraInfo", {"true", "", R"(http://new:80 {"a":1} token=u csrf=c)"}},
          {"ZELOCredItemSetExtraInfo", silent},
          {"ZELOCredItemGetID", {"false", "Get CredId fail", strOld}},
          {"ZELOCredSessAlloc ZELOCredSessLoad ZELOCredSessItemSetAccessToken ZELOCredSave",
           silent},
          {"ZELOCredSessSave",
           {"false", "", R"(http://new:80 {"a":1,"sn":"S"} token=t csrf=c)"}}}});
}

// Setters and savers fail below zero, getters on anything but zero.
TEST(ServerCredential, ReadsEachResultInItsOwnSense) {
    stored::Clear();
    bool blDone = false;
    seam::Observe({"ZELOCredItemSetHost", 1, true, 1},
                  [&] { blDone = ZELOQRMClientCreateServerCredential(Parse(kCred)); });
    EXPECT_TRUE(blDone);
    seam::Observe({"ZELOCredSave", 1, true, 1},
                  [&] { blDone = ZELOQRMClientCreateServerCredential(Parse(kCred)); });
    EXPECT_TRUE(blDone);
    for (const char *szGetter : {"ZELOCredItemGetHost", "ZELOCredItemGetPort"}) {
        Json::Value out;
        seam::Observe({szGetter, 1, true, 1}, [&] { ZELOQRMClientGetServerCredential(out); });
        EXPECT_EQ(out.size(), 2U) << szGetter << ' ' << ToLogText(out);
    }
}

TEST(ServerCredential, BadInputIsRefusedAndStoresNothing) {
    const Json::Value deep = Nest(2000);
    const auto with = [](const char *szMember, const Json::Value &value) {
        Json::Value cred = Parse(kCred);
        cred[szMember] = value;
        return cred;
    };
    std::vector<std::pair<Json::Value, const char *>> rows = {
        {Json::Value(), "Bad parameters"},
        {Json::Value("text"), "Bad parameters"},
        {Parse("[1]"), "Bad parameters"},
        {with("port", "443"), "Save Cred Item fail"},
        {with("port", 443.5), "Save Cred Item fail"},
        {with("port", true), "Save Cred Item fail"},
        {with("port", Json::Value()), "Save Cred Item fail"},
        {with("port", Json::Value(Json::UInt64(1) << 40U)), "Save Cred Item fail"},
        {with("host", 5), "Save Cred Item fail"},
        {with("host", std::string("a\0b", 3)), "Save Cred Item fail"},
        {with("protocol", Json::Value()), "Save Cred Item fail"},
        {with("application", Parse("{}")), "Save Cred Item fail"},
        {with("extra_info", deep), "Save Cred Item fail"},
    };
    for (const char *szMember : {"protocol", "host", "port", "application", "access_token"}) {
        rows.push_back({Parse(kCred), "Bad parameters"});
        rows.back().first.removeMember(szMember);
    }
    for (const auto &row : rows) {
        stored::Clear();
        EXPECT_EQ(
            seam::MessagesOf([&] { EXPECT_FALSE(ZELOQRMClientCreateServerCredential(row.first)); }),
            row.second);
        EXPECT_EQ(State(), "");
    }
    for (Json::Value cred : {Json::Value("x"), Parse("[]"), Parse("{}"),
                             Parse(R"({"application":7})"), Parse(R"({"application":"None"})")}) {
        EXPECT_EQ(
            seam::MessagesOf([&] { EXPECT_FALSE(ZELOQRMClientUpdateServerCredential(cred)); }),
            "cannot find qrm server info");
    }
    AddServer(R"({"a":1})");
    for (const Json::Value &cred :
         {with("port", "1"), with("port", 1.5), with("host", 1), with("protocol", 1),
          with("access_token", 1), with("sn", deep)}) {
        Json::Value copy = cred;
        EXPECT_FALSE(ZELOQRMClientUpdateServerCredential(copy));
        EXPECT_EQ(State(), R"(https://qrm:443 {"a":1} token=t csrf=c)");
    }
    Json::Value array(Json::arrayValue);
    EXPECT_FALSE(ZELOQRMClientGetServerCredential(array));
    EXPECT_FALSE(ZELOQRMClientGetServerCredentialWithToken(array));
}

TEST(ServerCredential, ExtraInfoKeepsWhatItCannotRead) {
    const std::tuple<const char *, const char *, const char *> rows[] = {
        {nullptr, "?", "null"},
        {"", "", "null"},
        {"null", R"({"sn":"S"})", R"("S")"},
        {"[1]", "[1]", "null"},
        {"no json", "no json", "null"},
        {R"({"other":{"x":1}})", R"({"other":{"x":1},"sn":"S"})", R"("S")"},
    };
    for (const auto &[szExtraInfo, szAfterUpdate, szSn] : rows) {
        AddServer(szExtraInfo);
        Json::Value cred = Parse(R"({"application":"ZELO.QRM","sn":"S"})");
        EXPECT_TRUE(ZELOQRMClientUpdateServerCredential(cred));
        EXPECT_EQ(State(), std::string("https://qrm:443 ") + szAfterUpdate + " token=t csrf=c");
        Json::Value out;
        EXPECT_TRUE(ZELOQRMClientGetServerCredential(out));
        EXPECT_EQ(ToLogText(out["sn"]), szSn);
    }
}

TEST(ServerCredential, TokensAreReadAsTheyAreStored) {
    stored::Clear();
    const long id = stored::AddCredential("ZELO.QRM", "qrm");
    Json::Value out;
    EXPECT_FALSE(ZELOQRMClientGetServerCredentialWithToken(out));
    EXPECT_EQ(ToLogText(out),
              R"({"application":"ZELO.QRM","host":"qrm","port":443,"protocol":"https"})");
    stored::AddSession(id, "", "");
    EXPECT_TRUE(ZELOQRMClientGetServerCredentialWithToken(out));
    EXPECT_EQ(ToLogText(out["access_token"]), R"("")");
    EXPECT_FALSE(out.isMember("csrf_token"));
    stored::AddSession(id, std::string(1500, 'x').c_str());
    EXPECT_TRUE(ZELOQRMClientGetServerCredentialWithToken(out));
    EXPECT_EQ(out["access_token"].asString(), std::string(1023, 'x'));

    // A second record changes nothing: the first one stays in force.
    stored::AddCredential("ZELO.QRM", "second");
    EXPECT_TRUE(ZELOQRMClientGetServerCredential(out));
    EXPECT_EQ(out["host"], "qrm");
}

TEST(Guard, WhatIsThrownBecomesTheFailureValueAndALine) {
    const auto guarded = [](const auto &thrown) {
        int result = 0;
        const seam::Outcome outcome =
            seam::Observe({}, [&] { result = ZELO_GUARD(-1, [&]() -> int { throw thrown; }); });
        EXPECT_EQ(result, -1);
        return seam::Messages(outcome);
    };
    EXPECT_EQ(guarded(std::bad_alloc()), "Unexpected exception: std::bad_alloc");
    EXPECT_EQ(guarded(7), "Unexpected exception");
}

}  // namespace
