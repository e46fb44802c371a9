// Directories with their parents.

#include "file_system.h"

#include <gtest/gtest.h>

#include "files.h"

namespace {

using namespace files;

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

}  // namespace
