// Key-value files: what is read, what a change leaves as it was, and what stands in its way.

#include "key_value_file.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <chrono>
#include <set>

#include "failures.h"
#include "key_value.h"

namespace {

using namespace key_value;

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
             WriteFile("/tmp/shared/other", "k=\"b\"\n");
             fs::rename("/tmp/shared/other", kFile);
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

}  // namespace
