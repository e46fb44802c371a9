// What any web session store has to promise.

#include "web_session.h"

#include <gtest/gtest.h>

#include "last_error.h"

namespace {

constexpr const char *kClient = "ZELO.QRM.Client";

TEST(WebSession, IsThereFromItsAddingToItsRemoval) {
    ZELO_CGI_CONTEXT context = {};
    EXPECT_EQ(ZeloCgiAddSessionByIndex(&context, 13, kClient), 0) << "the context is not ready";
    YLIBCErrSetEx(YLIBC_ERR_NONE, "", 0);
    EXPECT_NE(ZeloCgiInit("", &context), 0);
    EXPECT_NE(ZeloCgiRemoveSessionByIndex(&context, 13, kClient), 0) << "counts as removed";
    EXPECT_EQ(ZeloCgiSessionExistByIndex(&context, 13, kClient), 0);
    for (int i = 0; i < 2; ++i) {
        EXPECT_NE(ZeloCgiAddSessionByIndex(&context, 13, kClient), 0) << "also one that is there";
    }
    EXPECT_NE(ZeloCgiSessionExistByIndex(&context, 13, kClient), 0);
    EXPECT_EQ(ZeloCgiSessionExistByIndex(&context, 14, kClient), 0);
    EXPECT_EQ(ZeloCgiSessionExistByIndex(&context, 13, "zelo.qrm.client"), 0);
    EXPECT_NE(ZeloCgiRemoveSessionByIndex(&context, 13, kClient), 0);
    EXPECT_EQ(ZeloCgiSessionExistByIndex(&context, 13, kClient), 0);
    EXPECT_EQ(YLIBCErrGet(), static_cast<unsigned>(YLIBC_ERR_NONE)) << "nothing has failed";
    ZeloCgiFree(&context);
}

}  // namespace
