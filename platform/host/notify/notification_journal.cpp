// Appending to the journal of notifications, and beginning a new one.

#include "notification_journal.h"

#include <fcntl.h>
#include <json/value.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <mutex>
#include <string>
#include <utility>

#include "descriptor.h"
#include "fork_safe.h"
#include "json.h"
#include "status.h"
#include "wait.h"

namespace {

constexpr const char *kFile = "notification_journal";
constexpr const char *kJournal = "/var/log/notifications.jsonl";
constexpr const char *kFormerJournal = "/var/log/notifications.jsonl.1";

constexpr off_t kMaxJournal = off_t{1024} * 1024;

// A writer holds the journal for as long as one line takes.
constexpr int kLockTries = 500;
constexpr timespec kLockPause = {0, 10'000'000};

int FailWith(unsigned int code, const char *szReason, int line) {
    syslog(LOG_ERR, "%s:%d cannot write to the journal '%s': %s", kFile, line, kJournal, szReason);
    return host::Fail(code, kFile, line);
}

#define JOURNAL_FAIL(code, szReason) FailWith(code, szReason, __LINE__)

// The journal, held against other writers. A fork in another thread copies the descriptor, so
// closing it would not let go.
class HeldJournal {
  public:
    HeldJournal() = default;
    HeldJournal(const HeldJournal &) = delete;
    HeldJournal &operator=(const HeldJournal &) = delete;
    ~HeldJournal() { LetGo(); }

    // Opens the file that is the journal now, and holds it. Returns 0 or -1, with a log line.
    int Take() {
        do {
            LetGo();
            m_file = Descriptor(open(
                kJournal, O_RDWR | O_APPEND | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0640));
            if (!m_file.IsOpen()) {
                return errno == ELOOP    ? JOURNAL_FAIL(YLIBC_ERR_UNSAFE_FILE, "it is a link")
                       : errno == EISDIR ? JOURNAL_FAIL(YLIBC_ERR_UNSAFE_FILE, "it is a folder")
                                         : JOURNAL_FAIL(YLIBC_ERR_FILE, std::strerror(errno));
            }
            if (Hold() < 0) {
                return -1;
            }
        } while (!IsInPlace());
        return 0;
    }

    int Fd() const { return m_file.Get(); }
    off_t Size() const { return m_status.st_size; }

  private:
    void LetGo() {
        if (m_file.IsOpen()) {
            flock(m_file.Get(), LOCK_UN);
        }
    }

    int Hold() {
        const host::Waiting waiting({"waiting for the journal '", kJournal, "'"});
        int tries = 0;
        while (flock(m_file.Get(), LOCK_EX | LOCK_NB) != 0) {
            if (errno != EWOULDBLOCK && errno != EINTR) {
                return JOURNAL_FAIL(YLIBC_ERR_FILE, std::strerror(errno));
            }
            if (++tries == kLockTries) {
                return JOURNAL_FAIL(YLIBC_ERR_BUSY, "another process holds it");
            }
            nanosleep(&kLockPause, nullptr);
        }
        if (fstat(m_file.Get(), &m_status) != 0 || !S_ISREG(m_status.st_mode)) {
            return JOURNAL_FAIL(YLIBC_ERR_UNSAFE_FILE, "it is no regular file");
        }
        return 0;
    }

    // A new journal may have begun while this one was waited for.
    bool IsInPlace() const {
        struct stat there = {};
        return stat(kJournal, &there) == 0 && there.st_ino == m_status.st_ino &&
               there.st_dev == m_status.st_dev;
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

}  // namespace

int host::AppendToJournal(const Notification &notification) {
    std::string strLine = Line(notification);
    HeldJournal journal;
    if (journal.Take() < 0) {
        return -1;
    }
    const auto cbLine = static_cast<off_t>(strLine.size());
    if (journal.Size() > 0 && journal.Size() + cbLine > kMaxJournal) {
        if (std::rename(kJournal, kFormerJournal) != 0) {
            return JOURNAL_FAIL(YLIBC_ERR_FILE, std::strerror(errno));
        }
        if (journal.Take() < 0) {
            return -1;
        }
    }
    if (EndsInsideALine(journal)) {
        strLine.insert(0, 1, '\n');
    }
    const ssize_t cb = write(journal.Fd(), strLine.data(), strLine.size());
    if (cb == static_cast<ssize_t>(strLine.size())) {
        return 0;
    }
    const int error = cb < 0 ? errno : ENOSPC;
    if (cb > 0 && ftruncate(journal.Fd(), journal.Size()) != 0) {
        syslog(LOG_ERR, "%s:%d half a line stays in '%s'", kFile, __LINE__, kJournal);
    }
    return JOURNAL_FAIL(YLIBC_ERR_FILE, std::strerror(error));
}
