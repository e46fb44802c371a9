// Reloading the services of a type.

#include "service.h"

#include <gtest/gtest.h>

#include "failures.h"
#include "files.h"

namespace {

using namespace files;

constexpr const char *kRuns = "/tmp/runs";

void AddService(const std::string &strName, const std::string &strStatus, mode_t mode = 0755) {
    WriteProgram("/usr/zelo/etc/service.d/8/" + strName,
                 "echo \"$(basename \"$0\") $*\" >>/tmp/runs\nexit " + strStatus, mode);
}

std::string Runs() {
    std::string strRuns = FileText(kRuns);
    fs::remove(kRuns);
    return strRuns;
}

TEST(Service, AllProgramsOfTheTypeRunInTheOrderOfTheirNames) {
    EXPECT_EQ(YLIBServiceTypeReload(YLIB_SERVICE_TYPE_USERS), 0);
    fs::create_directories("/usr/zelo/etc/service.d/8/folder");
    AddService("20-second", "0");
    AddService("10-first", "0");
    AddService(".hidden", "1");
    AddService("not-executable", "1", 0400);
    EXPECT_EQ(YLIBServiceTypeReload(YLIB_SERVICE_TYPE_USERS), 0);
    EXPECT_EQ(Runs(), "10-first reload\n20-second reload\n");
    EXPECT_EQ(YLIBServiceTypeReload(7), 0);
    EXPECT_EQ(Runs(), "");

    AddService("15-fails", "3");
    AddService("17-open", "0", 0757);
    EXPECT_EQ(FailureOf(YLIBServiceTypeReload(YLIB_SERVICE_TYPE_USERS)), YLIBC_ERR_EXEC_STATUS);
    EXPECT_EQ(Runs(), "10-first reload\n15-fails reload\n20-second reload\n");

    // Whoever can write to a folder can put any program there.
    chmod("/usr/zelo/etc/service.d", 0777);
    EXPECT_EQ(FailureOf(YLIBServiceTypeReload(YLIB_SERVICE_TYPE_USERS)), YLIBC_ERR_UNSAFE_FILE);
    EXPECT_EQ(Runs(), "");
}

}  // namespace
