// Telling a damaged database file from everything else that can go wrong with it.

#ifndef ZELO_HOST_SQLITE_DAMAGE_H
#define ZELO_HOST_SQLITE_DAMAGE_H

#include <memory>

#include "sqlite_database.h"

struct sqlite3;
struct sqlite3_stmt;

namespace host::sqlite {

struct CloseDatabase {
    void operator()(sqlite3 *pDb) const;
};
struct FinalizeStatement {
    void operator()(sqlite3_stmt *pStatement) const;
};
using DatabaseHandle = std::unique_ptr<sqlite3, CloseDatabase>;
using StatementHandle = std::unique_ptr<sqlite3_stmt, FinalizeStatement>;

// What was found, as SQLite's error code: SQLITE_OK, or why not, in words.
struct Finding {
    int error;
    const char *szWhy;  // valid until the next use of the database
};

// Whether an error of SQLite's says that the file is damaged or another program's.
bool IsDamage(int sqliteError);

// Whether an open database has the store's format: SQLITE_NOTADB when it has not, SQLITE_EMPTY when
// nothing is in it yet.
Finding CheckFormat(sqlite3 *pDb, const Store &store);

// Looks through the whole of a store's file, which has to be there. SQLITE_OK also when nothing is
// in it. The process must have no connection to the file: this closes the file, and with it go the
// locks of all connections of the process.
//
// SQLite alone cannot tell: a read that the disk fails is SQLITE_CORRUPT to it, as is a page that
// came back short. So a copy in memory decides, which was read whole or not at all.
Finding FindDamage(const Store &store);

}  // namespace host::sqlite

#endif
