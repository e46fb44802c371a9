// Key-value files: what is read, what a change leaves as it was, and what stands in its way.

#include "key_value_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/syscall.h>

#include <atomic>
#include <chrono>
#include <set>

#include "children.h"
#include "failures.h"
#include "files.h"

namespace {
std::atomic<int> g_syncs = 0;
}  // namespace

// The platform's calls come here first.
extern "C" int fsync(int fd) {
    ++g_syncs;
    return static_cast<int>(syscall(SYS_fsync, fd));
}

namespace {

using namespace files;
using Set = std::set<std::string>;
using std::string_literals::operator""s;

constexpr const char *kFolder = "/tmp/shared";
constexpr const char *kFile = "/tmp/shared/a.conf";
constexpr const char *kTemporary = "/tmp/shared/.a.conf.zelo-new";
constexpr const char *kVictim = "/tmp/victim.conf";

// A folder that everybody can write to, empty.
class KeyValueFile : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kFolder);
        fs::create_directory(kFolder);
        chmod(kFolder, 01777);
    }
};

Set Names(const char *szFolder) {
    Set names;
    for (const auto &entry : fs::directory_iterator(szFolder)) {
        names.insert(entry.path().filename());
    }
    return names;
}

std::string Value(const char *szPath, const char *szKey) {
    std::string strValue(100000, 'x');
    const int cb = YLIBCFileGetKeyValue(szPath, szKey, strValue.data(), 100000, 0);
    return cb < 0 ? "unreadable" : strValue.substr(0, static_cast<std::size_t>(cb));
}

int SetValue(const char *szPath, const std::string &strKey, const std::string &strValue) {
    return YLIBCFileSetKeyValue(szPath, strKey.c_str(), strValue.c_str(), 0);
}

// Sets keys in so many processes at once; false when one of them has failed.
bool SetInProcesses(int processes, int keys,
                    const std::function<bool(const std::string &strKey)> &set) {
    return children::InEach(processes, [&](int process) {
        bool blAll = true;
        for (int i = 0; i < keys; ++i) {
            blAll = set(std::to_string(process) + '.' + std::to_string(i)) && blAll;
        }
        return blAll;
    });
}

TEST_F(KeyValueFile, ReadsEveryFormOfALine) {
    const std::string strLong(60000, 'v');
    WriteFile(kFile,
              "# plain=comment\n"
              "  #blank=comment\n"
              "plain=value one\n"
              "quoted=\"value two\"\r\n"
              " spaced = \t\"three\"  \n"
              "escaped=\"a \\\"b\\\" \\\\ c\"\n"
              "empty=\n"
              "emptyquoted=\"\"\n"
              "no line\n"
              "=no key\n"
              "open=\"never closed\n"
              "equals=a=b\n"
              "zero=a\0b\n"
              "zero\0=c\n"
              "plain=second\n"
              "long="s +
                  strLong + "\nlast=no line feed");
    const std::tuple<const char *, std::string, int> rows[] = {
        {"plain", "value one", 1},
        {"quoted", "value two", 1},
        {"spaced", "three", 1},
        {"escaped", "a \"b\" \\ c", 1},
        {"empty", "", 1},
        {"emptyquoted", "", 1},
        {"open", "never closed", 1},
        {"equals", "a=b", 1},
        {"long", strLong, 1},
        {"last", "no line feed", 1},
        {"absent", "", 0},
        {"blank", "", 0},
        {"#blank", "", 0},
        {"plai", "", 0},
        {"zero", "", 0},
        {"", "", 0},
    };
    for (const auto &[szKey, strValue, holds] : rows) {
        EXPECT_EQ(Value(kFile, szKey), strValue) << szKey;
        EXPECT_EQ(YLIBCFileCheckKeyValue(kFile, szKey, strValue.c_str(), 0), holds);
    }
}

TEST_F(KeyValueFile, GivesAllPairsInOrderAndOfAKeyTheFirst) {
    WriteFile(kFile, "b=1\n#c=2\njunk\n a = \"x \\\" y\" \nb=3\nold=new\nempty=\n=4\n");
    YLIBSZHASH *pHash = YLIBCSzHashAlloc(16);
    YLIBCSzHashSetValue(&pHash, "old", "old");
    YLIBCSzHashSetValue(&pHash, "own", "stays");
    EXPECT_EQ(YLIBCFileGetPair(kFile, &pHash), 4);
    std::string strPairs;
    for (int i = 0; i < pHash->nItem; ++i) {
        strPairs += YLIBCSzHashKeyAt(pHash, i) + "="s + YLIBCSzHashValueAt(pHash, i) + ";";
    }
    EXPECT_EQ(strPairs, "old=new;own=stays;b=1;a=x \" y;empty=;");
    EXPECT_EQ(FailureOf(YLIBCFileGetPair("/tmp/none", &pHash)), YLIBC_ERR_NOT_FOUND);
    EXPECT_LT(YLIBCFileGetPair(kFile, nullptr), 0);
    YLIBCSzHashFree(pHash);
}

TEST_F(KeyValueFile, ValuesComeBackAsTheyWentIn) {
    WriteFile(kFile, "odd=first\nother=stays\n");
    for (const std::string &strValue :
         {"plain"s, ""s, " blanks at both ends\t"s, "\"quoted\""s, "\""s, "\\"s, "ends in \\"s,
          "a\\\"b\\\\\"c"s, "# no comment"s, "a=b"s, "\x01\x7f\xff"s, std::string(50000, '"')}) {
        EXPECT_EQ(SetValue(kFile, "odd", strValue), 0);
        EXPECT_EQ(Value(kFile, "odd"), strValue);
        EXPECT_EQ(Value(kFile, "other"), "stays");
    }
    EXPECT_EQ(SetValue(kFile, "a \"key\" with\\blanks", "v"), 0);
    EXPECT_EQ(Value(kFile, "a \"key\" with\\blanks"), "v");
}

TEST_F(KeyValueFile, WhatTheFormatCannotHoldIsRefused) {
    WriteFile(kFile, "key=value\n");
    const std::pair<const char *, const char *> rows[] = {
        {"key", "a\nother=b"}, {"key", "a\r"}, {"k\ney", "a"},  {"key\n", "a"},
        {"ke=y", "a"},         {"", "a"},      {"#key", "a"},   {" key", "a"},
        {"key\t", "a"},        {nullptr, "a"}, {"key", nullptr}};
    const Set namesBefore = Names("/etc");
    for (const auto &[szKey, szValue] : rows) {
        for (int result : {YLIBCFileSetKeyValue(kFile, szKey, szValue, 0),
                           YLIBCINFOSetKeyValue(szKey, szValue)}) {
            EXPECT_EQ(FailureOf(result), YLIBC_ERR_INVALID_ARGUMENT);
        }
    }
    EXPECT_EQ(FileText(kFile), "key=value\n");
    EXPECT_EQ(Names("/etc"), namesBefore);
}

TEST_F(KeyValueFile, AChangeLeavesAllOtherLinesAndTheModeAsTheyWere) {
    const std::string strOdd = "# k=1\r\n\n junk \0 = \xff\nk\0=z\n b = 2 \r\n"s;
    // A null value removes the key.
    const std::tuple<std::string, const char *, std::string> rows[] = {
        {"", "v", "k=\"v\"\n"},
        {"a=1", "v", "a=1\nk=\"v\"\n"},
        {strOdd, "v", strOdd + "k=\"v\"\n"},
        {strOdd + " k = old # x\r\n" + strOdd, "v", strOdd + "k=\"v\"\n" + strOdd},
        {"k=old\nk=second\n", "v", "k=\"v\"\nk=second\n"},
        {strOdd + "k=1\n" + strOdd + " k =2\nk=", nullptr, strOdd + strOdd},
        {"k=1\n", nullptr, ""},
    };
    const mode_t umaskBefore = umask(077);
    for (const auto &[strBefore, szValue, strAfter] : rows) {
        for (mode_t mode : {0644U, 0600U, 0666U, 0640U}) {
            WriteFile(kFile, strBefore);
            chmod(kFile, mode);
            EXPECT_EQ(
                szValue == nullptr ? YLIBCFileRemoveKey(kFile, "k") : SetValue(kFile, "k", szValue),
                0);
            EXPECT_EQ(FileText(kFile), strAfter);
            EXPECT_EQ(Status(kFile).st_mode & 07777U, mode);
        }
    }
    SetUp();
    EXPECT_EQ(SetValue(kFile, "k", "v"), 0);
    EXPECT_EQ(Status(kFile).st_mode & 07777U, 0644U);
    umask(umaskBefore);
}

TEST_F(KeyValueFile, WritesOnlyWhatIsNewAndWaitsOnlyForWhatOutlivesARestart) {
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

TEST_F(KeyValueFile, APairThatSomebodyElseHasChangedIsWrittenAgain) {
    const std::pair<const char *, std::function<void()>> rows[] = {
        {"overwritten, with the old size and time",
         [] {
             const struct stat before = Status(kFile);
             WriteFile(kFile, "k=\"b\"\n");
             const timespec times[] = {before.st_atim, before.st_mtim};
             utimensat(AT_FDCWD, kFile, times, 0);
         }},
        {"replaced",
         [] {
             WriteFile(kTemporary, "k=\"b\"\n");
             fs::rename(kTemporary, kFile);
         }},
        {"removed", [] { fs::remove(kFile); }},
    };
    for (const auto &[szHow, change] : rows) {
        // Time and again, until the file has its content for longer than a step of its times.
        EXPECT_EQ(SetValue(kFile, "k", "a"), 0);
        const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(30);
        while (std::chrono::steady_clock::now() < end) {
            EXPECT_EQ(SetValue(kFile, "k", "a"), 0);
        }
        change();
        EXPECT_EQ(SetValue(kFile, "k", "a"), 0);
        EXPECT_EQ(Value(kFile, "k"), "a") << szHow;
    }
}

TEST_F(KeyValueFile, InASharedFolderTrapsAreLeftAlone) {
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

TEST_F(KeyValueFile, AnotherUsersFileIsNotBelievedAndMakesRoom) {
    if (!PutStrangers("file", kFile)) {
        GTEST_SKIP() << "there are no files of another user's";
    }
    WriteFile(kFile, "k=secret\n");
    EXPECT_LT(YLIBCFileCheckKeyValue(kFile, "k", "secret", 0), 0);
    EXPECT_EQ(SetValue(kFile, "k", "v"), 0);
    EXPECT_EQ(FileText(kFile), "k=\"v\"\n");
    EXPECT_EQ(Status(kFile).st_uid, 0U);
}

TEST_F(KeyValueFile, ElsewhereLinksAreFollowedAndStay) {
    fs::remove_all("/etc/a");
    fs::create_directories("/etc/a/b");
    WriteFile("/etc/a/real.conf", "k=old\n");
    fs::create_symlink("/etc/a/b/second", "/etc/a/first");
    fs::create_symlink("../real.conf", "/etc/a/b/second");
    fs::create_symlink("b/made.conf", "/etc/a/dangling");
    fs::create_symlink("loop", "/etc/a/loop");
    EXPECT_EQ(Value("/etc/a/first", "k"), "old");
    EXPECT_EQ(SetValue("/etc/a/first", "k", "new"), 0);
    EXPECT_EQ(FileText("/etc/a/real.conf"), "k=\"new\"\n");
    EXPECT_EQ(SetValue("/etc/a/dangling", "k", "v"), 0);
    EXPECT_EQ(FileText("/etc/a/b/made.conf"), "k=\"v\"\n");
    EXPECT_LT(SetValue("/etc/a/loop", "k", "v"), 0);
    for (const char *szLink : {"/etc/a/first", "/etc/a/b/second", "/etc/a/dangling"}) {
        EXPECT_TRUE(S_ISLNK(Status(szLink).st_mode)) << szLink;
    }
}

TEST_F(KeyValueFile, WritersOfThePlatformsSettingsExcludeEachOther) {
    Set names = Names("/etc");
    const std::size_t linesBefore = FileLines("/etc/zeloinfo.conf").size();
    EXPECT_TRUE(SetInProcesses(
        4, 10, [](const auto &strKey) { return YLIBCINFOSetKeyValue(strKey.c_str(), "v") == 0; }));
    EXPECT_EQ(FileLines("/etc/zeloinfo.conf").size(), linesBefore + 40);
    names.insert(".zeloinfo.conf.lock");
    EXPECT_EQ(Names("/etc"), names);
}

TEST_F(KeyValueFile, WritersWithoutALockLeaveWholeFiles) {
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
