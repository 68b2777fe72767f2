// tests/unit/usermgmt/user_entry_test.cpp: the public user record and how it is filled.
#include "usermgmt/user_entry.h"

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/secret_watch.h"
#include "usermgmt/context.h"

static constexpr const char *two_groups[] = {"video", "audio", nullptr};

TEST(UserEntry, PopulateTakesShellBeforeComment) {
    g_auto(user_entry) entry = {};
    usermgmt_populate_user_entry(&entry, USER_TYPE_ORNET, "name", "password", "group", two_groups,
                                 "shell", "comment", 1234);
    EXPECT_EQ(entry.type, 4U);
    EXPECT_STREQ(entry.name, "name");
    EXPECT_STREQ(entry.password, "password");
    EXPECT_STREQ(entry.group, "group");
    ASSERT_EQ(g_strv_length(entry.groups), 2U);
    EXPECT_STREQ(entry.groups[0], "video");
    EXPECT_STREQ(entry.groups[1], "audio");
    EXPECT_STREQ(entry.gecos, "comment");
    EXPECT_STREQ(entry.shell, "shell");
    EXPECT_EQ(entry.uid, 1234);
}

TEST(UserEntry, PopulateCopiesItsStrings) {
    char name[] = "name";
    char *groups[] = {name, nullptr};
    g_auto(user_entry) entry = {};
    usermgmt_populate_user_entry(&entry, 0, name, name, name, groups, name, name, 0);
    name[0] = 'X';
    for (const char *copy :
         {entry.name, entry.password, entry.group, entry.groups[0], entry.gecos, entry.shell})
        EXPECT_STREQ(copy, "name");
}

TEST(UserEntry, PopulateLeavesAbsentStringsAbsent) {
    g_auto(user_entry) entry = {};
    usermgmt_populate_user_entry(&entry, 7, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr,
                                 -1);
    EXPECT_EQ(entry.type, 7U);
    EXPECT_EQ(entry.name, nullptr);
    EXPECT_EQ(entry.password, nullptr);
    EXPECT_EQ(entry.group, nullptr);
    EXPECT_EQ(entry.groups, nullptr);
    EXPECT_EQ(entry.gecos, nullptr);
    EXPECT_EQ(entry.shell, nullptr);
    EXPECT_EQ(entry.uid, -1);
}

TEST(UserEntry, PopulateRefusesMissingEntry) {
    EXPECT_EQ(glib_log_of([] {
                  usermgmt_populate_user_entry(nullptr, 1, "a", "b", "c", nullptr, "d", "e", 0);
              }),
              lines{"usermgmt-CRITICAL: usermgmt_populate_user_entry: assertion 'entry != NULL' "
                    "failed"});
}

TEST(UserEntry, FreeEmptiesEntryAndWipesPassword) {
    secret_watch watch;
    user_entry entry = {};
    usermgmt_populate_user_entry(&entry, 4, "name", "clear text", "group", two_groups, "shell",
                                 "comment", 1234);
    watch.add(entry.password);
    usermgmt_free_user_entry(&entry);
    EXPECT_EQ(watch.wiped(), 1);
    EXPECT_EQ(watch.readable(), lines());
    EXPECT_EQ(entry.name, nullptr);
    EXPECT_EQ(entry.password, nullptr);
    EXPECT_EQ(entry.group, nullptr);
    EXPECT_EQ(entry.groups, nullptr);
    EXPECT_EQ(entry.gecos, nullptr);
    EXPECT_EQ(entry.shell, nullptr);
    EXPECT_EQ(entry.uid, -1);
}

TEST(UserEntry, FreeTwiceAndFreeOfNothingAreHarmless) {
    user_entry entry = {};
    usermgmt_free_user_entry(&entry);
    usermgmt_free_user_entry(&entry);
    EXPECT_EQ(entry.uid, -1);
    usermgmt_free_user_entry(nullptr);
}

// A context whose databases are built by hand.
class EntryFromInternal : public testing::Test {
  protected:
    void SetUp() override {
        ctx_.user_db = user_database_new(0);
        ctx_.group_db = group_database_new(0);
        group_database_add(&ctx_.group_db, new_group({.name = "users", .gid = 100}));
    }
    void TearDown() override {
        user_database_clear(&ctx_.user_db);
        group_database_clear(&ctx_.group_db);
    }
    void add_group(const group_fields &fields) {
        group_database_add(&ctx_.group_db, new_group(fields));
    }

    usermgmt_ctx ctx_ = {};
    error_slot error_;
    user_entry entry_ = {};
};

TEST_F(EntryFromInternal, CopiesTheRecord) {
    g_autoptr(internal_user) user = new_user({.name = "alice",
                                              .password = "hash",
                                              .uid = 1000,
                                              .gid = 100,
                                              .gecos = "Alice",
                                              .home = "/home/alice",
                                              .shell = "/bin/sh"});
    ASSERT_TRUE(user_entry_from_internal(&ctx_, user, &entry_, error_.out()));
    EXPECT_EQ(entry_.type, 4U);
    EXPECT_STREQ(entry_.name, "alice");
    EXPECT_NE(entry_.name, user->name);
    EXPECT_STREQ(entry_.password, "hash");
    EXPECT_NE(entry_.password, user->password);
    EXPECT_STREQ(entry_.group, "users");
    ASSERT_NE(entry_.groups, nullptr);
    EXPECT_EQ(entry_.groups[0], nullptr);
    EXPECT_STREQ(entry_.gecos, "Alice");
    EXPECT_STREQ(entry_.shell, "/bin/sh");
    EXPECT_EQ(entry_.uid, 1000);
    usermgmt_free_user_entry(&entry_);
}

TEST_F(EntryFromInternal, SecondaryGroupsComeInDatabaseOrderWithoutThePrimary) {
    add_group({
        .name = "video", .gid = 44, .members = {"bob", "alice"}
    });
    add_group({.name = "other", .gid = 45, .members = {"bob"}});
    add_group({.name = "audio", .gid = 29, .members = {"alice"}});
    add_group({.name = "primary", .gid = 200, .members = {"alice"}});
    g_autoptr(internal_user) user = new_user({.name = "alice", .gid = 200});
    ASSERT_TRUE(user_entry_from_internal(&ctx_, user, &entry_, error_.out()));
    EXPECT_STREQ(entry_.group, "primary");
    EXPECT_EQ(take_strings(g_steal_pointer(&entry_.groups)), (lines{"video", "audio"}));
    usermgmt_free_user_entry(&entry_);
}

TEST_F(EntryFromInternal, PrimaryGroupWithoutRecordIsAnError) {
    g_autoptr(internal_user) user = new_user({.name = "alice", .gid = 5});
    EXPECT_FALSE(user_entry_from_internal(&ctx_, user, &entry_, error_.out()));
    EXPECT_EQ(error_.text(), "usermgmt 16: no corresponding group for GID '5'");
    EXPECT_EQ(entry_.name, nullptr);
    EXPECT_EQ(entry_.groups, nullptr);
    EXPECT_EQ(entry_.uid, 0);
}

TEST_F(EntryFromInternal, MissingRecordIsACriticalWithoutError) {
    EXPECT_EQ(glib_log_of([this] {
                  EXPECT_FALSE(user_entry_from_internal(&ctx_, nullptr, &entry_, error_.out()));
              }),
              lines{"usermgmt-CRITICAL: user_entry_from_internal: assertion 'intern != NULL' "
                    "failed"});
    EXPECT_FALSE(error_.is_set());
}

TEST_F(EntryFromInternal, SecondaryGroupsNeedEntries) {
    group_database empty = {};
    char **groups = nullptr;
    EXPECT_EQ(glib_log_of([&] {
                  EXPECT_FALSE(build_secondary_group_list(&empty, "alice", "users", &groups));
              }),
              lines{"usermgmt-CRITICAL: build_secondary_group_list: assertion "
                    "'group_db->entries != NULL' failed"});
    EXPECT_EQ(groups, nullptr);
}

TEST_F(EntryFromInternal, SecondaryGroupsNeedAnEmptyResult) {
    char *filled[] = {nullptr};
    char **groups = filled;
    EXPECT_EQ(
        glib_log_of([&] {
            EXPECT_FALSE(build_secondary_group_list(&ctx_.group_db, "alice", "users", &groups));
        }),
        lines{"usermgmt-CRITICAL: build_secondary_group_list: assertion "
              "'*results == NULL' failed"});
    EXPECT_EQ(groups, filled);
}

// With databases that fail inside, no error is made up and nothing is filled.
TEST_F(EntryFromInternal, FailingGroupListFillsNothing) {
    g_autoptr(internal_user) user = new_user({.name = "alice", .gid = 100});
    GPtrArray *entries = g_steal_pointer(&ctx_.group_db.entries);
    EXPECT_EQ(glib_log_of([&] {
                  EXPECT_FALSE(user_entry_from_internal(&ctx_, user, &entry_, error_.out()));
              }).size(),
              1U);
    EXPECT_FALSE(error_.is_set());
    EXPECT_EQ(entry_.name, nullptr);
    ctx_.group_db.entries = entries;
}
