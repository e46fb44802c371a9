// Serial numbers, the host name, and the facts that the library makes of them.

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <fstream>

#include "host_name.h"
#include "qrm_client_description.h"
#include "serial_number.h"

namespace {

void Write(const char *szPath, const std::string &strText) {
    std::ofstream(szPath) << strText;
}

TEST(SerialNumber, TheCustomOneComesFirst) {
    const struct {
        const char *szCustom;
        const char *szFlash;
        bool blRead;
        const char *szSerial;
    } rows[] = {
        {"", "FLASH", true, "FLASH"},
        {"CUSTOM", "FLASH", true, "CUSTOM"},
        {"CUSTOM", "", true, "CUSTOM"},
        {"", "", false, ""},
        {"0123456789012345678901234567890123456789", "", true, "012345678901234567890123456789"},
        {"", "0123456789012345678901234567890123456789", true,
         "01234567890123456789012345678901234"},
    };
    for (const auto &row : rows) {
        Write("/etc/custom_serial_number", row.szCustom);
        Write("/etc.defaults/serial_number", std::string(row.szFlash) + "\n");
        std::string strSerial = "before";
        EXPECT_EQ(client_description::ReadSerialNumber(strSerial), row.blRead);
        EXPECT_EQ(strSerial, row.szSerial);
    }
    // What cannot be read is not an appliance without one.
    ASSERT_EQ(std::system("ln -sfn /etc /etc/custom_serial_number"), 0);
    char sz[8] = "before";
    EXPECT_LT(YLIBGetCustomSerialNumber(sz, sizeof(sz)), 0);
    EXPECT_STREQ(sz, "before");
    unlink("/etc/custom_serial_number");
}

TEST(HostName, IsCutToItsBuffer) {
    const pid_t pid = fork();
    if (pid == 0) {
        // A machine of the child's own, whose name may be set.
        const std::string strName(64, 'n');
        if (unshare(CLONE_NEWUSER | CLONE_NEWUTS) != 0 ||
            sethostname(strName.data(), strName.size()) != 0) {
            _exit(2);
        }
        char sz[ZELO_LNX_HOSTNAME_SIZE + 1];
        std::memset(sz, 'x', sizeof(sz));
        const bool blRead = ZELOLnxGetHostname(sz) >= 0;
        _exit(blRead && sz[64] == 'x' && sz == strName.substr(1) ? 0 : 1);
    }
    int status = -1;
    waitpid(pid, &status, 0);
    EXPECT_LT(ZELOLnxGetHostname(nullptr), 0);
    if (WEXITSTATUS(status) == 2) {
        GTEST_SKIP() << "no host name can be set here";
    }
    EXPECT_EQ(status, 0);
}

}  // namespace
