// Web sessions: rows of one table in a store of their own.

#include "web_session.h"

#include "damaged_store.h"
#include "diagnosis.h"
#include "sqlite_database.h"
#include "status.h"

namespace {

using host::Database;
using host::Status;

constexpr host::Store kStore = {
    "web session store",
    "/usr/zelo/etc/sessions",
    "/usr/zelo/etc/sessions/sessions.db",
    0x5A575353,
    1,
    "CREATE TABLE IF NOT EXISTS web_session (session_index INTEGER, name TEXT,"
    " PRIMARY KEY (session_index, name)) WITHOUT ROWID;"};

host::NeverDestroyed<Database> g_database(kStore);

const int g_forkHandlers = host::CloseAroundForks<g_database>();

// Runs a statement on one session; row tells whether it gave a row. Only adding creates the store.
Status RunOnSession(const ZELO_CGI_CONTEXT *pContext, int index, const char *szName,
                    const char *szStatement, Status (Database::*pfnUse)(const Database::Body &),
                    int &row) {
    HOST_REQUIRE(pContext != nullptr && pContext->blReady != 0 && index >= 0);
    HOST_REQUIRE(szName != nullptr && *szName != '\0');
    return ((*g_database).*pfnUse)([&](SQLite::Database &db) {
        SQLite::Statement statement(db, szStatement);
        statement.bind(1, index);
        statement.bindNoCopy(2, szName);
        row = statement.executeStep() ? 1 : 0;
    });
}

int ChangeSession(const ZELO_CGI_CONTEXT *pContext, int index, const char *szName,
                  const char *szStatement, Status (Database::*pfnUse)(const Database::Body &)) {
    int done = 1;
    return HOST_OPERATION(0, done, [&] {
        int row = 0;
        return RunOnSession(pContext, index, szName, szStatement, pfnUse, row);
    });
}

}  // namespace

int ZeloCgiInit(const char *szRequest, ZELO_CGI_CONTEXT *pContext) {
    int done = 1;
    return HOST_OPERATION(0, done, [&]() -> Status {
        HOST_REQUIRE(szRequest != nullptr && pContext != nullptr);
        pContext->blReady = 0;
        HOST_TRY(g_database->UseExisting(
            [](SQLite::Database &db) { db.exec("SELECT 1 FROM web_session LIMIT 1"); }));
        pContext->blReady = 1;
        return {};
    });
}

int ZeloCgiSessionExistByIndex(ZELO_CGI_CONTEXT *pContext, int index, const char *szName) {
    int row = 0;
    return HOST_OPERATION(0, row, [&] {
        return RunOnSession(pContext, index, szName,
                            "SELECT 1 FROM web_session WHERE session_index = ?1 AND name = ?2",
                            &Database::UseExisting, row);
    });
}

int ZeloCgiAddSessionByIndex(ZELO_CGI_CONTEXT *pContext, int index, const char *szName) {
    return ChangeSession(pContext, index, szName,
                         "INSERT INTO web_session (session_index, name) VALUES (?1, ?2)"
                         " ON CONFLICT DO NOTHING",
                         &Database::UseOrCreate);
}

int ZeloCgiRemoveSessionByIndex(ZELO_CGI_CONTEXT *pContext, int index, const char *szName) {
    return ChangeSession(pContext, index, szName,
                         "DELETE FROM web_session WHERE session_index = ?1 AND name = ?2",
                         &Database::UseExisting);
}

int ZeloCgiStoreSetAside(char *szPath, int cbPath) {
    return host::SetAsideIfDamaged(*g_database, szPath, cbPath);
}

void ZeloCgiFree(ZELO_CGI_CONTEXT *pContext) {
    if (pContext != nullptr) {
        *pContext = ZELO_CGI_CONTEXT();
    }
}
