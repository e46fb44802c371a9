// How a key-value file is replaced: the temporary file beside it, the locks, the waits for the
// disk.

#include <fcntl.h>
#include <sys/syscall.h>

#include <atomic>

#include "failures.h"
#include "key_value.h"

namespace {
std::atomic<int> g_syncs = 0;
}  // namespace

// The platform's calls come here first.
extern "C" int fsync(int fd) {
    ++g_syncs;
    return static_cast<int>(syscall(SYS_fsync, fd));
}

namespace {

using namespace key_value;

constexpr const char *kTemporary = "/tmp/shared/.a.conf.zelo-new";
constexpr const char *kVictim = "/tmp/victim.conf";

using Replacement = KeyValueFile;

TEST_F(Replacement, WritesOnlyWhatIsNewAndWaitsOnlyForWhatOutlivesARestart) {
    fs::remove("/etc/a.conf");
    const std::pair<const char *, int> rows[] = {{kFile, 0}, {"/etc/a.conf", 2}};
    for (const auto &[szPath, syncs] : rows) {
        g_syncs = 0;
        EXPECT_EQ(YLIBCFileRemoveKey(szPath, "k"), 0);
        EXPECT_FALSE(fs::exists(szPath));
        EXPECT_EQ(SetValue(szPath, "k", "v w"), 0);
        const ino_t inode = Status(szPath).st_ino;
        EXPECT_EQ(SetValue(szPath, "k", "v w"), 0);
        EXPECT_EQ(YLIBCFileRemoveKey(szPath, "absent"), 0);
        EXPECT_EQ(Status(szPath).st_ino, inode);
        EXPECT_EQ(g_syncs, syncs);
    }
}

TEST_F(Replacement, InASharedFolderTrapsAreLeftAlone) {
    using Trap = std::function<void(const char *szPath)>;
    const std::pair<const char *, Trap> traps[] = {
        {"link", [](const char *szPath) { fs::create_symlink(kVictim, szPath); }},
        {"dangling link", [](const char *szPath) { fs::create_symlink("/tmp/lured", szPath); }},
        {"second name", [](const char *szPath) { fs::create_hard_link(kVictim, szPath); }},
        {"folder", [](const char *szPath) { fs::create_directory(szPath); }},
        {"FIFO", [](const char *szPath) { mkfifo(szPath, 0666); }},
    };
    fs::remove("/etc/to-shared.conf");
    fs::create_symlink(kFile, "/etc/to-shared.conf");
    WriteFile(kVictim, "k=secret\n");
    for (const auto &[szTrap, set] : traps) {
        SCOPED_TRACE(szTrap);
        SetUp();
        set(kFile);
        for (const char *szPath : {kFile, "/etc/to-shared.conf"}) {
            for (int result : {YLIBCFileCheckKeyValue(szPath, "k", "secret", 0),
                               SetValue(szPath, "k", "v"), YLIBCFileRemoveKey(szPath, "k")}) {
                EXPECT_EQ(FailureOf(result), YLIBC_ERR_UNSAFE_FILE);
            }
        }
        EXPECT_EQ(Names(kFolder), Set{"a.conf"});
        // At the temporary file's name it is no hindrance.
        SetUp();
        set(kTemporary);
        EXPECT_EQ(SetValue(kFile, "k", "v"), 0);
        EXPECT_EQ(FileText(kFile), "k=\"v\"\n");
        EXPECT_EQ(Names(kFolder), (Set{"a.conf", ".a.conf.zelo-new"}));
    }
    EXPECT_EQ(FileText(kVictim), "k=secret\n");
    EXPECT_FALSE(fs::exists("/tmp/lured"));
}

TEST_F(Replacement, WritersOfThePlatformsSettingsExcludeEachOther) {
    Set names = Names("/etc");
    const std::size_t linesBefore = FileLines("/etc/zeloinfo.conf").size();
    EXPECT_TRUE(SetInProcesses(
        4, 10, [](const auto &strKey) { return YLIBCINFOSetKeyValue(strKey.c_str(), "v") == 0; }));
    EXPECT_EQ(FileLines("/etc/zeloinfo.conf").size(), linesBefore + 40);
    names.insert(".zeloinfo.conf.lock");
    EXPECT_EQ(Names("/etc"), names);
}

TEST_F(Replacement, WritersWithoutALockLeaveWholeFiles) {
    const std::string strRest = std::string(200000, '#') + "\nend=here\n";
    WriteFile(kFile, "k=0\n" + strRest);
    WriteFile(kTemporary, "what a killed writer has left");
    const auto writeOn = [](const std::string &strKey) {
        return SetValue(kFile, "k", strKey) == 0;
    };
    const pid_t pid = children::Start([&] { return SetInProcesses(3, 150, writeOn); });
    int status = -1;
    while (waitpid(pid, &status, WNOHANG) == 0) {
        const std::string strContent = FileText(kFile);
        ASSERT_EQ(strContent.substr(strContent.find('\n') + 1), strRest);
    }
    EXPECT_EQ(status, 0);
    EXPECT_NE(Value(kFile, "k"), "0");
    EXPECT_EQ(Names(kFolder), Set{"a.conf"});
}

}  // namespace
