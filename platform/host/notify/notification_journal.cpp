// Appending to the journal of notifications, and beginning a new one.

#include "notification_journal.h"

#include <json/value.h>
#include <sys/file.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <mutex>
#include <thread>

#include "descriptor.h"
#include "files/shared_folder.h"
#include "fork_safe.h"
#include "json.h"
#include "own_file.h"
#include "wait.h"

namespace {

using host::Status;
using host::Wait;

constexpr const char *kJournal = "/var/log/notifications.jsonl";
constexpr const char *kFormerJournal = "/var/log/notifications.jsonl.1";

constexpr off_t kMaxJournal = off_t{1024} * 1024;

// A writer holds the journal for as long as one line takes.
constexpr std::chrono::seconds kLockLimit(5);
constexpr std::chrono::milliseconds kLockPause(10);

Status Failure(int error) {
    return HOST_ERROR(YLIBC_ERR_FILE, std::string("cannot write to the journal '") + kJournal +
                                          "': " + std::strerror(error));
}

// The journal, held against other writers. A fork in another thread copies the descriptor, so
// closing it would not let go.
class HeldJournal {
  public:
    HeldJournal() = default;
    HeldJournal(const HeldJournal &) = delete;
    HeldJournal &operator=(const HeldJournal &) = delete;
    ~HeldJournal() { LetGo(); }

    // Opens the file that is the journal now, and holds it. A new one may have begun while the
    // former was waited for.
    Status Take() {
        do {
            LetGo();
            HOST_TRY(Open());
            HOST_TRY(Hold());
            if (fstat(m_file.Get(), &m_status) != 0) {
                return Failure(errno);
            }
        } while (!own_file::IsNamed(kJournal, m_status));
        return {};
    }

    int Fd() const { return m_file.Get(); }
    off_t Size() const { return m_status.st_size; }

  private:
    void LetGo() {
        if (m_file.IsOpen()) {
            flock(m_file.Get(), LOCK_UN);
        }
    }

    Status Open() {
        m_file = Descriptor(open(kJournal, O_RDWR | O_APPEND | O_CREAT | own_file::kFlags, 0640));
        const int error = errno;
        const bool blThere =
            (m_file.IsOpen() ? fstat(m_file.Get(), &m_status) : lstat(kJournal, &m_status)) == 0;
        if (blThere && !own_file::IsOwn(m_status)) {
            return host::Refusal(kJournal, m_status);
        }
        return m_file.IsOpen() ? Status() : Failure(error);
    }

    Status Hold() {
        Wait wait(std::string("the journal '") + kJournal + '\'', kLockLimit);
        while (flock(m_file.Get(), LOCK_EX | LOCK_NB) != 0) {
            if (errno != EWOULDBLOCK && errno != EINTR) {
                return Failure(errno);
            }
            const Wait::Clock::duration slice = wait.Slice();
            if (slice <= Wait::Clock::duration::zero()) {
                return wait.TimeUp(YLIBC_ERR_BUSY);
            }
            std::this_thread::sleep_for(std::min<Wait::Clock::duration>(slice, kLockPause));
        }
        return {};
    }

    Descriptor m_file;
    struct stat m_status = {};
};

// The C library takes a lock for each conversion, which a child process may find taken.
std::mutex g_conversion;
const int g_forkHandlers = HoldAroundForks<g_conversion>();

std::string Now() {
    const time_t now = time(nullptr);
    tm utc = {};
    {
        const std::lock_guard<std::mutex> lock(g_conversion);
        gmtime_r(&now, &utc);
    }
    char sz[32] = {};
    std::strftime(sz, sizeof(sz), "%Y-%m-%dT%H:%M:%SZ", &utc);
    return sz;
}

// JSON text escapes what would break a line, and everything that is no ASCII.
std::string Line(const host::Notification &notification) {
    Json::Value variables(Json::objectValue);
    for (const auto &[strName, strValue] : notification.variables) {
        variables[strName] = strValue;
    }
    Json::Value entry;
    entry["time"] = Now();
    entry["tag"] = notification.strTag;
    entry["title"] = notification.strTitle;
    entry["text"] = notification.strText;
    entry["variables"] = std::move(variables);
    std::string strLine;
    json::ToString(entry, strLine);
    return strLine + '\n';
}

// A process that died, or a full disk, may have left half a line at the end.
bool EndsInsideALine(const HeldJournal &journal) {
    char last = '\n';
    return journal.Size() > 0 && pread(journal.Fd(), &last, 1, journal.Size() - 1) == 1 &&
           last != '\n';
}

Status Append(std::string strLine) {
    HeldJournal journal;
    HOST_TRY(journal.Take());
    const auto cbLine = static_cast<off_t>(strLine.size());
    if (journal.Size() > 0 && journal.Size() + cbLine > kMaxJournal) {
        if (std::rename(kJournal, kFormerJournal) != 0) {
            return Failure(errno);
        }
        HOST_TRY(journal.Take());
    }
    if (EndsInsideALine(journal)) {
        strLine.insert(0, 1, '\n');
    }
    const ssize_t cb = write(journal.Fd(), strLine.data(), strLine.size());
    if (cb == static_cast<ssize_t>(strLine.size())) {
        return {};
    }
    Status failure = Failure(cb < 0 ? errno : ENOSPC);
    const bool blHalfStays = cb > 0 && ftruncate(journal.Fd(), journal.Size()) != 0;
    return blHalfStays ? HOST_ERROR(YLIBC_ERR_FILE, failure.Words() + "; half a line stays in it")
                       : failure;
}

}  // namespace

Status host::AppendToJournal(const Notification &notification) {
    return Append(Line(notification)).Logged(LOG_ERR);
}
