// Stores of the host platform: each is one SQLite file in a folder of its own.
//
// What every store keeps to. A statement is a transaction, durable when it returns; another
// process's write is waited for, within a bound. Reading never creates or changes the file: a store
// that does not exist yet has no records. Rights that others have over the file or its folder are
// taken away by every operation; a file or folder of somebody else's is refused. A file that is
// damaged or of another format is left as it is, and each operation on it fails with a log line;
// only SetAsideIfDamaged moves it. What is removed is overwritten. The process keeps one connection
// to each store, which its threads take in turn; it is closed before a fork, and opened anew after
// a failure and when another file has taken the place of the one that it leads to.

#ifndef ZELO_HOST_SQLITE_DATABASE_H
#define ZELO_HOST_SQLITE_DATABASE_H

#include <sys/stat.h>
#include <sys/types.h>

#include <cstddef>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "wait.h"

struct sqlite3;
struct sqlite3_stmt;

namespace host::sqlite {

enum class Result { kDone, kAbsent, kFailed };  // only kFailed sets the last error

// What makes a store. Everything that it designates is constant and stays.
struct Store {
    const char *szName;              // what log lines call it
    const char *szFolder;            // made together with the file, mode 0700
    const char *szPath;              // mode 0600
    int applicationId;               // tells the file from any other SQLite database
    int format;                      // one that another version of this code wrote is not ours
    const char *szSchema;            // creates what is not there of tables and indexes
    const char *const *pStatements;  // a run names its statement by the place in this list
    std::size_t cStatements;
};

struct Connection;

// The process's access to one store. Made once, while the library is loaded, and never destroyed,
// so that it serves until the very end of a process.
class Database {
  public:
    explicit Database(const Store &store);
    ~Database() = delete;
    Database(const Database &) = delete;
    Database &operator=(const Database &) = delete;

    // Looks through the whole store, and sets its file aside when that is damaged or of another
    // format (set_aside.h). For an operation with C linkage: throws nothing, and returns 1 when it
    // was set aside, 0 when nothing is damaged, -1 with the last error for a store that cannot be
    // judged, such as a busy one, or not be moved: it stays. szPath tells where the file is then.
    int SetAsideIfDamaged(char *szPath, int cbPath);

  private:
    friend class Run;

    static void CloseAllBeforeFork();
    static void UnlockAllAfterFork();

    // The caller of these holds the mutex.
    Result Connect(bool blWrite);
    Result Open();
    Result CreateFile();
    Result TakeFromOthers(const char *szPath, const struct stat &status, mode_t others);
    Result LookAtFile(struct stat &file);
    Result CheckFormat();
    Result MoveIfDamaged(std::string &strPath);
    Result CreateSchema();
    Result Fail(int sqliteError, const char *szWhat, int line);
    Result FailErrno(int line);

    const Store &m_store;
    std::mutex m_mutex;
    std::unique_ptr<Connection> m_pConnection;
    Database *m_pNext = nullptr;  // all databases are in one chain, for the fork handlers
};

// One run of a prepared statement: takes the mutex and the connection, gives both back when it goes
// out of scope. A failure on the way is kept: later steps do nothing and return it. With blWrite
// the store is created when it is not there; without, it then counts as empty.
class Run {
  public:
    Run(Database &database, std::size_t statement, bool blWrite);
    ~Run();
    Run(const Run &) = delete;
    Run &operator=(const Run &) = delete;

    // Parameters, from 1. A text has to outlive the run; an optional without a value stays NULL.
    void Bind(int at, long value);
    void Bind(int at, const std::string &strText);
    template <typename Value>
    void Bind(int at, const std::optional<Value> &value) {
        if (value) {
            Bind(at, *value);
        }
    }

    // kDone: on a row. kAbsent: there is no (other) row.
    Result Step();

    // Runs a statement that changes the store. A store that is not there counts as changed.
    Result Execute();

    // Columns of the row, from 0.
    bool IsNull(int column) const;
    long Number(int column) const;
    std::optional<long> OptionalNumber(int column) const;
    std::optional<std::string> OptionalText(int column) const;

    long LastId() const;
    int Changes() const;

  private:
    void Prepare(std::size_t statement);
    void Check(int sqliteError, int line);

    Database &m_database;
    Waiting m_waiting;
    std::lock_guard<std::mutex> m_lock;
    sqlite3 *m_pDb = nullptr;
    sqlite3_stmt *m_pStatement = nullptr;
    Result m_result = Result::kDone;
};

}  // namespace host::sqlite

#endif
