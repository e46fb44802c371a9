// Disk idle time on behalf of several processes: the value that was recorded first stays available
// to all of them while one of them changes the platform's. Records are kept by process id in a file
// that starts empty after a restart; those of processes that have ended go when they are met.

#include <unistd.h>

#include <cstdlib>

#include "fixed_text.h"
#include "guard.h"
#include "idle_timer.h"
#include "key_value_file.h"
#include "log.h"
#include "platform_handles.h"
#include "process.h"
#include "zeloqrmclient.h"

namespace {

constexpr const char *kFile = "/tmp/qrm_idle_time";
constexpr const char *kLockFile = "/tmp/qrm_idle_time.lock";
constexpr int kLockFlag = 1;
constexpr int kLockTime_s = 30;
constexpr int kHashSize = 512;

using KeyText = FixedText<8>;
using ValueText = FixedText<32>;

// The lock over the idle time file. A release that fails is worth a line, but changes no result.
class IdleLock {
  public:
    IdleLock() = default;
    ~IdleLock() {
        if (m_handle != -1 && YLIBCFileUnlockByFile(m_handle) < 0) {
            ZELO_LOG("fail to YLIBCFileLockTimeByFile %s", kFile);
        }
    }
    IdleLock(const IdleLock &) = delete;
    IdleLock &operator=(const IdleLock &) = delete;

    bool Take() {
        if (YLIBCFileLockTimeByFile(kLockFile, kLockFlag, kLockTime_s, &m_handle) < 0) {
            ZELO_LOG("fail to YLIBCFileLockTimeByFile %s", kLockFile);
            return false;
        }
        return true;
    }

  private:
    int m_handle = -1;
};

bool ReadPlatform(unsigned long &idleTime) {
    if (ZELODiskAllIdleTimerGet(&idleTime) < 0) {
        ZELO_LOG("fail to ZELODiskAllIdleTimerGet");
        return false;
    }
    return true;
}

// A key beyond an int names no process.
bool IsAlive(const char *szKey) {
    const long pid = std::strtol(szKey, nullptr, 10);
    return static_cast<int>(pid) == pid && YLIBCProcAlive(static_cast<int>(pid)) == 1;
}

// The value of the first record of a live process; the records before it go. Without one the
// platform's own.
bool ReadRecords(HashHandle &pairs, unsigned long &idleTime) {
    pairs.Reset(YLIBCSzHashAlloc(kHashSize));
    if (pairs.Get() == nullptr) {
        ZELO_LOG("Failed to YLIBCSzHashAlloc");
        return false;
    }
    if (YLIBCFileGetPair(kFile, pairs.Address()) < 0) {
        ZELO_LOG("Failed to parse %s", kFile);
        return false;
    }
    for (int i = 0; i < pairs.Get()->nItem; ++i) {
        const char *szKey = YLIBCSzHashKeyAt(pairs.Get(), i);
        const char *szValue = YLIBCSzHashValueAt(pairs.Get(), i);
        if (szKey == nullptr) {
            continue;
        }
        if (IsAlive(szKey)) {
            idleTime = szValue == nullptr ? 0 : std::strtoul(szValue, nullptr, 10);
            return true;
        }
        if (YLIBCFileRemoveKey(kFile, szKey) < 0) {
            ZELO_LOG("fail to YLIBCFileRemoveKey %s", kFile);
            return false;
        }
    }
    return ReadPlatform(idleTime);
}

int Get(unsigned long &idleTime) {
    KeyText key;
    key.Format("%d", static_cast<int>(getpid()));
    IdleLock lock;
    if (!lock.Take()) {
        return -1;
    }
    HashHandle pairs;
    const bool blRead =
        access(kFile, F_OK) == 0 ? ReadRecords(pairs, idleTime) : ReadPlatform(idleTime);
    if (!blRead) {
        return -1;
    }
    ValueText value;
    value.Format("%lu", idleTime);
    if (YLIBCFileSetKeyValue(kFile, key.sz(), value.sz(), 0) < 0) {
        ZELO_LOG("fail to YLIBCFileSetKeyValue %s", kFile);
        return -1;
    }
    return 0;
}

int Set(unsigned long idleTime) {
    KeyText key;
    key.Format("%d", static_cast<int>(getpid()));
    IdleLock lock;
    if (!lock.Take()) {
        return -1;
    }
    if (YLIBCFileRemoveKey(kFile, key.sz()) < 0) {
        ZELO_LOG("fail to YLIBCFileRemoveKey %s", kFile);
        return -1;
    }
    if (ZELODiskAllIdleTimerSet(idleTime) < 0) {
        ZELO_LOG("fail to ZELODiskAllIdleTimerSet");
        return -1;
    }
    return 0;
}

}  // namespace

int ZELOQRMIdleTimeGet(unsigned long &idleTime) {
    return ZELO_GUARD(-1, [&] { return Get(idleTime); });
}

int ZELOQRMIdleTimeSet(unsigned long idleTime) {
    return ZELO_GUARD(-1, [&] { return Set(idleTime); });
}
