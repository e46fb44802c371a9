// Web sessions: rows of one table in a store of their own.

#include "web_session.h"

#include <array>
#include <new>
#include <string>

#include "never_destroyed.h"
#include "sqlite_database.h"
#include "status.h"

namespace {

constexpr const char *kFile = "web_session";

using host::sqlite::Result;
using host::sqlite::Run;

constexpr const char *kSchema =
    "CREATE TABLE IF NOT EXISTS web_session (session_index INTEGER, name TEXT,"
    " PRIMARY KEY (session_index, name)) WITHOUT ROWID;";

enum StatementKind { kLook, kFind, kAdd, kRemove, kStatementCount };

constexpr std::array<const char *, kStatementCount> kStatements = {
    "SELECT 1 FROM web_session LIMIT 1",
    "SELECT 1 FROM web_session WHERE session_index = ?1 AND name = ?2",
    "INSERT INTO web_session (session_index, name) VALUES (?1, ?2) ON CONFLICT DO NOTHING",
    "DELETE FROM web_session WHERE session_index = ?1 AND name = ?2"};

constexpr host::sqlite::Store kStore = {"web session store",
                                        "/usr/zelo/etc/sessions",
                                        "/usr/zelo/etc/sessions/sessions.db",
                                        0x5A575353,
                                        1,
                                        kSchema,
                                        kStatements.data(),
                                        kStatements.size()};

host::NeverDestroyed<host::sqlite::Database> g_database(kStore);

// The answer of an operation: 1 when it ended as wanted, 0 otherwise.
template <typename Body>
int Answer(const Body &body) {
    try {
        return body() == Result::kDone ? 1 : 0;
    } catch (const std::bad_alloc &) {
        HOST_FAIL(YLIBC_ERR_OUT_OF_MEMORY);
        return 0;
    }
}

// Runs a statement on one session. Only adding creates the store.
int RunOnSession(const ZELO_CGI_CONTEXT *pContext, int index, const char *szName,
                 StatementKind kind) {
    if (pContext == nullptr || pContext->blReady == 0 || index < 0 || szName == nullptr ||
        *szName == '\0') {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return 0;
    }
    return Answer([&] {
        const std::string strName = szName;
        Run run(*g_database, kind, kind == kAdd);
        run.Bind(1, index);
        run.Bind(2, strName);
        return kind == kFind ? run.Step() : run.Execute();
    });
}

}  // namespace

int ZeloCgiInit(const char *szRequest, ZELO_CGI_CONTEXT *pContext) {
    if (szRequest == nullptr || pContext == nullptr) {
        HOST_FAIL(YLIBC_ERR_INVALID_ARGUMENT);
        return 0;
    }
    pContext->blReady = Answer([] { return Run(*g_database, kLook, false).Execute(); });
    return pContext->blReady;
}

int ZeloCgiSessionExistByIndex(ZELO_CGI_CONTEXT *pContext, int index, const char *szName) {
    return RunOnSession(pContext, index, szName, kFind);
}

int ZeloCgiAddSessionByIndex(ZELO_CGI_CONTEXT *pContext, int index, const char *szName) {
    return RunOnSession(pContext, index, szName, kAdd);
}

int ZeloCgiRemoveSessionByIndex(ZELO_CGI_CONTEXT *pContext, int index, const char *szName) {
    return RunOnSession(pContext, index, szName, kRemove);
}

int ZeloCgiStoreSetAside(char *szPath, int cbPath) {
    return g_database->SetAsideIfDamaged(szPath, cbPath);
}

void ZeloCgiFree(ZELO_CGI_CONTEXT *pContext) {
    if (pContext != nullptr) {
        *pContext = ZELO_CGI_CONTEXT();
    }
}
