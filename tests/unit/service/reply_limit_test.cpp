// tests/unit/service/reply_limit_test.cpp: replies of a build for a bus that carries 1 MiB.
#include <gtest/gtest.h>

#include "service/reply.h"

TEST(ReplyLimit, IsThatOfTheBuild) {
    g_autoptr(GError) error = nullptr;

    EXPECT_TRUE(check_reply_size(1048576 - 65536, nullptr));
    EXPECT_FALSE(check_reply_size(1048576 - 65535, &error));
    ASSERT_NE(error, nullptr);
    EXPECT_STREQ(error->message, "The reply of 983041 bytes is larger than a bus message may be");
}
