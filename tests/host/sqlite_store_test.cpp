// How the host platform keeps its stores: one SQLite file each, in a folder of its own.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sqlite3.h>
#include <unistd.h>

#include <cerrno>

#include "children.h"
#include "diagnosis.h"
#include "failures.h"
#include "files.h"
#include "stored.h"
#include "web_session.h"

namespace {

using namespace files;

// What belongs to another user: a box has none.
const char *g_szOfOther = nullptr;

int OwnStatus(const char *szPath, struct stat *pStatus, int flags) {
    const int result = fstatat(AT_FDCWD, szPath, pStatus, flags);
    if (g_szOfOther != nullptr && std::string(szPath) == g_szOfOther) {
        pStatus->st_uid = 1000;
    }
    return result;
}

void RemoveStore() {
    fs::remove_all(stored::kFolder);
}

TEST(SqliteStore, LooksAndRemovalsCreateNothing) {
    RemoveStore();
    EXPECT_EQ(stored::Describe(), "");
    EXPECT_EQ(ZELOCredRemoveByID(5), 0);
    EXPECT_EQ(ZELOCredSessRemoveByID(5), 0);
    EXPECT_FALSE(fs::exists(stored::kFolder));
    YLIBSZLIST *pslPaths = YLIBCSzListAlloc(0);
    EXPECT_EQ(ZELOCredStoreListSetAside(&pslPaths), 0);
    WriteFile(stored::kFolder, "a file in the folder's place");
    EXPECT_LT(ZELOCredStoreListSetAside(&pslPaths), 0);
    YLIBCSzListFree(pslPaths);

    RemoveStore();
    stored::AddCredential("ZELO.QRM", "a");
    EXPECT_EQ(FileMode(stored::kFolder), 0700U);
    EXPECT_EQ(FileMode(stored::kDatabase), 0600U);
}

// As a copy that was put back may stand there.
TEST(SqliteStore, OthersHaveNoRightsOverWhatIsUsed) {
    RemoveStore();
    stored::AddCredential("ZELO.QRM", "a");
    for (const char *szPath : {stored::kFolder, stored::kDatabase}) {
        const unsigned mode = FileMode(szPath);
        chmod(szPath, mode | 077U);
        EXPECT_EQ(stored::Describe(), "https://a:443 ?") << "a look will do";
        EXPECT_EQ(FileMode(szPath), mode) << szPath;
        g_szOfOther = szPath;
        EXPECT_LT(stored::AddCredential("ZELO.QRM", "b"), 0) << szPath;
        chmod(szPath, mode);  // another status, so that nothing is answered from memory
        EXPECT_EQ(FailureOf(ZELOCredIDGetByApplication("ZELO.QRM")), YLIBC_ERR_UNSAFE_FILE)
            << szPath;
        g_szOfOther = nullptr;
    }
    EXPECT_EQ(stored::Describe(), "https://a:443 ?");
}

TEST(SqliteStore, IsClosedBeforeAFork) {
    RemoveStore();
    stored::AddCredential("ZELO.QRM", "a");
    EXPECT_TRUE(HasOpen("self", stored::kDatabase));
    EXPECT_TRUE(children::InOne([] { return !HasOpen("self", stored::kDatabase); }));
}

TEST(SqliteStore, FollowsTheFileThatStandsAtItsPlace) {
    RemoveStore();
    stored::AddCredential("ZELO.QRM", "old");
    fs::copy_file(stored::kDatabase, "/usr/zelo/etc/backup.db",
                  fs::copy_options::overwrite_existing);
    stored::Clear();
    EXPECT_EQ(stored::Describe(), "");
    fs::rename("/usr/zelo/etc/backup.db", stored::kDatabase);
    EXPECT_EQ(stored::Describe(), "https://old:443 ?");
    EXPECT_TRUE(children::InOne([] { return stored::Describe() == "https://old:443 ?"; }));
}

// With a write-ahead log, a change does not show in the store's file.
TEST(SqliteStore, FollowsOtherProcessesAlsoInAFileWithALog) {
    RemoveStore();
    const long id = stored::AddCredential("ZELO.QRM", "a");
    stored::AddSession(id, "old");
    ASSERT_TRUE(children::InOne([] {
        sqlite3 *pDb = nullptr;
        return sqlite3_open(stored::kDatabase, &pDb) == SQLITE_OK &&
               sqlite3_exec(pDb, "PRAGMA journal_mode = WAL", nullptr, nullptr, nullptr) ==
                   SQLITE_OK &&
               sqlite3_close(pDb) == SQLITE_OK;
    }));
    const children::Signal known;
    const children::Signal changed;
    const children::Signal done;
    const pid_t writer = children::Start([&] {
        known.Await();
        stored::AddSession(id, "new");
        return changed.Give() && done.Await();
    });
    EXPECT_EQ(stored::Describe(), "https://a:443 ? token=old csrf=?");
    EXPECT_TRUE(known.Give());
    EXPECT_TRUE(changed.Await());
    EXPECT_EQ(stored::Describe(), "https://a:443 ? token=new csrf=?");
    EXPECT_TRUE(done.Give());
    EXPECT_TRUE(children::Ended(writer));
}

TEST(SqliteStore, DamagedOrForeignFilesAreLeftAsTheyAre) {
    RemoveStore();
    stored::AddCredential("ZELO.QRM", "a");
    const std::string strGood = FileText(stored::kDatabase);
    std::string strBroken = strGood;
    strBroken.replace(0, 100, 100, 'x');
    std::string strForeign = strGood;
    strForeign.replace(68, 4, "none");  // the place of the application id in the file's header
    std::string strNewer = strGood;
    strNewer[63] = 9;  // the format
    for (const std::string &strContent :
         {std::string("not a database at all, but text"), strBroken, strForeign, strNewer}) {
        RemoveStore();
        fs::create_directory(stored::kFolder);
        WriteFile(stored::kDatabase, strContent);
        EXPECT_EQ(stored::AddCredential("ZELO.QRM", "b"), -1);
        EXPECT_EQ(FailureOf(stored::Count()), YLIBC_ERR_STORE_DAMAGED);
        EXPECT_LT(ZELOCredRemoveByID(1), 0);
        EXPECT_EQ(FileText(stored::kDatabase), strContent);
    }
    // A process that dies while it creates the file leaves an empty one: that is no damage. What
    // comes into that file afterwards is looked at again.
    for (const std::string &strContent : {std::string(), strForeign}) {
        RemoveStore();
        fs::create_directory(stored::kFolder);
        std::ofstream file(stored::kDatabase, std::ios::binary);
        EXPECT_EQ(stored::Describe(), "");
        file << strContent << std::flush;
        EXPECT_EQ(stored::AddCredential("ZELO.QRM", "a") >= 0, strContent.empty());
        EXPECT_EQ(FileText(stored::kDatabase) == strForeign, !strContent.empty());
    }
}

TEST(SqliteStore, ADamagedFileOfSessionsIsLeftAsItIs) {
    constexpr const char *kDatabase = "/usr/zelo/etc/sessions/sessions.db";
    ZELO_CGI_CONTEXT context = {};
    EXPECT_NE(ZeloCgiInit("", &context), 0);
    EXPECT_NE(ZeloCgiAddSessionByIndex(&context, 13, "name"), 0);
    EXPECT_EQ(FileMode(kDatabase), 0600U);
    Replace(kDatabase, "no database, but text");
    EXPECT_EQ(ZeloCgiSessionExistByIndex(&context, 13, "name"), 0);
    EXPECT_EQ(ZeloCgiAddSessionByIndex(&context, 13, "name"), 0);
    EXPECT_EQ(ZeloCgiRemoveSessionByIndex(&context, 13, "name"), 0);
    EXPECT_EQ(ZeloCgiInit("", &context), 0);
    EXPECT_EQ(FileText(kDatabase), "no database, but text");
    ZeloCgiFree(&context);
}

// How SQLite reads a file, with one read that fails: it counts down to that one.
int g_reads = 0;
ssize_t g_failed = 0;
ssize_t Read(int fd, void *pBuffer, std::size_t cb, off_t offset) {
    errno = EIO;
    return --g_reads == 0 ? g_failed : pread(fd, pBuffer, cb, offset);
}

// SQLite takes a failed read for damage, and what a short one leaves out for zeros.
TEST(SqliteStore, AReadThatFailsIsNoDamage) {
    RemoveStore();
    stored::AddCredential("ZELO.QRM", "a");
    const std::string strContent = FileText(stored::kDatabase);
    sqlite3_vfs *const pVfs = sqlite3_vfs_find(nullptr);
    pVfs->xSetSystemCall(pVfs, "pread64", reinterpret_cast<sqlite3_syscall_ptr>(&Read));
    for (const ssize_t failed : {-1, 0}) {
        g_failed = failed;
        for (int nth = 1, left = 0; left <= 0; ++nth) {
            char szPath[256] = {};
            g_reads = nth;
            EXPECT_NE(ZELOCredStoreSetAside(szPath, sizeof(szPath)), 1) << nth << " " << szPath;
            left = g_reads;
            ASSERT_TRUE(FileText(stored::kDatabase) == strContent);
            g_reads = failed != 0 ? nth : 0;
            if (ZELOCredIDGetByApplication("ZELO.QRM") < 0) {
                EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_STORE)) << nth;
            }
        }
    }
    pVfs->xSetSystemCall(pVfs, "pread64", nullptr);
    EXPECT_EQ(stored::Describe(), "https://a:443 ?");
}

int g_writes = 0;
ssize_t Write(int fd, const void *pBuffer, std::size_t cb, off_t offset) {
    errno = EIO;
    return --g_writes <= 0 ? -1 : pwrite(fd, pBuffer, cb, offset);
}

// The disk fails at one write after the other, and from there on: nothing can be undone then.
TEST(SqliteStore, ARecordAndItsSessionGoTogether) {
    RemoveStore();
    sqlite3_vfs *const pVfs = sqlite3_vfs_find(nullptr);
    bool blRemoved = false;
    for (int nth = 1; !blRemoved; ++nth) {
        stored::Clear();
        const long id = stored::AddCredential("ZELO.QRM", "a");
        stored::AddSession(id, "t");
        g_writes = nth;
        pVfs->xSetSystemCall(pVfs, "pwrite64", reinterpret_cast<sqlite3_syscall_ptr>(&Write));
        blRemoved = ZELOCredRemoveByID(id) == 0;
        pVfs->xSetSystemCall(pVfs, "pwrite64", nullptr);
        EXPECT_EQ(stored::Describe(), blRemoved ? "" : "https://a:443 ? token=t csrf=?") << nth;
        const stored::Session pSess(ZELOCredSessAlloc(), ZELOCredSessFree);
        EXPECT_EQ(ZELOCredSessLoad(id, pSess.get()) == 0, !blRemoved) << nth;
    }
}

TEST(SqliteStore, RemovedTokensAreGoneFromTheFile) {
    RemoveStore();
    const long id = stored::AddCredential("ZELO.QRM", "a");
    stored::AddSession(id, "top-secret-token");
    EXPECT_NE(FileText(stored::kDatabase).find("top-secret-token"), std::string::npos);
    EXPECT_EQ(ZELOCredSessRemoveByID(id), 0);
    EXPECT_EQ(FileText(stored::kDatabase).find("top-secret-token"), std::string::npos);
}

}  // namespace

// The host platform's looks at files come here.
extern "C" int stat(const char *szPath, struct stat *pStatus) {
    return OwnStatus(szPath, pStatus, 0);
}
extern "C" int lstat(const char *szPath, struct stat *pStatus) {
    return OwnStatus(szPath, pStatus, AT_SYMLINK_NOFOLLOW);
}
