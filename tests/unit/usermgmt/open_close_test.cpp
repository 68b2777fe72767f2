// tests/unit/usermgmt/open_close_test.cpp: one context at a time, from open to close.
#include <atomic>
#include <cerrno>
#include <thread>

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/io_trace.h"
#include "tests/unit/usermgmt/secret_watch.h"
#include "usermgmt/context.h"

class OpenClose : public AccountFiles {
  protected:
    void SetUp() override {
        AccountFiles::SetUp();
        write_typical();
    }
    static bool is_locked() {
        error_slot error;
        const open_context second(usermgmt_open(USERMGMT_OPEN_TRYLOCK, error.out()));
        return error.text() == "usermgmt 1: User database already open";
    }
};

TEST_F(OpenClose, OpenedContextIsInitialised) {
    const open_context ctx = opened(USERMGMT_OPEN_STRICT);
    ASSERT_NE(ctx, nullptr);
    EXPECT_TRUE(ctx->initialised);
    EXPECT_TRUE(ctx->has_shadow);
    EXPECT_EQ(ctx->open_flags, guint32{USERMGMT_OPEN_STRICT} | USERMGMT_OPEN_TRYLOCK);
}

// Taken for missing, it would cost every user whose password it holds.
TEST_F(OpenClose, ShadowFileThatCannotBeLookedAtIsNoMissingOne) {
    for (const int error : {EIO, EACCES, EINTR, ENOTDIR}) {
        SCOPED_TRACE(error);
        io_trace trace;
        trace.fail("stat", "etc/shadow", 1, error);
        const open_context ctx = opened();
        ASSERT_NE(ctx, nullptr);
        EXPECT_TRUE(trace.has_struck());
        EXPECT_TRUE(ctx->has_shadow);
        EXPECT_TRUE(usermgmt_user_exists(ctx.get(), "root"));
    }
    remove("shadow");
    EXPECT_FALSE(open_context(usermgmt_open(USERMGMT_OPEN_TRYLOCK, nullptr))->has_shadow);
    (void)take_syslog();  // whose password it held
}

TEST_F(OpenClose, TryingWhileOpenFails) {
    const open_context ctx = opened();
    EXPECT_EQ(error_of_open(), "usermgmt 1: User database already open");
    EXPECT_EQ(usermgmt_open(USERMGMT_OPEN_TRYLOCK, nullptr), nullptr);
}

TEST_F(OpenClose, ClosingLetsTheNextOneIn) {
    usermgmt_ctx *ctx = opened().release();
    EXPECT_TRUE(is_locked());
    EXPECT_TRUE(usermgmt_close(ctx));
    EXPECT_FALSE(is_locked());
    EXPECT_NE(opened(), nullptr);
}

TEST_F(OpenClose, PlainOpenWaitsForTheClose) {
    open_context first = opened();
    std::atomic<bool> entered = false;
    std::thread waiter([&entered] {
        const open_context second(usermgmt_open(0, nullptr));
        EXPECT_NE(second, nullptr);
        entered = true;
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    EXPECT_FALSE(entered);
    first.reset();
    waiter.join();
    EXPECT_TRUE(entered);
}

TEST_F(OpenClose, ClosingNothingFailsAndLeavesTheLockFree) {
    EXPECT_FALSE(usermgmt_close(nullptr));
    usermgmt_ctx never_opened = {};
    EXPECT_FALSE(usermgmt_close(&never_opened));
    EXPECT_FALSE(is_locked());
}

TEST_F(OpenClose, ClosingNothingLeavesTheLockHeld) {
    const open_context ctx = opened();
    EXPECT_FALSE(usermgmt_close(nullptr));
    usermgmt_ctx never_opened = {};
    EXPECT_FALSE(usermgmt_close(&never_opened));
    EXPECT_TRUE(is_locked());
    EXPECT_EQ(ctx->user_db.entries->len, 4U);
}

TEST_F(OpenClose, FailedOpenLeavesTheLockFree) {
    for (const char *missing : {"group", "passwd"}) {
        write_typical();
        remove(missing);
        EXPECT_NE(error_of_open(), "");
        (void)take_syslog();
        write_typical();
        EXPECT_FALSE(is_locked());
    }
}

TEST_F(OpenClose, FailedOpenNeedsNoErrorSlot) {
    remove("group");
    EXPECT_EQ(usermgmt_open(0, nullptr), nullptr);
    EXPECT_EQ(take_syslog(), lines{"3 Unable to parse group file (etc/group)"});
}

TEST_F(OpenClose, OpenKeepsTheParsedFiles) {
    const open_context ctx = opened();
    for (const core_file_data &cached : ctx->cached)
        EXPECT_NE(cached.data, nullptr);
}

TEST_F(OpenClose, WithoutCacheTheParsedFilesAreDropped) {
    const open_context ctx = opened(USERMGMT_OPEN_NO_CACHE);
    for (const core_file_data &cached : ctx->cached)
        EXPECT_EQ(cached.data, nullptr);
    EXPECT_TRUE(usermgmt_user_exists(ctx.get(), "alice"));
}

TEST_F(OpenClose, ClosingWipesTheHashes) {
    usermgmt_ctx *ctx = opened().release();
    secret_watch watch;
    for (const internal_user *user : records<const internal_user>(ctx->user_db.entries))
        watch.add(user->password);
    EXPECT_TRUE(usermgmt_close(ctx));
    EXPECT_EQ(watch.wiped(), 4);
    EXPECT_EQ(watch.readable(), lines());
}

class CoreFileCache : public OpenClose {
  protected:
    // One digit for each slot, in the order of the rows: whether it holds something.
    std::string filled() const {
        std::string digits;
        for (const core_file_data &cached : ctx_.cached)
            digits += cached.data != nullptr ? '1' : '0';
        return digits;
    }
    void TearDown() override {
        ctx_.has_shadow = TRUE;
        core_file_free_data(&ctx_, CORE_FILE_ALL);
        OpenClose::TearDown();
    }

    usermgmt_ctx ctx_ = {};
    error_slot error_;
};

struct mask_case {
    guint32 mask;
    const char *filled;
    const char *filled_without_shadow;
};

TEST_F(CoreFileCache, MaskSelectsTheSlots) {
    static constexpr mask_case cases[] = {
        {0,     "000", "000"},
        {2,     "100", "100"},
        {4,     "001", "001"},
        {8,     "010", "000"},
        {2 | 4, "101", "101"},
        {2 | 8, "110", "100"},
        {14,    "111", "101"},
        {1,     "000", "000"},
        {240,   "000", "000"},
    };
    for (const bool has_shadow : {true, false}) {
        ctx_.has_shadow = has_shadow;
        for (const mask_case &row : cases) {
            const char *expected = has_shadow ? row.filled : row.filled_without_shadow;
            EXPECT_TRUE(core_file_parse(&ctx_, row.mask, error_.out())) << error_.text();
            EXPECT_EQ(filled(), expected) << row.mask;
            core_file_free_data(&ctx_, row.mask);
            EXPECT_EQ(filled(), "000") << row.mask;
        }
    }
}

TEST_F(CoreFileCache, FreeLeavesTheOtherSlots) {
    ctx_.has_shadow = TRUE;
    ASSERT_TRUE(core_file_parse(&ctx_, 14, error_.out()));
    core_file_free_data(&ctx_, CORE_FILE_GROUP);
    EXPECT_EQ(filled(), "110");
    ctx_.has_shadow = FALSE;
    core_file_free_data(&ctx_, CORE_FILE_PASSWD | CORE_FILE_SHADOW);
    EXPECT_EQ(filled(), "010");
}

TEST_F(CoreFileCache, FailureReleasesTheWholeMaskAndIsLogged) {
    ctx_.has_shadow = TRUE;
    remove("group");
    EXPECT_FALSE(core_file_parse(&ctx_, 14, error_.out()));
    EXPECT_EQ(error_.text(),
              "corefile 100: could not open group file 'etc/group', No such file or directory");
    EXPECT_EQ(filled(), "000");
    EXPECT_EQ(take_syslog(), lines{"3 Unable to parse group file (etc/group)"});
}

TEST_F(CoreFileCache, FirstFailureStopsTheReading) {
    ctx_.has_shadow = TRUE;
    remove("passwd");
    remove("shadow");
    EXPECT_FALSE(core_file_parse(&ctx_, 14, error_.out()));
    EXPECT_EQ(take_syslog(), lines{"3 Unable to parse passwd file (etc/passwd)"});
}

TEST_F(CoreFileCache, FailureLeavesSlotsOutsideOfTheMask) {
    ctx_.has_shadow = TRUE;
    ASSERT_TRUE(core_file_parse(&ctx_, CORE_FILE_PASSWD, error_.out()));
    remove("group");
    EXPECT_FALSE(core_file_parse(&ctx_, CORE_FILE_GROUP, error_.out()));
    EXPECT_EQ(filled(), "100");
    EXPECT_EQ(take_syslog(), lines{"3 Unable to parse group file (etc/group)"});
}
