// Access to the credential database through one connection per process.

#include "credential_database.h"

#include <fcntl.h>
#include <pthread.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "last_error.h"

namespace host::credential_database {
namespace {

constexpr const char *kFile = "credential_database";
constexpr const char *kFolder = "/usr/zelo/etc/credentials";
constexpr const char *kPath = "/usr/zelo/etc/credentials/credentials.db";

// How long a writer of another process is waited for.
constexpr int kBusyTimeout_ms = 10000;

// Tells our file from any other SQLite database.
constexpr int kApplicationId = 0x5A51524D;
constexpr int kFormat = 1;

// AUTOINCREMENT: an id is never used again, also not after the record with the highest one is gone.
constexpr const char *kSchema =
    "BEGIN IMMEDIATE;"
    "CREATE TABLE IF NOT EXISTS credential (id INTEGER PRIMARY KEY AUTOINCREMENT,"
    " application TEXT, host TEXT, protocol TEXT, extra_info TEXT, port INTEGER, owner INTEGER,"
    " create_time INTEGER, modify_time INTEGER);"
    "CREATE INDEX IF NOT EXISTS credential_application ON credential (application);"
    "CREATE TABLE IF NOT EXISTS session (id INTEGER PRIMARY KEY, access_token TEXT,"
    " csrf_token TEXT);"
    "PRAGMA application_id = 1515278925;"
    "PRAGMA user_version = 1;"
    "COMMIT;";
static_assert(kApplicationId == 1515278925 && kFormat == 1, "the schema sets both as numbers");

// EXTRA: a removal is durable too, the journal's directory entry included. Removed tokens are
// overwritten.
constexpr const char *kSettings =
    "PRAGMA synchronous = EXTRA; PRAGMA secure_delete = ON; PRAGMA trusted_schema = OFF;";

#define CREDENTIAL_COLUMNS \
    "id, application, host, protocol, extra_info, port, owner, create_time, modify_time"

enum StatementKind {
    kReadCredential,
    kReadFirst,
    kCount,
    kReadAll,
    kFindId,
    kInsertCredential,
    kUpdateCredential,
    kRemoveCredential,
    kReadSession,
    kWriteSession,
    kRemoveSession,
    kStatementCount
};

constexpr std::array<const char *, kStatementCount> kStatements = {
    "SELECT " CREDENTIAL_COLUMNS " FROM credential WHERE id = ?1",
    "SELECT " CREDENTIAL_COLUMNS " FROM credential WHERE application = ?1 ORDER BY id LIMIT 1",
    "SELECT COUNT(*) FROM credential WHERE application = ?1",
    "SELECT " CREDENTIAL_COLUMNS " FROM credential ORDER BY id",
    "SELECT MIN(id) FROM credential WHERE application = ?1",
    "INSERT INTO credential (application, host, protocol, extra_info, port, owner, create_time,"
    " modify_time) VALUES (?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9)",
    "UPDATE credential SET application = ?2, host = ?3, protocol = ?4, extra_info = ?5, port = ?6,"
    " owner = ?7, create_time = ?8, modify_time = ?9 WHERE id = ?1",
    "DELETE FROM credential WHERE id = ?1",
    "SELECT id, access_token, csrf_token FROM session WHERE id = ?1",
    "INSERT INTO session (id, access_token, csrf_token) VALUES (?1, ?2, ?3)"
    " ON CONFLICT (id) DO UPDATE SET access_token = ?2, csrf_token = ?3",
    "DELETE FROM session WHERE id = ?1"};

struct CloseDatabase {
    void operator()(sqlite3 *pDb) const { sqlite3_close_v2(pDb); }
};
struct FinalizeStatement {
    void operator()(sqlite3_stmt *pStatement) const { sqlite3_finalize(pStatement); }
};
using DatabaseHandle = std::unique_ptr<sqlite3, CloseDatabase>;
using StatementHandle = std::unique_ptr<sqlite3_stmt, FinalizeStatement>;

// How many credentials an application has in one version of the store.
struct Count {
    std::string strApplication;
    unsigned version = 0;
    int count = 0;
};

// The statements go before the database that they belong to.
struct Connection {
    dev_t device = 0;
    ino_t inode = 0;
    bool blHasSchema = false;
    std::optional<Count> lastCount;
    DatabaseHandle pDb;
    std::array<StatementHandle, kStatementCount> statements;
};

// One connection per process, kept until another file takes its place or the process forks:
// SQLite's connections do not survive a fork. Never destroyed, so that it serves until the very end
// of a process.
struct Shared {
    std::mutex mutex;
    std::unique_ptr<Connection> pConnection;
};

Shared &TheShared() {
    static auto *const pShared = new Shared;
    return *pShared;
}

void CloseBeforeFork() {
    TheShared().mutex.lock();
    TheShared().pConnection.reset();
}

void UnlockAfterFork() {
    TheShared().mutex.unlock();
}

const int g_forkHandlers = pthread_atfork(CloseBeforeFork, UnlockAfterFork, UnlockAfterFork);

// SQLite's error as the platform's, with one log line.
Result Fail(int sqliteError, const char *szWhat, int line) {
    switch (sqliteError & 0xFF) {
        case SQLITE_NOTADB:
        case SQLITE_CORRUPT:
            syslog(LOG_ERR,
                   "%s:%d credential store '%s' is damaged or of another format, nothing was "
                   "changed: move it aside or restore a copy",
                   kFile, line, kPath);
            YLIBCErrSetEx(YLIBC_ERR_STORE_DAMAGED, kFile, line);
            break;
        case SQLITE_BUSY:
        case SQLITE_LOCKED:
            syslog(LOG_ERR, "%s:%d credential store '%s' stayed locked for %d s", kFile, line,
                   kPath, kBusyTimeout_ms / 1000);
            YLIBCErrSetEx(YLIBC_ERR_STORE_BUSY, kFile, line);
            break;
        default:
            syslog(LOG_ERR, "%s:%d credential store '%s': %s", kFile, line, kPath, szWhat);
            YLIBCErrSetEx(YLIBC_ERR_STORE, kFile, line);
    }
    return Result::kFailed;
}

Result FailErrno(int line) {
    return Fail(SQLITE_CANTOPEN, std::strerror(errno), line);
}

Result Absent(int line) {
    YLIBCErrSetEx(YLIBC_ERR_NOT_FOUND, kFile, line);
    return Result::kAbsent;
}

// Makes sure that the file is there, ours alone. SQLite's journal takes over its mode.
Result CreateFile() {
    if (mkdir(kFolder, 0700) != 0 && errno != EEXIST) {
        return FailErrno(__LINE__);
    }
    const int fd = open(kPath, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600);
    if (fd < 0) {
        return FailErrno(__LINE__);
    }
    close(fd);
    return Result::kDone;
}

bool ReadPragma(sqlite3 *pDb, const char *szPragma, int &value, int &error) {
    sqlite3_stmt *pRaw = nullptr;
    error = sqlite3_prepare_v2(pDb, szPragma, -1, &pRaw, nullptr);
    const StatementHandle pStatement(pRaw);
    if (error == SQLITE_OK) {
        error = sqlite3_step(pRaw);
    }
    if (error != SQLITE_ROW) {
        return false;
    }
    value = sqlite3_column_int(pRaw, 0);
    return true;
}

// Is it ours? An empty file, as a process that died while creating it leaves behind, is.
Result CheckFormat(Connection &connection, off_t size) {
    if (size == 0) {
        return Result::kDone;
    }
    int applicationId = 0;
    int format = 0;
    int error = SQLITE_OK;
    if (!ReadPragma(connection.pDb.get(), "PRAGMA application_id", applicationId, error) ||
        !ReadPragma(connection.pDb.get(), "PRAGMA user_version", format, error)) {
        return Fail(error, sqlite3_errmsg(connection.pDb.get()), __LINE__);
    }
    if (applicationId != kApplicationId || format != kFormat) {
        return Fail(SQLITE_NOTADB, "", __LINE__);
    }
    connection.blHasSchema = true;
    return Result::kDone;
}

Result Open(const struct stat &status, std::unique_ptr<Connection> &pResult) {
    auto pConnection = std::make_unique<Connection>();
    pConnection->device = status.st_dev;
    pConnection->inode = status.st_ino;
    sqlite3 *pRaw = nullptr;
    const int error =
        sqlite3_open_v2(kPath, &pRaw, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX, nullptr);
    pConnection->pDb.reset(pRaw);
    if (error != SQLITE_OK) {
        return Fail(error, pRaw == nullptr ? sqlite3_errstr(error) : sqlite3_errmsg(pRaw),
                    __LINE__);
    }
    sqlite3_busy_timeout(pRaw, kBusyTimeout_ms);
    const int settingsError = sqlite3_exec(pRaw, kSettings, nullptr, nullptr, nullptr);
    if (settingsError != SQLITE_OK) {
        return Fail(settingsError, sqlite3_errmsg(pRaw), __LINE__);
    }
    const Result result = CheckFormat(*pConnection, status.st_size);
    if (result == Result::kDone) {
        pResult = std::move(pConnection);
    }
    return result;
}

// Makes shared.pConnection a connection to the file that stands at the path now. The caller holds
// the mutex.
Result Connect(Shared &shared, bool blWrite) {
    struct stat status = {};
    if (stat(kPath, &status) != 0) {
        if (errno != ENOENT) {
            return FailErrno(__LINE__);
        }
        shared.pConnection.reset();
        if (!blWrite) {
            return Absent(__LINE__);
        }
        if (CreateFile() != Result::kDone) {
            return Result::kFailed;
        }
        if (stat(kPath, &status) != 0) {
            return FailErrno(__LINE__);
        }
    }
    const auto *pOld = shared.pConnection.get();
    if (pOld == nullptr || pOld->device != status.st_dev || pOld->inode != status.st_ino) {
        shared.pConnection.reset();
        if (Open(status, shared.pConnection) != Result::kDone) {
            return Result::kFailed;
        }
    }
    Connection &connection = *shared.pConnection;
    if (connection.blHasSchema) {
        return Result::kDone;
    }
    if (!blWrite && status.st_size == 0) {
        return Absent(__LINE__);
    }
    const int error = sqlite3_exec(connection.pDb.get(), kSchema, nullptr, nullptr, nullptr);
    if (error != SQLITE_OK) {
        const Result result = Fail(error, sqlite3_errmsg(connection.pDb.get()), __LINE__);
        shared.pConnection.reset();
        return result;
    }
    connection.blHasSchema = true;
    return Result::kDone;
}

// One run of a prepared statement on the process's connection: takes the mutex and the connection,
// gives both back when it goes out of scope.
class Run {
  public:
    Run(StatementKind kind, bool blWrite) : m_lock(TheShared().mutex) {
        Shared &shared = TheShared();
        m_result = Connect(shared, blWrite);
        if (m_result != Result::kDone) {
            return;
        }
        Prepare(shared.pConnection.get(), kind);
    }
    // A further statement while the outer run is on a row, and thereby on the same version of the
    // store.
    Run(const Run &outer, StatementKind kind) { Prepare(outer.m_pConnection, kind); }
    ~Run() {
        if (m_pStatement != nullptr) {
            sqlite3_reset(m_pStatement);
            sqlite3_clear_bindings(m_pStatement);
        }
    }
    Run(const Run &) = delete;
    Run &operator=(const Run &) = delete;

    void Bind(int at, long value) {
        if (m_result == Result::kDone) {
            Check(sqlite3_bind_int64(m_pStatement, at, value), __LINE__);
        }
    }
    void Bind(int at, const std::optional<long> &value) {
        if (value) {
            Bind(at, *value);
        }
    }
    // The text has to outlive the run.
    void Bind(int at, const std::string &strText) {
        if (m_result == Result::kDone) {
            Check(sqlite3_bind_text64(m_pStatement, at, strText.data(), strText.size(),
                                      SQLITE_STATIC, SQLITE_UTF8),
                  __LINE__);
        }
    }
    void Bind(int at, const std::optional<std::string> &text) {
        if (text) {
            Bind(at, *text);
        }
    }

    // kDone: on a row. kAbsent: there is no (other) row.
    Result Step() {
        if (m_result != Result::kDone) {
            return m_result;
        }
        const int error = sqlite3_step(m_pStatement);
        if (error == SQLITE_ROW) {
            return Result::kDone;
        }
        if (error == SQLITE_DONE) {
            return Absent(__LINE__);
        }
        Check(error, __LINE__);
        return m_result;
    }

    // Runs a statement that changes the store. A store that is not there counts as changed.
    Result Execute() {
        const Result result = Step();
        return result == Result::kAbsent ? Result::kDone : result;
    }

    bool IsNull(int column) const {
        return sqlite3_column_type(m_pStatement, column) == SQLITE_NULL;
    }
    long Number(int column) const { return sqlite3_column_int64(m_pStatement, column); }
    std::optional<long> OptionalNumber(int column) const {
        return IsNull(column) ? std::nullopt : std::optional<long>(Number(column));
    }
    std::optional<std::string> OptionalText(int column) const {
        const auto *pText = sqlite3_column_text(m_pStatement, column);
        if (pText == nullptr) {
            return std::nullopt;
        }
        return std::string(reinterpret_cast<const char *>(pText),
                           static_cast<std::size_t>(sqlite3_column_bytes(m_pStatement, column)));
    }
    long LastId() const { return sqlite3_last_insert_rowid(m_pDb); }
    int Changes() const { return sqlite3_changes(m_pDb); }

    // The version of the store that the row belongs to; any process's change makes another one.
    unsigned Version() const {
        unsigned version = 0;
        sqlite3_file_control(m_pDb, "main", SQLITE_FCNTL_DATA_VERSION, &version);
        return version;
    }
    std::optional<Count> &LastCount() const { return m_pConnection->lastCount; }

  private:
    void Prepare(Connection *pConnection, StatementKind kind) {
        m_pConnection = pConnection;
        m_pDb = pConnection->pDb.get();
        StatementHandle &pCached = pConnection->statements[kind];
        if (pCached == nullptr) {
            sqlite3_stmt *pRaw = nullptr;
            const int error = sqlite3_prepare_v3(m_pDb, kStatements[kind], -1,
                                                 SQLITE_PREPARE_PERSISTENT, &pRaw, nullptr);
            pCached.reset(pRaw);
            Check(error, __LINE__);
        }
        m_pStatement = pCached.get();
    }

    void Check(int error, int line) {
        if (error != SQLITE_OK) {
            m_result = Fail(error, sqlite3_errmsg(m_pDb), line);
        }
    }

    std::unique_lock<std::mutex> m_lock;
    Connection *m_pConnection = nullptr;
    sqlite3 *m_pDb = nullptr;
    sqlite3_stmt *m_pStatement = nullptr;
    Result m_result = Result::kDone;
};

void ReadRow(const Run &run, ZELO_CRED &cred) {
    cred.id = run.Number(0);
    cred.application = run.OptionalText(1);
    cred.host = run.OptionalText(2);
    cred.protocol = run.OptionalText(3);
    cred.extraInfo = run.OptionalText(4);
    cred.port = run.OptionalNumber(5);
    cred.owner = run.OptionalNumber(6);
    cred.createTime_s = run.OptionalNumber(7);
    cred.modifyTime_s = run.OptionalNumber(8);
}

// Counting walks the application's part of the index, so it is done once for each version of the
// store.
Result CountOf(const Run &run, const std::string &strApplication, int &count) {
    std::optional<Count> &last = run.LastCount();
    const unsigned version = run.Version();
    if (!last || last->version != version || last->strApplication != strApplication) {
        Run counting(run, kCount);
        counting.Bind(1, strApplication);
        const Result result = counting.Step();
        if (result != Result::kDone) {
            return result;
        }
        last = Count{strApplication, version, static_cast<int>(counting.Number(0))};
    }
    count = last->count;
    return Result::kDone;
}

Result RemoveById(StatementKind kind, long id) {
    // A store that does not exist is not created for the sake of a removal.
    Run run(kind, false);
    run.Bind(1, id);
    return run.Execute();
}

}  // namespace

Result ReadCredential(long id, ZELO_CRED &cred) {
    Run run(kReadCredential, false);
    run.Bind(1, id);
    const Result result = run.Step();
    if (result == Result::kDone) {
        ReadRow(run, cred);
    }
    return result;
}

Result ReadFirst(const char *szApplication, ZELO_CRED &cred, int &count) {
    const std::string strApplication = szApplication;
    Run run(kReadFirst, false);
    run.Bind(1, strApplication);
    const Result result = run.Step();
    if (result != Result::kDone) {
        return result;
    }
    ReadRow(run, cred);
    return CountOf(run, strApplication, count);
}

Result ReadAll(std::vector<ZELO_CRED> &creds) {
    Run run(kReadAll, false);
    Result result = Result::kDone;
    while ((result = run.Step()) == Result::kDone) {
        ReadRow(run, creds.emplace_back());
    }
    return result == Result::kAbsent ? Result::kDone : result;
}

Result FindId(const char *szApplication, long &id) {
    const std::string strApplication = szApplication;
    Run run(kFindId, false);
    run.Bind(1, strApplication);
    const Result result = run.Step();
    if (result != Result::kDone) {
        return result;
    }
    if (run.IsNull(0)) {
        return Absent(__LINE__);
    }
    id = run.Number(0);
    return Result::kDone;
}

Result WriteCredential(ZELO_CRED &cred) {
    Run run(cred.id < 0 ? kInsertCredential : kUpdateCredential, true);
    if (cred.id >= 0) {
        run.Bind(1, cred.id);
    }
    run.Bind(2, cred.application);
    run.Bind(3, cred.host);
    run.Bind(4, cred.protocol);
    run.Bind(5, cred.extraInfo);
    run.Bind(6, cred.port);
    run.Bind(7, cred.owner);
    run.Bind(8, cred.createTime_s);
    run.Bind(9, cred.modifyTime_s);
    const Result result = run.Execute();
    if (result != Result::kDone) {
        return result;
    }
    if (cred.id < 0) {
        cred.id = run.LastId();
    } else if (run.Changes() == 0) {
        return Absent(__LINE__);
    }
    return Result::kDone;
}

Result RemoveCredential(long id) {
    return RemoveById(kRemoveCredential, id);
}

Result ReadSession(long id, ZELO_CRED_SESS &sess) {
    Run run(kReadSession, false);
    run.Bind(1, id);
    const Result result = run.Step();
    if (result == Result::kDone) {
        sess.id = run.Number(0);
        sess.accessToken = run.OptionalText(1);
        sess.csrfToken = run.OptionalText(2);
    }
    return result;
}

Result WriteSession(const ZELO_CRED_SESS &sess) {
    Run run(kWriteSession, true);
    run.Bind(1, sess.id);
    run.Bind(2, sess.accessToken);
    run.Bind(3, sess.csrfToken);
    return run.Execute();
}

Result RemoveSession(long id) {
    return RemoveById(kRemoveSession, id);
}

}  // namespace host::credential_database
