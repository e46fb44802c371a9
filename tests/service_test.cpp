// Reloading the services of a type.

#include "service.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "last_error.h"

namespace {

namespace fs = std::filesystem;

constexpr const char *kRuns = "/tmp/runs";

void AddService(const std::string &strName, const std::string &strStatus,
                fs::perms mode = fs::perms::owner_all) {
    const std::string strPath = "/usr/zelo/etc/service.d/8/" + strName;
    std::ofstream(strPath) << "#!/bin/sh\necho \"$(basename \"$0\") $*\" >>" << kRuns << "\nexit "
                           << strStatus << "\n";
    fs::permissions(strPath, mode);
}

std::string Runs() {
    std::ostringstream text;
    text << std::ifstream(kRuns).rdbuf();
    fs::remove(kRuns);
    return text.str();
}

TEST(Service, AllProgramsOfTheTypeRunInTheOrderOfTheirNames) {
    EXPECT_EQ(YLIBServiceTypeReload(YLIB_SERVICE_TYPE_USERS), 0);
    fs::create_directories("/usr/zelo/etc/service.d/8/folder");
    AddService("20-second", "0");
    AddService("10-first", "0");
    AddService(".hidden", "1");
    AddService("not-executable", "1", fs::perms::owner_read);
    EXPECT_EQ(YLIBServiceTypeReload(YLIB_SERVICE_TYPE_USERS), 0);
    EXPECT_EQ(Runs(), "10-first reload\n20-second reload\n");
    EXPECT_EQ(YLIBServiceTypeReload(7), 0);
    EXPECT_EQ(Runs(), "");

    AddService("15-fails", "3");
    EXPECT_LT(YLIBServiceTypeReload(YLIB_SERVICE_TYPE_USERS), 0);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_EXEC));
    EXPECT_EQ(Runs(), "10-first reload\n15-fails reload\n20-second reload\n");
}

}  // namespace
