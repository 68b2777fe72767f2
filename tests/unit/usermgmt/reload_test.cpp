// tests/unit/usermgmt/reload_test.cpp: dropping changes in memory.
#include "tests/unit/usermgmt/account_files.h"
#include "usermgmt/context.h"

class Reload : public AccountFiles {
  protected:
    void SetUp() override {
        AccountFiles::SetUp();
        write_typical();
    }

    // Changes both databases in memory.
    static void change(usermgmt_ctx *ctx) {
        user_database_add(&ctx->user_db, new_user({.name = "new", .password = "*", .uid = 1001}));
        group_database_add(&ctx->group_db, new_group({.name = "newgroup", .gid = 7}));
    }
    // Which of the two changes is still there: "user", "group".
    static lines changes(const usermgmt_ctx *ctx) {
        lines left;
        if (usermgmt_user_exists(ctx, "new"))
            left.emplace_back("user");
        if (usermgmt_group_exists(ctx, "newgroup"))
            left.emplace_back("group");
        return left;
    }
    // Changes the files behind the context's back: a group, and a user in it.
    static void change_files() {
        write("passwd", read("passwd") + "late:*:1002:9:::\n");
        write("group", read("group") + "lategroup:x:9:\n");
    }
};

TEST_F(Reload, EmptyMaskDropsNothing) {
    for (const guint32 flags : {guint32{0}, guint32{USERMGMT_OPEN_NO_CACHE}}) {
        const open_context ctx = opened(flags);
        change(ctx.get());
        usermgmt_reload(ctx.get(), 0);
        EXPECT_EQ(changes(ctx.get()), (lines{"user", "group"}));
        EXPECT_TRUE(ctx->user_db.dirty);
        EXPECT_TRUE(ctx->group_db.dirty);
    }
}

TEST_F(Reload, GroupMaskDropsGroupChangesOnly) {
    const open_context ctx = opened();
    change(ctx.get());
    usermgmt_reload(ctx.get(), CORE_FILE_GROUP);
    EXPECT_EQ(changes(ctx.get()), lines{"user"});
    EXPECT_TRUE(ctx->user_db.dirty);
    EXPECT_FALSE(ctx->group_db.dirty);
}

TEST_F(Reload, PasswdOrShadowMaskDropsUserChangesOnly) {
    const open_context ctx = opened();
    for (const guint32 mask : {CORE_FILE_PASSWD, CORE_FILE_SHADOW}) {
        change(ctx.get());
        usermgmt_reload(ctx.get(), mask);
        EXPECT_EQ(changes(ctx.get()), lines{"group"});
        EXPECT_FALSE(ctx->user_db.dirty);
        EXPECT_TRUE(ctx->group_db.dirty);
        usermgmt_reload(ctx.get(), CORE_FILE_GROUP);
    }
}

TEST_F(Reload, WholeMaskDropsEverything) {
    for (const guint32 flags : {guint32{0}, guint32{USERMGMT_OPEN_NO_CACHE}}) {
        const open_context ctx = opened(flags);
        change(ctx.get());
        usermgmt_reload(ctx.get(), CORE_FILE_PASSWD | CORE_FILE_SHADOW | CORE_FILE_GROUP);
        EXPECT_EQ(changes(ctx.get()), lines());
        EXPECT_FALSE(ctx->user_db.dirty);
        EXPECT_FALSE(ctx->group_db.dirty);
        EXPECT_TRUE(usermgmt_user_exists(ctx.get(), "alice"));
    }
}

// Deliberately not the state of the last write.
TEST_F(Reload, WithACacheTheStateAtOpenComesBack) {
    const open_context ctx = opened();
    change(ctx.get());
    error_slot error;
    ASSERT_TRUE(usermgmt_sync(ctx.get(), error.out())) << error.text();
    usermgmt_reload(ctx.get(), CORE_FILE_PASSWD | CORE_FILE_GROUP);
    EXPECT_EQ(changes(ctx.get()), lines());
    EXPECT_NE(read("passwd").find("new:"), std::string::npos);
    EXPECT_FALSE(ctx->user_db.dirty);
}

TEST_F(Reload, WithACacheTheFilesAreNotReadAgain) {
    const open_context ctx = opened();
    remove("passwd");
    remove("shadow");
    remove("group");
    usermgmt_reload(ctx.get(), CORE_FILE_PASSWD | CORE_FILE_SHADOW | CORE_FILE_GROUP);
    EXPECT_TRUE(usermgmt_user_exists(ctx.get(), "alice"));
    EXPECT_EQ(take_syslog(), lines());
}

TEST_F(Reload, WithoutCacheTheLiveFilesAreRead) {
    const open_context ctx = opened(USERMGMT_OPEN_NO_CACHE);
    change(ctx.get());
    ASSERT_TRUE(usermgmt_sync(ctx.get(), nullptr));
    change_files();
    usermgmt_reload(ctx.get(), CORE_FILE_PASSWD | CORE_FILE_GROUP);
    EXPECT_EQ(changes(ctx.get()), (lines{"user", "group"}));
    EXPECT_TRUE(usermgmt_user_exists(ctx.get(), "late"));
    EXPECT_TRUE(usermgmt_group_exists(ctx.get(), "lategroup"));
}

// A user of a group that is new in the file would otherwise be left out.
TEST_F(Reload, WithoutCacheGroupsAreReadBeforeUsers) {
    for (const guint32 mask : {CORE_FILE_PASSWD, CORE_FILE_SHADOW}) {
        write_typical();
        const open_context ctx = opened(USERMGMT_OPEN_NO_CACHE);
        change_files();
        usermgmt_reload(ctx.get(), mask);
        EXPECT_TRUE(usermgmt_user_exists(ctx.get(), "late"));
        EXPECT_TRUE(usermgmt_group_exists(ctx.get(), "lategroup"));
        EXPECT_EQ(take_syslog(), lines());
    }
}

TEST_F(Reload, WithoutCacheNothingStaysCached) {
    const open_context ctx = opened(USERMGMT_OPEN_NO_CACHE);
    for (const guint32 mask : {CORE_FILE_PASSWD, CORE_FILE_SHADOW, CORE_FILE_GROUP}) {
        usermgmt_reload(ctx.get(), mask);
        for (const core_file_data &cached : ctx->cached)
            EXPECT_EQ(cached.data, nullptr);
    }
}

TEST_F(Reload, FailedGroupsAreLoggedAndUsersStillRead) {
    const open_context ctx = opened(USERMGMT_OPEN_NO_CACHE | USERMGMT_OPEN_STRICT);
    change(ctx.get());
    write("group", read("group") + "video:x:45:\n");
    usermgmt_reload(ctx.get(), CORE_FILE_PASSWD | CORE_FILE_GROUP);
    EXPECT_EQ(take_syslog(),
              lines{"3 Could not re-read group data!! Could not init group database, "
                    "group data contains duplicate entry 'video'"});
    EXPECT_EQ(changes(ctx.get()), lines{"group"});
}

TEST_F(Reload, MissingGroupFileLeavesThePreviousDatabases) {
    const open_context ctx = opened(USERMGMT_OPEN_NO_CACHE);
    change(ctx.get());
    remove("group");
    usermgmt_reload(ctx.get(), CORE_FILE_GROUP);
    EXPECT_EQ(take_syslog(),
              (lines{"3 Unable to parse group file (etc/group)",
                     "3 Could not re-read group data!! Could not init group database, could not "
                     "open group file 'etc/group', No such file or directory"}));
    EXPECT_EQ(changes(ctx.get()), (lines{"user", "group"}));
    EXPECT_TRUE(ctx->group_db.dirty);
    EXPECT_NE(group_database_find_gid(&ctx->group_db, 44), nullptr);
}

TEST_F(Reload, MissingPasswdFileLeavesThePreviousUsers) {
    const open_context ctx = opened(USERMGMT_OPEN_NO_CACHE);
    change(ctx.get());
    remove("passwd");
    usermgmt_reload(ctx.get(), CORE_FILE_PASSWD);
    EXPECT_EQ(take_syslog(),
              (lines{"3 Unable to parse passwd file (etc/passwd)",
                     "3 Could not re-read user data!! Could not init user database, could not open "
                     "passwd file 'etc/passwd', No such file or directory"}));
    EXPECT_EQ(changes(ctx.get()), lines{"user"});
    EXPECT_TRUE(ctx->user_db.dirty);
}

TEST_F(Reload, StrictUsersThatFailLeaveThePreviousUsers) {
    const open_context ctx = opened(USERMGMT_OPEN_NO_CACHE | USERMGMT_OPEN_STRICT);
    change(ctx.get());
    write("passwd", read("passwd") + "big:*:60001:100:::\n");
    usermgmt_reload(ctx.get(), CORE_FILE_SHADOW);
    EXPECT_EQ(take_syslog(),
              (lines{"4 Failed to parse user 'big': user type for big could not be determined!",
                     "3 Could not re-read user data!! could not parse user big as user type for "
                     "big could not be determined!"}));
    EXPECT_EQ(changes(ctx.get()), lines{"user"});
    for (const core_file_data &cached : ctx->cached)
        EXPECT_EQ(cached.data, nullptr);
}

TEST_F(Reload, ReadingGroupsAgainReplacesTheCache) {
    const open_context ctx = opened();
    change_files();
    ASSERT_TRUE(group_database_init(ctx.get(), TRUE, nullptr));
    EXPECT_TRUE(usermgmt_group_exists(ctx.get(), "lategroup"));
    usermgmt_reload(ctx.get(), CORE_FILE_PASSWD);
    EXPECT_FALSE(usermgmt_user_exists(ctx.get(), "late"));
}
