// What any plug-in SDK has to promise, and what the host's adds: a plug-in is a folder of programs.

#include <gtest/gtest.h>

#include <chrono>

#include "failures.h"
#include "files.h"
#include "plugin_sdk.h"

namespace {

using namespace files;

constexpr const char *kRoot = "/usr/zelo/etc/plugins";
constexpr const char *kFolder = "/usr/zelo/etc/plugins/qrm_client/disjoin";
constexpr const char *kRan = "/tmp/ran";

// Every program says first that it has run.
void AddProgram(const std::string &strName, const std::string &strBody, mode_t mode = 0755) {
    WriteProgram(fs::path(kFolder) / strName,
                 "echo \"${0##*/}\" >>" + std::string(kRan) + '\n' + strBody, mode);
}

class PluginSdk : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kRoot);
        fs::remove(kRan);
        fs::create_directories(kFolder);
        YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
    }
    void TearDown() override { YLIBPluginExit(pHandle); }

    int Init(const char *szFamily = "qrm_client", const char *szPlugin = "qrm_client/disjoin") {
        YLIBPluginExit(pHandle);
        return YLIBPluginSDKInit(szFamily, szPlugin, &pHandle);
    }
    int Run(_tag_sdk_plugin_action_ action = SDK_PLUGIN_ACTION_PRE) {
        return YLIBPluginAction(action, pHandle);
    }

    YLIBPLUGIN *pHandle = nullptr;
};

TEST_F(PluginSdk, RunsProgramsInTheOrderOfTheirNamesWithTheArguments) {
    const std::string strBody =
        std::string("echo \"$# $1 $QRM_CLIENT_RESULT $QRM_CLIENT_HOST ${HOST-none}\" >>") + kRan;
    for (const char *szName : {"9-last", "10-first", "20-second"}) {
        AddProgram(szName, strBody);
    }
    setenv("QRM_CLIENT_HOST", "inherited", 1);
    ASSERT_GE(Init(), 0);
    EXPECT_NE(YLIBPluginHasInit(pHandle), 0);
    EXPECT_GE(YLIBPluginSetArgByInt(pHandle, "RESULT", 0), 0);
    EXPECT_GE(YLIBPluginSetArg(pHandle, "HOST", "$(a) \"b\"='c'"), 0);
    EXPECT_EQ(Run(SDK_PLUGIN_ACTION_PRE), 0);
    EXPECT_GE(YLIBPluginSetArgByInt(pHandle, "RESULT", -1), 0);
    EXPECT_EQ(Run(SDK_PLUGIN_ACTION_POST), 0);

    std::string strExpected;
    for (const char *szLine : {"1 pre 0", "1 post -1"}) {
        for (const char *szName : {"10-first", "20-second", "9-last"}) {
            strExpected += std::string(szName) + '\n' + szLine + " $(a) \"b\"='c' none\n";
        }
    }
    EXPECT_EQ(FileText(kRan), strExpected);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NONE));
}

TEST_F(PluginSdk, AllProgramsRunAndTheFirstFailureIsTheResult) {
    // The settings leave time enough for the other two.
    const std::tuple<const char *, int, unsigned int, const char *> rows[] = {
        {"exit 3", -3, YLIBC_ERR_EXEC_STATUS, ""},
        {"kill -KILL $$", -137, YLIBC_ERR_EXEC_STATUS, ""},
        {"sleep 600 & wait", -124, YLIBC_ERR_EXEC_TIME, "plugin_timeout=\"2\"\n"}};
    const std::string strSettings = FileText(kConfig);
    AddProgram("0", "true");
    AddProgram("2", "exit 255");
    ASSERT_GE(Init(), 0);
    const auto begin = std::chrono::steady_clock::now();
    for (const auto &[szFirst, result, code, szSettings] : rows) {
        fs::remove(kRan);
        WriteFile(kConfig, szSettings + strSettings);
        AddProgram("1", szFirst);
        EXPECT_EQ(Run(), result);
        EXPECT_EQ(YLIBCErrGet(), code);
        EXPECT_EQ(FileText(kRan), "0\n1\n2\n");
    }
    EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(300));
    WriteFile(kConfig, strSettings);

    std::ofstream(fs::path(kFolder) / "1") << "#!/no/such/interpreter\n";
    EXPECT_EQ(Run(), -126);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_EXEC));
}

TEST_F(PluginSdk, RunsOnlyWhatNobodyElseCanChange) {
    AddProgram("good", "");
    AddProgram("group", "", 0775);
    AddProgram("others", "", 0757);
    AddProgram("plain", "", 0644);
    AddProgram(".hidden", "");
    fs::create_symlink("good", fs::path(kFolder) / "link");
    fs::create_directory(fs::path(kFolder) / "folder");
    ASSERT_GE(Init(), 0);
    EXPECT_EQ(Run(), 0);
    EXPECT_EQ(FileText(kRan), "good\n");

    // The folders on the way are as good as the programs.
    for (const fs::path &folder : {fs::path(kFolder), fs::path(kFolder).parent_path()}) {
        fs::permissions(folder, fs::perms::others_write, fs::perm_options::add);
        EXPECT_LT(Run(), 0);
        EXPECT_EQ(FailureOf(Init()), YLIBC_ERR_UNSAFE_FILE);
        EXPECT_EQ(YLIBPluginHasInit(pHandle), 0);
        fs::permissions(folder, fs::perms::others_write, fs::perm_options::remove);
        ASSERT_GE(Init(), 0);
    }
    EXPECT_EQ(FileText(kRan), "good\n");
    for (const char *szPlugin : {"", "/qrm_client/disjoin", "qrm_client/../qrm_client/disjoin"}) {
        EXPECT_EQ(FailureOf(Init("qrm_client", szPlugin)), YLIBC_ERR_INVALID_ARGUMENT) << szPlugin;
    }
}

}  // namespace
