// tests/unit/usermgmt/database_test.cpp: inserting records and changing group membership.
#include "usermgmt/database.h"

#include <algorithm>

#include "tests/unit/usermgmt/account_files.h"

class Database : public testing::Test {
  protected:
    void SetUp() override {
        users_ = user_database_new(0);
        groups_ = group_database_new(0);
    }
    void TearDown() override {
        user_database_clear(&users_);
        group_database_clear(&groups_);
    }

    internal_group *add_group(const group_fields &fields) {
        internal_group *group = new_group(fields);
        group_database_add(&groups_, group);
        groups_.dirty = FALSE;
        return group;
    }

    static lines members(const internal_group *group) {
        lines names;
        GHashTableIter iter;
        gpointer name;
        g_hash_table_iter_init(&iter, group->members);
        while (g_hash_table_iter_next(&iter, &name, nullptr))
            names.emplace_back(static_cast<const char *>(name));
        std::sort(names.begin(), names.end());
        return names;
    }

    user_database users_ = {};
    group_database groups_ = {};
    error_slot error_;
};

TEST_F(Database, NewOnesAreEmptyAndClean) {
    EXPECT_EQ(users_.entries->len, 0U);
    EXPECT_EQ(g_hash_table_size(users_.name_hash), 0U);
    EXPECT_FALSE(users_.dirty);
    EXPECT_EQ(groups_.entries->len, 0U);
    EXPECT_EQ(g_hash_table_size(groups_.name_hash), 0U);
    EXPECT_EQ(g_hash_table_size(groups_.gid_hash), 0U);
    EXPECT_FALSE(groups_.dirty);
    EXPECT_EQ(user_database_find(&users_, "root"), nullptr);
    EXPECT_EQ(group_database_find(&groups_, "root"), nullptr);
    EXPECT_EQ(group_database_find_gid(&groups_, 0), nullptr);
}

TEST_F(Database, ClearLeavesNothingAndMayBeRepeated) {
    users_.dirty = groups_.dirty = TRUE;
    for (int i = 0; i < 2; i++) {
        user_database_clear(&users_);
        group_database_clear(&groups_);
        EXPECT_EQ(users_.entries, nullptr);
        EXPECT_EQ(users_.name_hash, nullptr);
        EXPECT_FALSE(users_.dirty);
        EXPECT_EQ(groups_.entries, nullptr);
        EXPECT_EQ(groups_.name_hash, nullptr);
        EXPECT_EQ(groups_.gid_hash, nullptr);
        EXPECT_FALSE(groups_.dirty);
    }
}

TEST_F(Database, AddedUserIsIndexedByACopyOfItsName) {
    internal_user *user = new_user({.name = "alice"});
    user_database_add(&users_, user);
    EXPECT_TRUE(users_.dirty);
    ASSERT_EQ(users_.entries->len, 1U);
    EXPECT_EQ(g_ptr_array_index(users_.entries, 0), user);
    EXPECT_EQ(user_database_find(&users_, "alice"), user);
    EXPECT_EQ(user_database_find(&users_, "Alice"), nullptr);

    gpointer key = nullptr;
    ASSERT_TRUE(g_hash_table_lookup_extended(users_.name_hash, "alice", &key, nullptr));
    EXPECT_NE(key, static_cast<void *>(user->name));
}

TEST_F(Database, AddedGroupIsIndexedByCopiesOfNameAndGid) {
    internal_group *group = new_group({.name = "video", .gid = 44});
    group_database_add(&groups_, group);
    EXPECT_TRUE(groups_.dirty);
    EXPECT_EQ(group_database_find(&groups_, "video"), group);
    EXPECT_EQ(group_database_find_gid(&groups_, 44), group);
    EXPECT_EQ(group_database_find_gid(&groups_, 45), nullptr);

    gpointer key = nullptr;
    ASSERT_TRUE(g_hash_table_lookup_extended(groups_.name_hash, "video", &key, nullptr));
    EXPECT_NE(key, static_cast<void *>(group->name));
    const guint32 gid = 44;
    ASSERT_TRUE(g_hash_table_lookup_extended(groups_.gid_hash, &gid, &key, nullptr));
    EXPECT_NE(key, static_cast<void *>(&group->gid));
}

TEST_F(Database, EntriesKeepTheOrderOfAdding) {
    for (const char *name : {"z", "a", "m"})
        user_database_add(&users_, new_user({.name = name}));
    lines names;
    for (const internal_user *user : records<const internal_user>(users_.entries))
        names.emplace_back(user->name);
    EXPECT_EQ(names, (lines{"z", "a", "m"}));
}

TEST_F(Database, LaterUserOfANameWinsInTheIndexAndBothStay) {
    internal_user *first = new_user({.name = "twin", .uid = 1000});
    internal_user *second = new_user({.name = "twin", .uid = 1001});
    user_database_add(&users_, first);
    user_database_add(&users_, second);
    EXPECT_EQ(users_.entries->len, 2U);
    EXPECT_EQ(user_database_find(&users_, "twin"), second);
}

TEST_F(Database, LaterGroupOfAGidWinsInTheGidIndex) {
    internal_group *first = add_group({.name = "one", .gid = 7});
    internal_group *second = add_group({.name = "two", .gid = 7});
    EXPECT_EQ(group_database_find_gid(&groups_, 7), second);
    EXPECT_EQ(group_database_find(&groups_, "one"), first);
    EXPECT_EQ(group_database_find(&groups_, "two"), second);
    EXPECT_EQ(groups_.entries->len, 2U);
}

TEST_F(Database, AddingAGroupNeedsTheWholeDatabase) {
    g_autoptr(internal_group) group = new_group({.name = "video", .gid = 44});
    const group_database whole = groups_;
    group_database part = whole;
    part.entries = nullptr;
    EXPECT_EQ(glib_log_of([&] { group_database_add(&part, group); }),
              lines{"usermgmt-CRITICAL: group_database_add: assertion 'group_db->entries != NULL' "
                    "failed"});
    part = whole;
    part.gid_hash = nullptr;
    EXPECT_EQ(glib_log_of([&] { group_database_add(&part, group); }),
              lines{"usermgmt-CRITICAL: group_database_add: assertion 'group_db->gid_hash != NULL' "
                    "failed"});
    part = whole;
    part.name_hash = nullptr;
    EXPECT_EQ(glib_log_of([&] { group_database_add(&part, group); }),
              lines{"usermgmt-CRITICAL: group_database_add: assertion 'group_db->name_hash != "
                    "NULL' failed"});
    EXPECT_EQ(groups_.entries->len, 0U);
    EXPECT_EQ(g_hash_table_size(groups_.gid_hash), 0U);
    EXPECT_EQ(g_hash_table_size(groups_.name_hash), 0U);
}

TEST_F(Database, AddingAMemberTellsWhetherItWasNew) {
    internal_group *group = add_group({.name = "video", .gid = 44});
    gboolean changed = FALSE;
    std::string name = "alice";
    add_user_to_group(group, name.c_str(), &changed);
    EXPECT_TRUE(changed);
    name = "XXXXX";
    EXPECT_EQ(members(group), lines{"alice"});

    changed = FALSE;
    add_user_to_group(group, "alice", &changed);
    EXPECT_FALSE(changed);
    changed = TRUE;
    add_user_to_group(group, "alice", &changed);
    EXPECT_TRUE(changed);
    add_user_to_group(group, "bob", nullptr);
    EXPECT_EQ(members(group), (lines{"alice", "bob"}));
}

TEST_F(Database, RemovingAMemberTellsWhetherItWasThere) {
    internal_group *group = add_group({
        .name = "video", .gid = 44, .members = {"alice", "bob"}
    });
    gboolean changed = FALSE;
    remove_user_from_group(group, "carol", &changed);
    EXPECT_FALSE(changed);
    remove_user_from_group(group, "alice", &changed);
    EXPECT_TRUE(changed);
    remove_user_from_group(group, "alice", &changed);
    EXPECT_TRUE(changed);
    remove_user_from_group(group, "bob", nullptr);
    EXPECT_EQ(members(group), lines());
}

TEST_F(Database, AddToGroupsSkipsThePrimaryOne) {
    internal_group *users = add_group({.name = "users", .gid = 100});
    internal_group *video = add_group({.name = "video", .gid = 44});
    static constexpr const char *names[] = {"users", "video", nullptr};
    EXPECT_TRUE(add_user_to_groups(&groups_, "alice", names, "users", error_.out()));
    EXPECT_EQ(members(users), lines());
    EXPECT_EQ(members(video), lines{"alice"});
    EXPECT_TRUE(groups_.dirty);
}

// The name to skip need not exist: it is never looked up.
TEST_F(Database, AddToGroupsDoesNotLookUpTheSkippedGroup) {
    static constexpr const char *names[] = {"ghost", nullptr};
    EXPECT_TRUE(add_user_to_groups(&groups_, "alice", names, "ghost", error_.out()));
    EXPECT_FALSE(groups_.dirty);
}

TEST_F(Database, AddToGroupsWithoutChangeStaysClean) {
    add_group({.name = "video", .gid = 44, .members = {"alice"}});
    static constexpr const char *names[] = {"video", "video", nullptr};
    static constexpr const char *none[] = {nullptr};
    EXPECT_TRUE(add_user_to_groups(&groups_, "alice", names, nullptr, error_.out()));
    EXPECT_TRUE(add_user_to_groups(&groups_, "alice", none, nullptr, error_.out()));
    EXPECT_FALSE(groups_.dirty);
    EXPECT_EQ(error_.text(), "");
}

TEST_F(Database, AddToGroupsStopsAtAnUnknownGroup) {
    internal_group *before = add_group({.name = "before", .gid = 1});
    internal_group *behind = add_group({.name = "behind", .gid = 2});
    static constexpr const char *names[] = {"before", "nosuch", "behind", nullptr};
    EXPECT_FALSE(add_user_to_groups(&groups_, "alice", names, nullptr, error_.out()));
    EXPECT_EQ(error_.text(),
              "usermgmt 4: could not add user 'alice' to non-existing group 'nosuch'!");
    EXPECT_EQ(members(before), lines{"alice"});
    EXPECT_EQ(members(behind), lines());
    EXPECT_TRUE(groups_.dirty);
}

TEST_F(Database, AddToGroupsThatFailsAtOnceStaysClean) {
    static constexpr const char *names[] = {"nosuch", nullptr};
    EXPECT_FALSE(add_user_to_groups(&groups_, "alice", names, nullptr, nullptr));
    EXPECT_FALSE(groups_.dirty);
}
