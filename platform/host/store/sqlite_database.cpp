#include "sqlite_database.h"

#include <sqlite3.h>
#include <syslog.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <thread>
#include <utility>

#include "files/file_state.h"

namespace host {
namespace {

// How long a writer of another process is waited for.
constexpr std::chrono::seconds kBusyLimit{10};

// EXTRA: a removal is durable too, the journal's directory entry included. What is removed is
// overwritten.
constexpr const char *kSettings =
    "PRAGMA synchronous = EXTRA; PRAGMA secure_delete = ON; PRAGMA trusted_schema = OFF;";

// SQLite asks this whether to try again.
int SleepWhileBusy(void *pWait, int nth) {
    constexpr int kMostDoublings = 5;
    const Wait::Clock::duration slice = (*static_cast<std::optional<Wait> *>(pWait))->Slice();
    if (slice <= Wait::Clock::duration::zero()) {
        return 0;
    }
    const std::chrono::milliseconds pause(1 << std::min(nth, kMostDoublings));
    std::this_thread::sleep_for(std::min<Wait::Clock::duration>(slice, pause));
    return 1;
}

// The marks of the format go in with the tables: a file has all of it or nothing.
void CreateSchema(SQLite::Database &db, const Store &store) {
    db.exec(std::string("BEGIN IMMEDIATE;") + store.szSchema +
            "PRAGMA application_id = " + std::to_string(store.applicationId) +
            "; PRAGMA user_version = " + std::to_string(store.format) + "; COMMIT;");
}

bool IsDamage(int sqliteError) {
    return sqliteError == SQLITE_NOTADB || sqliteError == SQLITE_CORRUPT;
}

Status TimeUp(const Wait &wait) {
    Status status = wait.TimeUp(YLIBC_ERR_STORE_BUSY);
    return status.Code() == YLIBC_ERR_STORE_BUSY ? std::move(status).Logged(LOG_ERR) : status;
}

Status StatusOf(const SQLite::Exception &exception, const Store &store, const Wait &wait,
                const SQLite::Database *pConnection) {
    int systemError = 0;
    if (pConnection != nullptr && IsDamage(exception.getErrorCode())) {
        sqlite3_file_control(pConnection->getHandle(), "main", SQLITE_FCNTL_LAST_ERRNO,
                             &systemError);
    }
    if (systemError != 0) {
        return StoreError(store, std::strerror(systemError));
    }
    switch (exception.getErrorCode()) {
        case SQLITE_NOTADB:
        case SQLITE_CORRUPT:
            return HOST_ERROR(YLIBC_ERR_STORE_DAMAGED,
                              store.Named() +
                                  " is damaged or of another format, nothing was changed: move it "
                                  "aside or restore a copy")
                .Logged(LOG_ERR);
        case SQLITE_BUSY:
        case SQLITE_LOCKED:
            return TimeUp(wait);
        case SQLITE_NOMEM:
            return HOST_ERROR(YLIBC_ERR_OUT_OF_MEMORY, store.Named() + ": " + exception.what())
                .Logged(LOG_ERR);
        default:
            return StoreError(store, exception.what());
    }
}

}  // namespace

Status CatchSqlite(const Store &store, const Wait &wait,
                   const std::unique_ptr<SQLite::Database> &pConnection,
                   const std::function<void()> &body) {
    try {
        body();
        return {};
    } catch (const SQLite::Exception &exception) {
        return StatusOf(exception, store, wait, pConnection.get());
    }
}

// That is asked of SQLite, not of the file's size: its journal may still have to undo something.
bool HasFormat(SQLite::Database &db, const Store &store) {
    const auto number = [&db](const char *szPragma) { return db.execAndGet(szPragma).getInt(); };
    if (number("PRAGMA page_count") == 0) {
        return false;
    }
    if (number("PRAGMA application_id") != store.applicationId ||
        number("PRAGMA user_version") != store.format) {
        throw SQLite::Exception("it is of another format", SQLITE_NOTADB);
    }
    return true;
}

const Wait &Database::BeginWait() {
    return m_wait.emplace("the " + m_store.Named(), kBusyLimit);
}

// False when the file is empty, and no store is to be created in it.
bool Database::Open(std::unique_ptr<SQLite::Database> &pConnection, bool blCreate) {
    pConnection = std::make_unique<SQLite::Database>(m_store.szPath,
                                                     SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX);
    sqlite3_busy_handler(pConnection->getHandle(), SleepWhileBusy, &m_wait);
    pConnection->exec(kSettings);
    if (HasFormat(*pConnection, m_store)) {
        return true;
    }
    if (blCreate) {
        CreateSchema(*pConnection, m_store);
    }
    return blCreate;
}

Status Database::Use(const Body &body, bool blCreate) {
    const std::lock_guard<std::mutex> lock(m_mutex);
    const Wait &wait = BeginWait();
    // Only a whole success puts it back: where something fails, the connection is closed.
    std::unique_ptr<SQLite::Database> pConnection = std::move(m_pConnection);
    struct stat file = {};
    bool blThere = false;
    HOST_TRY(FindStoreFile(m_store, file, blThere));
    if (!blThere && blCreate) {
        HOST_TRY(CreateStoreFile(m_store));
        HOST_TRY(FindStoreFile(m_store, file, blThere));
    }
    if (!blThere) {
        return {};
    }
    if (pConnection != nullptr && !IsSameFile(m_file, file)) {
        pConnection.reset();
    }
    return CatchSqlite(m_store, wait, pConnection, [&] {
        if (pConnection != nullptr || Open(pConnection, blCreate)) {
            body(*pConnection);
            m_pConnection = std::move(pConnection);
            m_file = file;
        }
    });
}

Status Database::WithoutConnection(const std::function<Status(const Wait &)> &body) {
    const std::lock_guard<std::mutex> lock(m_mutex);
    m_pConnection.reset();
    return body(BeginWait());
}

void Database::CloseBeforeFork() {
    m_mutex.lock();
    m_pConnection.reset();
}

}  // namespace host
