// The records of the credential store in its database.

#include "credential_store.h"

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "credential_record.h"
#include "damaged_store.h"
#include "diagnosis.h"
#include "sqlite_database.h"
#include "status.h"

namespace {

using host::Database;
using host::Status;

constexpr long kDefaultRecord = -1;

// AUTOINCREMENT: an id is never used again, also not after the record with the highest one is gone.
constexpr host::Store kStore = {
    "credential store",
    "/usr/zelo/etc/credentials",
    "/usr/zelo/etc/credentials/credentials.db",
    0x5A51524D,
    1,
    "CREATE TABLE IF NOT EXISTS credential (id INTEGER PRIMARY KEY AUTOINCREMENT,"
    " application TEXT, host TEXT, protocol TEXT, extra_info TEXT, port INTEGER, owner INTEGER,"
    " create_time INTEGER, modify_time INTEGER);"
    "CREATE INDEX IF NOT EXISTS credential_application ON credential (application);"
    "CREATE TABLE IF NOT EXISTS session (id INTEGER PRIMARY KEY, access_token TEXT,"
    " csrf_token TEXT);"};

#define CREDENTIAL_COLUMNS \
    "id, application, host, protocol, extra_info, port, owner, create_time, modify_time"

constexpr int kCredentialColumns = 9;

constexpr const char *kInsert =
    "INSERT INTO credential (application, host, protocol, extra_info, port, owner, create_time,"
    " modify_time) VALUES (?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9)";
constexpr const char *kUpdate =
    "UPDATE credential SET application = ?2, host = ?3, protocol = ?4, extra_info = ?5, port = ?6,"
    " owner = ?7, create_time = ?8, modify_time = ?9 WHERE id = ?1";

host::NeverDestroyed<Database> g_database(kStore);

const int g_forkHandlers = host::CloseAroundForks<g_database>();

// --- Statements ---------------------------------------------------------------------------------

// A value that was never set stays NULL. A text has to outlive the statement.
void Bind(SQLite::Statement &statement, int at, const std::optional<std::string> &text) {
    if (text) {
        statement.bindNoCopy(at, *text);
    }
}

void Bind(SQLite::Statement &statement, int at, const std::optional<long> &number) {
    if (number) {
        statement.bind(at, static_cast<std::int64_t>(*number));
    }
}

std::optional<std::string> Text(const SQLite::Statement &statement, int column) {
    const SQLite::Column value = statement.getColumn(column);
    return value.isNull() ? std::nullopt : std::optional(value.getString());
}

std::optional<long> Number(const SQLite::Statement &statement, int column) {
    const SQLite::Column value = statement.getColumn(column);
    return value.isNull() ? std::nullopt : std::optional<long>(value.getInt64());
}

void ReadRow(const SQLite::Statement &row, ZELO_CRED &cred) {
    cred.id = Number(row, 0).value_or(-1);
    cred.application = Text(row, 1);
    cred.host = Text(row, 2);
    cred.protocol = Text(row, 3);
    cred.extraInfo = Text(row, 4);
    cred.port = Number(row, 5);
    cred.owner = Number(row, 6);
    cred.createTime_s = Number(row, 7);
    cred.modifyTime_s = Number(row, 8);
}

// Returns how many rows have changed.
int WriteRow(SQLite::Database &db, const char *szStatement, const ZELO_CRED &cred) {
    SQLite::Statement statement(db, szStatement);
    if (cred.id >= 0) {
        Bind(statement, 1, cred.id);
    }
    Bind(statement, 2, cred.application);
    Bind(statement, 3, cred.host);
    Bind(statement, 4, cred.protocol);
    Bind(statement, 5, cred.extraInfo);
    Bind(statement, 6, cred.port);
    Bind(statement, 7, cred.owner);
    Bind(statement, 8, cred.createTime_s);
    Bind(statement, 9, cred.modifyTime_s);
    return statement.exec();
}

void RunOnId(SQLite::Database &db, const char *szStatement, long id) {
    SQLite::Statement statement(db, szStatement);
    Bind(statement, 1, id);
    statement.exec();
}

Status NotFound(const std::string &strWhat) {
    return HOST_ERROR(YLIBC_ERR_NOT_FOUND, "the credential store has no " + strWhat);
}

Status NoRecord(long id) {
    return NotFound("record " + std::to_string(id));
}

// --- Lists --------------------------------------------------------------------------------------

// The application's first record, and how many it has.
Status ListApplication(const char *szApplication, ZELO_CRED &first, int &count) {
    return g_database->UseExisting([&](SQLite::Database &db) {
        SQLite::Statement select(db, "SELECT " CREDENTIAL_COLUMNS
                                     ", (SELECT COUNT(*) FROM credential WHERE application = ?1)"
                                     " FROM credential WHERE application = ?1 ORDER BY id LIMIT 1");
        select.bindNoCopy(1, szApplication);
        if (select.executeStep()) {
            ReadRow(select, first);
            count = select.getColumn(kCredentialColumns).getInt();
        }
    });
}

// The first record that the filter keeps, and how many it keeps.
Status ListKept(ZELO_CRED_KEEP pfnKeep, const char *szValue, ZELO_CRED &first, int &count) {
    if (pfnKeep == ZELOCredKeepByApplication) {
        return ListApplication(szValue, first, count);
    }
    std::vector<ZELO_CRED> creds;
    HOST_TRY(g_database->UseExisting([&](SQLite::Database &db) {
        SQLite::Statement select(db, "SELECT " CREDENTIAL_COLUMNS " FROM credential ORDER BY id");
        while (select.executeStep()) {
            ReadRow(select, creds.emplace_back());
        }
    }));
    for (ZELO_CRED &cred : creds) {
        if (pfnKeep(&cred, szValue) != 0 && count++ == 0) {
            first = std::move(cred);
        }
    }
    return {};
}

}  // namespace

// --- Credentials --------------------------------------------------------------------------------

int ZELOCredSave(ZELO_CRED *pCred) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pCred != nullptr);
        const bool blNew = pCred->id < 0;
        int changes = 0;
        HOST_TRY(g_database->UseOrCreate([&](SQLite::Database &db) {
            changes = WriteRow(db, blNew ? kInsert : kUpdate, *pCred);
            if (blNew) {
                pCred->id = static_cast<long>(db.getLastInsertRowid());
            }
        }));
        return changes > 0 ? Status() : NoRecord(pCred->id);
    });
}

int ZELOCredLoad(long id, ZELO_CRED *pCred) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pCred != nullptr);
        ZELO_CRED cred;
        if (id != kDefaultRecord) {
            HOST_TRY(g_database->UseExisting([&](SQLite::Database &db) {
                SQLite::Statement select(
                    db, "SELECT " CREDENTIAL_COLUMNS " FROM credential WHERE id = ?1");
                Bind(select, 1, id);
                if (select.executeStep()) {
                    ReadRow(select, cred);
                }
            }));
            if (cred.id < 0) {
                return NoRecord(id);
            }
        }
        *pCred = std::move(cred);
        return {};
    });
}

int ZELOCredListGet(ZELO_CRED **ppList, ZELO_CRED_KEEP pfnKeep, const char *szValue) {
    int count = 0;
    return HOST_OPERATION(-1, count, [&]() -> Status {
        HOST_REQUIRE(ppList != nullptr);
        *ppList = nullptr;
        HOST_REQUIRE(pfnKeep != nullptr && szValue != nullptr);
        ZELO_CRED first;
        HOST_TRY(ListKept(pfnKeep, szValue, first, count));
        if (count > 0) {
            *ppList = new ZELO_CRED(std::move(first));
        }
        return {};
    });
}

long ZELOCredIDGetByApplication(const char *szApplication) {
    long id = -1;
    return HOST_OPERATION(-1L, id, [&]() -> Status {
        HOST_REQUIRE(szApplication != nullptr);
        HOST_TRY(g_database->UseExisting([&](SQLite::Database &db) {
            SQLite::Statement select(db, "SELECT MIN(id) FROM credential WHERE application = ?1");
            select.bindNoCopy(1, szApplication);
            select.executeStep();
            id = Number(select, 0).value_or(-1);
        }));
        return id >= 0 ? Status()
                       : NotFound("record of the application '" + std::string(szApplication) + "'");
    });
}

int ZELOCredRemoveByID(long id) {
    return HOST_OPERATION([&] {
        return g_database->UseExisting([&](SQLite::Database &db) {
            // Not SQLite::Transaction, whose destructor ends the process where memory stays short.
            db.exec("BEGIN IMMEDIATE");
            RunOnId(db, "DELETE FROM session WHERE id = ?1", id);
            RunOnId(db, "DELETE FROM credential WHERE id = ?1", id);
            db.exec("COMMIT");
        });
    });
}

// --- Sessions -----------------------------------------------------------------------------------

int ZELOCredSessSave(ZELO_CRED_SESS *pSess) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pSess != nullptr && pSess->id >= 0);
        return g_database->UseOrCreate([&](SQLite::Database &db) {
            SQLite::Statement insert(
                db,
                "INSERT INTO session (id, access_token, csrf_token) VALUES (?1, ?2, ?3)"
                " ON CONFLICT (id) DO UPDATE SET access_token = ?2, csrf_token = ?3");
            Bind(insert, 1, pSess->id);
            Bind(insert, 2, pSess->accessToken);
            Bind(insert, 3, pSess->csrfToken);
            insert.exec();
        });
    });
}

int ZELOCredSessLoad(long id, ZELO_CRED_SESS *pSess) {
    return HOST_OPERATION([&]() -> Status {
        HOST_REQUIRE(pSess != nullptr);
        ZELO_CRED_SESS sess;
        if (id != kDefaultRecord) {
            HOST_TRY(g_database->UseExisting([&](SQLite::Database &db) {
                SQLite::Statement select(
                    db, "SELECT id, access_token, csrf_token FROM session WHERE id = ?1");
                Bind(select, 1, id);
                if (select.executeStep()) {
                    sess = {id, Text(select, 1), Text(select, 2)};
                }
            }));
            if (sess.id < 0) {
                return NotFound("session of the record " + std::to_string(id));
            }
        }
        *pSess = std::move(sess);
        return {};
    });
}

int ZELOCredSessRemoveByID(long id) {
    return HOST_OPERATION([&] {
        return g_database->UseExisting(
            [&](SQLite::Database &db) { RunOnId(db, "DELETE FROM session WHERE id = ?1", id); });
    });
}

// --- A damaged store ----------------------------------------------------------------------------

int ZELOCredStoreSetAside(char *szPath, int cbPath) {
    return host::SetAsideIfDamaged(*g_database, szPath, cbPath);
}

int ZELOCredStoreListSetAside(YLIBSZLIST **ppslPaths) {
    int count = 0;
    return HOST_OPERATION(-1, count, [&]() -> Status {
        HOST_REQUIRE(ppslPaths != nullptr);
        std::vector<std::string> paths;
        HOST_TRY(host::ListSetAside(kStore, paths));
        for (const std::string &strPath : paths) {
            if (YLIBCSzListPush(ppslPaths, strPath.c_str()) < 0) {
                return HOST_ERROR(YLIBCErrGet(), "the list cannot take '" + strPath + "'");
            }
        }
        count = static_cast<int>(paths.size());
        return {};
    });
}
