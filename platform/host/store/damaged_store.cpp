#include "damaged_store.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <system_error>

#include "descriptor.h"
#include "files/file_state.h"
#include "fixed_text.h"
#include "system_log.h"

namespace host {
namespace {

namespace fs = std::filesystem;

// --- Finding damage -----------------------------------------------------------------------------
//
// SQLite alone cannot tell: a read that the disk fails is SQLITE_CORRUPT to it, as is a page that
// came back short. So a copy in memory decides, which was read whole or not at all.

using Copy = std::vector<unsigned char>;

void Require(int sqliteError) {
    if (sqliteError != SQLITE_OK) {
        throw SQLite::Exception(sqlite3_errstr(sqliteError), sqliteError);
    }
}

// Reads the whole file while nobody writes to it: closing the file ends the lock.
Copy ReadCopy(const Store &store) {
    const SQLite::Database db(store.szPath, SQLITE_OPEN_READONLY | SQLITE_OPEN_NOMUTEX);
    sqlite3_file *pFile = nullptr;
    Require(sqlite3_file_control(db.getHandle(), "main", SQLITE_FCNTL_FILE_POINTER, &pFile));
    Require(pFile->pMethods == nullptr ? SQLITE_CANTOPEN : SQLITE_OK);
    Require(pFile->pMethods->xLock(pFile, SQLITE_LOCK_SHARED));
    sqlite3_int64 cb = 0;
    Require(pFile->pMethods->xFileSize(pFile, &cb));
    Require(cb > INT_MAX ? SQLITE_TOOBIG : SQLITE_OK);
    Copy copy(static_cast<std::size_t>(cb));
    Require(cb == 0 ? SQLITE_OK
                    : pFile->pMethods->xRead(pFile, copy.data(), static_cast<int>(cb), 0));
    return copy;
}

void CheckCopy(Copy &copy, const Store &store) {
    // A database in memory has no write-ahead log: the marks of one in the header are wiped.
    constexpr std::size_t kWriteVersion = 18;
    constexpr std::size_t kReadVersion = 19;
    constexpr unsigned char kWithLog = 2;
    for (const std::size_t mark : {kWriteVersion, kReadVersion}) {
        if (mark < copy.size() && copy[mark] == kWithLog) {
            copy[mark] = 1;
        }
    }
    SQLite::Database db(":memory:", SQLITE_OPEN_READWRITE);
    sqlite3_db_config(db.getHandle(), SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
    const auto cb = static_cast<sqlite3_int64>(copy.size());
    Require(sqlite3_deserialize(db.getHandle(), "main", copy.data(), cb, cb,
                                SQLITE_DESERIALIZE_READONLY));
    if (HasFormat(db, store) && db.execAndGet("PRAGMA integrity_check(1)").getString() != "ok") {
        Require(SQLITE_CORRUPT);
    }
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

// Looks through the whole of a store's file, which has to be there. Nothing in it is no damage. The
// process must have no connection to the file: this closes the file, and with it go the locks of
// all connections of the process.
Status FindDamage(const Store &store, const Wait &wait) {
    Status status = CatchSqlite(store, wait, nullptr, [&store] {
        Copy copy = ReadCopy(store);
        if (!copy.empty()) {
            CheckCopy(copy, store);
        }
    });
    if (status.Code() == YLIBC_ERR_STORE_DAMAGED && HasChangesBeside(store.szPath)) {
        return StoreError(store, "changes to it stand in a file beside it");
    }
    return status;
}

// --- Setting aside ------------------------------------------------------------------------------

constexpr const char *kMark = ".damaged-";
constexpr std::array<const char *, 3> kCompanions = {"-journal", "-wal", "-shm"};

bool IsThere(const std::string &strPath) {
    struct stat status = {};
    return lstat(strPath.c_str(), &status) == 0;
}

std::string TimeText() {
    const std::time_t now = std::time(nullptr);
    std::tm utc = {};
    gmtime_r(&now, &utc);
    std::array<char, 32> text = {};
    std::strftime(text.data(), text.size(), "%Y%m%dT%H%M%SZ", &utc);
    return text.data();
}

bool Rename(const std::string &strFrom, const std::string &strTo) {
    return renameat2(AT_FDCWD, strFrom.c_str(), AT_FDCWD, strTo.c_str(), RENAME_NOREPLACE) == 0;
}

// The companions go first, so that no journal is ever at the path without its database. All or
// nothing, with errno; only where the database has gone meanwhile its companions do not come back.
bool MoveAll(const std::string &strPath, const std::string &strName) {
    constexpr std::array<const char *, 4> kAll = {"-journal", "-wal", "-shm", ""};
    std::vector<const char *> moved;
    for (const char *szSuffix : kAll) {
        // What has the name already belongs to another database, also where nothing would move.
        const bool blTaken = IsThere(strName + szSuffix);
        if (!blTaken && Rename(strPath + szSuffix, strName + szSuffix)) {
            moved.push_back(szSuffix);
            continue;
        }
        const int error = blTaken ? EEXIST : errno;
        if (error == ENOENT && *szSuffix != '\0') {
            continue;
        }
        for (const char *szMoved : moved) {
            static_cast<void>(!IsThere(strPath) || Rename(strName + szMoved, strPath + szMoved));
        }
        errno = error;
        return false;
    }
    return true;
}

// Whether the file is named by that of its database. What a broken-off move has left is not.
bool IsBesideItsDatabase(const std::string &strPath) {
    return std::any_of(kCompanions.begin(), kCompanions.end(), [&strPath](const char *szSuffix) {
        const std::size_t cb = std::strlen(szSuffix);
        return strPath.size() >= cb && strPath.compare(strPath.size() - cb, cb, szSuffix) == 0 &&
               IsThere(strPath.substr(0, strPath.size() - cb));
    });
}

Status SyncFolder(const Store &store) {
    const Descriptor folder(open(store.szFolder, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return folder.IsOpen() && fsync(folder.Get()) == 0 ? Status() : StoreSystemError(store);
}

// strPath tells where the file is now.
Status Move(const Store &store, std::string &strPath) {
    // Two damages within a second get different names.
    const std::string strFirst = strPath + kMark + TimeText();
    std::string strName = strFirst;
    for (int i = 2; !MoveAll(strPath, strName); ++i) {
        if (errno != EEXIST) {
            return StoreSystemError(store);
        }
        strName = strFirst + '.' + std::to_string(i);
    }
    strPath = strName;
    return SyncFolder(store);
}

// While the process has no connection.
Status MoveIfDamaged(const Store &store, const struct stat &judged, const Wait &wait,
                     std::string &strPath) {
    const Status found = FindDamage(store, wait);
    if (found.Code() != YLIBC_ERR_STORE_DAMAGED) {
        return found;
    }
    // A copy that was restored meanwhile is another file.
    struct stat now = {};
    if (lstat(store.szPath, &now) != 0 || !IsSameFile(now, judged)) {
        return {};
    }
    return Move(store, strPath);
}

Status SetAside(Database &database, std::string &strPath) {
    const Store &store = database.GetStore();
    struct stat judged = {};
    if (lstat(store.szPath, &judged) != 0) {
        return errno == ENOENT ? Status() : StoreSystemError(store);
    }
    // This waits for a writer, and plays back the journal of one that has died. Closing the
    // connection writes a log's changes into the file.
    Status status =
        database.UseExisting([](SQLite::Database &db) { db.execAndGet("PRAGMA schema_version"); });
    if (status.Failed() && status.Code() != YLIBC_ERR_STORE_DAMAGED) {
        return status;
    }
    return database.WithoutConnection(
        [&](const Wait &wait) { return MoveIfDamaged(store, judged, wait, strPath); });
}

}  // namespace

int SetAsideIfDamaged(Database &database, char *szPath, int cbPath) {
    int result = 0;
    return HOST_OPERATION(-1, result, [&]() -> Status {
        HOST_REQUIRE(szPath != nullptr && cbPath > 0);
        const Store &store = database.GetStore();
        std::string strPath = store.szPath;
        Status status = SetAside(database, strPath);
        CopyToFit(szPath, cbPath, strPath);
        if (!status.Failed() && strPath != store.szPath) {
            result = 1;
            system_log::Write(
                LOG_WARNING, ZELO_SOURCE_STEM, __LINE__,
                store.Named() + " was damaged or of another format: it is '" + strPath + "' now");
        }
        return status;
    });
}

Status ListSetAside(const Store &store, std::vector<std::string> &paths) {
    const std::string strBegin = fs::path(store.szPath).filename().string() + kMark;
    std::error_code error;
    for (fs::directory_iterator entry(store.szFolder, error);
         !error && entry != fs::directory_iterator(); entry.increment(error)) {
        const std::string strName = entry->path().filename().string();
        if (strName.compare(0, strBegin.size(), strBegin) == 0 &&
            !IsBesideItsDatabase(entry->path().string())) {
            paths.push_back(entry->path().string());
        }
    }
    std::sort(paths.begin(), paths.end());
    if (error && error != std::errc::no_such_file_or_directory) {
        return HOST_ERROR(YLIBC_ERR_FILE, std::string("cannot read the folder '") + store.szFolder +
                                              "': " + error.message());
    }
    return {};
}

}  // namespace host
