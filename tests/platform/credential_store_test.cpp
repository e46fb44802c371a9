// What any credential store has to promise.

#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <thread>

#include "children.h"
#include "failures.h"
#include "stored.h"

namespace {

bool HasSession(long id) {
    const stored::Session pSess(ZELOCredSessAlloc(), ZELOCredSessFree);
    return ZELOCredSessLoad(id, pSess.get()) == 0;
}

TEST(CredentialStore, WhatIsNotThereIsNoFailureOfARemoval) {
    YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
    EXPECT_EQ(stored::Count(), 0);
    EXPECT_EQ(ZELOCredRemoveByID(5), 0);
    EXPECT_EQ(ZELOCredSessRemoveByID(5), 0);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NONE)) << "nothing has failed";
    EXPECT_EQ(FailureOf(ZELOCredIDGetByApplication("ZELO.QRM")), YLIBC_ERR_NOT_FOUND);
}

TEST(CredentialStore, NoSessionOutlivesItsRecord) {
    const long id = stored::AddCredential("ZELO.QRM", "a");
    stored::AddSession(id, "t");
    EXPECT_EQ(ZELOCredRemoveByID(id), 0);
    EXPECT_FALSE(HasSession(id));
    stored::AddSession(id, "stray");
    EXPECT_EQ(ZELOCredRemoveByID(id), 0) << "the record is not there any more";
    EXPECT_FALSE(HasSession(id));
}

TEST(CredentialStore, ANewIdIsHigherThanEveryIdBefore) {
    long last = -1;
    for (int i = 0; i < 5; ++i) {
        const long id = stored::AddCredential("ZELO.QRM", "a");
        EXPECT_GT(id, last);
        EXPECT_EQ(ZELOCredRemoveByID(id), 0);
        last = id;
    }
}

TEST(CredentialStore, ARecordThatWasRemovedDoesNotComeBack) {
    const long id = stored::AddCredential("ZELO.QRM", "host");
    ZELO_CRED *pCred = ZELOCredAlloc();
    char sz[8];
    EXPECT_EQ(ZELOCredLoad(id, pCred), 0);
    EXPECT_EQ(FailureOf(ZELOCredLoad(id + 1, pCred)), YLIBC_ERR_NOT_FOUND);
    EXPECT_EQ(ZELOCredItemGetHost(sz, 3, pCred), 0) << "what was loaded before is still there";
    EXPECT_STREQ(sz, "ho");
    EXPECT_EQ(ZELOCredRemoveByID(id), 0);
    EXPECT_LT(ZELOCredSave(pCred), 0);
    EXPECT_EQ(ZELOCredLoad(-1, pCred), 0);
    EXPECT_NE(ZELOCredItemGetHost(sz, sizeof(sz), pCred), 0);
    ZELOCredFree(pCred);
}

TEST(CredentialStore, ProcessesWriteAtOnceAndLoseNothing) {
    stored::Clear();
    stored::AddCredential("Parent", "open before the fork");
    constexpr int kProcesses = 6;
    constexpr int kRecords = 15;
    EXPECT_TRUE(children::InEach(kProcesses, [](int /*process*/) {
        bool blAll = true;
        for (int n = 0; n < kRecords; ++n) {
            const long id = stored::AddCredential("ZELO.QRM", "child");
            stored::AddSession(id, "t");
            blAll = blAll && id >= 0;
        }
        return blAll;
    }));
    EXPECT_EQ(stored::Count(), kProcesses * kRecords);
    EXPECT_GE(stored::AddCredential("Parent", "still works"), 0);
}

TEST(CredentialStore, WorksInAChildWhateverOtherThreadsWereDoing) {
    stored::Clear();
    stored::AddCredential("ZELO.QRM", "a");
    std::atomic<bool> blGoOn{true};
    std::thread reader([&blGoOn] {
        while (blGoOn) {
            stored::Describe();
        }
    });
    constexpr int kChildren = 200;
    int whole = 0;
    for (int i = 0; i < kChildren; ++i) {
        constexpr unsigned kMost_s = 20;
        whole += children::InOne([] { return alarm(kMost_s), stored::Count() == 1; }) ? 1 : 0;
    }
    blGoOn = false;
    reader.join();
    EXPECT_EQ(whole, kChildren);
}

}  // namespace
