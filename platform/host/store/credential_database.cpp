// The credential database: its tables, and the statements that run on them.

#include "credential_database.h"

#include <array>

#include "never_destroyed.h"
#include "set_aside.h"
#include "sqlite_database.h"

namespace host::credential_database {
namespace {

using sqlite::Run;

// AUTOINCREMENT: an id is never used again, also not after the record with the highest one is gone.
constexpr const char *kSchema =
    "CREATE TABLE IF NOT EXISTS credential (id INTEGER PRIMARY KEY AUTOINCREMENT,"
    " application TEXT, host TEXT, protocol TEXT, extra_info TEXT, port INTEGER, owner INTEGER,"
    " create_time INTEGER, modify_time INTEGER);"
    "CREATE INDEX IF NOT EXISTS credential_application ON credential (application);"
    "CREATE TABLE IF NOT EXISTS session (id INTEGER PRIMARY KEY, access_token TEXT,"
    " csrf_token TEXT);";

#define CREDENTIAL_COLUMNS \
    "id, application, host, protocol, extra_info, port, owner, create_time, modify_time"

constexpr int kCredentialColumns = 9;

enum StatementKind {
    kReadCredential,
    kReadFirst,
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
    "SELECT " CREDENTIAL_COLUMNS
    ", (SELECT COUNT(*) FROM credential WHERE application = ?1)"
    " FROM credential WHERE application = ?1 ORDER BY id LIMIT 1",
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

constexpr sqlite::Store kStore = {"credential store",
                                  "/usr/zelo/etc/credentials",
                                  "/usr/zelo/etc/credentials/credentials.db",
                                  0x5A51524D,
                                  1,
                                  kSchema,
                                  kStatements.data(),
                                  kStatements.size()};

NeverDestroyed<sqlite::Database> g_database(kStore);

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

Result RemoveById(StatementKind kind, long id) {
    // A store that does not exist is not created for the sake of a removal.
    Run run(*g_database, kind, false);
    run.Bind(1, id);
    return run.Execute();
}

}  // namespace

Result ReadCredential(long id, ZELO_CRED &cred) {
    Run run(*g_database, kReadCredential, false);
    run.Bind(1, id);
    const Result result = run.Step();
    if (result == Result::kDone) {
        ReadRow(run, cred);
    }
    return result;
}

Result ReadFirst(const char *szApplication, ZELO_CRED &cred, int &count) {
    const std::string strApplication = szApplication;
    Run run(*g_database, kReadFirst, false);
    run.Bind(1, strApplication);
    const Result result = run.Step();
    if (result != Result::kDone) {
        return result;
    }
    ReadRow(run, cred);
    count = static_cast<int>(run.Number(kCredentialColumns));
    return Result::kDone;
}

Result ReadAll(std::vector<ZELO_CRED> &creds) {
    Run run(*g_database, kReadAll, false);
    Result result = Result::kDone;
    while ((result = run.Step()) == Result::kDone) {
        ReadRow(run, creds.emplace_back());
    }
    return result == Result::kAbsent ? Result::kDone : result;
}

Result FindId(const char *szApplication, long &id) {
    const std::string strApplication = szApplication;
    Run run(*g_database, kFindId, false);
    run.Bind(1, strApplication);
    const Result result = run.Step();
    if (result != Result::kDone) {
        return result;
    }
    if (run.IsNull(0)) {
        return Result::kAbsent;
    }
    id = run.Number(0);
    return Result::kDone;
}

Result WriteCredential(ZELO_CRED &cred) {
    Run run(*g_database, cred.id < 0 ? kInsertCredential : kUpdateCredential, true);
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
        return Result::kAbsent;
    }
    return Result::kDone;
}

Result RemoveCredential(long id) {
    return RemoveById(kRemoveCredential, id);
}

int SetAsideIfDamaged(char *szPath, int cbPath) {
    return g_database->SetAsideIfDamaged(szPath, cbPath);
}

bool ListSetAside(std::vector<std::string> &paths) {
    return host::ListSetAside(kStore.szPath, paths);
}

Result ReadSession(long id, ZELO_CRED_SESS &sess) {
    Run run(*g_database, kReadSession, false);
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
    Run run(*g_database, kWriteSession, true);
    run.Bind(1, sess.id);
    run.Bind(2, sess.accessToken);
    run.Bind(3, sess.csrfToken);
    return run.Execute();
}

Result RemoveSession(long id) {
    return RemoveById(kRemoveSession, id);
}

}  // namespace host::credential_database
