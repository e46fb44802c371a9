// Stores of the host platform: each is one SQLite file in a folder of its own.
//
// What every store keeps to. A change is a transaction, durable when it returns; another process's
// write is waited for, within a bound. Reading never creates or changes the file: a store that does
// not exist yet has no records. Rights that others have over the file or its folder are taken away
// by every operation; a file or folder of somebody else's is refused. A file that is damaged or of
// another format is left as it is, and each operation on it fails with a log line; only
// damaged_store.h moves it. What is removed is overwritten. The process keeps one connection to
// each store, which its threads take in turn; it is closed before a fork, and opened anew after a
// failure and when another file has taken the place of the one that it leads to.

#ifndef ZELO_HOST_SQLITE_DATABASE_H
#define ZELO_HOST_SQLITE_DATABASE_H

#include <SQLiteCpp/Database.h>
#include <SQLiteCpp/Statement.h>
#include <pthread.h>
#include <sys/stat.h>

#include <functional>
#include <memory>
#include <mutex>
#include <optional>

#include "never_destroyed.h"
#include "status.h"
#include "store_file.h"
#include "wait.h"

namespace host {

// The process's access to one store. Made once, while the library is loaded, and never destroyed,
// so that it serves until the very end of a process.
class Database {
  public:
    // What is done in one use. It may throw SQLite::Exception; a transaction that it has begun and
    // not committed is rolled back then.
    using Body = std::function<void(SQLite::Database &)>;

    explicit Database(const Store &store) : m_store(store) {}
    ~Database() = delete;
    Database(const Database &) = delete;
    Database &operator=(const Database &) = delete;

    const Store &GetStore() const { return m_store; }

    // Does nothing when there is no store, or nothing in it.
    Status UseExisting(const Body &body) { return Use(body, false); }

    // Creates the store when there is none.
    Status UseOrCreate(const Body &body) { return Use(body, true); }

    // Runs the body while the process has no connection, and no thread can open one.
    Status WithoutConnection(const std::function<Status(const Wait &)> &body);

    // SQLite's connections do not survive a fork.
    void CloseBeforeFork();
    void GoOnAfterFork() { m_mutex.unlock(); }

  private:
    Status Use(const Body &body, bool blCreate);
    bool Open(std::unique_ptr<SQLite::Database> &pConnection, bool blCreate);
    const Wait &BeginWait();

    const Store &m_store;
    std::mutex m_mutex;                               // held around every use of SQLite
    std::optional<Wait> m_wait;                       // of the latest use
    std::unique_ptr<SQLite::Database> m_pConnection;  // to a file with the store's format
    struct stat m_file = {};                          // that file
};

// Closes the database around each fork from now on, at namespace scope like HoldAroundForks.
template <NeverDestroyed<Database> &database>
int CloseAroundForks() {
    const auto goOn = [] { database->GoOnAfterFork(); };
    return pthread_atfork([] { database->CloseBeforeFork(); }, goOn, goOn);
}

// Runs the body, and turns an exception of SQLite's into a status: YLIBC_ERR_STORE_DAMAGED for a
// file that is damaged or of another format. pConnection is looked at then: what SQLite calls
// damage is the system's error where a read has failed.
Status CatchSqlite(const Store &store, const Wait &wait,
                   const std::unique_ptr<SQLite::Database> &pConnection,
                   const std::function<void()> &body);

// Whether a database has the store's format; false when nothing is in it yet, as a process leaves
// it that dies while creating it. Throws for another format.
bool HasFormat(SQLite::Database &db, const Store &store);

}  // namespace host

#endif
