// What any web session store has to promise, and what the host's adds.

#include <gtest/gtest.h>
#include <sys/stat.h>
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

struct Context {
    ZELO_CGI_CONTEXT context = {};
    int inited = ZeloCgiInit("", &context);
    Context() = default;
    Context(const Context &) = delete;
    Context &operator=(const Context &) = delete;
    ~Context() { ZeloCgiFree(&context); }

    bool Exists(int index, const char *szName) {
        return ZeloCgiSessionExistByIndex(&context, index, szName) != 0;
    }
    bool Add(int index, const char *szName) {
        return ZeloCgiAddSessionByIndex(&context, index, szName) != 0;
    }
    bool Remove(int index, const char *szName) {
        return ZeloCgiRemoveSessionByIndex(&context, index, szName) != 0;
    }
};

void ClearLastError() {
    YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
}

int Mode(const char *szPath) {
    struct stat status = {};
    return stat(szPath, &status) == 0 ? static_cast<int>(status.st_mode & 07777U) : -1;
}

bool HasDatabaseOpen() {
    std::error_code error;
    for (const auto &entry : fs::directory_iterator("/proc/self/fd")) {
        if (fs::read_symlink(entry, error) == kDatabase) {
            return true;
        }
    }
    return false;
}

TEST(WebSession, LookingAndRemovingCreateNothing) {
    fs::remove_all(kFolder);
    ClearLastError();
    Context cgi;
    EXPECT_NE(cgi.inited, 0);
    EXPECT_FALSE(cgi.Exists(13, kClient));
    EXPECT_TRUE(cgi.Remove(13, kClient)) << "one that is not there counts as removed";
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NONE)) << "nothing has failed";
    EXPECT_FALSE(fs::exists(kFolder));

    EXPECT_TRUE(cgi.Add(13, kClient));
    EXPECT_EQ(Mode(kFolder), 0700);
    EXPECT_EQ(Mode(kDatabase), 0600);
}

TEST(WebSession, IsKnownByItsIndexAndItsWholeName) {
    fs::remove_all(kFolder);
    Context cgi;
    EXPECT_TRUE(cgi.Add(13, kMachine));
    EXPECT_TRUE(cgi.Add(13, kMachine)) << "one that is there counts as added";
    const struct {
        int index;
        const char *szName;
        bool blExists;
    } rows[] = {{13, kMachine, true},
                {13, kClient, false},
                {13, "zelo.qrm.client.machine", false},
                {0, kMachine, false}};
    for (const auto &row : rows) {
        EXPECT_EQ(Context().Exists(row.index, row.szName), row.blExists) << row.szName;
    }
    EXPECT_TRUE(cgi.Remove(0, kMachine));
    EXPECT_TRUE(cgi.Exists(13, kMachine));
    EXPECT_TRUE(cgi.Remove(13, kMachine));
    EXPECT_FALSE(Context().Exists(13, kMachine));
}

TEST(WebSession, RefusesWhatItCannotUse) {
    Context cgi;
    Context never;
    ZeloCgiFree(&never.context);
    for (int result : {ZeloCgiInit("", nullptr), ZeloCgiInit(nullptr, &never.context),
                       ZeloCgiSessionExistByIndex(nullptr, 13, kClient),
                       ZeloCgiAddSessionByIndex(nullptr, 1, "a"),
                       ZeloCgiAddSessionByIndex(&cgi.context, -1, "a"),
                       ZeloCgiAddSessionByIndex(&cgi.context, 1, ""),
                       ZeloCgiRemoveSessionByIndex(&cgi.context, 1, nullptr),
                       ZeloCgiRemoveSessionByIndex(&never.context, 13, kClient)}) {
        EXPECT_EQ(result, 0);
        EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_INVALID_ARGUMENT));
    }
    ZeloCgiFree(&never.context);
    ZeloCgiFree(nullptr);
}

TEST(WebSession, ProcessesChangeAtOnceAndLoseNothing) {
    fs::remove_all(kFolder);
    constexpr int kProcesses = 6;
    constexpr int kSessions = 12;
    Context cgi;
    EXPECT_TRUE(cgi.Add(13, "open before the fork"));
    EXPECT_TRUE(HasDatabaseOpen());
    std::vector<pid_t> children;
    for (int i = 0; i < kProcesses; ++i) {
        children.push_back(fork());
        if (children.back() == 0) {
            bool blAll = !HasDatabaseOpen();  // SQLite's connections do not survive a fork
            for (int n = 0; n < kSessions; ++n) {
                const std::string strName = std::to_string(i) + '.' + std::to_string(n);
                blAll = blAll && cgi.Add(13, strName.c_str());
                blAll = blAll && (n % 2 == 0 || cgi.Remove(13, strName.c_str()));
            }
            _exit(blAll ? 0 : 1);
        }
    }
    for (pid_t pid : children) {
        int status = -1;
        waitpid(pid, &status, 0);
        EXPECT_EQ(status, 0);
    }
    for (int i = 0; i < kProcesses * kSessions; ++i) {
        const int n = i % kSessions;
        const std::string strName = std::to_string(i / kSessions) + '.' + std::to_string(n);
        EXPECT_EQ(cgi.Exists(13, strName.c_str()), n % 2 == 0) << strName;
    }
}

TEST(WebSession, DamagedOrForeignFilesAreLeftAsTheyAre) {
    fs::remove_all(kFolder);
    fs::create_directory(kFolder);
    // Another store's file is one SQLite database too.
    Context other;
    EXPECT_TRUE(other.Add(13, kClient));
    std::ostringstream good;
    good << std::ifstream(kDatabase, std::ios::binary).rdbuf();
    std::string strForeign = good.str();
    strForeign.replace(68, 4, "none");  // the place of the application id in the file's header
    for (const std::string &strContent : {std::string("no database, but text"), strForeign}) {
        fs::remove(kDatabase);
        std::ofstream(kDatabase, std::ios::binary) << strContent;
        const Context cgi;
        EXPECT_EQ(cgi.inited, 0);
        EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_STORE_DAMAGED));
        EXPECT_FALSE(other.Exists(13, kClient));
        EXPECT_FALSE(other.Add(13, kClient));
        EXPECT_FALSE(other.Remove(13, kClient));
        std::ostringstream now;
        now << std::ifstream(kDatabase, std::ios::binary).rdbuf();
        EXPECT_EQ(now.str(), strContent);
    }
}

}  // namespace
