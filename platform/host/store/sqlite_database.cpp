#include "sqlite_database.h"

#include <fcntl.h>
#include <pthread.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <new>
#include <vector>

#include "files/file_state.h"
#include "fixed_text.h"
#include "set_aside.h"
#include "sqlite_damage.h"
#include "status.h"

namespace host::sqlite {
namespace {

constexpr const char *kFile = "sqlite_database";

// How long a writer of another process is waited for.
constexpr int kBusyTimeout_ms = 10000;

// EXTRA: a removal is durable too, the journal's directory entry included. What is removed is
// overwritten.
constexpr const char *kSettings =
    "PRAGMA synchronous = EXTRA; PRAGMA secure_delete = ON; PRAGMA trusted_schema = OFF;";

// The chain of all databases. The mutex goes before those of the databases.
std::mutex g_chainMutex;

Database *g_pFirst = nullptr;

// Waited for: the store's other users, in this process and elsewhere, and its disk.
Waiting NameWait(const Store &store) {
    return Waiting({"waiting for the ", store.szName, " '", store.szPath, "'"});
}

// The rights that others must not have.
constexpr mode_t kOthersOfFolder = 0077;
constexpr mode_t kOthersOfFile = 0177;

bool IsOurs(const struct stat &status) {
    return status.st_uid == 0 || status.st_uid == geteuid();
}

}  // namespace

// The statements go before the database that they belong to.
struct Connection {
    struct stat file = {};  // at the latest use
    bool blHasSchema = false;
    bool blFailed = false;  // the next use opens the file anew
    DatabaseHandle pDb;
    std::vector<StatementHandle> statements;
};

// --- Database -----------------------------------------------------------------------------------

Database::Database(const Store &store) : m_store(store) {
    const std::lock_guard<std::mutex> lock(g_chainMutex);
    if (g_pFirst == nullptr) {
        pthread_atfork(CloseAllBeforeFork, UnlockAllAfterFork, UnlockAllAfterFork);
    }
    m_pNext = g_pFirst;
    g_pFirst = this;
}

// SQLite's connections do not survive a fork.
void Database::CloseAllBeforeFork() {
    g_chainMutex.lock();
    for (Database *p = g_pFirst; p != nullptr; p = p->m_pNext) {
        p->m_mutex.lock();
        p->m_pConnection.reset();
    }
}

void Database::UnlockAllAfterFork() {
    for (Database *p = g_pFirst; p != nullptr; p = p->m_pNext) {
        p->m_mutex.unlock();
    }
    g_chainMutex.unlock();
}

// SQLite's error as the platform's, with one log line. What SQLite calls damage is the system's
// error where a read has failed.
Result Database::Fail(int sqliteError, const char *szWhat, int line) {
    int systemError = 0;
    if (m_pConnection != nullptr) {
        m_pConnection->blFailed = true;
        if (IsDamage(sqliteError)) {
            sqlite3_file_control(m_pConnection->pDb.get(), "main", SQLITE_FCNTL_LAST_ERRNO,
                                 &systemError);
        }
    }
    switch (systemError == 0 ? sqliteError & 0xFF : SQLITE_IOERR) {
        case SQLITE_NOTADB:
        case SQLITE_CORRUPT:
            syslog(LOG_ERR,
                   "%s:%d %s '%s' is damaged or of another format, nothing was changed: move it "
                   "aside or restore a copy",
                   kFile, line, m_store.szName, m_store.szPath);
            YLIBCErrSetEx(YLIBC_ERR_STORE_DAMAGED, kFile, line);
            break;
        case SQLITE_BUSY:
        case SQLITE_LOCKED:
            syslog(LOG_ERR, "%s:%d %s '%s' stayed locked for %d s", kFile, line, m_store.szName,
                   m_store.szPath, kBusyTimeout_ms / 1000);
            YLIBCErrSetEx(YLIBC_ERR_STORE_BUSY, kFile, line);
            break;
        default:
            syslog(LOG_ERR, "%s:%d %s '%s': %s", kFile, line, m_store.szName, m_store.szPath,
                   systemError == 0 ? szWhat : std::strerror(systemError));
            YLIBCErrSetEx(sqliteError == SQLITE_NOMEM ? YLIBC_ERR_OUT_OF_MEMORY : YLIBC_ERR_STORE,
                          kFile, line);
    }
    return Result::kFailed;
}

Result Database::FailErrno(int line) {
    return Fail(SQLITE_CANTOPEN, std::strerror(errno), line);
}

// Makes sure that the file is there, ours alone. SQLite's journal takes over its mode.
Result Database::CreateFile() {
    if (mkdir(m_store.szFolder, 0700) != 0 && errno != EEXIST) {
        return FailErrno(__LINE__);
    }
    const int fd = open(m_store.szPath, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600);
    if (fd < 0) {
        return FailErrno(__LINE__);
    }
    close(fd);
    return Result::kDone;
}

// A store that was copied back, or made by hand, may be open to others, or theirs. What it holds is
// not for them, and what they may have put there is not for us.
Result Database::TakeFromOthers(const char *szPath, const struct stat &status, mode_t others) {
    if (IsOurs(status) &&
        ((status.st_mode & others) == 0 || chmod(szPath, 07777U & status.st_mode & ~others) == 0)) {
        return Result::kDone;
    }
    const char *const szWhy =
        IsOurs(status) ? "others have rights over it, which cannot be taken back"
                       : "it belongs to another user: look what it holds, and make it root's";
    syslog(LOG_ERR, "%s:%d %s '%s' is not used: %s", kFile, __LINE__, m_store.szName, szPath,
           szWhy);
    YLIBCErrSetEx(YLIBC_ERR_UNSAFE_FILE, kFile, __LINE__);
    return Result::kFailed;
}

// Looks at the folder and then, when nobody else can put another one there, at the file. kAbsent:
// there is none.
Result Database::LookAtFile(struct stat &file) {
    struct stat folder = {};
    if (stat(m_store.szFolder, &folder) != 0) {
        return errno == ENOENT ? Result::kAbsent : FailErrno(__LINE__);
    }
    if (TakeFromOthers(m_store.szFolder, folder, kOthersOfFolder) != Result::kDone) {
        return Result::kFailed;
    }
    if (lstat(m_store.szPath, &file) != 0) {
        return errno == ENOENT ? Result::kAbsent : FailErrno(__LINE__);
    }
    if (!S_ISREG(file.st_mode)) {
        return Fail(SQLITE_CANTOPEN, "it is no regular file", __LINE__);
    }
    return TakeFromOthers(m_store.szPath, file, kOthersOfFile);
}

Result Database::Open() {
    m_pConnection = std::make_unique<Connection>();
    m_pConnection->statements.resize(m_store.cStatements);
    sqlite3 *pRaw = nullptr;
    const int error = sqlite3_open_v2(m_store.szPath, &pRaw,
                                      SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX, nullptr);
    m_pConnection->pDb.reset(pRaw);
    if (error != SQLITE_OK) {
        return Fail(error, pRaw == nullptr ? sqlite3_errstr(error) : sqlite3_errmsg(pRaw),
                    __LINE__);
    }
    sqlite3_busy_timeout(pRaw, kBusyTimeout_ms);
    const int settingsError = sqlite3_exec(pRaw, kSettings, nullptr, nullptr, nullptr);
    if (settingsError != SQLITE_OK) {
        return Fail(settingsError, sqlite3_errmsg(pRaw), __LINE__);
    }
    return Result::kDone;
}

// The marks of the format go in with the tables: a file has all of it or nothing.
Result Database::CreateSchema() {
    const std::string strSchema =
        std::string("BEGIN IMMEDIATE;") + m_store.szSchema +
        "PRAGMA application_id = " + std::to_string(m_store.applicationId) +
        "; PRAGMA user_version = " + std::to_string(m_store.format) + "; COMMIT;";
    sqlite3 *const pDb = m_pConnection->pDb.get();
    const int error = sqlite3_exec(pDb, strSchema.c_str(), nullptr, nullptr, nullptr);
    if (error != SQLITE_OK) {
        return Fail(error, sqlite3_errmsg(pDb), __LINE__);
    }
    m_pConnection->blHasSchema = true;
    return Result::kDone;
}

// Is it ours? kAbsent: nothing is in it yet, as a process leaves it that dies while creating it.
// That is asked of SQLite, not of the file's size: its journal may still have to undo something.
Result Database::CheckFormat() {
    const Finding finding = sqlite::CheckFormat(m_pConnection->pDb.get(), m_store);
    if (finding.error == SQLITE_EMPTY) {
        return Result::kAbsent;
    }
    if (finding.error != SQLITE_OK) {
        return Fail(finding.error, finding.szWhy, __LINE__);
    }
    m_pConnection->blHasSchema = true;
    return Result::kDone;
}

// Makes m_pConnection a connection to the file that stands at the path now, or none when that
// fails. kAbsent: there is no file, or nothing in it.
Result Database::Connect(bool blWrite) {
    struct stat status = {};
    Result result = LookAtFile(status);
    if (result == Result::kAbsent && blWrite) {
        result = CreateFile() == Result::kDone ? LookAtFile(status) : Result::kFailed;
    }
    if (result != Result::kDone) {
        m_pConnection.reset();
        return result;
    }
    if (m_pConnection == nullptr || m_pConnection->blFailed ||
        !IsSameFile(m_pConnection->file, status)) {
        m_pConnection.reset();
        result = Open();
    }
    m_pConnection->file = status;
    if (result == Result::kDone && !m_pConnection->blHasSchema) {
        result = CheckFormat();
        if (result == Result::kAbsent && blWrite) {
            result = CreateSchema();
        }
    }
    if (result == Result::kFailed) {
        m_pConnection.reset();
    }
    return result;
}

Result Database::MoveIfDamaged(std::string &strPath) {
    const Waiting waiting = NameWait(m_store);
    const std::lock_guard<std::mutex> lock(m_mutex);
    struct stat judged = {};
    if (lstat(m_store.szPath, &judged) != 0) {
        return errno == ENOENT ? Result::kAbsent : FailErrno(__LINE__);
    }
    // This waits for a writer, and plays back the journal of one that has died. Its closing writes
    // a log's changes into the file.
    const Result result = Connect(false);
    m_pConnection.reset();
    if (result == Result::kAbsent ||
        (result == Result::kFailed && YLIBCErrGet() != YLIBC_ERR_STORE_DAMAGED)) {
        return result;
    }
    const Finding finding = FindDamage(m_store);
    if (finding.error == SQLITE_OK) {
        return Result::kAbsent;
    }
    if (!IsDamage(finding.error)) {
        return Fail(finding.error, finding.szWhy, __LINE__);
    }
    // A copy that was restored meanwhile is another file.
    struct stat now = {};
    if (lstat(m_store.szPath, &now) != 0 || !IsSameFile(now, judged)) {
        return Result::kAbsent;
    }
    if (!SetAside(m_store.szPath, strPath)) {
        return FailErrno(__LINE__);
    }
    syslog(LOG_WARNING, "%s:%d %s '%s' was damaged or of another format: it is '%s' now", kFile,
           __LINE__, m_store.szName, m_store.szPath, strPath.c_str());
    return Result::kDone;
}

int Database::SetAsideIfDamaged(char *szPath, int cbPath) {
    if (szPath == nullptr || cbPath <= 0) {
        return HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
    }
    try {
        std::string strPath = m_store.szPath;
        const Result result = MoveIfDamaged(strPath);
        static_cast<void>(CopyToFit(szPath, cbPath, strPath));
        return result == Result::kDone ? 1 : result == Result::kAbsent ? 0 : -1;
    } catch (const std::bad_alloc &) {
        return HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
    }
}

// --- Run ----------------------------------------------------------------------------------------

Run::Run(Database &database, std::size_t statement, bool blWrite)
    : m_database(database), m_waiting(NameWait(database.m_store)), m_lock(database.m_mutex) {
    m_result = database.Connect(blWrite);
    if (m_result == Result::kDone) {
        Prepare(statement);
    }
}

void Run::Prepare(std::size_t statement) {
    m_pDb = m_database.m_pConnection->pDb.get();
    StatementHandle &pCached = m_database.m_pConnection->statements[statement];
    if (pCached == nullptr) {
        sqlite3_stmt *pRaw = nullptr;
        const int error = sqlite3_prepare_v3(m_pDb, m_database.m_store.pStatements[statement], -1,
                                             SQLITE_PREPARE_PERSISTENT, &pRaw, nullptr);
        pCached.reset(pRaw);
        Check(error, __LINE__);
    }
    m_pStatement = pCached.get();
}

Run::~Run() {
    if (m_pStatement != nullptr) {
        sqlite3_reset(m_pStatement);
        sqlite3_clear_bindings(m_pStatement);
    }
}

void Run::Bind(int at, long value) {
    if (m_result == Result::kDone) {
        Check(sqlite3_bind_int64(m_pStatement, at, value), __LINE__);
    }
}

void Run::Bind(int at, const std::string &strText) {
    if (m_result == Result::kDone) {
        Check(sqlite3_bind_text64(m_pStatement, at, strText.data(), strText.size(), SQLITE_STATIC,
                                  SQLITE_UTF8),
              __LINE__);
    }
}

Result Run::Step() {
    if (m_result != Result::kDone) {
        return m_result;
    }
    const int error = sqlite3_step(m_pStatement);
    if (error == SQLITE_ROW) {
        return Result::kDone;
    }
    if (error == SQLITE_DONE) {
        return Result::kAbsent;
    }
    Check(error, __LINE__);
    return m_result;
}

Result Run::Execute() {
    const Result result = Step();
    return result == Result::kAbsent ? Result::kDone : result;
}

bool Run::IsNull(int column) const {
    return sqlite3_column_type(m_pStatement, column) == SQLITE_NULL;
}

long Run::Number(int column) const {
    return sqlite3_column_int64(m_pStatement, column);
}

std::optional<long> Run::OptionalNumber(int column) const {
    return IsNull(column) ? std::nullopt : std::optional<long>(Number(column));
}

std::optional<std::string> Run::OptionalText(int column) const {
    const auto *pText = sqlite3_column_text(m_pStatement, column);
    if (pText == nullptr) {
        return std::nullopt;
    }
    return std::string(reinterpret_cast<const char *>(pText),
                       static_cast<std::size_t>(sqlite3_column_bytes(m_pStatement, column)));
}

long Run::LastId() const {
    return sqlite3_last_insert_rowid(m_pDb);
}

int Run::Changes() const {
    return sqlite3_changes(m_pDb);
}

void Run::Check(int sqliteError, int line) {
    if (sqliteError != SQLITE_OK) {
        m_result = m_database.Fail(sqliteError, sqlite3_errmsg(m_pDb), line);
    }
}

}  // namespace host::sqlite
