// Requests to the joined server: the Web API call with its status, marker and notification, the
// client info update, and the download, over real HTTPS.

#include <fcntl.h>
#include <sys/file.h>

#include <chrono>

#include "children.h"
#include "descriptor.h"
#include "joined.h"
#include "json.h"
#include "last_error.h"
#include "text_containers.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

using namespace files;
using joined::Messages;
using torture::Expected;

constexpr const char *kFile = "qrm_send_webapi";
constexpr const char *kApi = "ZELO.QRM.RPC";
constexpr const char *kFileApi = "ZELO.QRM.RPC.File";
constexpr const char *kUpdateApi = "ZELO.QRM.RPC.ClientInfo";
constexpr const char *kDownload = "/tmp/got/deep/file";

class SendWebapi : public joined::Joined {
  protected:
    static std::string Call(bool blUseCache = false, const char *szMethod = "info") {
        Json::Value resp = "untouched";
        const int result =
            ZELOQRMClientSendWebapi(resp, kApi, 1, szMethod, Json::Value(), blUseCache);
        EXPECT_EQ(result == -1, resp == Json::Value("untouched"));
        return std::to_string(result);
    }
};

TEST_F(SendWebapi, SurvivesEveryFailingCallOfTheFirstCallOfAProcess) {
    const auto fails = [&](const char *szLog, int kept) {
        return Expected{"-1", szLog, "status= marker=yes notified=1", kept};
    };
    const Expected done{"0", "", "status=success marker=no notified=0", 2};
    const Expected noStatus{"0", "", "status= marker=no notified=0", 2};
    torture::Run(
        {"call",
         kFile,
         [] { Reset(); },
         [] { return Call(); },
         State,
         done,
         {{"ZELOCredIDGetByApplication('ZELO.QRM')", fails("QRM credential is not found. [E]", 0)},
          {"ZELOCredAlloc()", fails("Failed to alloc ZELO_CRED. [E]", 0)},
          {"ZELOCredLoad(-1, *)", fails("Failed to load default ZELO_CRED. [E]", 1)},
          {"ZELOCredLoad(1, *)", fails("CredId [1] is invalid. [E]", 1)},
          {"ZELOCredSessAlloc()", fails("Failed to alloc ZELO_CRED_SESS. [E]", 1)},
          {"ZELOCredSessLoad(-1, *)", fails("Failed to load default ZELO_CRED_SESS. [E]", 2)},
          {"ZELOCredSessLoad(1, *)", fails("CredId [1] is invalid. [E]", 2)},
          {"CreateWebAPIRequest(*, *, 'ZELO.QRM.RPC', 1, 'info', *)",
           fails("Create CredRequest fail. api=ZELO.QRM.RPC, ver=1, method=info", 2)},
          // An URL that cannot be read is no https URL: the parameters are to be protected.
          {"GetURL(*)", done},
          {"Process(*, 1, 0)",
           fails("Process webapi fail. api=ZELO.QRM.RPC, ver=1, method=info", 2)},
          {"GetResponse(*)",
           {"-1", "API:ZELO.QRM.RPC, method:info, Response invalid: ",
            "status=no_connection marker=yes notified=1", 2}},
          {"YLIBCFileLockByFile('/tmp/qrm_client.info.lock', 0, *)\n"
           "YLIBCFileSetKeyValue('/tmp/qrm_client.info', 'status', 'success', 0)",
           noStatus},
          {"unlink('/tmp/qrmclientconnectfailed')", done}},
         true});
}

TEST_F(SendWebapi, TheFailurePathNotifiesHoweverItsOwnCallsFail) {
    const std::string strAbsent = "qrm_send_webapi QRM credential is not found. [E]\n";
    const std::string strUnnamed = "qrm_server_credential cannot find qrm server info";
    const char *szMarked = "status= marker=yes notified=1";
    const char *szUntold = "status= marker=yes notified=0";
    const Expected told{"-1", strAbsent + strUnnamed, szMarked};
    torture::Run(
        {"notify",
         "",
         [] {
             Reset();
             ZELOQRMClientDeleteServerCredential();
         },
         [] { return Call(); },
         State,
         told,
         {{"ZELOCredIDGetByApplication('ZELO.QRM')", told},
          {"YLIBCFileStat('/tmp/qrmclientconnectfailed', 1, *)", told},
          {"YLIBCExec('/bin/touch', '/tmp/qrmclientconnectfailed', null, null, null)", told},
          {"YLIBCSzHashAlloc(512)",
           {"-1", strAbsent + "qrm_send_notificatioin Failed to YLIBCSzHashAlloc[E]", szUntold}},
          {"ZELOCredListGet(*, *, 'ZELO.QRM')\n"
           "YLIBCSzHashGetValue(*, '%QRM_SERVER%')",
           told},
          {"YLIBCSzHashSetValue(*, '%QRM_SERVER%', 'Unknown')",
           {"-1", told.strLog + "\nqrm_send_notificatioin Failed to YLIBCSzHashSetValue[E]",
            szMarked}},
          {"ZELOSysNotifySendNotifiction('QRMClientConnectFailed', *)",
           {"-1", told.strLog, szUntold}}}});
}

TEST_F(SendWebapi, TheReplyDecidesTheStatus) {
    const std::pair<std::string, std::string> rows[] = {
        {R"({"success":true,"data":1})", "success"},
        {R"({"success":1})", "success"},
        {R"({"success":false,"error":{"code":104}})", "error"},
        {R"({"success":false,"error":{"code":105}})", "no_permission"},
        {R"({"success":false,"error":{"code":106}})", "no_permission"},
        {R"({"success":false,"error":{"code":107}})", "no_permission"},
        {R"({"success":false,"error":{"code":108}})", "error"},
        {R"({"success":false,"error":{"code":105.0}})", "no_permission"},
        {R"({"success":false,"error":{"code":"105"}})", "error"},
        {R"({"success":"true"})", "error"},
        {"{}", "error"},
        {"[1]", "error"},
        {"null", "error"},
        {"", "no_connection"},
        {"<html>", "no_connection"},
        {R"({"success":tr)", "no_connection"},
        {std::string(2000, '[') + std::string(2000, ']'), "no_connection"},
    };
    EXPECT_EQ(Call(), "0") << "and the process keeps its records";
    for (const auto &[strBody, strStatus] : rows) {
        SCOPED_TRACE(strBody.substr(0, 60));
        WriteFile(kMarker, "");
        Answer(kApi, "info", strBody);
        Json::Value resp;
        int result = 1;
        const seam::Outcome outcome = seam::Observe(
            [&] { result = ZELOQRMClientSendWebapi(resp, kApi, 1, "info", Json::Value(), false); });
        const bool blReply = strStatus != "no_connection";
        EXPECT_EQ(result, blReply ? 0 : -1);
        Json::Value body;
        EXPECT_EQ(json::FromString(strBody, body), blReply);
        EXPECT_EQ(resp, body);
        EXPECT_EQ(State(),
                  "status=" + strStatus + " marker=" + (blReply ? "no" : "yes") + " notified=0");
        EXPECT_EQ(Messages(outcome),
                  strStatus == "success"
                      ? ""
                      : "API:ZELO.QRM.RPC, method:info, Response invalid: " + strBody);
        EXPECT_EQ(outcome.recordsLeft, 0);
    }
}

TEST_F(SendWebapi, EchoedTokensStayOutOfTheLog) {
    Answer(kApi, "info",
           std::string("{\"t\":\"") + joined::kToken + "\",\"c\":\"csrf-9876543210\"}");
    EXPECT_EQ(seam::MessagesOf([] { EXPECT_EQ(Call(), "0"); }),
              R"(API:ZELO.QRM.RPC, method:info, Response invalid: {"t":"***","c":"***"})");
}

TEST_F(SendWebapi, NamesWithControlCharactersStayOnTheirLine) {
    const char *szMethod = "m\r\x1B";
    Answer(kApi, szMethod, "no json\n");
    const std::tuple<const char *, seam::Fault, const char *> rows[] = {
        {"A\nB", {}, R"(Create CredRequest fail. api=A\nB, ver=1, method=m\r\x1B)"},
        {kApi, {"Process"}, R"(Process webapi fail. api=ZELO.QRM.RPC, ver=1, method=m\r\x1B)"},
        {kApi, {}, R"(API:ZELO.QRM.RPC, method:m\r\x1B, Response invalid: no json\n)"},
    };
    for (const auto &[szApi, fault, szLog] : rows) {
        const std::string strApi = szApi;
        Json::Value reply;
        EXPECT_EQ(
            seam::MessagesOf(
                fault,
                [&] { ZELOQRMClientSendWebapi(reply, strApi, 1, szMethod, Json::Value(), false); }),
            szLog);
    }
}

TEST_F(SendWebapi, UsersAreToldAgainAfterTwoHoursAndAtOnceAfterAReply) {
    constexpr long kNow = 2'000'000'000;
    for (const long age : {0, 7200, 7201, -7200, -7201}) {
        SCOPED_TRACE(age);
        const bool blTold = std::abs(age) > 7200;
        Reset();
        ZELOQRMClientDeleteServerCredential();
        WriteFile(kMarker, "");
        const timespec times[] = {{kNow - age, 0}, {kNow - age, 0}};
        utimensat(AT_FDCWD, kMarker, times, 0);
        seam::Observe({"time", 1, true, kNow}, [] { EXPECT_EQ(Call(), "-1"); });
        EXPECT_EQ(State(),
                  blTold ? "status= marker=yes notified=1" : "status= marker=yes notified=0");
        EXPECT_EQ(Status(kMarker).st_mtime == kNow - age, !blTold);
    }
}

TEST_F(SendWebapi, WhatOthersPutInTheMarkersPlaceNeitherSilencesNorMisleadsIt) {
    constexpr const char *kTarget = "/tmp/target";
    const std::time_t then = std::time(nullptr) - 60;
    Descriptor locked;
    const std::function<bool()> rows[] = {
        [] { return symlink(kTarget, kMarker) == 0; },
        [] { return symlink("/tmp/absent", kMarker) == 0; },
        [] { return link(kTarget, kMarker) == 0; },
        [] { return mkfifo(kMarker, 0666) == 0; },
        [] { return fs::create_directory(kMarker); },
        [] { return fs::create_directories(std::string(kMarker) + "/full"); },
        [] { return PutStrangers("link", kMarker); },
        [] { return PutStrangers("file", kMarker); },
        [&] {
            const bool blPut = PutStrangers("file", kMarker);
            locked = Descriptor(open(kMarker, O_RDONLY | O_CLOEXEC));
            return blPut && flock(locked.Get(), LOCK_EX) == 0;
        }};
    for (const auto &put : rows) {
        // It stands there when the marker is looked at, or comes right afterwards.
        for (const char *szLook : {"", "YLIBCFileStat"}) {
            SCOPED_TRACE(&put - rows);
            Reset();
            ZELOQRMClientDeleteServerCredential();
            Replace(kTarget, "");
            const timespec times[] = {{then, 0}, {then, 0}};
            utimensat(AT_FDCWD, kTarget, times, 0);
            if (!put()) {
                continue;  // there is no other user here
            }
            seam::Observe({szLook, 1, true, -1}, [] { EXPECT_EQ(Call(), "-1"); });
            EXPECT_EQ(State(), "status= marker=yes notified=1");
            const struct stat status = Status(kMarker);
            EXPECT_TRUE(S_ISREG(status.st_mode) && status.st_uid == geteuid());
            EXPECT_EQ(Status(kTarget).st_mtime, then);
            EXPECT_FALSE(fs::exists("/tmp/absent"));
        }
    }

    // Where others can rename what is ours, nothing is touched by its name.
    chmod("/tmp", 0777);
    Reset();
    ZELOQRMClientDeleteServerCredential();
    const seam::Outcome outcome = seam::Observe([] { EXPECT_EQ(Call(), "-1"); });
    chmod("/tmp", 01777);
    EXPECT_EQ(State(), "status= marker=yes notified=1");
    EXPECT_EQ(std::count(outcome.calls.begin(), outcome.calls.end(), "YLIBCExec"), 0);
}

TEST_F(SendWebapi, TheCacheIsUsedOnlyWhenAskedFor) {
    torture::Separately(true, [] {
        EXPECT_EQ(Call(true), "0") << "the first call of a process loads";
        ZELOQRMClientDeleteServerCredential();
        const seam::Outcome cached = seam::Observe([] { EXPECT_EQ(Call(true), "0"); });
        EXPECT_EQ(cached.calls.at(0), "CreateWebAPIRequest") << "without a look at the store";
        EXPECT_EQ(Call(false), "-1");
    });
}

TEST_F(SendWebapi, PlainHttpAsksForProtectedParameters) {
    Reset("http");
    const seam::Outcome outcome = seam::Observe([] { EXPECT_EQ(Call(), "0"); });
    EXPECT_NE(torture::Joined(outcome.details, "\n")
                  .find("GetURL(*)\nSetEncryptMode(*, 2)\nProcess(*, 1, 0)"),
              std::string::npos);
    const seam::Outcome refused =
        seam::Observe({"SetEncryptMode", 1}, [] { EXPECT_EQ(Call(), "-1"); });
    EXPECT_EQ(Messages(refused), "Failed to set encrypt mode for https.");
    EXPECT_EQ(refused.recordsLeft, 0);
}

TEST_F(SendWebapi, TheTokensGoToTheServerAloneAndAsHeaders) {
    EXPECT_EQ(Call(), "0");
    DevServerProcess other{devserver::Options()};
    other.Start();
    devserver::NextAnswer redirect;
    redirect.method = "info";
    redirect.status = 307;
    redirect.headers["Location"] =
        "http://localhost:" + std::to_string(other.HttpPort()) + "/qrm/rpc";
    s_pServer->AnswerNext(kApi, redirect);
    EXPECT_EQ(Call(), "-1");
    EXPECT_EQ(State(), "status=no_connection marker=yes notified=1");
    EXPECT_EQ(other.Requests().size(), 0U);

    const Json::Value requests = s_pServer->Requests();
    const Json::Value &call = requests[requests.size() - 1U];
    EXPECT_EQ(call["headers"]["Authorization"], std::string("Bearer ") + joined::kToken);
    EXPECT_EQ(call["headers"]["X-QRM-CSRF-Token"], "csrf-9876543210");
    EXPECT_EQ(call["body"].asString().find(joined::kToken), std::string::npos);

    for (const char *szToken : {"a\r\nX-Evil: 1", "a b", "a\x7F"}) {
        stored::AddSession(1, szToken);
        s_pServer->ForgetRequests();
        EXPECT_EQ(Call(), "-1");
        EXPECT_EQ(s_pServer->Requests().size(), 0U);
    }
}

// A server that is silent, that sends a byte a second for ever, that never ends, that cuts: each
// call ends within its bound and leaves the status of the call before, and the user is told. They
// wait at the same time, each in a process of its own.
TEST_F(SendWebapi, NoServerKeepsACallForEver) {
    std::map<std::string, devserver::NextAnswer> answers;
    answers["silent"].delay_ms = 120'000;
    answers["slow"].bytes_per_s = 1;
    answers["slow"].endless = true;
    answers["endless"].endless = true;
    answers["cut"].cut_after = 5;
    // A file may be endless; silent and slow are no better than in a call.
    answers["file, silent"] = answers["silent"];
    answers["file, slow"] = answers["slow"];
    for (auto &[strMethod, answer] : answers) {
        answer.method = strMethod;
        answer.status = 200;
        s_pServer->AnswerNext(kApi, answer);
    }
    EXPECT_EQ(Call(), "0");
    EXPECT_TRUE(children::InEach(static_cast<int>(answers.size()), [&](int i) {
        const std::string &strMethod = std::next(answers.begin(), i)->first;
        const bool blFile = strMethod.rfind("file", 0) == 0;
        const auto start = std::chrono::steady_clock::now();
        int result = 0;
        const seam::Outcome outcome = seam::Observe([&] {
            Json::Value params;
            result = blFile ? ZELOQRMClientGetFile("/tmp/" + strMethod, kApi, 1, strMethod, params)
                            : std::stoi(Call(false, strMethod.c_str()));
        });
        const bool blLookedAtMarker =
            std::count(outcome.calls.begin(), outcome.calls.end(), "YLIBCFileStat") == 1;
        return result == -1 && !HasFailure() && blLookedAtMarker != blFile &&
               std::chrono::steady_clock::now() - start < std::chrono::seconds(100);
    }));
    EXPECT_EQ(State().substr(0, State().rfind('=')), "status=success marker=yes notified");
    EXPECT_GE(joined::CountLines(kJournal), 1);
}

// --- Client info update -------------------------------------------------------------------------

TEST_F(SendWebapi, TheUpdateSurvivesEveryFailingCall) {
    const std::string strUpdated = R"({"build_number":123,"host":["h"],"http_port":5000,)"
                                   R"("https_port":5001,"name":"zelobox",)"
                                   R"("nvo_version":"NVO 6.2-123 Update 4","sn":"SN"})";
    WriteFile("/etc/zeloinfo.conf", "admin_port=5000\nsecure_admin_port=5001\nrunHTTPS=no\n");
    WriteFile("/etc.defaults/VERSION",
              "majorversion=6\nminorversion=2\nbuildnumber=123\nsmallfixnumber=4\n");
    WriteFile("/etc.defaults/serial_number", "SN\n");
    const auto sent = [] {
        Json::Value call;
        for (const Json::Value &request : s_pServer->Requests()) {
            json::FromString(request["body"].asString(), call);
        }
        return json::ToLogText(call["params"]);
    };
    const Expected silent{"-1", "", "null"};
    const auto without = [&](const std::string &strPart, const char *szLog = "") {
        std::string strLeft = strUpdated;
        return Expected{"0", szLog, strLeft.erase(strLeft.find(strPart), strPart.size())};
    };
    const auto read = [](const char *szFile, const char *szKey, const char *szSize) {
        return std::string("YLIBCFileGetKeyValue('/") + szFile + "', '" + szKey + "', buf, " +
               szSize + ", 0)";
    };
    const char *szVersion = "etc.defaults/VERSION";
    const char *szConfig = "etc/zeloinfo.conf";
    Json::Value info;
    info["host"].append("h");
    info["http_port"] = 1;
    torture::Case test{"update",
                       "qrm_send_setclient",
                       [] {
                           s_pServer->ForgetRequests();
                           Answer(kUpdateApi, "update", R"({"success":true})");
                       },
                       [&] { return std::to_string(ZELOQRMClientSendSetClient(info)); },
                       sent,
                       {"0", "", strUpdated},
                       {{"YLIBGetCustomSerialNumber(buf, 31)", {"0", "", strUpdated}},
                        {"YLIBGetSerialNumber(buf, 36)",
                         without("SN", "Failed to get serial number from flash. [E]")},
                        {"gethostname(buf, 1024)", silent},
                        {read(szVersion, "majorversion", "16"), silent},
                        {read(szVersion, "minorversion", "16"), silent},
                        {read(szVersion, "smallfixnumber", "16"), without(" Update 4")},
                        {read(szVersion, "buildnumber", "16"), silent},
                        {read(szConfig, "admin_port", "1024"), silent},
                        {read(szConfig, "secure_admin_port", "1024"), silent}}};
    // The calls of the Web API call have a table of their own: what counts here comes before them.
    test.blGoesOn = true;
    torture::Run(test);
    // A serial number that fills its buffer goes out as it is, and nothing that lies behind it.
    const std::string strSerial(36, 'S');
    torture::RunOnce(test, {"YLIBGetSerialNumber", 1, true, 0, 0, strSerial},
                     {"0", "", std::regex_replace(strUpdated, std::regex("SN"), strSerial)});
}

TEST_F(SendWebapi, TheUpdateReportsWhatTheServerSays) {
    const std::pair<const char *, const char *> rows[] = {
        // the reply, and what is logged; "" where the update is taken
        {R"({"success":true})", ""},
        {R"({"success":false,"error":{"code":105}})", "Send create client failed. (105)"},
        {R"({"success":false})", "Send create client failed. (0)"},
        {"[]", "Send create client failed. (0)"},
        {"no json", "Send create client failed. (500)"},
    };
    for (const auto &[szBody, szLog] : rows) {
        Answer(kUpdateApi, "update", szBody);
        int result = 1;
        const seam::Outcome outcome =
            seam::Observe([&] { result = ZELOQRMClientSendSetClient(Json::Value("text")); });
        EXPECT_EQ(result, szLog[0] == '\0' ? 0 : -1);
        EXPECT_EQ(outcome.logs.empty() ? "" : outcome.logs.back().strMessage, szLog);
    }
}

// --- Download -----------------------------------------------------------------------------------

Json::Value FileParams(int size) {
    Json::Value params;
    params["name"] = "f";
    params["size"] = size;
    return params;
}

std::string Download(const char *szPath = kDownload) {
    Json::Value params = FileParams(100'000);
    return std::to_string(ZELOQRMClientGetFile(szPath, kFileApi, 1, "get", params));
}

std::string DownloadState() {
    return fs::exists(kDownload) ? std::to_string(fs::file_size(kDownload)) : "none";
}

TEST_F(SendWebapi, TheDownloadSurvivesEveryFailingCall) {
    const Expected empty{"-1", "", "0"};
    const Expected done{"0", "", "100000"};
    torture::Run({"download",
                  kFile,
                  [] {
                      Reset();
                      fs::create_directories("/tmp/got/deep");
                      WriteFile(kDownload, "old");
                  },
                  [] { return Download(); },
                  DownloadState,
                  done,
                  {{"ZELOFSMkdirP('/tmp/got/deep', 0, 1, 1024, 100, 493)",
                    {"-1", "Failed to prepare path [/tmp/got/deep] [E]", "3"}},
                   {"fopen64('/tmp/got/deep/file', 'w')", {"-1", "", "3"}},
                   {"ZELOCredIDGetByApplication('ZELO.QRM')\n"
                    "CreateWebAPIRequestById(1, 'ZELO.QRM.RPC.File', 1, 'get', *)",
                    empty},
                   {"GetURL(*)", done},
                   {"SetRespStream(*, *, null)\nProcess(*, 1, 0)", empty}}});
}

TEST_F(SendWebapi, ADownloadTellsTheCopyThatItHas) {
    fs::remove_all("/tmp/got");
    Json::Value params = FileParams(100'000);
    EXPECT_EQ(ZELOQRMClientGetFile(kDownload, kFileApi, 1, "get", params), 0);
    EXPECT_FALSE(params.isMember("md5")) << "there was no copy";
    EXPECT_EQ(DownloadState(), "100000");
    const std::string strContent = FileText(kDownload);

    params = FileParams(100'001);
    EXPECT_EQ(ZELOQRMClientGetFile(kDownload, kFileApi, 1, "get", params), 0);
    EXPECT_EQ(params["md5"].asString().size(), 32U);
    EXPECT_EQ(DownloadState(), "100001");

    // The server answers that the copy is current: a result of 0, and the file emptied before.
    params = FileParams(100'001);
    YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
    EXPECT_EQ(ZELOQRMClientGetFile(kDownload, kFileApi, 1, "get", params), 0);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_UNCHANGED));
    EXPECT_EQ(DownloadState(), "0");

    fs::remove(kDownload);
    Answer(kFileApi, "get", "", 304);
    EXPECT_EQ(Download(), "-1") << "there is no copy that could be current";

    for (const char *szPath :
         {"/tmp/got/a\\b", "\\c", "file-in-the-current-directory", "/tmp/got/deep/file"}) {
        fs::current_path("/tmp/got");
        EXPECT_EQ(Download(szPath), "0") << szPath;
        EXPECT_EQ(FileText(szPath), strContent) << szPath;
        fs::current_path("/");
    }
    EXPECT_TRUE(fs::is_directory("/tmp/got/a"));
}

TEST_F(SendWebapi, ADownloadGoesThroughNobodysTrap) {
    constexpr const char *kTarget = "/tmp/target";
    constexpr const char *kShared = "/tmp/shared";
    constexpr const char *kLink = "/tmp/shared/link";
    const auto own = [] { return symlink(kTarget, kLink) == 0; };
    const auto strangers = [] { return PutStrangers("link", kLink); };
    const std::tuple<mode_t, std::function<bool()>, std::string, std::string> rows[] = {
        {01777, own, kLink, "0"},
        {0777, own, kLink, "0"},
        {0755, strangers, kLink, "0"},
        {01777, strangers, kLink, "-1"},
        {0777, strangers, kLink, "-1"},
        {01777, strangers, "/tmp/leads-there", "-1"},
        {01777, strangers, "/tmp/shared/link/deeper/file", "-1"},
        {0777, [] { return PutStrangers("file", kTarget); }, kTarget, "0"},
        {0777, [] { return true; }, "/tmp/shared/new", "0"},
        {01777, [] { return true; }, "/tmp/shared/new", "0"},
    };
    fs::create_symlink(kLink, "/tmp/leads-there");
    for (const auto &[mode, put, strPath, strResult] : rows) {
        SCOPED_TRACE(strPath);
        fs::remove_all(kTarget);
        fs::remove_all(kShared);
        fs::create_directory(kShared);
        chmod(kShared, mode);
        const bool blFolder = Holds(strPath, "deeper");
        blFolder ? static_cast<void>(fs::create_directory(kTarget)) : WriteFile(kTarget, "kept");
        if (!put()) {
            continue;  // there is no other user here
        }
        EXPECT_EQ(Download(strPath.c_str()), strResult);
        const bool blFetched = strResult == "0";
        if (blFolder) {
            EXPECT_TRUE(fs::is_empty(kTarget));
        } else {
            EXPECT_EQ(FileText(blFetched ? strPath : kTarget).size(), blFetched ? 100'000U : 4U);
        }
    }

    mkfifo("/tmp/fifo", 0600);
    const pid_t reader = children::Start([] { return FileText("/tmp/fifo").size() == 100'000; });
    EXPECT_EQ(Download("/tmp/fifo"), "0");
    EXPECT_TRUE(children::Ended(reader));
    EXPECT_EQ(Download("/dev/null"), "0");
}

TEST_F(SendWebapi, AnErrorPageIsNoFile) {
    for (int status : {500, 302}) {
        Answer(kFileApi, "get", "<html>", status);
        EXPECT_EQ(Download(), "-1");
        EXPECT_EQ(DownloadState(), "0");
    }
    devserver::NextAnswer cut;
    cut.method = "get";
    cut.cut_after = 1000;
    s_pServer->AnswerNext(kFileApi, cut);
    EXPECT_EQ(Download(), "-1");
    EXPECT_EQ(DownloadState(), "1000");
    devserver::NextAnswer encoded;
    encoded.method = "get";
    encoded.headers["Content-Encoding"] = "gzip";
    s_pServer->AnswerNext(kFileApi, encoded);
    EXPECT_EQ(Download(), "-1");
    EXPECT_EQ(DownloadState(), "0");
    EXPECT_EQ(Download("/dev/full"), "-1") << "a full disk is an error";
    Json::Value array(Json::arrayValue);
    EXPECT_EQ(Download(), "0");
    EXPECT_EQ(ZELOQRMClientGetFile(kDownload, kFileApi, 1, "get", array), -1);
    EXPECT_EQ(DownloadState(), "100000") << "nothing is emptied for parameters of a wrong type";
}

TEST_F(SendWebapi, DigestsReadAsOneLine) {
    fs::current_path("/tmp");
    const std::string strPath = "digest $(touch evil)'\"";
    std::ofstream(strPath.c_str()) << "The quick brown fox jumps over the lazy dog";
    std::ofstream("/tmp/empty").flush();
    const std::string strDigits = "9e107d9d372bb6826bd81d3542a419d6";
    const std::tuple<const char *, int, int, std::string> rows[] = {
        {strPath.c_str(), 34, 0, strDigits + "\n"},
        {strPath.c_str(), 32, 0, strDigits.substr(0, 31)},
        {strPath.c_str(), 0, -1, "before"},
        {"/tmp/empty", 64, 0, "d41d8cd98f00b204e9800998ecf8427e\n"},
        {"/dev/zero", 64, -1, "before"},
        {"/tmp", 64, -1, "before"},
        {"/tmp/absent", 64, -1, "before"},
        {nullptr, 64, -1, "before"},
    };
    for (const auto &[szPath, size, result, strText] : rows) {
        char sz[64] = "before";
        EXPECT_EQ(GetFileMd5String(szPath, sz, size), result);
        EXPECT_EQ(sz, strText);
    }
    EXPECT_FALSE(fs::exists("/tmp/evil"));
    EXPECT_EQ(GetFileMd5String("/tmp/empty", nullptr, 64), -1);
}

// --- Client info file and notifications ---------------------------------------------------------

TEST_F(SendWebapi, KeysOfTheInfoFileAreReadAsTheyWereWritten) {
    std::string strValue = "before";
    EXPECT_FALSE(ZELOQRMClientGetInfo("key", strValue)) << "there is no file";
    EXPECT_EQ(strValue, "before");
    EXPECT_TRUE(ZELOQRMClientSetInfo("key", "a \"b\" \\ c"));
    EXPECT_TRUE(ZELOQRMClientGetInfo("key", strValue));
    EXPECT_EQ(strValue, "a \"b\" \\ c");
    EXPECT_TRUE(ZELOQRMClientGetInfo("other", strValue));
    EXPECT_EQ(strValue, "");
    EXPECT_TRUE(ZELOQRMClientSetInfo("long", std::string(3000, 'x')));
    EXPECT_TRUE(ZELOQRMClientGetInfo("long", strValue));
    EXPECT_EQ(strValue, std::string(1023, 'x'));

    seam::Observe({"YLIBCFileGetKeyValue", 1, true, 1024, 0, std::string(1024, 'f')},
                  [&] { EXPECT_TRUE(ZELOQRMClientGetInfo("key", strValue)); });
    EXPECT_EQ(strValue, std::string(1023, 'f'));

    const std::string strBefore = FileText(kInfoFile);
    EXPECT_FALSE(ZELOQRMClientSetInfo("a=b", "c"));
    EXPECT_FALSE(ZELOQRMClientSetInfo({"a\0b", 3}, "c"));
    EXPECT_FALSE(ZELOQRMClientSetInfo("a", {"c\0d", 3}));
    EXPECT_EQ(FileText(kInfoFile), strBefore);
}

TEST_F(SendWebapi, NotificationsNameTheServer) {
    const auto last = [] {
        std::string strJournal = FileText(kJournal);
        strJournal.pop_back();
        Json::Value line;
        json::FromString(strJournal.substr(strJournal.rfind('\n') + 1), line);
        return line["variables"];
    };
    YLIBSZHASH *pNull = nullptr;
    for (YLIBSZHASH **ppHash : {static_cast<YLIBSZHASH **>(nullptr), &pNull}) {
        const seam::Outcome outcome =
            seam::Observe([&] { SendNotification("QRMClientDetachSuccess", ppHash); });
        EXPECT_EQ(outcome.recordsLeft, 0);
        EXPECT_TRUE(outcome.logs.empty());
        EXPECT_EQ(json::ToLogText(last()), R"({"%QRM_SERVER%":"localhost"})");
    }
    EXPECT_EQ(pNull, nullptr);
}

}  // namespace
