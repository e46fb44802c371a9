// The server credential's functions, against the bare SQLite statements that they come down to.

#include <sqlite3.h>

#include <array>
#include <filesystem>
#include <memory>
#include <string>

#include "ratio_table.h"
#include "rows.h"
#include "zeloqrmclient.h"

namespace bench {
namespace {

namespace fs = std::filesystem;

constexpr const char *kStore = "/usr/zelo/etc/credentials/credentials.db";
constexpr const char *kPeerStore = "/usr/zelo/etc/credentials/peer.db";

constexpr const char *kApplication = "ZELO.QRM";
constexpr const char *kNotificationCenter = "ZELO.NotificationCenter";
constexpr const char *kToken = "0123456789abcdef0123456789abcdef";

// --- Subject ------------------------------------------------------------------------------------

bool Create() {
    static const Json::Value cred = [] {
        Json::Value value;
        value["application"] = kApplication;
        value["host"] = "qrm.example";
        value["protocol"] = "https";
        value["port"] = 5001;
        value["extra_info"]["sn"] = "18Z0123456789";
        value["access_token"] = kToken;
        return value;
    }();
    return ZELOQRMClientCreateServerCredential(cred);
}

bool Read() {
    Json::Value out;
    return ZELOQRMClientGetServerCredentialWithToken(out);
}

// --- Peer ---------------------------------------------------------------------------------------

struct Close {
    void operator()(sqlite3 *pDb) const { sqlite3_close_v2(pDb); }
    void operator()(sqlite3_stmt *pStatement) const { sqlite3_finalize(pStatement); }
};

// A row's first column, and copies of the others.
struct Found {
    sqlite3_int64 number = 0;
    std::array<std::string, 4> texts;
};

// A statement that is prepared once; each run is a transaction of its own, as in the store.
class Statement {
  public:
    Statement(sqlite3 *pDb, const char *szSql) : m_pDb(pDb) {
        sqlite3_stmt *pRaw = nullptr;
        const int error =
            sqlite3_prepare_v3(pDb, szSql, -1, SQLITE_PREPARE_PERSISTENT, &pRaw, nullptr);
        m_pStatement.reset(pRaw);
        Require(error == SQLITE_OK, sqlite3_errmsg(pDb));
    }

    template <typename... Values>
    bool Change(Values... values) {
        const int result = Start(values...);
        sqlite3_reset(m_pStatement.get());
        return result == SQLITE_DONE && sqlite3_changes(m_pDb) == 1;
    }

    template <typename Value>
    bool Find(Found &found, Value value) {
        const bool blFound = Start(value) == SQLITE_ROW;
        if (blFound) {
            found.number = sqlite3_column_int64(m_pStatement.get(), 0);
            for (int i = 1; i < sqlite3_column_count(m_pStatement.get()); ++i) {
                const auto *pText = sqlite3_column_text(m_pStatement.get(), i);
                found.texts[i - 1] = pText == nullptr ? "" : reinterpret_cast<const char *>(pText);
            }
        }
        sqlite3_reset(m_pStatement.get());
        return blFound;
    }

  private:
    template <typename... Values>
    int Start(Values... values) {
        int at = 0;
        (Bind(++at, values), ...);
        return sqlite3_step(m_pStatement.get());
    }
    void Bind(int at, sqlite3_int64 value) { sqlite3_bind_int64(m_pStatement.get(), at, value); }
    void Bind(int at, const char *szValue) {
        sqlite3_bind_text(m_pStatement.get(), at, szValue, -1, SQLITE_STATIC);
    }

    sqlite3 *m_pDb;
    std::unique_ptr<sqlite3_stmt, Close> m_pStatement;
};

std::unique_ptr<sqlite3, Close> Open(const char *szPath) {
    sqlite3 *pRaw = nullptr;
    const int error =
        sqlite3_open_v2(szPath, &pRaw, SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOMUTEX, nullptr);
    std::unique_ptr<sqlite3, Close> pDb(pRaw);
    Require(error == SQLITE_OK, sqlite3_errstr(error));
    return pDb;
}

void Execute(sqlite3 *pDb, const std::string &strSql) {
    Require(sqlite3_exec(pDb, strSql.c_str(), nullptr, nullptr, nullptr) == SQLITE_OK,
            sqlite3_errmsg(pDb));
}

// The statements on an open handle, with the store's settings.
class BareStore {
  public:
    BareStore() { Execute(m_pDb.get(), "PRAGMA synchronous = EXTRA; PRAGMA secure_delete = ON;"); }

    bool Create() {
        constexpr sqlite3_int64 kTime = 1'700'000'000;
        return m_insertCredential.Change(kApplication, "qrm.example", "https",
                                         R"({"sn":"18Z0123456789"})", 5001, 1024, kTime, kTime) &&
               m_insertSession.Change(sqlite3_last_insert_rowid(m_pDb.get()), kToken);
    }
    bool Read() {
        Found credential;
        Found session;
        return m_findCredential.Find(credential, kApplication) &&
               m_findSession.Find(session, credential.number);
    }
    bool Delete() {
        Found found;
        return m_findId.Find(found, kApplication) && m_deleteSession.Change(found.number) &&
               m_deleteCredential.Change(found.number) &&
               !m_findId.Find(found, kNotificationCenter);
    }

  private:
    std::unique_ptr<sqlite3, Close> m_pDb = Open(kPeerStore);
    Statement m_insertCredential{m_pDb.get(),
                                 "INSERT INTO credential (application, host, protocol, extra_info,"
                                 " port, owner, create_time, modify_time)"
                                 " VALUES (?, ?, ?, ?, ?, ?, ?, ?)"};
    Statement m_insertSession{m_pDb.get(), "INSERT INTO session (id, access_token) VALUES (?, ?)"};
    Statement m_findCredential{m_pDb.get(),
                               "SELECT id, host, protocol, extra_info, port FROM credential"
                               " WHERE application = ? ORDER BY id LIMIT 1"};
    Statement m_findSession{m_pDb.get(),
                            "SELECT id, access_token, csrf_token FROM session WHERE id = ?"};
    Statement m_findId{m_pDb.get(),
                       "SELECT id FROM credential WHERE application = ? ORDER BY id LIMIT 1"};
    Statement m_deleteSession{m_pDb.get(), "DELETE FROM session WHERE id = ?"};
    Statement m_deleteCredential{m_pDb.get(), "DELETE FROM credential WHERE id = ?"};
};

// --- Rows ---------------------------------------------------------------------------------------

// Makes the store anew, with one record of the application among so many of others, and gives the
// peer a copy of the file: the same tables, the same records on the same pages.
std::shared_ptr<BareStore> SetUpStores(int records) {
    fs::remove(kStore);
    fs::remove(kPeerStore);
    Require(Create(), "cannot create the first credential");
    Execute(Open(kStore).get(),
            "WITH RECURSIVE more (id) AS (SELECT 1 UNION ALL SELECT id + 1 FROM more WHERE id < " +
                std::to_string(records) +
                ") INSERT OR IGNORE INTO credential SELECT more.id, 'other', host, protocol,"
                " extra_info, port, owner, create_time, modify_time FROM more, credential;"
                "INSERT OR IGNORE INTO session SELECT credential.id, access_token, csrf_token"
                " FROM credential, session;");
    fs::copy_file(kStore, kPeerStore);
    return std::make_shared<BareStore>();
}

Pair CreatePair(int records) {
    const auto pBare = SetUpStores(records);
    return {{Create, ZELOQRMClientDeleteServerCredential},
            {[pBare] { return pBare->Create(); }, [pBare] { return pBare->Delete(); }}};
}

Pair ReadPair(int records) {
    const auto pBare = SetUpStores(records);
    return {{Read, nullptr}, {[pBare] { return pBare->Read(); }, nullptr}};
}

Pair DeletePair(int records) {
    const auto pBare = SetUpStores(records);
    return {{ZELOQRMClientDeleteServerCredential, Create},
            {[pBare] { return pBare->Delete(); }, [pBare] { return pBare->Create(); }}};
}

void AddRows(const std::string &strFunction, double goal, Pair (*pfnSetUp)(int records)) {
    const std::string strOne = strFunction + ", 1 record";
    AddRow({strOne, "bare SQLite statements", goal, [pfnSetUp] { return pfnSetUp(1); }, ""});
    AddRow({strFunction + ", 1,000 records", "bare SQLite statements", goal,
            [pfnSetUp] { return pfnSetUp(1000); }, strOne});
}

}  // namespace

void AddCredentialRows() {
    AddRows("ZELOQRMClientCreateServerCredential", 1.5, CreatePair);
    AddRows("ZELOQRMClientGetServerCredentialWithToken", 3.0, ReadPair);
    AddRows("ZELOQRMClientDeleteServerCredential", 1.5, DeletePair);
}

}  // namespace bench
