// Key-value files, serial numbers, the host name, and the facts that the library makes of them.

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>

#include "host_name.h"
#include "key_value_file.h"
#include "last_error.h"
#include "qrm_client_description.h"
#include "serial_number.h"

namespace {

constexpr const char *kFile = "/tmp/settings.conf";

void Write(const char *szPath, const std::string &strText) {
    std::ofstream(szPath) << strText;
}

TEST(KeyValueFile, ReadsEveryFormOfALine) {
    Write(kFile,
          "# plain=comment\n"
          "  #blank=comment\n"
          "plain=value one\n"
          "quoted=\"value two\"\r\n"
          " spaced = \t\"three\"  \n"
          "escaped=\"a \\\"b\\\" \\\\ c\"\n"
          "empty=\n"
          "emptyquoted=\"\"\n"
          "no line\n"
          "open=\"never closed\n"
          "equals=a=b\n"
          "plain=second\n"
          "last=no line feed");
    const struct {
        const char *szKey;
        int result;
        const char *szValue;
    } rows[] = {
        {"plain", 9, "value one"},
        {"quoted", 9, "value two"},
        {"spaced", 5, "three"},
        {"escaped", 9, "a \"b\" \\ c"},
        {"empty", 0, ""},
        {"emptyquoted", 0, ""},
        {"open", 12, "never closed"},
        {"equals", 3, "a=b"},
        {"last", 12, "no line feed"},
        {"absent", 0, ""},
        {"blank", 0, ""},
        {"#blank", 0, ""},
        {"plai", 0, ""},
    };
    for (const auto &row : rows) {
        char sz[64] = "before";
        EXPECT_EQ(YLIBCFileGetKeyValue(kFile, row.szKey, sz, sizeof(sz), 0), row.result)
            << row.szKey;
        EXPECT_STREQ(sz, row.szValue);
        EXPECT_EQ(YLIBCFileCheckKeyValue(kFile, row.szKey, row.szValue, 0),
                  row.result > 0 || std::string(row.szKey).find("empty") == 0);
    }
}

TEST(KeyValueFile, CutsAndRefuses) {
    Write(kFile, "key=0123456789\n");
    char sz[5] = "xxxx";
    EXPECT_EQ(YLIBCFileGetKeyValue(kFile, "key", sz, sizeof(sz), 0), 4);
    EXPECT_STREQ(sz, "0123");
    EXPECT_EQ(YLIBCFileCheckKeyValue(kFile, "key", "0123", 0), 0);
    EXPECT_LT(YLIBCFileGetKeyValue("/tmp/none", "key", sz, sizeof(sz), 0), 0);
    EXPECT_STREQ(sz, "");
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_FILE));
    EXPECT_LT(YLIBCFileCheckKeyValue("/tmp", "key", "x", 0), 0);
    EXPECT_LT(YLIBCFileGetKeyValue(nullptr, "key", sz, sizeof(sz), 0), 0);
    EXPECT_LT(YLIBCFileGetKeyValue(kFile, "key", sz, 0, 0), 0);
    EXPECT_LT(YLIBCFileCheckKeyValue(kFile, nullptr, "x", 0), 0);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_INVALID_ARGUMENT));
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

TEST(ClientDescription, AnUnreadableFactChangesNothing) {
    Write("/etc.defaults/VERSION", "majorversion=6\nbuildnumber=1\n");
    Json::Value description;
    EXPECT_FALSE(client_description::ReadVersion(description));
    EXPECT_TRUE(description.isNull());
    Write("/etc/zeloinfo.conf", "admin_port=80x\nsecure_admin_port=x\nrunHTTPS=\"Yes\"\n");
    long port = -1;
    EXPECT_TRUE(client_description::ReadAdminPort(port));
    EXPECT_EQ(port, 80);
    EXPECT_TRUE(client_description::ReadSecureAdminPort(port));
    EXPECT_EQ(port, 0);
    EXPECT_FALSE(client_description::IsHttpsServed());
}

}  // namespace
