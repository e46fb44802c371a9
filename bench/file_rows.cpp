// The small files that processes share, against bare loops of lock, change and rename in the same
// folder.

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "ratio_table.h"
#include "rows.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

// --- Peer ---------------------------------------------------------------------------------------

class BareLock {
  public:
    explicit BareLock(const char *szPath) : m_fd(open(szPath, O_RDWR | O_CREAT | O_CLOEXEC, 0600)) {
        m_blHeld = m_fd >= 0 && flock(m_fd, LOCK_EX) == 0;
    }
    ~BareLock() { close(m_fd); }
    BareLock(const BareLock &) = delete;
    BareLock &operator=(const BareLock &) = delete;
    bool IsHeld() const { return m_blHeld; }

  private:
    int m_fd;
    bool m_blHeld;
};

bool ReplaceBare(const std::string &strPath, const std::string &strText) {
    const std::string strNew = strPath + ".new";
    const int fd = open(strNew.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    const bool blWritten = fd >= 0 && write(fd, strText.data(), strText.size()) ==
                                          static_cast<ssize_t>(strText.size());
    close(fd);
    return blWritten && rename(strNew.c_str(), strPath.c_str()) == 0;
}

std::string ReadBare(const char *szPath) {
    const int fd = open(szPath, O_RDONLY | O_CLOEXEC);
    static std::array<char, std::size_t{64} * 1024> buffer;
    const ssize_t cb = read(fd, buffer.data(), buffer.size());
    close(fd);
    return {buffer.data(), cb > 0 ? static_cast<std::size_t>(cb) : 0};
}

// --- Client info file ---------------------------------------------------------------------------

// Every other turn has the other value: one that is there already would not be written again.
const char *NextStatus(int &turn) {
    return ++turn % 2 == 0 ? "success" : "no_permission";
}

Pair InfoPair() {
    const auto pTurns = std::make_shared<std::pair<int, int>>();
    const auto subject = [pTurns] {
        return ZELOQRMClientSetInfo("status", NextStatus(pTurns->first));
    };
    const auto peer = [pTurns] {
        const BareLock lock("/tmp/bare.info.lock");
        return lock.IsHeld() &&
               ReplaceBare("/tmp/bare.info",
                           std::string("status=\"") + NextStatus(pTurns->second) + "\"\n");
    };
    return {{subject, nullptr}, {peer, nullptr}};
}

// --- Idle time ----------------------------------------------------------------------------------

constexpr const char *kIdleFile = "/tmp/qrm_idle_time";
constexpr const char *kBareFile = "/tmp/bare_idle_time";
constexpr const char *kBareLock = "/tmp/bare_idle_time.lock";

// Above every process id that a kernel gives out.
constexpr int kDead = 5'000'000;

// Which of the records is the live one.
enum class Live { kFirst, kLast };

std::string Records(int count, Live live) {
    std::string strText;
    for (int i = 0; i < count; ++i) {
        const bool blLive = i == (live == Live::kFirst ? 0 : count - 1);
        strText += std::to_string(blLive ? getppid() : kDead + i) + "=\"20\"\n";
    }
    return strText;
}

// A record as it stands in the file: a process id, and a value in quotes.
struct Record {
    pid_t pid;
    unsigned long value;
};

std::vector<Record> Parse(const std::string &strText) {
    std::vector<Record> records;
    for (std::size_t at = 0; at < strText.size(); at = strText.find('\n', at) + 1) {
        char *szEquals = nullptr;
        const long pid = std::strtol(&strText[at], &szEquals, 10);
        records.push_back({static_cast<pid_t>(pid), std::strtoul(szEquals + 2, nullptr, 10)});
    }
    return records;
}

// Each change reads the file anew, as one by path and key has to.
bool RemoveBare(long pid) {
    std::string strText = ReadBare(kBareFile);
    const std::size_t begin = strText.find(std::to_string(pid) + '=');
    strText.erase(begin, strText.find('\n', begin) + 1 - begin);
    return ReplaceBare(kBareFile, strText);
}

bool AppendBare(long pid, unsigned long idleTime) {
    return ReplaceBare(kBareFile, ReadBare(kBareFile) + std::to_string(pid) + "=\"" +
                                      std::to_string(idleTime) + "\"\n");
}

// What ZELOQRMIdleTimeGet does to the file, dead records one by one.
bool GetBare(unsigned long &idleTime) {
    const BareLock lock(kBareLock);
    for (const Record &record : Parse(ReadBare(kBareFile))) {
        if (kill(record.pid, 0) == 0 || errno == EPERM) {
            idleTime = record.value;
            break;
        }
        if (!RemoveBare(record.pid)) {
            return false;
        }
    }
    return lock.IsHeld() && AppendBare(getpid(), idleTime);
}

Pair IdlePair(int count, Live live) {
    const std::string strRecords = Records(count, live);
    const auto restore = [strRecords](const char *szFile) {
        return [=] { return ReplaceBare(szFile, strRecords); };
    };
    Require(restore(kIdleFile)() && restore(kBareFile)(), "cannot write the records");
    const auto subject = [] {
        unsigned long idleTime = 0;
        return ZELOQRMIdleTimeGet(idleTime) == 0 && idleTime == 20;
    };
    const auto peer = [] {
        unsigned long idleTime = 0;
        return GetBare(idleTime) && idleTime == 20;
    };
    return {{subject, restore(kIdleFile)}, {peer, restore(kBareFile)}};
}

void AddIdleRow(const std::string &strRecords, int count, Live live, const std::string &strSmaller,
                int pairs) {
    AddRow({"ZELOQRMIdleTimeGet, " + strRecords, "bare lock, parse, kill, rename", 1.5,
            [=] { return IdlePair(count, live); },
            strSmaller.empty() ? "" : "ZELOQRMIdleTimeGet, " + strSmaller, pairs});
}

}  // namespace

void AddFileRows() {
    AddRow({"ZELOQRMClientSetInfo", "bare lock, write, rename", 1.5, InfoPair, ""});
    AddIdleRow("1 record", 1, Live::kFirst, "", 0);
    AddIdleRow("100 records, the first live", 100, Live::kFirst, "1 record", 0);
    AddIdleRow("1,000 records, the first live", 1000, Live::kFirst, "100 records, the first live",
               0);
    AddIdleRow("100 records, the last live", 100, Live::kLast, "1 record", 75);
    AddIdleRow("1,000 records, the last live", 1000, Live::kLast, "100 records, the last live", 9);
}

}  // namespace bench
