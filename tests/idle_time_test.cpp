// Disk idle time: what each caller gets and records, alone, with failing calls, and among many
// processes that come and die.

#include <gtest/gtest.h>
#include <sys/mman.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <limits>
#include <random>
#include <thread>
#include <vector>

#include "children.h"
#include "file_lock.h"
#include "idle_timer.h"
#include "key_value_file.h"
#include "platform_handles.h"
#include "process.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

using torture::Expected;

constexpr const char *kFile = "/tmp/qrm_idle_time";
constexpr const char *kLockFile = "/tmp/qrm_idle_time.lock";
constexpr unsigned long kLargest = std::numeric_limits<unsigned long>::max();

std::string Self() {
    return std::to_string(getpid());
}

void Prepare(const std::string &strRecords, unsigned long platform = 20) {
    std::filesystem::remove(kFile);
    if (!strRecords.empty()) {
        std::ofstream(kFile) << strRecords;
    }
    ASSERT_EQ(ZELODiskAllIdleTimerSet(platform), 0);
}

// The file as it stands, line feeds as blanks, and the platform's time: "12="20" platform=20".
std::string State() {
    std::ifstream file(kFile);
    std::string strAll;
    for (std::string strLine; std::getline(file, strLine);) {
        strAll += strLine + ' ';
    }
    unsigned long platform = 0;
    ZELODiskAllIdleTimerGet(&platform);
    return strAll + "platform=" + std::to_string(platform);
}

std::string Get() {
    unsigned long idleTime = 0;
    const int result = ZELOQRMIdleTimeGet(idleTime);
    return std::to_string(result) + (result == 0 ? ' ' + std::to_string(idleTime) : "");
}

// A process that lives as long as this does.
class LiveProcess {
  public:
    explicit LiveProcess(const std::function<bool()> &first = [] { return true; })
        : m_pid(children::Start([&] { return first() && m_ready.Give() && m_end.Await(); })) {
        m_ready.Await();
    }
    ~LiveProcess() { Kill(); }
    LiveProcess(const LiveProcess &) = delete;
    LiveProcess &operator=(const LiveProcess &) = delete;

    void Kill() {
        if (m_pid > 0) {
            children::Kill(m_pid);
            m_pid = -1;
        }
    }
    pid_t Pid() const { return m_pid; }

  private:
    children::Signal m_ready;
    children::Signal m_end;
    pid_t m_pid;
};

TEST(IdleTime, GetSurvivesEveryFailingCallAmongRecordsOfNoLiveProcess) {
    // Ids above any that the system gives, and keys that are no id.
    const std::string strRecords =
        "abc=\"1\"\n0=\"2\"\n-1=\"3\"\n4194305=\"4\"\n99999999999=\"5\"\n";
    const std::string strOwn = Self() + "=\"20\" platform=20";
    const std::string strBefore =
        "abc=\"1\" 0=\"2\" -1=\"3\" 4194305=\"4\" 99999999999=\"5\" platform=20";
    const auto fails = [&](const std::string &strLog, const std::string &strState) {
        return Expected{"-1", strLog, strState};
    };
    const auto after = [&](const char *szKey) { return strBefore.substr(strBefore.find(szKey)); };
    const std::string strUnremoved = "fail to YLIBCFileRemoveKey /tmp/qrm_idle_time";
    const Expected done{"0 20", "", strOwn};
    const auto stays = [&](const std::string &strRecord) {
        return Expected{"0 20", "", strRecord + ' ' + strOwn};
    };
    const auto record = [](int i, const std::string &strKey, const std::string &strAlive) {
        const std::string strIndex = std::to_string(i);
        return "YLIBCSzHashKeyAt(*, " + strIndex + ")\nYLIBCSzHashValueAt(*, " + strIndex + ")\n" +
               strAlive + "YLIBCFileRemoveKey('/tmp/qrm_idle_time', '" + strKey + "')\n";
    };
    torture::Run(
        {"dead",
         "qrm_hibernation",
         [&] { Prepare(strRecords); },
         Get,
         State,
         "getpid()\n"
         "YLIBCFileLockTimeByFile('/tmp/qrm_idle_time.lock', 1, 30, *)\n"
         "access('/tmp/qrm_idle_time', 0)\n"
         "YLIBCSzHashAlloc(512)\n"
         "YLIBCFileGetPair('/tmp/qrm_idle_time', *)\n" +
             record(0, "abc", "YLIBCProcAlive(0)\n") + record(1, "0", "YLIBCProcAlive(0)\n") +
             record(2, "-1", "YLIBCProcAlive(-1)\n") +
             record(3, "4194305", "YLIBCProcAlive(4194305)\n") + record(4, "99999999999", "") +
             "ZELODiskAllIdleTimerGet(*)\n"
             "YLIBCFileSetKeyValue('/tmp/qrm_idle_time', '" +
             Self() + "', '20', 0)",
         done,
         {// An id of seven digits makes a whole key.
          {"getpid", {"0 20", "", "4194303=\"20\" platform=20"}},
          {"YLIBCFileLockTimeByFile",
           fails("fail to YLIBCFileLockTimeByFile /tmp/qrm_idle_time.lock", strBefore)},
          // As if there were no file.
          {"access", {"0 20", "", strBefore.substr(0, strBefore.rfind("platform")) + strOwn}},
          {"YLIBCSzHashAlloc", fails("Failed to YLIBCSzHashAlloc", strBefore)},
          {"YLIBCFileGetPair", fails("Failed to parse /tmp/qrm_idle_time", strBefore)},
          {"YLIBCSzHashKeyAt#1", stays("abc=\"1\"")},
          {"YLIBCSzHashKeyAt#2", stays("0=\"2\"")},
          {"YLIBCSzHashKeyAt#3", stays("-1=\"3\"")},
          {"YLIBCSzHashKeyAt#4", stays("4194305=\"4\"")},
          {"YLIBCSzHashKeyAt#5", stays("99999999999=\"5\"")},
          {"YLIBCSzHashValueAt", done},
          {"YLIBCProcAlive", done},
          {"YLIBCFileRemoveKey#1", fails(strUnremoved, strBefore)},
          {"YLIBCFileRemoveKey#2", fails(strUnremoved, after("0="))},
          {"YLIBCFileRemoveKey#3", fails(strUnremoved, after("-1="))},
          {"YLIBCFileRemoveKey#4", fails(strUnremoved, after("4194305="))},
          {"YLIBCFileRemoveKey#5", fails(strUnremoved, after("99999999999="))},
          {"ZELODiskAllIdleTimerGet", fails("fail to ZELODiskAllIdleTimerGet", "platform=20")},
          {"YLIBCFileSetKeyValue",
           fails("fail to YLIBCFileSetKeyValue /tmp/qrm_idle_time", "platform=20")}}});
}

TEST(IdleTime, GetSurvivesEveryFailingCallWithALiveRecord) {
    const LiveProcess live;
    const std::string strLive = std::to_string(live.Pid());
    const std::string strRest = "4194306=\"7\" ";
    const std::string strBefore = "4194305=\"4\" " + strLive + "=\"30\" " + strRest + "platform=0";
    const auto fails = [&](const std::string &strLog, const std::string &strState) {
        return Expected{"-1", strLog, strState};
    };
    const auto records = [&](const std::string &strValue, const std::string &strHead) {
        return Expected{"0 " + strValue, "",
                        strHead + strRest + Self() + "=\"" + strValue + "\" platform=0"};
    };
    torture::Run(
        {"live",
         "qrm_hibernation",
         [&] { Prepare("4194305=\"4\"\n" + strLive + "=\"30\"\n4194306=\"7\"\n", 0); },
         Get,
         State,
         "getpid YLIBCFileLockTimeByFile access YLIBCSzHashAlloc YLIBCFileGetPair "
         "YLIBCSzHashKeyAt YLIBCSzHashValueAt YLIBCProcAlive YLIBCFileRemoveKey "
         "YLIBCSzHashKeyAt YLIBCSzHashValueAt YLIBCProcAlive YLIBCFileSetKeyValue",
         records("30", strLive + "=\"30\" "),
         {{"getpid", {"0 30", "", strLive + "=\"30\" " + strRest + "4194303=\"30\" platform=0"}},
          {"YLIBCFileLockTimeByFile",
           fails("fail to YLIBCFileLockTimeByFile /tmp/qrm_idle_time.lock", strBefore)},
          {"access", records("0", "4194305=\"4\" " + strLive + "=\"30\" ")},
          {"YLIBCSzHashAlloc", fails("Failed to YLIBCSzHashAlloc", strBefore)},
          {"YLIBCFileGetPair", fails("Failed to parse /tmp/qrm_idle_time", strBefore)},
          {"YLIBCSzHashKeyAt#1", records("30", "4194305=\"4\" " + strLive + "=\"30\" ")},
          {"YLIBCSzHashKeyAt#2", {"0 0", "", strLive + "=\"30\" " + Self() + "=\"0\" platform=0"}},
          {"YLIBCSzHashValueAt#1", records("30", strLive + "=\"30\" ")},
          {"YLIBCSzHashValueAt#2", records("0", strLive + "=\"30\" ")},
          {"YLIBCProcAlive#1", records("30", strLive + "=\"30\" ")},
          {"YLIBCProcAlive#2", {"0 0", "", Self() + "=\"0\" platform=0"}},
          {"YLIBCFileRemoveKey", fails("fail to YLIBCFileRemoveKey /tmp/qrm_idle_time", strBefore)},
          {"YLIBCFileSetKeyValue", fails("fail to YLIBCFileSetKeyValue /tmp/qrm_idle_time",
                                         strLive + "=\"30\" " + strRest + "platform=0")}}});
}

TEST(IdleTime, SetSurvivesEveryFailingCall) {
    const std::string strOthers = "4194305=\"4\" ";
    const std::string strBefore = Self() + "=\"9\" " + strOthers + "platform=20";
    torture::Run({"set",
                  "qrm_hibernation",
                  [] { Prepare(Self() + "=\"9\"\n4194305=\"4\"\n"); },
                  [] { return std::to_string(ZELOQRMIdleTimeSet(45)); },
                  State,
                  "getpid()\n"
                  "YLIBCFileLockTimeByFile('/tmp/qrm_idle_time.lock', 1, 30, *)\n"
                  "YLIBCFileRemoveKey('/tmp/qrm_idle_time', '" +
                      Self() +
                      "')\n"
                      "ZELODiskAllIdleTimerSet(45)",
                  {"0", "", strOthers + "platform=45"},
                  {{"getpid", {"0", "", Self() + "=\"9\" " + strOthers + "platform=45"}},
                   {"YLIBCFileLockTimeByFile",
                    {"-1", "fail to YLIBCFileLockTimeByFile /tmp/qrm_idle_time.lock", strBefore}},
                   {"YLIBCFileRemoveKey",
                    {"-1", "fail to YLIBCFileRemoveKey /tmp/qrm_idle_time", strBefore}},
                   {"ZELODiskAllIdleTimerSet",
                    {"-1", "fail to ZELODiskAllIdleTimerSet", strOthers + "platform=20"}}}});
}

TEST(IdleTime, AFailingReleaseChangesNoResult) {
    Prepare("");
    for (const auto &body : std::vector<std::function<int()>>{
             [] { return Get() == "0 20" ? 0 : -1; }, [] { return ZELOQRMIdleTimeSet(20); }}) {
        const seam::Outcome outcome =
            seam::Observe({"YLIBCFileUnlockByFile"}, [&] { EXPECT_EQ(body(), 0); });
        ASSERT_EQ(outcome.logs.size(), 1U);
        EXPECT_EQ(outcome.logs[0].strMessage, "fail to YLIBCFileLockTimeByFile /tmp/qrm_idle_time");
        EXPECT_EQ(outcome.recordsLeft, 0);
    }
}

TEST(IdleTime, TheFirstValueStaysUntilItsRecordGoes) {
    Prepare("");
    EXPECT_EQ(ZELOQRMIdleTimeSet(kLargest), 0) << "there is no record to remove";
    EXPECT_FALSE(std::filesystem::exists(kFile));
    const std::string strLargest = std::to_string(kLargest);
    EXPECT_EQ(Get(), "0 " + strLargest);
    EXPECT_EQ(State(), Self() + "=\"" + strLargest + "\" platform=" + strLargest);
    ASSERT_EQ(ZELODiskAllIdleTimerSet(0), 0);
    EXPECT_EQ(Get(), "0 " + strLargest);
    EXPECT_EQ(ZELOQRMIdleTimeSet(5), 0);
    EXPECT_EQ(Get(), "0 5");

    Prepare("4194303=\"77\"\n");
    const seam::Outcome outcome =
        seam::Observe({"YLIBCProcAlive", 1, true, 1}, [] { EXPECT_EQ(Get(), "0 77"); });
    EXPECT_EQ(outcome.details.at(7), "YLIBCProcAlive(4194303)");
}

TEST(IdleTime, AThousandRecordsAreReadToTheLiveOne) {
    const LiveProcess live;
    std::string strRecords;
    for (int i = 1; i < 1000; ++i) {
        strRecords += std::to_string(4194304 + i) + "=\"" + std::to_string(i) + "\"\n";
    }
    Prepare(strRecords + std::to_string(live.Pid()) + "=\"3\"\n");
    EXPECT_EQ(Get(), "0 3");
    EXPECT_EQ(State(), std::to_string(live.Pid()) + "=\"3\" " + Self() + "=\"3\" platform=20");
}

// --- Many processes -----------------------------------------------------------------------------

// The values that live processes have recorded. They are all the same one: each took the first.
void ExpectOneValue() {
    ::FileLock lock;
    ASSERT_GT(YLIBCFileLockByFile(kLockFile, 0, lock.Address()), 0);
    HashHandle pairs(YLIBCSzHashAlloc(0));
    ASSERT_TRUE(!std::filesystem::exists(kFile) || YLIBCFileGetPair(kFile, pairs.Address()) >= 0);
    std::set<std::string> values;
    for (int i = 0; i < pairs.Get()->nItem; ++i) {
        const std::string strKey = YLIBCSzHashKeyAt(pairs.Get(), i);
        EXPECT_EQ(strKey.find_first_not_of("0123456789"), std::string::npos) << strKey;
        if (YLIBCProcAlive(std::stoi(strKey)) == 1) {
            values.insert(YLIBCSzHashValueAt(pairs.Get(), i));
        }
    }
    EXPECT_LE(values.size(), 1U);
}

TEST(IdleTime, SixteenProcessesThatAreKilledAtRandomKeepTheFirstLiveValue) {
    constexpr unsigned long kFirst = 1'000'000;
    constexpr auto kDuration = std::chrono::seconds(20);
    Prepare("", kFirst);
    void *pShared = mmap(nullptr, sizeof(std::atomic<int>), PROT_READ | PROT_WRITE,
                         MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    ASSERT_NE(pShared, MAP_FAILED);
    auto *const pWrong = new (pShared) std::atomic<int>(0);
    LiveProcess holder([] { return Get() == "0 1000000"; });
    const pid_t holderPid = holder.Pid();

    std::minstd_rand random(1);
    const auto work = [&] {
        std::minstd_rand own(static_cast<unsigned>(getpid()));
        while (true) {
            unsigned long idleTime = 0;
            const bool blGot = ZELOQRMIdleTimeGet(idleTime) == 0;
            // Nobody takes a live process's record away.
            const std::string strOwn = std::to_string(idleTime);
            const bool blRecorded =
                YLIBCFileCheckKeyValue(kFile, Self().c_str(), strOwn.c_str(), 0) == 1;
            // Who lives now has lived all the time.
            const bool blHeld = YLIBCProcAlive(holderPid) == 1;
            if (!blGot || !blRecorded || (blHeld && idleTime != kFirst) ||
                ZELOQRMIdleTimeSet(own()) != 0) {
                ++*pWrong;
            }
        }
        return true;
    };
    std::vector<pid_t> workers(16);
    for (pid_t &pid : workers) {
        pid = children::Start(work);
    }
    const auto start = std::chrono::steady_clock::now();
    int killed = 0;
    while (std::chrono::steady_clock::now() - start < kDuration && !HasFailure()) {
        if (std::chrono::steady_clock::now() - start > kDuration / 2) {
            holder.Kill();
        }
        // The moment is the random thing here.
        std::this_thread::sleep_for(std::chrono::microseconds(random() % 20'000));
        pid_t &pid = workers[random() % workers.size()];
        children::Kill(pid);
        pid = children::Start(work);
        if (++killed % 16 == 0) {
            ExpectOneValue();
        }
    }
    for (pid_t pid : workers) {
        children::Kill(pid);
    }
    EXPECT_GT(killed, 20);
    EXPECT_EQ(pWrong->load(), 0);
    unsigned long platform = 0;
    EXPECT_EQ(ZELODiskAllIdleTimerGet(&platform), 0);
    EXPECT_NE(platform, kFirst) << "the processes have set it";
    const std::string strPlatform = std::to_string(platform);
    EXPECT_EQ(Get(), "0 " + strPlatform);
    EXPECT_EQ(State(), Self() + "=\"" + strPlatform + "\" platform=" + strPlatform);
    munmap(pShared, sizeof(std::atomic<int>));
}

}  // namespace
