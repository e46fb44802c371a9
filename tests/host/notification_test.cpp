// Notifications: what stands in the journal, what hooks are told, and which hooks are run at all.

#include "notification.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <json/reader.h>
#include <sys/file.h>
#include <syslog.h>

#include <cstdarg>
#include <cstdio>
#include <functional>
#include <set>
#include <vector>

#include "children.h"
#include "failures.h"
#include "files.h"
#include "strings_file.h"

namespace {

using namespace files;

constexpr const char *kFormerJournal = "/var/log/notifications.jsonl.1";
constexpr const char *kHooks = "/usr/zelo/etc/notify.d";
constexpr const char *kHookOutput = "/var/log/hooks";

using Variables = std::vector<std::pair<std::string, std::string>>;

std::string g_strLog;

int Send(const char *szTag, const Variables &variables = {}) {
    YLIBSZHASH *pHash = YLIBCSzHashAlloc(512);
    for (const auto &[strName, strValue] : variables) {
        YLIBCSzHashSetValue(&pHash, strName.c_str(), strValue.c_str());
    }
    const int result = ZELOSysNotifySendNotifiction(szTag, &pHash);
    YLIBCSzHashFree(pHash);
    return result;
}

Json::Value Parse(const std::string &strLine) {
    Json::Value entry;
    EXPECT_TRUE(Json::Reader().parse(strLine, entry)) << strLine;
    return entry;
}

void Hook(const std::string &strName, const std::string &strScript, mode_t mode = 0755) {
    WriteProgram(std::string(kHooks) + "/" + strName, strScript, mode);
}

class Notification : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kJournal);
        fs::remove_all(kFormerJournal);
        fs::remove_all(kHooks);
        fs::remove_all(kHookOutput);
        fs::create_directory(kHooks);
        chmod(kHooks, 0755);
        g_strLog.clear();
    }
};

TEST_F(Notification, TheJournalHoldsTheTextsInTheLanguage) {
    const std::tuple<const char *, const char *, const char *, const char *> rows[] = {
        {"", "QRMClientConnectFailed", "QRM server cannot be reached", "This appliance could not"},
        {"ger", "QRMClientDetachSuccess", "Nicht mehr vom QRM-Server verwaltet", "Dieses Gerät"},
        {"jpn", "QRMClientConnectFailed", "QRM サーバーに接続できません", "このデバイスは"},
        {"xyz", "QRMClientDetachSuccess", "No longer managed by the QRM server", "This appliance"},
        {"../ger", "QRMClientConnectFailed", "QRM server cannot be reached", "This appliance"},
        {"ger", "NoSuchTag", "NoSuchTag", ""},
    };
    const std::string strServer = "%OTHER%\n\"x\"\\\x01 é";
    std::size_t count = 0;
    for (const auto &[szLanguage, szTag, szTitle, szTextStart] : rows) {
        std::ofstream("/etc/zeloinfo.conf") << "language=\"" << szLanguage << "\"\n";
        YLIBCErrSetEx(0x1234, "before", 7);
        ASSERT_EQ(Send(szTag, {{"%QRM_SERVER%", strServer}, {"%OTHER%", "wrong"}}), 0);
        EXPECT_EQ(YLIBCErrGet(), 0x1234U) << "a success is no error";
        const auto lines = FileLines(kJournal);
        ASSERT_EQ(lines.size(), ++count);
        const Json::Value entry = Parse(lines.back());
        EXPECT_EQ(entry["tag"], szTag);
        EXPECT_EQ(entry["title"], szTitle);
        const std::string strText = entry["text"].asString();
        EXPECT_EQ(strText.rfind(szTextStart, 0), 0U) << strText;
        EXPECT_EQ(strText.find(strServer) != std::string::npos, *szTextStart != '\0');
        EXPECT_EQ(entry["variables"]["%QRM_SERVER%"], strServer);
        EXPECT_EQ(entry["variables"].size(), 2U);
        EXPECT_EQ(entry["time"].asString().size(), std::string("2000-01-01T00:00:00Z").size());
    }
    EXPECT_EQ(ZELOSysNotifySendNotifiction("NoSuchTag", nullptr), 0);
    EXPECT_LT(ZELOSysNotifySendNotifiction(nullptr, nullptr), 0);
    EXPECT_LT(ZELOSysNotifySendNotifiction("", nullptr), 0);
    EXPECT_EQ(FileLines(kJournal).size(), count + 1);
}

TEST_F(Notification, HooksRunInTheirOrderWhateverOneOfThemDoes) {
    const std::string strTell =
        "echo ${0##*/} $1 $ZELO_NOTIFY_TITLE/$ZELO_NOTIFY_VAR_QRM_SERVER >>";
    for (const char *szName : {"30-d", "10-a", "40-e", "20-c", "Z", "11-b"}) {
        Hook(szName, strTell + kHookOutput);
    }
    Hook("15-fails", "exit 3");
    Hook("16-dies", "kill -9 $$");
    Hook("17-open", strTell + kHookOutput, 0775);
    Hook("README", strTell + kHookOutput, 0644);
    fs::create_directory(std::string(kHooks) + "/folder");
    fs::create_symlink("10-a", std::string(kHooks) + "/18-li\nnk");
    EXPECT_EQ(Send("Tag", {{"%QRM_SERVER%", "a b;c"}}), 0);
    const std::vector<std::string> expected = {"10-a Tag Tag/a b;c", "11-b Tag Tag/a b;c",
                                               "20-c Tag Tag/a b;c", "30-d Tag Tag/a b;c",
                                               "40-e Tag Tag/a b;c", "Z Tag Tag/a b;c"};
    EXPECT_EQ(FileLines(kHookOutput), expected);
    EXPECT_EQ(std::count(g_strLog.begin(), g_strLog.end(), '\n'), 6) << g_strLog;
    for (const char *szPart :
         {"15-fails' failed for 'Tag': exit status 3", "16-dies' failed", "17-open' is not run",
          R"(18-li\nnk' is not run)", "README' is not run"}) {
        EXPECT_TRUE(Holds(g_strLog, szPart)) << szPart << " in " << g_strLog;
    }

    // A journal that cannot be written is a failure, but hooks are told all the same.
    fs::remove(kJournal);
    fs::create_directory(kJournal);
    EXPECT_EQ(FailureOf(Send("Tag")), YLIBC_ERR_UNSAFE_FILE);
    EXPECT_EQ(FileLines(kHookOutput).size(), 2 * expected.size());

    chmod(kHooks, 0777);
    EXPECT_LT(Send("Tag"), 0);
    EXPECT_TRUE(Holds(failures::Reason(), kJournal)) << failures::Reason();
    EXPECT_EQ(FileLines(kHookOutput).size(), 2 * expected.size())
        << "anybody could have put a hook there";
}

TEST_F(Notification, OnlyAFileOfOursIsTheJournal) {
    WriteFile("/var/log/elsewhere", "");
    const std::pair<const char *, std::function<void()>> rows[] = {
        {"is a link", [] { fs::create_symlink("elsewhere", kJournal); }},
        {"has a second name", [] { fs::create_hard_link("/var/log/elsewhere", kJournal); }},
        {"is no file", [] { EXPECT_EQ(mkfifo(kJournal, 0600), 0); }},
        {"is no file", [] { EXPECT_EQ(mknod(kJournal, S_IFSOCK | 0600, 0), 0); }},
        {"belongs to the user 1000", [] { PutStrangers("file", kJournal); }}};
    for (const auto &[szReason, put] : rows) {
        put();
        // Strangers' files there are where root has made the box.
        if (fs::exists(fs::symlink_status(kJournal))) {
            EXPECT_EQ(FailureOf(Send("Tag")), YLIBC_ERR_UNSAFE_FILE) << szReason;
            EXPECT_EQ(failures::Reason(), '\'' + std::string(kJournal) + "' " + szReason);
        }
        EXPECT_EQ(fs::file_size("/var/log/elsewhere"), 0U);
        fs::remove(kJournal);
    }
}

TEST_F(Notification, AJournalThatIsHeldIsWaitedForUntilTheDeadline) {
    const int fd = open(kJournal, O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    ASSERT_EQ(flock(fd, LOCK_EX), 0);
    ZELODeadlineSet(200);
    EXPECT_EQ(FailureOf(Send("Tag")), YLIBC_ERR_DEADLINE);
    ZELODeadlineSet(-1);
    close(fd);
    EXPECT_EQ(Send("Tag"), 0);
}

TEST_F(Notification, ProcessesAppendAtOnceAndEveryLineIsWhole) {
    constexpr int kProcesses = 4;
    constexpr int kEach = 50;
    std::ofstream(kJournal) << "{\"half";
    EXPECT_TRUE(children::InEach(kProcesses, [](int process) {
        int result = 0;
        for (int i = 0; i < kEach; ++i) {
            const std::string strId = std::to_string(process) + ":" + std::to_string(i);
            result |= Send("Tag", {{"id", strId}, {"filler", std::string(8000, 'x')}});
        }
        return result == 0;
    }));
    std::set<std::string> ids;
    auto lines = FileLines(kFormerJournal);
    ASSERT_FALSE(lines.empty()) << "1.6 MB fit into no single journal";
    EXPECT_EQ(lines.front(), "{\"half");
    lines.erase(lines.begin());
    for (const char *szPath : {kFormerJournal, kJournal}) {
        EXPECT_LE(fs::file_size(szPath), 1024U * 1024U);
    }
    for (const std::string &strLine : FileLines(kJournal)) {
        lines.push_back(strLine);
    }
    for (const std::string &strLine : lines) {
        ids.insert(Parse(strLine)["variables"]["id"].asString());
    }
    EXPECT_EQ(lines.size(), static_cast<std::size_t>(kProcesses * kEach));
    EXPECT_EQ(ids.size(), lines.size());
}

TEST(InterfaceTexts, EveryLanguageHasEveryTextWithTheSameMarkers) {
    const std::string strFolder = "/usr/zelo/zeloman/webman/texts/";
    int languages = 0;
    for (const auto &language : fs::directory_iterator(strFolder)) {
        ++languages;
        std::string strSection;
        for (const std::string &strLine : FileLines(strFolder + "enu/strings")) {
            if (strLine[0] == '[') {
                strSection = strLine.substr(1, strLine.size() - 2);
            } else if (const auto equals = strLine.find('='); equals != std::string::npos) {
                char sz[512] = {};
                const std::string strKey = strLine.substr(0, equals);
                ASSERT_GT(YLIBCFileGetSectionValue((language.path() / "strings").c_str(),
                                                   strSection.c_str(), strKey.c_str(), sz, 512),
                          0)
                    << language.path() << strKey;
                for (const char *szMarker : {"{0}", "{1}", "{2}", "%QRM_SERVER%"}) {
                    EXPECT_EQ(std::string(sz).find(szMarker) == std::string::npos,
                              strLine.find(szMarker) == std::string::npos)
                        << language.path() << strKey;
                }
            }
        }
    }
    EXPECT_EQ(languages, 20);
}

}  // namespace

static void KeepLogLine(const char *szFormat, va_list args) {
    char sz[1024];
    std::vsnprintf(sz, sizeof(sz), szFormat, args);
    g_strLog.append(sz) += '\n';
}

// The host platform's log lines end here; a fortified build calls the second one.
extern "C" void syslog(int /*level*/, const char *szFormat, ...) {
    va_list args;
    va_start(args, szFormat);
    KeepLogLine(szFormat, args);
    va_end(args);
}
extern "C" void __syslog_chk(int /*level*/, int /*flag*/, const char *szFormat, ...) {
    va_list args;
    va_start(args, szFormat);
    KeepLogLine(szFormat, args);
    va_end(args);
}
