// Disk idle time: what each caller gets and records, alone, with failing calls, and among many
// processes that come and die.

#include <chrono>
#include <limits>
#include <random>
#include <thread>

#include "children.h"
#include "file_lock.h"
#include "files.h"
#include "idle_timer.h"
#include "key_value_file.h"
#include "platform_handles.h"
#include "process.h"
#include "torture.h"
#include "zeloqrmclient.h"

namespace {

using namespace files;
using torture::Expected;

constexpr const char *kFile = "/tmp/qrm_idle_time";
constexpr const char *kLockFile = "/tmp/qrm_idle_time.lock";
constexpr const char *kNoLock = "fail to YLIBCFileLockTimeByFile /tmp/qrm_idle_time.lock";
constexpr const char *kUnremoved = "fail to YLIBCFileRemoveKey /tmp/qrm_idle_time";
constexpr const char *kUnset = "fail to YLIBCFileSetKeyValue /tmp/qrm_idle_time";
constexpr unsigned long kLargest = std::numeric_limits<unsigned long>::max();

std::string Self() {
    return std::to_string(getpid());
}

// The records as State() shows them.
void Prepare(std::string strRecords, unsigned long platform = 20) {
    fs::remove(kFile);
    if (!strRecords.empty()) {
        std::replace(strRecords.begin(), strRecords.end(), ' ', '\n');
        std::ofstream(kFile) << strRecords;
    }
    ASSERT_EQ(ZELODiskAllIdleTimerSet(platform), 0);
}

// The file as it stands, line feeds as blanks, and the platform's time: "12="20" platform=20".
std::string State() {
    std::string strAll;
    for (const std::string &strLine : FileLines(kFile)) {
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
    // The key, the record, and the look for the process.
    const std::tuple<std::string, std::string, const char *> records[] = {
        {"abc", "abc=\"1\"", "\nYLIBCProcAlive(0)"},
        {"0", "0=\"2\"", "\nYLIBCProcAlive(0)"},
        {"-1", "-1=\"3\"", "\nYLIBCProcAlive(-1)"},
        {"4194305", "4194305=\"4\"", "\nYLIBCProcAlive(4194305)"},
        {"99999999999", "99999999999=\"5\"", ""}};
    std::string strThere;
    for (const auto &[strKey, strRecord, szLook] : records) {
        strThere += strRecord + ' ';
    }
    const std::string strBefore = strThere + "platform=20";
    const std::string strOwn = Self() + "=\"20\" platform=20";
    const Expected done{"0 20", "", strOwn};
    const auto fails = [](const char *szLog, const std::string &strState) {
        return Expected{"-1", szLog, strState};
    };
    int index = 0;
    std::vector<torture::Step> steps = {
        // An id of seven digits makes a whole key.
        {"getpid()", {"0 20", "", "4194303=\"20\" platform=20"}},
        {"YLIBCFileLockTimeByFile('/tmp/qrm_idle_time.lock', 1, 30, *)", fails(kNoLock, strBefore)},
        // As if there were no file.
        {"access('/tmp/qrm_idle_time', 0)", {"0 20", "", strThere + strOwn}},
        {"YLIBCSzHashAlloc(512)", fails("Failed to YLIBCSzHashAlloc", strBefore)},
        {"YLIBCFileGetPair('/tmp/qrm_idle_time', *)",
         fails("Failed to parse /tmp/qrm_idle_time", strBefore)}};
    for (const auto &[strKey, strRecord, szLook] : records) {
        const std::string strIndex = std::to_string(index++);
        steps.push_back(
            {"YLIBCSzHashKeyAt(*, " + strIndex + ')', {"0 20", "", strRecord + ' ' + strOwn}});
        steps.push_back({"YLIBCSzHashValueAt(*, " + strIndex + ')' + szLook, done});
        steps.push_back({"YLIBCFileRemoveKey('/tmp/qrm_idle_time', '" + strKey + "')",
                         fails(kUnremoved, strBefore.substr(strBefore.find(strRecord)))});
    }
    steps.push_back(
        {"ZELODiskAllIdleTimerGet(*)", fails("fail to ZELODiskAllIdleTimerGet", "platform=20")});
    steps.push_back({"YLIBCFileSetKeyValue('/tmp/qrm_idle_time', '" + Self() + "', '20', 0)",
                     fails(kUnset, "platform=20")});
    torture::Run({"dead", "qrm_hibernation", [&] { Prepare(strThere); }, Get, State, done, steps});
}

// Of the calls that find the live one among records of no live process.
TEST(IdleTime, GetSurvivesFailingCallsWithALiveRecord) {
    const LiveProcess live;
    const std::string strDead = "4194305=\"4\" ";
    const std::string strLive = std::to_string(live.Pid()) + "=\"30\" ";
    const std::string strRest = "4194306=\"7\" ";
    const torture::Case test{
        "live", "qrm_hibernation", [&] { Prepare(strDead + strLive + strRest, 0); }, Get, State, {},
        {}};
    const std::tuple<const char *, int, std::string, std::string> rows[] = {
        {"", 1, "30", strLive + strRest},
        {"access", 1, "0", strDead + strLive + strRest},
        {"YLIBCSzHashKeyAt", 1, "30", strDead + strLive + strRest},
        {"YLIBCSzHashKeyAt", 2, "0", strLive},
        {"YLIBCSzHashValueAt", 2, "0", strLive + strRest},
        {"YLIBCProcAlive", 2, "0", ""}};
    for (const auto &[szOperation, nth, strValue, strOthers] : rows) {
        SCOPED_TRACE(szOperation);
        torture::RunOnce(
            test, {szOperation, nth},
            {"0 " + strValue, "", strOthers + Self() + "=\"" + strValue + "\" platform=0"});
    }
}

TEST(IdleTime, SetSurvivesEveryFailingCall) {
    const std::string strOwn = Self() + "=\"9\" ";
    const std::string strOthers = "4194305=\"4\" ";
    const std::string strBefore = strOwn + strOthers + "platform=20";
    torture::Run({"set",
                  "qrm_hibernation",
                  [&] { Prepare(strOwn + strOthers); },
                  [] { return std::to_string(ZELOQRMIdleTimeSet(45)); },
                  State,
                  {"0", "", strOthers + "platform=45"},
                  {{"getpid()", {"0", "", strOwn + strOthers + "platform=45"}},
                   {"YLIBCFileLockTimeByFile('/tmp/qrm_idle_time.lock', 1, 30, *)",
                    {"-1", kNoLock, strBefore}},
                   {"YLIBCFileRemoveKey('/tmp/qrm_idle_time', '" + Self() + "')",
                    {"-1", kUnremoved, strBefore}},
                   {"ZELODiskAllIdleTimerSet(45)",
                    {"-1", "fail to ZELODiskAllIdleTimerSet", strOthers + "platform=20"}}}});
}

TEST(IdleTime, AFailingReleaseChangesNoResult) {
    Prepare("");
    for (const auto &body : std::vector<std::function<int()>>{
             [] { return Get() == "0 20" ? 0 : -1; }, [] { return ZELOQRMIdleTimeSet(20); }}) {
        const seam::Outcome outcome =
            seam::Observe({"YLIBCFileUnlockByFile"}, [&] { EXPECT_EQ(body(), 0); });
        EXPECT_EQ(seam::Messages(outcome), "fail to YLIBCFileLockTimeByFile /tmp/qrm_idle_time");
        EXPECT_EQ(outcome.recordsLeft, 0);
    }
}

TEST(IdleTime, TheFirstValueStaysUntilItsRecordGoes) {
    Prepare("");
    EXPECT_EQ(ZELOQRMIdleTimeSet(kLargest), 0) << "there is no record to remove";
    EXPECT_FALSE(fs::exists(kFile));
    const std::string strLargest = std::to_string(kLargest);
    EXPECT_EQ(Get(), "0 " + strLargest);
    EXPECT_EQ(State(), Self() + "=\"" + strLargest + "\" platform=" + strLargest);
    ASSERT_EQ(ZELODiskAllIdleTimerSet(0), 0);
    EXPECT_EQ(Get(), "0 " + strLargest);
    EXPECT_EQ(ZELOQRMIdleTimeSet(5), 0);
    EXPECT_EQ(Get(), "0 5");

    Prepare("4194303=\"77\" ");
    const seam::Outcome outcome =
        seam::Observe({"YLIBCProcAlive", 1, true, 1}, [] { EXPECT_EQ(Get(), "0 77"); });
    EXPECT_EQ(outcome.details.at(7), "YLIBCProcAlive(4194303)");
}

// --- Many processes -----------------------------------------------------------------------------

// The values that live processes have recorded. They are all the same one: each took the first.
void ExpectOneValue() {
    ::FileLock lock;
    ASSERT_GT(YLIBCFileLockByFile(kLockFile, 0, lock.Address()), 0);
    HashHandle pairs(YLIBCSzHashAlloc(0));
    ASSERT_TRUE(!fs::exists(kFile) || YLIBCFileGetPair(kFile, pairs.Address()) >= 0);
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
    constexpr auto kHalf = std::chrono::seconds(10);
    Prepare("", kFirst);
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
                return false;
            }
        }
    };
    std::vector<pid_t> workers(16);
    for (pid_t &pid : workers) {
        pid = children::Start(work);
    }
    const auto disturb = [&] {
        const auto end = std::chrono::steady_clock::now() + kHalf;
        // On a busy machine that many kills take longer.
        for (int killed = 0;
             (std::chrono::steady_clock::now() < end || killed < 16) && !HasFailure(); ++killed) {
            // The moment is the random thing here.
            std::this_thread::sleep_for(std::chrono::microseconds(random() % 20'000));
            pid_t &pid = workers[random() % workers.size()];
            EXPECT_TRUE(children::Kill(pid)) << "something was wrong for it";
            pid = children::Start(work);
            if (killed % 16 == 15) {
                ExpectOneValue();
            }
        }
    };
    disturb();
    holder.Kill();
    disturb();
    for (pid_t pid : workers) {
        EXPECT_TRUE(children::Kill(pid));
    }
    unsigned long platform = 0;
    EXPECT_EQ(ZELODiskAllIdleTimerGet(&platform), 0);
    EXPECT_NE(platform, kFirst) << "the processes have set it";
    const std::string strPlatform = std::to_string(platform);
    EXPECT_EQ(Get(), "0 " + strPlatform);
    EXPECT_EQ(State(), Self() + "=\"" + strPlatform + "\" platform=" + strPlatform);
}

}  // namespace
