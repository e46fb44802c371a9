// The server credential's five functions: what they read, write, log and leave behind.

#include <gtest/gtest.h>

#include "json_text.h"
#include "stored.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

constexpr const char *kFile = "qrm_server_credential";
constexpr const char *kCred =
    R"({"protocol":"https","host":"qrm","port":443,"application":"ZELO.QRM","access_token":"t"})";

Json::Value Parse(const std::string &strText) {
    Json::Value value;
    EXPECT_TRUE(json_text::FromString(strText, value)) << strText;
    return value;
}

std::string Text(const Json::Value &value) {
    return json_text::ToLogText(value);
}

std::string Bool(bool bl) {
    return bl ? "true" : "false";
}

std::string State() {
    return stored::Describe();
}

void AddServer(const char *szExtraInfo) {
    stored::Clear();
    stored::AddSession(stored::AddCredential("ZELO.QRM", "qrm", szExtraInfo), "t", "c");
}

// A fault that the function does not treat as one.
torture::Expected Like(const torture::Expected &expected) {
    return expected;
}

TEST(ServerCredential, CreateSurvivesEveryFailingCall) {
    const torture::Expected done{"true", "", "https://qrm:443 null token=t csrf=?"};
    const torture::Expected nothing{"false", "Save Cred Item fail", ""};
    const torture::Expected half{"false", "Save CredSess Item fail", "https://qrm:443 null"};
    torture::Run({"create",
                  kFile,
                  stored::Clear,
                  [] { return Bool(ZELOQRMClientCreateServerCredential(Parse(kCred))); },
                  State,
                  "ZELOCredAlloc time ZELOCredItemSetCreateTime ZELOCredItemSetModifyTime "
                  "ZELOCredItemSetOwner ZELOCredItemSetPort ZELOCredItemSetHost "
                  "ZELOCredItemSetProtocol ZELOCredItemSetApplication ZELOCredItemSetExtraInfo "
                  "ZELOCredSave ZELOCredItemGetID ZELOCredSessAlloc ZELOCredSessItemSetID "
                  "ZELOCredSessItemSetAccessToken ZELOCredSessSave",
                  done,
                  {{"time", Like(done)},
                   {"ZELOCredAlloc", nothing},
                   {"ZELOCredItemSetCreateTime", nothing},
                   {"ZELOCredItemSetModifyTime", nothing},
                   {"ZELOCredItemSetOwner", nothing},
                   {"ZELOCredItemSetPort", nothing},
                   {"ZELOCredItemSetHost", nothing},
                   {"ZELOCredItemSetProtocol", nothing},
                   {"ZELOCredItemSetApplication", nothing},
                   {"ZELOCredItemSetExtraInfo", nothing},
                   {"ZELOCredSave", nothing},
                   {"ZELOCredItemGetID", {"false", "Get CredId fail", "https://qrm:443 null"}},
                   {"ZELOCredSessAlloc", half},
                   {"ZELOCredSessItemSetID", half},
                   {"ZELOCredSessItemSetAccessToken", half},
                   {"ZELOCredSessSave", half}}});
}

TEST(ServerCredential, DeleteSurvivesEveryFailingCall) {
    const auto bothStates = [] {
        return State() + " | " + stored::Describe("ZELO.NotificationCenter");
    };
    const std::string strQrm = "https://qrm:443 ?";
    const std::string strCenter = "https://center:443 ?";
    const std::string strTokens = " token=t csrf=c";
    const torture::Expected gone{"true", "", " | "};
    torture::Run({"delete",
                  kFile,
                  [] {
                      AddServer(nullptr);
                      stored::AddSession(stored::AddCredential("ZELO.NotificationCenter", "center"),
                                         "t", "c");
                  },
                  [] { return Bool(ZELOQRMClientDeleteServerCredential()); },
                  bothStates,
                  "ZELOCredIDGetByApplication ZELOCredSessRemoveByID ZELOCredRemoveByID "
                  "ZELOCredIDGetByApplication ZELOCredSessRemoveByID ZELOCredRemoveByID",
                  gone,
                  {{"ZELOCredIDGetByApplication#1", {"true", "", strQrm + strTokens + " | "}},
                   {"ZELOCredIDGetByApplication#2", {"true", "", " | " + strCenter + strTokens}},
                   {"ZELOCredSessRemoveByID#1",
                    {"false", "", strQrm + strTokens + " | " + strCenter + strTokens}},
                   {"ZELOCredRemoveByID#1", {"false", "", strQrm + " | " + strCenter + strTokens}},
                   {"ZELOCredSessRemoveByID#2", {"false", "", " | " + strCenter + strTokens}},
                   {"ZELOCredRemoveByID#2", {"false", "", " | " + strCenter}}}});

    stored::Clear();
    EXPECT_TRUE(ZELOQRMClientDeleteServerCredential());
}

TEST(ServerCredential, GetSurvivesEveryFailingCall) {
    const std::string strKept = R"(https://qrm:443 {"sn":[7]} token=t csrf=c)";
    const auto expect = [&](const std::string &strOut) {
        return torture::Expected{"true " + strOut, "", strKept};
    };
    torture::Run(
        {"get",
         kFile,
         [] { AddServer(R"({"sn":[7]})"); },
         [] {
             Json::Value out = Parse(R"({"own":1})");
             const bool bl = ZELOQRMClientGetServerCredential(out);
             return Bool(bl) + ' ' + Text(out);
         },
         State,
         "ZELOCredListGet ZELOCredItemGetHost ZELOCredItemGetPort ZELOCredItemGetProtocol "
         "ZELOCredItemGetExtraInfo",
         expect(R"({"host":"qrm","own":1,"port":443,"protocol":"https","sn":[7]})"),
         {{"ZELOCredListGet", {"false {\"own\":1}", "cannot find qrm server info", strKept}},
          {"ZELOCredItemGetHost", expect(R"({"own":1,"port":443,"protocol":"https","sn":[7]})")},
          {"ZELOCredItemGetPort", expect(R"({"host":"qrm","own":1,"protocol":"https","sn":[7]})")},
          {"ZELOCredItemGetProtocol", expect(R"({"host":"qrm","own":1,"port":443,"sn":[7]})")},
          {"ZELOCredItemGetExtraInfo",
           expect(R"({"host":"qrm","own":1,"port":443,"protocol":"https"})")}}});
}

TEST(ServerCredential, GetWithTokenSurvivesEveryFailingCall) {
    const std::string strKept = R"(https://qrm:443 {"sn":7} token=t csrf=c)";
    const std::string strServer = R"("host":"qrm","port":443,"protocol":"https","sn":7})";
    const std::string strApplication = R"("application":"ZELO.QRM",)";
    const std::string strFailed = "false {" + strApplication + strServer;
    const auto expect = [&](const std::string &strOut) {
        return torture::Expected{"true {" + strOut, "", strKept};
    };
    const std::string strTokens =
        R"("access_token":"t","application":"ZELO.QRM","csrf_token":"c",)";
    const std::string strNoSession =
        "cannot find qrm server session[" +
        std::to_string((AddServer(nullptr), ZELOCredIDGetByApplication("ZELO.QRM"))) + ']';
    torture::Run(
        {"get with token",
         kFile,
         [] {
             // The session and the extra information change, the id stays for the message.
             ZELO_CRED *pList = nullptr;
             ZELOCredListGet(&pList, ZELOCredKeepByApplication, "ZELO.QRM");
             ZELOCredItemSetExtraInfo(pList, R"({"sn":7})");
             ZELOCredSave(pList);
             ZELOCredListFree(&pList);
         },
         [] {
             Json::Value out;
             const bool bl = ZELOQRMClientGetServerCredentialWithToken(out);
             return Bool(bl) + ' ' + Text(out);
         },
         State,
         "ZELOCredListGet ZELOCredItemGetHost ZELOCredItemGetPort ZELOCredItemGetProtocol "
         "ZELOCredItemGetExtraInfo ZELOCredItemGetID ZELOCredSessAlloc ZELOCredSessLoad "
         "ZELOCredSessLoad ZELOCredSessItemGetAccessToken ZELOCredSessItemGetCsrfToken",
         expect(strTokens + strServer),
         {{"ZELOCredListGet", {"false null", "cannot find qrm server info", strKept}},
          {"ZELOCredItemGetHost", expect(strTokens + R"("port":443,"protocol":"https","sn":7})")},
          {"ZELOCredItemGetPort", expect(strTokens + R"("host":"qrm","protocol":"https","sn":7})")},
          {"ZELOCredItemGetProtocol", expect(strTokens + R"("host":"qrm","port":443,"sn":7})")},
          {"ZELOCredItemGetExtraInfo",
           expect(strTokens + R"("host":"qrm","port":443,"protocol":"https"})")},
          {"ZELOCredItemGetID", {strFailed, "get cred id fail", strKept}},
          {"ZELOCredSessAlloc", {strFailed, "alloc ZELO_CRED_SESS fail", strKept}},
          {"ZELOCredSessLoad#1", {strFailed, strNoSession, strKept}},
          {"ZELOCredSessLoad#2", {strFailed, strNoSession, strKept}},
          {"ZELOCredSessItemGetAccessToken",
           expect(strApplication + R"("csrf_token":"c",)" + strServer)},
          {"ZELOCredSessItemGetCsrfToken",
           expect(R"("access_token":"t",)" + strApplication + strServer)}}});
}

TEST(ServerCredential, UpdateSurvivesEveryFailingCall) {
    const std::string strOld = R"(https://qrm:443 {"a":1} token=t csrf=c)";
    const torture::Expected silent{"false", "", strOld};
    torture::Run(
        {"update",
         kFile,
         [] { AddServer(R"({"a":1})"); },
         [] {
             Json::Value cred = Parse(
                 R"({"application":"ZELO.QRM","protocol":"http","host":"new","port":80,)"
                 R"("sn":"S","access_token":"u","csrf_token":"ignored","extra_info":"ignored"})");
             return Bool(ZELOQRMClientUpdateServerCredential(cred));
         },
         State,
         "ZELOCredListGet ZELOCredItemSetProtocol ZELOCredItemSetHost ZELOCredItemSetPort "
         "ZELOCredItemSetApplication ZELOCredItemGetExtraInfo ZELOCredItemSetExtraInfo "
         "ZELOCredItemGetID ZELOCredSessAlloc ZELOCredSessLoad ZELOCredSessItemSetAccessToken "
         "ZELOCredSave ZELOCredSessSave",
         {"true", "", R"(http://new:80 {"a":1,"sn":"S"} token=u csrf=c)"},
         {{"ZELOCredListGet", {"false", "cannot find qrm server info", strOld}},
          {"ZELOCredItemSetProtocol", silent},
          {"ZELOCredItemSetHost", silent},
          {"ZELOCredItemSetPort", silent},
          {"ZELOCredItemSetApplication", silent},
          {"ZELOCredItemGetExtraInfo", {"true", "", R"(http://new:80 {"a":1} token=u csrf=c)"}},
          {"ZELOCredItemSetExtraInfo", silent},
          {"ZELOCredItemGetID", {"false", "Get CredId fail", strOld}},
          {"ZELOCredSessAlloc", silent},
          {"ZELOCredSessLoad", silent},
          {"ZELOCredSessItemSetAccessToken", silent},
          {"ZELOCredSave", silent},
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
        EXPECT_EQ(out.size(), 2U) << szGetter << ' ' << Text(out);
    }
}

TEST(ServerCredential, BadInputIsRefusedAndStoresNothing) {
    std::string strDeep = std::string(2000, '[') + std::string(2000, ']');
    Json::Value deep(Json::arrayValue);
    for (int i = 0; i < 2000; ++i) {
        Json::Value outer(Json::arrayValue);
        outer.append(std::move(deep));
        deep = std::move(outer);
    }
    const auto with = [](const char *szMember, const Json::Value &value) {
        Json::Value cred = Parse(kCred);
        cred[szMember] = value;
        return cred;
    };
    const auto without = [](const char *szMember) {
        Json::Value cred = Parse(kCred);
        cred.removeMember(szMember);
        return cred;
    };
    const struct {
        Json::Value cred;
        const char *szLog;
    } rows[] = {
        {Json::Value(), "Bad parameters"},
        {Json::Value("text"), "Bad parameters"},
        {Parse("[1]"), "Bad parameters"},
        {without("protocol"), "Bad parameters"},
        {without("host"), "Bad parameters"},
        {without("port"), "Bad parameters"},
        {without("application"), "Bad parameters"},
        {without("access_token"), "Bad parameters"},
        {with("port", "443"), "Save Cred Item fail"},
        {with("port", 443.5), "Save Cred Item fail"},
        {with("port", Json::Value(Json::UInt64(1) << 40U)), "Save Cred Item fail"},
        {with("host", 5), "Save Cred Item fail"},
        {with("host", std::string("a\0b", 3)), "Save Cred Item fail"},
        {with("protocol", Json::Value()), "Save Cred Item fail"},
        {with("application", Parse("{}")), "Save Cred Item fail"},
        {with("extra_info", deep), "Save Cred Item fail"},
    };
    for (const auto &row : rows) {
        stored::Clear();
        bool blDone = true;
        const seam::Outcome outcome =
            seam::Observe([&] { blDone = ZELOQRMClientCreateServerCredential(row.cred); });
        EXPECT_FALSE(blDone);
        ASSERT_EQ(outcome.logs.size(), 1U);
        EXPECT_EQ(outcome.logs[0].strMessage, row.szLog);
        EXPECT_EQ(State(), "");
    }
    for (Json::Value cred : {Json::Value("x"), Parse("[]"), Parse("{}"),
                             Parse(R"({"application":7})"), Parse(R"({"application":"None"})")}) {
        bool blDone = true;
        const seam::Outcome outcome =
            seam::Observe([&] { blDone = ZELOQRMClientUpdateServerCredential(cred); });
        EXPECT_FALSE(blDone);
        ASSERT_EQ(outcome.logs.size(), 1U);
        EXPECT_EQ(outcome.logs[0].strMessage, "cannot find qrm server info");
    }
    AddServer(R"({"a":1})");
    for (const Json::Value &cred : {with("port", "1"), with("host", 1), with("protocol", 1),
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
    const struct {
        const char *szExtraInfo;
        const char *szAfterUpdate;
        const char *szSn;
    } rows[] = {
        {nullptr, "?", "null"},
        {"", "", "null"},
        {"null", R"({"sn":"S"})", R"("S")"},
        {"[1]", "[1]", "null"},
        {"no json", "no json", "null"},
        {R"({"other":{"x":1}})", R"({"other":{"x":1},"sn":"S"})", R"("S")"},
    };
    for (const auto &row : rows) {
        AddServer(row.szExtraInfo);
        Json::Value cred = Parse(R"({"application":"ZELO.QRM","sn":"S"})");
        EXPECT_TRUE(ZELOQRMClientUpdateServerCredential(cred));
        EXPECT_EQ(State(), std::string("https://qrm:443 ") + row.szAfterUpdate + " token=t csrf=c");
        Json::Value out;
        EXPECT_TRUE(ZELOQRMClientGetServerCredential(out));
        EXPECT_EQ(Text(out["sn"]), row.szSn);
    }
}

TEST(ServerCredential, WhatCanBeStoredCanBeReadBack) {
    const auto nest = [](int depth) {
        Json::Value value = 1;
        for (int i = 0; i < depth; ++i) {
            Json::Value outer(Json::arrayValue);
            outer.append(std::move(value));
            value = std::move(outer);
        }
        return value;
    };
    for (int depth = json_text::kMaxDepth - 2; depth <= json_text::kMaxDepth; ++depth) {
        std::string strText;
        Json::Value read;
        const bool blWritten = json_text::ToString(nest(depth), strText);
        EXPECT_EQ(blWritten, depth < json_text::kMaxDepth);
        EXPECT_EQ(blWritten && json_text::FromString(strText, read), blWritten) << depth;
    }
}

TEST(ServerCredential, TokensAreReadAsTheyAreStored) {
    stored::Clear();
    const long id = stored::AddCredential("ZELO.QRM", "qrm");
    Json::Value out;
    EXPECT_FALSE(ZELOQRMClientGetServerCredentialWithToken(out));
    EXPECT_EQ(Text(out),
              R"({"application":"ZELO.QRM","host":"qrm","port":443,"protocol":"https"})");
    stored::AddSession(id, "", "");
    EXPECT_TRUE(ZELOQRMClientGetServerCredentialWithToken(out));
    EXPECT_EQ(Text(out["access_token"]), R"("")");
    EXPECT_FALSE(out.isMember("csrf_token"));
    stored::AddSession(id, std::string(1500, 'x').c_str());
    EXPECT_TRUE(ZELOQRMClientGetServerCredentialWithToken(out));
    EXPECT_EQ(out["access_token"].asString(), std::string(1023, 'x'));

    // A second record changes nothing: the first one stays in force.
    stored::AddCredential("ZELO.QRM", "second");
    EXPECT_TRUE(ZELOQRMClientGetServerCredential(out));
    EXPECT_EQ(out["host"], "qrm");
}

}  // namespace
