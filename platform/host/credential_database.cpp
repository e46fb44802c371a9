// The credential database: its tables, and the statements that run on them.

#include "credential_database.h"

#include <array>

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

constexpr sqlite::Store kStore = {"credential store",
                                  "/usr/zelo/etc/credentials",
                                  "/usr/zelo/etc/credentials/credentials.db",
                                  0x5A51524D,
                                  1,
                                  kSchema,
                                  kStatements.data(),
                                  kStatements.size()};

sqlite::Database &g_database = *new sqlite::Database(kStore);

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

// What was read last in answer to a question, and in which state of the store. The store's mutex
// guards it. Requests that load their records anew each time then cost a look at the file each.
template <typename Question, typename Answer>
struct Kept {
    sqlite::State state;
    Question question = {};
    Answer answer = {};
};

template <typename Question, typename Answer>
bool IsKept(const Kept<Question, Answer> &kept, const Question &question, Answer &answer) {
    const sqlite::Glance glance(g_database);
    if (!glance.Shows(kept.state) || kept.question != question) {
        return false;
    }
    answer = kept.answer;
    return true;
}

// Never destroyed, so that they serve until the very end of a process.
Kept<std::string, long> &g_keptId = *new Kept<std::string, long>;
Kept<long, ZELO_CRED> &g_keptCredential = *new Kept<long, ZELO_CRED>;
Kept<long, ZELO_CRED_SESS> &g_keptSession = *new Kept<long, ZELO_CRED_SESS>;

// How many credentials an application has in one version of the store. The store's mutex guards it.
struct Count {
    std::string strApplication;
    std::uint64_t version = 0;
    int count = 0;
};

// Counting walks the application's part of the index, so it is done once for each version of the
// store.
Result CountOf(const Run &run, const std::string &strApplication, int &count) {
    static auto *const pLast = new Count;
    const std::uint64_t version = run.Version();
    if (pLast->version != version || pLast->strApplication != strApplication) {
        Run counting(run, kCount);
        counting.Bind(1, strApplication);
        const Result result = counting.Step();
        if (result != Result::kDone) {
            return result;
        }
        *pLast = {strApplication, version, static_cast<int>(counting.Number(0))};
    }
    count = pLast->count;
    return Result::kDone;
}

Result RemoveById(StatementKind kind, long id) {
    // A store that does not exist is not created for the sake of a removal.
    Run run(g_database, kind, false);
    run.Bind(1, id);
    return run.Execute();
}

}  // namespace

Result ReadCredential(long id, ZELO_CRED &cred) {
    if (IsKept(g_keptCredential, id, cred)) {
        return Result::kDone;
    }
    Run run(g_database, kReadCredential, false);
    run.Bind(1, id);
    const Result result = run.Step();
    if (result == Result::kDone) {
        ReadRow(run, cred);
        g_keptCredential = {run.FileState(), id, cred};
    }
    return result;
}

Result ReadFirst(const char *szApplication, ZELO_CRED &cred, int &count) {
    const std::string strApplication = szApplication;
    Run run(g_database, kReadFirst, false);
    run.Bind(1, strApplication);
    const Result result = run.Step();
    if (result != Result::kDone) {
        return result;
    }
    ReadRow(run, cred);
    return CountOf(run, strApplication, count);
}

Result ReadAll(std::vector<ZELO_CRED> &creds) {
    Run run(g_database, kReadAll, false);
    Result result = Result::kDone;
    while ((result = run.Step()) == Result::kDone) {
        ReadRow(run, creds.emplace_back());
    }
    return result == Result::kAbsent ? Result::kDone : result;
}

Result FindId(const char *szApplication, long &id) {
    const std::string strApplication = szApplication;
    if (IsKept(g_keptId, strApplication, id)) {
        return Result::kDone;
    }
    Run run(g_database, kFindId, false);
    run.Bind(1, strApplication);
    const Result result = run.Step();
    if (result != Result::kDone) {
        return result;
    }
    if (run.IsNull(0)) {
        return Result::kAbsent;
    }
    id = run.Number(0);
    g_keptId = {run.FileState(), strApplication, id};
    return Result::kDone;
}

Result WriteCredential(ZELO_CRED &cred) {
    Run run(g_database, cred.id < 0 ? kInsertCredential : kUpdateCredential, true);
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
    return g_database.SetAsideIfDamaged(szPath, cbPath);
}

bool ListSetAside(std::vector<std::string> &paths) {
    return host::ListSetAside(kStore.szPath, paths);
}

Result ReadSession(long id, ZELO_CRED_SESS &sess) {
    if (IsKept(g_keptSession, id, sess)) {
        return Result::kDone;
    }
    Run run(g_database, kReadSession, false);
    run.Bind(1, id);
    const Result result = run.Step();
    if (result == Result::kDone) {
        sess.id = run.Number(0);
        sess.accessToken = run.OptionalText(1);
        sess.csrfToken = run.OptionalText(2);
        g_keptSession = {run.FileState(), id, sess};
    }
    return result;
}

Result WriteSession(const ZELO_CRED_SESS &sess) {
    Run run(g_database, kWriteSession, true);
    run.Bind(1, sess.id);
    run.Bind(2, sess.accessToken);
    run.Bind(3, sess.csrfToken);
    return run.Execute();
}

Result RemoveSession(long id) {
    return RemoveById(kRemoveSession, id);
}

}  // namespace host::credential_database
