// Serial numbers, the host name, and the facts that the library makes of them.

#include <gtest/gtest.h>
#include <sched.h>

#include "children.h"
#include "files.h"
#include "host_name.h"
#include "qrm_client_description.h"
#include "serial_number.h"

namespace {

using namespace files;

TEST(SerialNumber, TheCustomOneComesFirst) {
    const std::tuple<const char *, const char *, bool, const char *> rows[] = {
        {"", "FLASH", true, "FLASH"},
        {"CUSTOM", "FLASH", true, "CUSTOM"},
        {"CUSTOM", "", true, "CUSTOM"},
        {"", "", false, ""},
        {"0123456789012345678901234567890123456789", "", true, "012345678901234567890123456789"},
        {"", "0123456789012345678901234567890123456789", true,
         "01234567890123456789012345678901234"},
    };
    for (const auto &[szCustom, szFlash, blRead, szSerial] : rows) {
        WriteFile("/etc/custom_serial_number", szCustom);
        WriteFile("/etc.defaults/serial_number", std::string(szFlash) + "\n");
        std::string strSerial = "before";
        EXPECT_EQ(client_description::ReadSerialNumber(strSerial), blRead);
        EXPECT_EQ(strSerial, szSerial);
    }
    // What cannot be read is not the empty number.
    char sz[] = "before";
    fs::remove("/etc/custom_serial_number");
    fs::create_directory("/etc/custom_serial_number");
    EXPECT_LT(YLIBGetCustomSerialNumber(sz, sizeof(sz)), 0);
    EXPECT_STREQ(sz, "before");
    fs::remove("/etc/custom_serial_number");
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
