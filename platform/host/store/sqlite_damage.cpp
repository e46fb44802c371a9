#include "sqlite_damage.h"

#include <sqlite3.h>
#include <sys/stat.h>

#include <climits>
#include <cstring>
#include <string>
#include <vector>

namespace host::sqlite {
namespace {

using Copy = std::vector<unsigned char>;

// Takes from the first row that the pragma gives what read() makes of it.
template <typename Value, typename Read>
int ReadPragma(sqlite3 *pDb, const char *szPragma, Value &value, const Read &read) {
    sqlite3_stmt *pRaw = nullptr;
    int error = sqlite3_prepare_v2(pDb, szPragma, -1, &pRaw, nullptr);
    const StatementHandle pStatement(pRaw);
    if (error == SQLITE_OK) {
        error = sqlite3_step(pRaw);
    }
    if (error != SQLITE_ROW) {
        return error;
    }
    value = read(pRaw);
    return SQLITE_OK;
}

int ReadNumber(sqlite3 *pDb, const char *szPragma, int &number) {
    return ReadPragma(pDb, szPragma, number,
                      [](sqlite3_stmt *p) { return sqlite3_column_int(p, 0); });
}

// Reads the whole file while nobody writes to it.
int ReadCopy(sqlite3 *pDb, Copy &copy) {
    sqlite3_file *pFile = nullptr;
    int error = sqlite3_file_control(pDb, "main", SQLITE_FCNTL_FILE_POINTER, &pFile);
    if (error != SQLITE_OK || pFile->pMethods == nullptr) {
        return error != SQLITE_OK ? error : SQLITE_CANTOPEN;
    }
    error = pFile->pMethods->xLock(pFile, SQLITE_LOCK_SHARED);
    sqlite3_int64 cb = 0;
    if (error == SQLITE_OK) {
        error = pFile->pMethods->xFileSize(pFile, &cb);
    }
    if (error == SQLITE_OK && cb > INT_MAX) {
        error = SQLITE_TOOBIG;
    }
    if (error == SQLITE_OK && cb > 0) {
        copy.resize(static_cast<std::size_t>(cb));
        error = pFile->pMethods->xRead(pFile, copy.data(), static_cast<int>(cb), 0);
    }
    pFile->pMethods->xUnlock(pFile, SQLITE_LOCK_NONE);
    return error;
}

int CheckCopy(Copy &copy, const Store &store) {
    // A database in memory has no write-ahead log: the marks of one in the header are wiped.
    constexpr std::size_t kWriteVersion = 18;
    constexpr std::size_t kReadVersion = 19;
    constexpr unsigned char kWithLog = 2;
    for (const std::size_t mark : {kWriteVersion, kReadVersion}) {
        if (mark < copy.size() && copy[mark] == kWithLog) {
            copy[mark] = 1;
        }
    }
    sqlite3 *pRaw = nullptr;
    int error = sqlite3_open(":memory:", &pRaw);
    const DatabaseHandle pDb(pRaw);
    if (error == SQLITE_OK) {
        sqlite3_db_config(pRaw, SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
        const auto cb = static_cast<sqlite3_int64>(copy.size());
        error = sqlite3_deserialize(pRaw, "main", copy.data(), cb, cb, SQLITE_DESERIALIZE_READONLY);
    }
    if (error == SQLITE_OK) {
        error = CheckFormat(pRaw, store).error;
    }
    if (error != SQLITE_OK) {
        return error;
    }
    bool blWhole = false;
    error = ReadPragma(pRaw, "PRAGMA integrity_check(1)", blWhole, [](sqlite3_stmt *p) {
        const auto *pText = reinterpret_cast<const char *>(sqlite3_column_text(p, 0));
        return pText != nullptr && std::strcmp(pText, "ok") == 0;
    });
    return error != SQLITE_OK || blWhole ? error : SQLITE_CORRUPT;
}

// Whether there are changes beside the file that belong into it.
bool HasChangesBeside(const std::string &strPath) {
    for (const char *szSuffix : {"-journal", "-wal"}) {
        struct stat status = {};
        if (lstat((strPath + szSuffix).c_str(), &status) == 0 && status.st_size > 0) {
            return true;
        }
    }
    return false;
}

}  // namespace

void CloseDatabase::operator()(sqlite3 *pDb) const {
    sqlite3_close_v2(pDb);
}

void FinalizeStatement::operator()(sqlite3_stmt *pStatement) const {
    sqlite3_finalize(pStatement);
}

bool IsDamage(int sqliteError) {
    const int kind = sqliteError & 0xFF;
    return kind == SQLITE_NOTADB || kind == SQLITE_CORRUPT;
}

Finding CheckFormat(sqlite3 *pDb, const Store &store) {
    int pages = 0;
    int applicationId = 0;
    int format = 0;
    int error = ReadNumber(pDb, "PRAGMA page_count", pages);
    if (error == SQLITE_OK) {
        error = ReadNumber(pDb, "PRAGMA application_id", applicationId);
    }
    if (error == SQLITE_OK) {
        error = ReadNumber(pDb, "PRAGMA user_version", format);
    }
    if (error != SQLITE_OK) {
        return {error, sqlite3_errmsg(pDb)};
    }
    if (pages == 0) {
        return {SQLITE_EMPTY, ""};
    }
    const bool blOurs = applicationId == store.applicationId && format == store.format;
    return {blOurs ? SQLITE_OK : SQLITE_NOTADB, ""};
}

Finding FindDamage(const Store &store) {
    Copy copy;
    sqlite3 *pRaw = nullptr;
    int error =
        sqlite3_open_v2(store.szPath, &pRaw, SQLITE_OPEN_READONLY | SQLITE_OPEN_NOMUTEX, nullptr);
    const DatabaseHandle pDb(pRaw);
    if (error == SQLITE_OK) {
        error = ReadCopy(pRaw, copy);
    }
    if (error == SQLITE_OK && !copy.empty()) {
        error = CheckCopy(copy, store);
    }
    if (IsDamage(error) && HasChangesBeside(store.szPath)) {
        return {SQLITE_PROTOCOL, "changes to it stand in a file beside it"};
    }
    return {error == SQLITE_EMPTY ? SQLITE_OK : error, sqlite3_errstr(error)};
}

}  // namespace host::sqlite
