// What any web session store has to promise, and what the host's adds.

#include <gtest/gtest.h>

#include "files.h"
#include "last_error.h"
#include "web_session.h"

namespace {

using namespace files;

constexpr const char *kFolder = "/usr/zelo/etc/sessions";
constexpr const char *kDatabase = "/usr/zelo/etc/sessions/sessions.db";
constexpr const char *kClient = "ZELO.QRM.Client";

class WebSession : public testing::Test {
  protected:
    void SetUp() override {
        fs::remove_all(kFolder);
        YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
        EXPECT_NE(ZeloCgiInit("", &context), 0);
    }
    void TearDown() override { ZeloCgiFree(&context); }

    bool Exists(int index, const char *szName) {
        return ZeloCgiSessionExistByIndex(&context, index, szName) != 0;
    }
    bool Add(int index, const char *szName) {
        return ZeloCgiAddSessionByIndex(&context, index, szName) != 0;
    }
    bool Remove(int index, const char *szName) {
        return ZeloCgiRemoveSessionByIndex(&context, index, szName) != 0;
    }

    ZELO_CGI_CONTEXT context = {};
};

TEST_F(WebSession, LookingAndRemovingCreateNothing) {
    EXPECT_FALSE(Exists(13, kClient));
    EXPECT_TRUE(Remove(13, kClient)) << "one that is not there counts as removed";
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NONE)) << "nothing has failed";
    EXPECT_FALSE(fs::exists(kFolder));

    EXPECT_TRUE(Add(13, kClient));
    EXPECT_EQ(fs::status(kFolder).permissions(), fs::perms::owner_all);
    fs::permissions(kDatabase, fs::perms::all);
    EXPECT_TRUE(Exists(13, kClient));
    EXPECT_EQ(fs::status(kDatabase).permissions(), fs::perms::owner_read | fs::perms::owner_write);
}

TEST_F(WebSession, ADamagedFileIsLeftAsItIs) {
    const std::string strContent = "no database, but text";
    fs::create_directory(kFolder);
    WriteFile(kDatabase, strContent);
    ZELO_CGI_CONTEXT other = {};
    EXPECT_EQ(ZeloCgiInit("", &other), 0);
    EXPECT_FALSE(Exists(13, kClient) || Add(13, kClient) || Remove(13, kClient));
    EXPECT_EQ(FileText(kDatabase), strContent);
}

}  // namespace
