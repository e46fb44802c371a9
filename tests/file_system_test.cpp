// Status of files, and directories with their parents.

#include "file_system.h"

#include <gtest/gtest.h>

#include "failures.h"
#include "files.h"

namespace {

using namespace files;

TEST(FileSystem, StatusIsTheLinksOwnWhenAskedFor) {
    std::ofstream("/tmp/file") << "12345";
    fs::create_symlink("/tmp/file", "/tmp/link");
    fs::create_symlink("/tmp/none", "/tmp/dangling");
    const std::tuple<const char *, int, int, mode_t> rows[] = {
        {"/tmp/file", 0, 0, S_IFREG},  {"/tmp/file", 1, 0, S_IFREG},
        {"/tmp/link", 0, 0, S_IFREG},  {"/tmp/link", 1, 0, S_IFLNK},
        {"/tmp/dangling", 0, -1, 0},   {"/tmp/dangling", 1, 0, S_IFLNK},
        {"/tmp/file/below", 1, -1, 0},
    };
    for (const auto &[szPath, blNoFollow, result, type] : rows) {
        struct stat status = {};
        EXPECT_EQ(YLIBCFileStat(szPath, blNoFollow, &status), result) << szPath;
        EXPECT_EQ(status.st_mode & S_IFMT, type);
    }
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NOT_FOUND));
    EXPECT_EQ(FailureOf(YLIBCFileStat(nullptr, 0, nullptr)), YLIBC_ERR_INVALID_ARGUMENT);
}

TEST(FileSystem, DirectoriesComeWithTheirParentsAndLeaveOthersAlone) {
    const mode_t umaskBefore = umask(077);
    fs::create_directory("/tmp/there");
    fs::create_directory("/tmp/lead");
    fs::create_symlink("/tmp/there", "/tmp/lead/link");
    EXPECT_GE(ZELOFSMkdirP("/tmp/there//new/./deep/", 0, 1, 0, 0, 0755), 0);
    EXPECT_GE(ZELOFSMkdirP("/tmp/lead/link/other", 0, 1, 1024, 100, 02751), 0);
    EXPECT_GE(ZELOFSMkdirP("/tmp/there/new", 0, 1, 0, 0, 0700), 0);
    EXPECT_GE(ZELOFSMkdirP("/", 0, 0, 0, 0, 0700), 0);
    fs::current_path("/tmp/there");
    EXPECT_GE(ZELOFSMkdirP("relative", 0, 0, 0, 0, 0711), 0);
    umask(umaskBefore);
    const std::pair<const char *, mode_t> rows[] = {
        {"/tmp/there", 0700},        {"/tmp/there/new", 0755},      {"/tmp/there/new/deep", 0755},
        {"/tmp/there/other", 02751}, {"/tmp/there/relative", 0711},
    };
    for (const auto &row : rows) {
        EXPECT_EQ(FileMode(row.first), row.second) << row.first;
    }
}

TEST(FileSystem, WhatIsNoDirectoryStaysInTheWay) {
    std::ofstream("/tmp/way") << "file";
    fs::create_symlink("/tmp/nowhere", "/tmp/lost");
    for (const char *szPath : {"/tmp/way", "/tmp/way/below", "/tmp/lost", "/tmp/lost/below"}) {
        EXPECT_EQ(FailureOf(ZELOFSMkdirP(szPath, 0, 0, 0, 0, 0755)), YLIBC_ERR_FILE) << szPath;
    }
    EXPECT_FALSE(fs::exists("/tmp/nowhere"));
    EXPECT_LT(ZELOFSMkdirP("", 0, 0, 0, 0, 0755), 0);
    EXPECT_EQ(FailureOf(ZELOFSMkdirP(nullptr, 0, 0, 0, 0, 0755)), YLIBC_ERR_INVALID_ARGUMENT);
}

}  // namespace
