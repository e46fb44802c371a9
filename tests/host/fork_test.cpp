// A child process that is forked while another thread makes the process's first call can make the
// same call: no lock stays held, nothing stays half made. Each run is a process of its own.

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <iterator>
#include <random>
#include <thread>

#include "children.h"
#include "file_lock.h"
#include "key_value_file.h"
#include "notification.h"
#include "process.h"
#include "stored.h"
#include "strings_file.h"
#include "user_group.h"
#include "web_session.h"
#include "zeloqrmclient.h"

namespace {

constexpr unsigned int kHangs_s = 20;

bool Lock() {
    int handle = -1;
    return YLIBCFileLockByFile("/tmp/fork.lock", 0, &handle) == 1 &&
           YLIBCFileUnlockByFile(handle) == 0;
}

bool AddWebSession() {
    ZELO_CGI_CONTEXT context = {};
    const bool blAdded = ZeloCgiInit("", &context) != 0 &&
                         ZeloCgiAddSessionByIndex(&context, 13, "ZELO.QRM.Client") != 0;
    ZeloCgiFree(&context);
    return blAdded;
}

bool ReadText() {
    char szText[64];
    return YLIBCFileGetSectionValue("/usr/zelo/zeloman/webman/texts/enu/strings", "qrm_log",
                                    "volume_degraded", szText, sizeof(szText)) > 0;
}

bool ReadUser() {
    ZELO_USER *pUser = nullptr;
    const int result = ZELOUserGet("root", &pUser);
    ZELOUserFree(pUser);
    return result == 0;
}

bool ChangeUser() {
    const char *const names[] = {"nobody-of-this-name"};
    YLIBCM_RESULT *pResult = YLIBCMResultAlloc();
    ZELOUserDelete(names, 1, &pResult);
    YLIBCMResultFree(pResult);
    return true;
}

bool Notify() {
    YLIBSZHASH *pHash = YLIBCSzHashAlloc(64);
    const int result = ZELOSysNotifySendNotifiction("QRMClientConnectFailed", &pHash);
    YLIBCSzHashFree(pHash);
    return result >= 0;
}

// There is no credential, which the library logs.
bool FailAndLog() {
    Json::Value credential;
    return !ZELOQRMClientGetServerCredential(credential);
}

struct Operation {
    const char *szName;
    bool (*Run)();
};

constexpr Operation kOperations[] = {
    {"a lock", Lock},
    {"a key-value file", [] { return YLIBCFileSetKeyValue("/tmp/f.conf", "k", "v", 0) == 0; }},
    {"a setting", [] { return YLIBCINFOSetKeyValue("fork", "v") == 0; }},
    {"a text", ReadText},
    {"reading the store", [] { return ZELOCredIDGetByApplication("Other") == -1; }},
    {"writing the store", [] { return stored::AddCredential("ZELO.QRM.Fork", "host") >= 0; }},
    {"a web session", AddWebSession},
    {"reading a user", ReadUser},
    {"changing the accounts", ChangeUser},
    {"a program", [] { return YLIBCExec("/bin/true", nullptr, nullptr, nullptr, nullptr) == 0; }},
    {"a notification", Notify},
    {"a log line", FailAndLog},
};

// In a process of its own, which has made no call yet.
bool RunOnce(const Operation &operation, useconds_t delay_us) {
    bool blOther = false;
    std::thread other([&] { blOther = operation.Run(); });
    usleep(delay_us);
    const bool blChild = children::InOne([&] {
        alarm(kHangs_s);
        return operation.Run();
    });
    other.join();
    return blChild && blOther;
}

TEST(Fork, AChildOfTheFirstCallMakesTheSameCall) {
    std::mt19937 random(std::random_device{}());
    for (std::size_t i = 0; i < std::size(kOperations); ++i) {
        for (int run = 0; run < 5; ++run) {
            const std::string strDelay = std::to_string(random() % 1500);
            EXPECT_TRUE(children::InOne([&] {
                alarm(3 * kHangs_s);
                execl("/proc/self/exe", "fork_test", "--once", std::to_string(i).c_str(),
                      strDelay.c_str(), nullptr);
                return false;
            })) << kOperations[i].szName
                << ", " << strDelay << " us";
        }
    }
}

}  // namespace

int main(int argc, char **argv) {
    if (argc == 4 && std::string(argv[1]) == "--once") {
        const bool blDone =
            RunOnce(kOperations[std::atoi(argv[2])], static_cast<useconds_t>(std::atoi(argv[3])));
        return blDone ? EXIT_SUCCESS : EXIT_FAILURE;
    }
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
