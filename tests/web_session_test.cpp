// What any web session store has to promise, and what the host's adds.

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <vector>

#include "last_error.h"
#include "web_session.h"

namespace {

namespace fs = std::filesystem;

constexpr const char *kFolder = "/usr/zelo/etc/sessions";
constexpr const char *kDatabase = "/usr/zelo/etc/sessions/sessions.db";
constexpr const char *kClient = "ZELO.QRM.Client";
constexpr const char *kMachine = "ZELO.QRM.Client.Machine";

class WebSession : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kFolder);
        YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
        EXPECT_NE(ZeloCgiInit("", &context), 0);
    }
    void TearDown() override { ZeloCgiFree(&context); }

    bool Exists(int index, const char *szName) {
        return ZeloCgiSessionExistByIndex(&context, index, szName) != 0;
    }
    bool Add(int index, const char *szName) {
        return ZeloCgiAddSessionByIndex(&context, index, szName) != 0;
    }
    bool Remove(int index, const char *szName) {
        return ZeloCgiRemoveSessionByIndex(&context, index, szName) != 0;
    }

    ZELO_CGI_CONTEXT context = {};
};

bool HasDatabaseOpen() {
    std::error_code error;
    for (const auto &entry : fs::directory_iterator("/proc/self/fd")) {
        if (fs::read_symlink(entry, error) == kDatabase) {
            return true;
        }
    }
    return false;
}

TEST_F(WebSession, LookingAndRemovingCreateNothing) {
    EXPECT_FALSE(Exists(13, kClient));
    EXPECT_TRUE(Remove(13, kClient)) << "one that is not there counts as removed";
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NONE)) << "nothing has failed";
    EXPECT_FALSE(fs::exists(kFolder));

    EXPECT_TRUE(Add(13, kClient));
    EXPECT_EQ(fs::status(kFolder).permissions(), fs::perms::owner_all);
    EXPECT_EQ(fs::status(kDatabase).permissions(), fs::perms::owner_read | fs::perms::owner_write);
}

TEST_F(WebSession, IsKnownByItsIndexAndItsWholeName) {
    EXPECT_TRUE(Add(13, kMachine));
    EXPECT_TRUE(Add(13, kMachine)) << "one that is there counts as added";
    EXPECT_FALSE(Exists(13, kClient));
    EXPECT_FALSE(Exists(13, "zelo.qrm.client.machine"));
    EXPECT_FALSE(Exists(0, kMachine));
    EXPECT_TRUE(Remove(0, kMachine));
    EXPECT_TRUE(Exists(13, kMachine));
    EXPECT_TRUE(Remove(13, kMachine));
    EXPECT_FALSE(Exists(13, kMachine));
}

TEST_F(WebSession, RefusesWhatItCannotUse) {
    ZELO_CGI_CONTEXT never = {};
    for (int result :
         {ZeloCgiInit("", nullptr), ZeloCgiInit(nullptr, &never),
          ZeloCgiAddSessionByIndex(&context, -1, "a"), ZeloCgiAddSessionByIndex(&context, 1, ""),
          ZeloCgiRemoveSessionByIndex(&never, 13, kClient)}) {
        EXPECT_EQ(result, 0);
        EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_INVALID_ARGUMENT));
    }
    ZeloCgiFree(&never);
    ZeloCgiFree(nullptr);
}

TEST_F(WebSession, ProcessesChangeAtOnceAndLoseNothing) {
    constexpr int kProcesses = 6;
    constexpr int kSessions = 12;
    const auto name = [](int process, int session) {
        return std::to_string(process) + '.' + std::to_string(session);
    };
    EXPECT_TRUE(Add(13, "open before the fork"));
    EXPECT_TRUE(HasDatabaseOpen());
    std::vector<pid_t> children;
    for (int i = 0; i < kProcesses; ++i) {
        children.push_back(fork());
        if (children.back() == 0) {
            bool blAll = !HasDatabaseOpen();  // SQLite's connections do not survive a fork
            for (int n = 0; n < kSessions; ++n) {
                blAll = blAll && Add(13, name(i, n).c_str());
                blAll = blAll && (n % 2 == 0 || Remove(13, name(i, n).c_str()));
            }
            _exit(blAll ? 0 : 1);
        }
    }
    for (int i = 0; i < kProcesses; ++i) {
        int status = -1;
        waitpid(children[static_cast<std::size_t>(i)], &status, 0);
        EXPECT_EQ(status, 0);
        for (int n = 0; n < kSessions; ++n) {
            EXPECT_EQ(Exists(13, name(i, n).c_str()), n % 2 == 0) << name(i, n);
        }
    }
}

TEST_F(WebSession, ADamagedFileIsLeftAsItIs) {
    const std::string strContent = "no database, but text";
    fs::create_directory(kFolder);
    std::ofstream(kDatabase) << strContent;
    ZELO_CGI_CONTEXT other = {};
    EXPECT_EQ(ZeloCgiInit("", &other), 0);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_STORE_DAMAGED));
    EXPECT_FALSE(Exists(13, kClient));
    EXPECT_FALSE(Add(13, kClient));
    EXPECT_FALSE(Remove(13, kClient));
    ZeloCgiFree(&other);
    std::ostringstream now;
    now << std::ifstream(kDatabase).rdbuf();
    EXPECT_EQ(now.str(), strContent);
}

}  // namespace
