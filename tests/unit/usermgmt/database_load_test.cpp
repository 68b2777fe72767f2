// tests/unit/usermgmt/database_load_test.cpp: which lines become records, and what is said of
// others.
#include <algorithm>

#include <glib/gstdio.h>

#include "tests/unit/usermgmt/account_files.h"
#include "usermgmt/context.h"

static constexpr const char *OPEN_FAILURE = "Could not initialise user management: ";

class DatabaseLoad : public AccountFiles {
  protected:
    void SetUp() override {
        AccountFiles::SetUp();
        write_typical();
    }

    static open_context open_logging(guint32 flags = 0) {
        error_slot error;
        open_context ctx(usermgmt_open(flags | USERMGMT_OPEN_TRYLOCK, error.out()));
        EXPECT_EQ(error.text(), "");
        return ctx;
    }

    static lines user_names(const usermgmt_ctx *ctx) {
        char **names = nullptr;
        EXPECT_TRUE(usermgmt_get_all_users(ctx, &names, nullptr, nullptr));
        return take_strings(names);
    }
    static lines group_names(const usermgmt_ctx *ctx) {
        char **names = nullptr;
        EXPECT_TRUE(usermgmt_get_all_groups(ctx, &names, nullptr));
        return take_strings(names);
    }
    static const internal_user *user(const open_context &ctx, const char *name) {
        return user_database_find(&ctx->user_db, name);
    }
    static const internal_group *group(const open_context &ctx, const char *name) {
        return group_database_find(&ctx->group_db, name);
    }
};

TEST_F(DatabaseLoad, RecordsComeInFileOrderAndClean) {
    const open_context ctx = opened(USERMGMT_OPEN_STRICT);
    EXPECT_EQ(user_names(ctx.get()), (lines{"root", "daemon", "alice", "nobody"}));
    EXPECT_EQ(group_names(ctx.get()), (lines{"root", "daemon", "video", "users", "nogroup"}));
    EXPECT_FALSE(ctx->user_db.dirty);
    EXPECT_FALSE(ctx->group_db.dirty);
}

TEST_F(DatabaseLoad, ShadowedUserHasEveryField) {
    const open_context ctx = opened();
    const internal_user *alice = user(ctx, "alice");
    ASSERT_NE(alice, nullptr);
    EXPECT_EQ(alice->type, 4U);
    EXPECT_TRUE(alice->shadowed);
    EXPECT_STREQ(alice->name, "alice");
    EXPECT_STREQ(alice->password, "$5$salt$aliceshash");
    EXPECT_STREQ(alice->gecos, "Alice");
    EXPECT_STREQ(alice->home, "/home/alice");
    EXPECT_STREQ(alice->shell, "/bin/false");
    EXPECT_EQ(alice->uid, 1000U);
    EXPECT_EQ(alice->gid, 100U);
    EXPECT_EQ(alice->last_change, gint64{19002} * 86400);
}

TEST_F(DatabaseLoad, PasswordOfThePasswdFileStaysThere) {
    const open_context ctx = opened();
    const internal_user *nobody = user(ctx, "nobody");
    ASSERT_NE(nobody, nullptr);
    EXPECT_EQ(nobody->type, 5U);
    EXPECT_FALSE(nobody->shadowed);
    EXPECT_STREQ(nobody->password, "*");
    EXPECT_EQ(nobody->last_change, 0);
}

// A shadow line counts only for a user whose passwd line says "x".
TEST_F(DatabaseLoad, ShadowLineOfAPlainHashIsLeftOut) {
    write("passwd", "alice:$5$s$plain:1000:100::/:/s\n");
    write("group", "users:x:100:\n");
    const open_context ctx = opened();
    EXPECT_STREQ(user(ctx, "alice")->password, "$5$s$plain");
    EXPECT_FALSE(user(ctx, "alice")->shadowed);
    EXPECT_EQ(user(ctx, "alice")->last_change, 0);
}

TEST_F(DatabaseLoad, OnlyExactlyXMeansTheShadowFile) {
    write("passwd", "alice:xx:1000:100::/:/s\nalice::1000:100::/:/s\nalice:X:1000:100::/:/s\n");
    const open_context ctx = opened();
    lines passwords;
    for (const internal_user *record : records<const internal_user>(ctx->user_db.entries)) {
        EXPECT_FALSE(record->shadowed);
        passwords.emplace_back(record->password);
    }
    EXPECT_EQ(passwords, (lines{"xx", "", "X"}));
}

TEST_F(DatabaseLoad, GroupHasEveryField) {
    write("group",
          "root:x:0:\nvideo::44:alice,root,alice\nusers:x:100:\ndaemon:x:1:\nn:x:65534:\n");
    const open_context ctx = opened();
    EXPECT_EQ(group(ctx, "video")->type, 2U);
    EXPECT_EQ(group(ctx, "video")->password, nullptr);
    EXPECT_EQ(group(ctx, "video")->gid, 44U);
    EXPECT_EQ(g_hash_table_size(group(ctx, "video")->members), 2U);
    EXPECT_TRUE(g_hash_table_contains(group(ctx, "video")->members, "alice"));
    EXPECT_STREQ(group(ctx, "users")->password, "x");
    EXPECT_EQ(g_hash_table_size(group(ctx, "users")->members), 0U);
}

TEST_F(DatabaseLoad, FirstShadowLineOfANameCounts) {
    write("shadow",
          "root:one:1::::::\nalice:first:2::::::\nalice:second:3::::::\ndaemon:*:1::::::\n");
    const open_context ctx = opened();
    EXPECT_STREQ(user(ctx, "alice")->password, "first");
    EXPECT_EQ(user(ctx, "alice")->last_change, 2 * 86400);
}

struct day_case {
    const char *field;
    gint64 seconds;
};

TEST_F(DatabaseLoad, LastChangeIsHeldInSeconds) {
    static constexpr day_case cases[] = {
        {"0",     0              },
        {"24855", 24855LL * 86400},
        {"24856", 24856LL * 86400},
        {"99999", 99999LL * 86400},
        {"",      -86400         },
    };
    write("passwd", "root:x:0:0:::\n");
    write("group", "root:x:0:\n");
    for (const day_case &row : cases) {
        write("shadow", std::string("root:h:") + row.field + "::::::\n");
        EXPECT_EQ(user(opened(), "root")->last_change, row.seconds) << row.field;
    }
}

TEST_F(DatabaseLoad, LaterUserOfANameWinsAndBothStay) {
    write("passwd", "twin:*:1000:100:::\ntwin:*:1001:100:::\n");
    write("group", "users:x:100:\n");
    const open_context ctx = opened(USERMGMT_OPEN_STRICT);
    EXPECT_EQ(user_names(ctx.get()), (lines{"twin", "twin"}));
    EXPECT_EQ(user(ctx, "twin")->uid, 1001U);
}

TEST_F(DatabaseLoad, FirstGroupOfANameWins) {
    write("passwd", "");
    write("group", "users:x:100:\nusers:x:101:\nother:x:7:\n");
    const open_context ctx = open_logging();
    EXPECT_EQ(take_syslog(), lines{"4 Skipping duplicate group entry 'users'"});
    EXPECT_EQ(group_names(ctx.get()), (lines{"users", "other"}));
    EXPECT_EQ(group(ctx, "users")->gid, 100U);
    EXPECT_EQ(group_database_find_gid(&ctx->group_db, 101), nullptr);
}

TEST_F(DatabaseLoad, LaterGroupOfAGidWinsInTheIndex) {
    write("passwd", "");
    write("group", "one:x:7:\ntwo:x:7:\n");
    const open_context ctx = opened(USERMGMT_OPEN_STRICT);
    EXPECT_STREQ(group_database_find_gid(&ctx->group_db, 7)->name, "two");
    EXPECT_EQ(group_names(ctx.get()), (lines{"one", "two"}));
}

// A group that is dropped must not hide one of the same name behind it.
TEST_F(DatabaseLoad, DroppedGroupIsNoDuplicate) {
    write("passwd", "");
    write("group", "users:x:5000:\nusers:x:100:\n");
    const open_context ctx = open_logging();
    EXPECT_EQ(take_syslog(),
              lines{"3 Failed to parse group 'users': unable to determine group type"});
    EXPECT_EQ(group(ctx, "users")->gid, 100U);
}

struct skip_case {
    const char *what;
    const char *file;
    const char *line;
    lines log;
    const char *strict_error;
};

class DatabaseLoadSkips : public DatabaseLoad, public testing::WithParamInterface<skip_case> {};

INSTANTIATE_TEST_SUITE_P(
    Lines, DatabaseLoadSkips,
    testing::Values(
        skip_case{
            "GroupOutOfRange",
            "group",
            "big:x:5000:\n",
            {"3 Failed to parse group 'big': unable to determine group type"},
            "usermgmt 4: Could not initialise user management: Could not init group database, "
            "could not parse group data for 'big': unable to determine group type"},
        skip_case{
            "GroupTwice",
            "group",
            "video:x:45:\n",
            {"4 Skipping duplicate group entry 'video'"},
            "usermgmt 2: Could not initialise user management: Could not init group database, "
            "group data contains duplicate entry 'video'"},
        skip_case{"UserOutOfRange",
                  "passwd",
                  "big:*:60001:100:::\n",
                  {"4 Failed to parse user 'big': user type for big could not be determined!"},
                  "usermgmt 5: Could not initialise user management: could not parse user big as "
                  "user type for big could not be determined!"},
        skip_case{
            "UserWithoutGroup",
            "passwd",
            "lost:*:1001:4711:::\n",
            {"4 Failed to parse user 'lost': no group was found on the system for GID '4711'"},
            "usermgmt 4: Could not initialise user management: could not parse user lost as "
            "no group was found on the system for GID '4711'"},
        skip_case{"UserWithoutShadowLine",
                  "passwd",
                  "bare:x:1001:100:::\n",
                  {"4 Failed to parse user 'bare': no corresponding shadow entry was found for "
                   "'bare'"},
                  "usermgmt 3: Could not initialise user management: could not parse user bare as "
                  "no corresponding shadow entry was found for 'bare'"},
        skip_case{"ShadowIsLookedUpBeforeTheGroup",
                  "passwd",
                  "bare:x:60001:4711:::\n",
                  {"4 Failed to parse user 'bare': no corresponding shadow entry was found for "
                   "'bare'"},
                  "usermgmt 3: Could not initialise user management: could not parse user bare as "
                  "no corresponding shadow entry was found for 'bare'"},
        skip_case{
            "GroupIsLookedUpBeforeTheType",
            "passwd",
            "lost:*:60001:4711:::\n",
            {"4 Failed to parse user 'lost': no group was found on the system for GID '4711'"},
            "usermgmt 4: Could not initialise user management: could not parse user lost as "
            "no group was found on the system for GID '4711'"}),
    [](const auto &row) { return std::string(row.param.what); });

TEST_P(DatabaseLoadSkips, LineIsLeftOutAndLogged) {
    write(GetParam().file, read(GetParam().file) + GetParam().line);
    const open_context ctx = open_logging();
    EXPECT_EQ(take_syslog(), GetParam().log);
    EXPECT_EQ(user_names(ctx.get()), (lines{"root", "daemon", "alice", "nobody"}));
    EXPECT_EQ(group_names(ctx.get()), (lines{"root", "daemon", "video", "users", "nogroup"}));
    EXPECT_EQ(group(ctx, "video")->gid, 44U);
}

TEST_P(DatabaseLoadSkips, StrictOpenFails) {
    write(GetParam().file, read(GetParam().file) + GetParam().line);
    EXPECT_EQ(error_of_open(USERMGMT_OPEN_STRICT), GetParam().strict_error);
    // A user is also logged; a group is not.
    const bool is_user = GetParam().file == std::string("passwd");
    EXPECT_EQ(take_syslog(), is_user ? GetParam().log : lines());
}

// GIDs and UIDs are printed as signed numbers.
TEST_F(DatabaseLoad, LargeGidIsPrintedSigned) {
    write("passwd", "lost:*:1001:4294967295:::\n");
    write("group", "");
    const open_context ctx = open_logging();
    EXPECT_EQ(
        take_syslog(),
        lines{"4 Failed to parse user 'lost': no group was found on the system for GID '-1'"});
}

TEST_F(DatabaseLoad, WithoutShadowFileEveryXUserIsLeftOut) {
    remove("shadow");
    const open_context ctx = open_logging();
    EXPECT_FALSE(ctx->has_shadow);
    EXPECT_EQ(user_names(ctx.get()), lines{"nobody"});
    EXPECT_EQ(take_syslog(),
              (lines{"4 Failed to parse user 'root': no corresponding shadow entry was found for "
                     "'root'",
                     "4 Failed to parse user 'daemon': no corresponding shadow entry was found for "
                     "'daemon'",
                     "4 Failed to parse user 'alice': no corresponding shadow entry was found for "
                     "'alice'"}));
}

TEST_F(DatabaseLoad, MemberWithoutAccountIsLoggedAndKept) {
    write("group", read("group") + "extra:x:7:ghost\n");
    const open_context ctx = open_logging(USERMGMT_OPEN_STRICT);
    EXPECT_EQ(take_syslog(),
              lines{"4 Group 'extra' lists member 'ghost', which has no passwd line"});
    EXPECT_TRUE(g_hash_table_contains(group(ctx, "extra")->members, "ghost"));
}

TEST_F(DatabaseLoad, ManyMembersWithoutAccountAreOneRecord) {
    write("group", read("group") + "extra:x:7:ghost,ghost,alice\nmany:x:8:one,two,alice,three\n");
    const open_context ctx = open_logging();
    const lines records = take_syslog();
    ASSERT_EQ(records.size(), 2U);
    EXPECT_EQ(records[0], "4 Group 'extra' lists member 'ghost', which has no passwd line");
    EXPECT_EQ(records[1].rfind("4 Group 'many' lists 3 members without a passwd line, '", 0), 0U);
    usermgmt_reload(ctx.get(), CORE_FILE_PASSWD | CORE_FILE_GROUP);
    EXPECT_EQ(take_syslog(), lines{});
}

TEST_F(DatabaseLoad, EmptyFilesMakeEmptyDatabases) {
    write_all({
        {"passwd", ""},
        {"shadow", ""},
        {"group",  ""}
    });
    const open_context ctx = opened(USERMGMT_OPEN_STRICT);
    EXPECT_EQ(user_names(ctx.get()), lines());
    EXPECT_EQ(group_names(ctx.get()), lines());
}

// A populating step starts from nothing: what it was handed must be empty in every part.
TEST_F(DatabaseLoad, PopulatingAFilledDatabaseFails) {
    usermgmt_ctx ctx = {};
    error_slot error;
    user_database users = user_database_new(0);
    group_database groups = group_database_new(0);
    user_database_add(&users, new_user({.name = "alice"}));
    group_database_add(&groups, new_group({.name = "users"}));

    EXPECT_FALSE(init_populate_user_database(&ctx, &users, error.out()));
    EXPECT_EQ(error.text(), "usermgmt 16: could not allocate internal structures");
    EXPECT_FALSE(init_populate_group_database(&ctx, &groups, error.out()));
    EXPECT_EQ(error.text(), "usermgmt 16: failed to init internal structures");
    EXPECT_EQ(users.entries->len, 1U);
    EXPECT_EQ(groups.entries->len, 1U);
    user_database_clear(&users);
    group_database_clear(&groups);
}

TEST_F(DatabaseLoad, PopulatingFromNoFileLeavesTheDatabaseEmpty) {
    const usermgmt_ctx ctx = {};
    error_slot error;
    user_database users = user_database_new(0);
    group_database groups = group_database_new(0);
    EXPECT_TRUE(init_populate_user_database(&ctx, &users, error.out()));
    EXPECT_TRUE(init_populate_group_database(&ctx, &groups, error.out()));
    EXPECT_EQ(error.text(), "");
    EXPECT_EQ(users.entries->len, 0U);
    EXPECT_EQ(groups.entries->len, 0U);
    user_database_clear(&users);
    group_database_clear(&groups);
}

// Before there is a group database, the parsed groups say which GIDs exist.
TEST_F(DatabaseLoad, UsersLoadWithoutAGroupDatabase) {
    usermgmt_ctx ctx = {};
    ctx.has_shadow = TRUE;
    error_slot error;
    ASSERT_TRUE(user_database_init(&ctx, error.out())) << error.text();
    EXPECT_EQ(ctx.user_db.entries->len, 4U);
    EXPECT_EQ(ctx.group_db.entries, nullptr);
    EXPECT_FALSE(ctx.user_db.dirty);
    user_database_clear(&ctx.user_db);
    core_file_free_data(&ctx, CORE_FILE_ALL);
}

TEST_F(DatabaseLoad, UnreadableFilesAreNamed) {
    static constexpr struct {
        const char *file;
        const char *log;
        const char *error;
    } cases[] = {
        {"passwd", "3 Unable to parse passwd file (etc/passwd)",
         "Could not init user database, could not open passwd file 'etc/passwd', No such file or "
         "directory"},
        {"group",  "3 Unable to parse group file (etc/group)",
         "Could not init group database, could not open group file 'etc/group', No such file or "
         "directory"},
    };
    for (const auto &row : cases) {
        write_typical();
        remove(row.file);
        EXPECT_EQ(error_of_open(), std::string("corefile 100: ") + OPEN_FAILURE + row.error);
        EXPECT_EQ(take_syslog(), lines{row.log});
    }
}

TEST_F(DatabaseLoad, UnreadableShadowFileIsNamed) {
    remove("shadow");
    ASSERT_EQ(g_mkdir("etc/shadow", 0755), 0);
    EXPECT_EQ(error_of_open(), std::string("corefile 100: ") + OPEN_FAILURE +
                                   "Could not init user database, could not read 'shadow' entry "
                                   "0: Is a directory");
    EXPECT_EQ(take_syslog(), lines{"3 Unable to parse shadow file (etc/shadow)"});
}
