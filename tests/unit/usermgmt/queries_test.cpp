// tests/unit/usermgmt/queries_test.cpp: the read-only operations.
#include <algorithm>

#include "tests/unit/usermgmt/account_files.h"
#include "usermgmt/context.h"

class Queries : public AccountFiles {
  protected:
    void SetUp() override {
        AccountFiles::SetUp();
        write_typical();
        owner_ = opened();
        ctx_ = owner_.get();
    }
    void TearDown() override {
        usermgmt_free_user_entry(&entry_);
        owner_.reset();
        AccountFiles::TearDown();
    }
    // A user whose primary group has gone from the database.
    void add_lost_user() {
        user_database_add(&owner_->user_db, new_user({.name = "lost", .uid = 1001, .gid = 5}));
    }

    open_context owner_;
    const usermgmt_ctx *ctx_ = nullptr;
    error_slot error_;
    user_entry entry_ = {};
};

struct unusable {
    const usermgmt_ctx *ctx;
};
static const usermgmt_ctx never_opened = {};
static const unusable unusable_contexts[] = {{nullptr}, {&never_opened}};

TEST_F(Queries, UserIsFilledIn) {
    ASSERT_TRUE(usermgmt_get_user(ctx_, "alice", &entry_, error_.out())) << error_.text();
    EXPECT_EQ(entry_.type, 4U);
    EXPECT_STREQ(entry_.name, "alice");
    EXPECT_STREQ(entry_.password, "$5$salt$aliceshash");
    EXPECT_STREQ(entry_.group, "users");
    EXPECT_EQ(take_strings(g_steal_pointer(&entry_.groups)), lines{"video"});
    EXPECT_STREQ(entry_.gecos, "Alice");
    EXPECT_STREQ(entry_.shell, "/bin/false");
    EXPECT_EQ(entry_.uid, 1000);
}

TEST_F(Queries, UnknownUser) {
    EXPECT_FALSE(usermgmt_get_user(ctx_, "x", &entry_, error_.out()));
    EXPECT_EQ(error_.text(), "usermgmt 3: Could not retrieve user 'x', user does not exist");
    EXPECT_FALSE(usermgmt_get_user(ctx_, "", &entry_, error_.out()));
    EXPECT_EQ(error_.text(), "usermgmt 3: Could not retrieve user '', user does not exist");
    EXPECT_FALSE(usermgmt_get_user(ctx_, "x", &entry_, nullptr));
}

TEST_F(Queries, UserWithoutPrimaryGroup) {
    add_lost_user();
    entry_.uid = 77;
    EXPECT_FALSE(usermgmt_get_user(ctx_, "lost", &entry_, error_.out()));
    EXPECT_EQ(error_.text(),
              "usermgmt 16: Could not retrieve user 'lost', no corresponding group for GID '5'");
    EXPECT_EQ(entry_.name, nullptr);
    EXPECT_EQ(entry_.uid, 77);
}

TEST_F(Queries, GetUserChecksContextThenNameThenEntry) {
    for (const auto &[bad] : unusable_contexts) {
        EXPECT_FALSE(usermgmt_get_user(bad, nullptr, nullptr, error_.out()));
        EXPECT_EQ(error_.text(),
                  "usermgmt 17: Failed to retrieve user: Invalid or uninitialised context");
    }
    EXPECT_FALSE(usermgmt_get_user(ctx_, nullptr, nullptr, error_.out()));
    EXPECT_EQ(error_.text(),
              "usermgmt 17: Failed to retrieve user: Invalid or missing 'username' argument");
    EXPECT_FALSE(usermgmt_get_user(ctx_, "nosuch", nullptr, error_.out()));
    EXPECT_EQ(error_.text(),
              "usermgmt 17: Failed to retrieve user: Invalid or missing 'result' argument");
}

TEST_F(Queries, Existence) {
    EXPECT_TRUE(usermgmt_user_exists(ctx_, "alice"));
    EXPECT_FALSE(usermgmt_user_exists(ctx_, "video"));
    EXPECT_FALSE(usermgmt_user_exists(ctx_, ""));
    EXPECT_FALSE(usermgmt_user_exists(ctx_, nullptr));
    EXPECT_TRUE(usermgmt_group_exists(ctx_, "video"));
    EXPECT_FALSE(usermgmt_group_exists(ctx_, "alice"));
    EXPECT_FALSE(usermgmt_group_exists(ctx_, ""));
    EXPECT_FALSE(usermgmt_group_exists(ctx_, nullptr));
    for (const auto &[bad] : unusable_contexts) {
        EXPECT_FALSE(usermgmt_user_exists(bad, "alice"));
        EXPECT_FALSE(usermgmt_group_exists(bad, "video"));
    }
}

static constexpr guint UNTOUCHED = 4711;

struct groups_case {
    std::vector<const char *> names;
    bool exist;
    guint missing;
};

TEST_F(Queries, GroupsExistNamesTheFirstMissing) {
    const groups_case cases[] = {
        {{nullptr},                                 true,  UNTOUCHED},
        {{"users", nullptr},                        true,  UNTOUCHED},
        {{"users", "video", nullptr},               true,  UNTOUCHED},
        {{"users", "nosuch", "video", nullptr},     false, 1        },
        {{"nosuch", "users", nullptr},              false, 0        },
        {{"users", "video", "no", "nope", nullptr}, false, 2        },
        {{"users", "", nullptr},                    false, 1        },
    };
    for (const groups_case &row : cases) {
        guint missing = UNTOUCHED;
        EXPECT_EQ(usermgmt_groups_exist(ctx_, row.names.data(), &missing) != FALSE, row.exist);
        EXPECT_EQ(missing, row.missing);
        EXPECT_EQ(usermgmt_groups_exist(ctx_, row.names.data(), nullptr) != FALSE, row.exist);
    }
}

TEST_F(Queries, GroupsExistWithoutContextOrListTouchesNothing) {
    static constexpr const char *none[] = {nullptr};
    guint missing = UNTOUCHED;
    EXPECT_FALSE(usermgmt_groups_exist(ctx_, nullptr, &missing));
    for (const auto &[bad] : unusable_contexts)
        EXPECT_FALSE(usermgmt_groups_exist(bad, none, &missing));
    EXPECT_EQ(missing, UNTOUCHED);
}

TEST_F(Queries, GroupHasGidAndMembers) {
    owner_->group_db.dirty = FALSE;
    add_user_to_group(group_database_find(&owner_->group_db, "video"), "root", nullptr);
    guint32 gid = 0;
    char **members = nullptr;
    ASSERT_TRUE(usermgmt_get_group(ctx_, "video", &gid, &members, error_.out()));
    EXPECT_EQ(gid, 44U);
    lines names = take_strings(members);
    std::sort(names.begin(), names.end());
    EXPECT_EQ(names, (lines{"alice", "root"}));
}

TEST_F(Queries, GroupWithoutMembersHasAnEmptyList) {
    char **members = nullptr;
    ASSERT_TRUE(usermgmt_get_group(ctx_, "nogroup", nullptr, &members, error_.out()));
    ASSERT_NE(members, nullptr);
    EXPECT_EQ(take_strings(members), lines());
    guint32 gid = 0;
    ASSERT_TRUE(usermgmt_get_group(ctx_, "nogroup", &gid, nullptr, error_.out()));
    EXPECT_EQ(gid, 65534U);
    EXPECT_TRUE(usermgmt_get_group(ctx_, "nogroup", nullptr, nullptr, error_.out()));
}

TEST_F(Queries, GetGroupFailuresTouchNoSlot) {
    guint32 gid = UNTOUCHED;
    char **members = nullptr;
    EXPECT_FALSE(usermgmt_get_group(ctx_, "x", &gid, &members, error_.out()));
    EXPECT_EQ(error_.text(), "usermgmt 4: Group 'x' does not exist");
    EXPECT_FALSE(usermgmt_get_group(ctx_, nullptr, &gid, &members, error_.out()));
    EXPECT_EQ(error_.text(),
              "usermgmt 17: Failed to retrieve group: Invalid or missing 'groupname' argument");
    for (const auto &[bad] : unusable_contexts) {
        EXPECT_FALSE(usermgmt_get_group(bad, nullptr, &gid, &members, error_.out()));
        EXPECT_EQ(error_.text(),
                  "usermgmt 17: Failed to retrieve group: Invalid or uninitialised context");
    }
    EXPECT_EQ(gid, UNTOUCHED);
    EXPECT_EQ(members, nullptr);
}

static lines take_entry_names(GList *entries) {
    lines names;
    for (const GList *link = entries; link != nullptr; link = link->next) {
        const auto *entry = static_cast<const user_entry *>(link->data);
        names.push_back(std::string(entry->name) + " " + std::to_string(entry->uid) + " " +
                        entry->group);
    }
    g_list_free_full(entries, [](gpointer entry) {
        usermgmt_free_user_entry(static_cast<user_entry *>(entry));
        g_free(entry);
    });
    return names;
}

static const lines all_names = {"root", "daemon", "alice", "nobody"};
static const lines all_entries = {"root 0 root", "daemon 1 daemon", "alice 1000 users",
                                  "nobody 65534 nogroup"};

TEST_F(Queries, AllUsersInDatabaseOrder) {
    char **names = nullptr;
    GList *entries = nullptr;
    ASSERT_TRUE(usermgmt_get_all_users(ctx_, &names, &entries, error_.out()));
    EXPECT_EQ(take_strings(names), all_names);
    EXPECT_EQ(take_entry_names(entries), all_entries);
}

TEST_F(Queries, AllUsersByEitherSlotAlone) {
    char **names = nullptr;
    GList *entries = nullptr;
    ASSERT_TRUE(usermgmt_get_all_users(ctx_, &names, nullptr, error_.out()));
    ASSERT_TRUE(usermgmt_get_all_users(ctx_, nullptr, &entries, error_.out()));
    EXPECT_EQ(take_strings(names), all_names);
    EXPECT_EQ(take_entry_names(entries), all_entries);
}

TEST_F(Queries, NoUsersAreEmptyLists) {
    owner_.reset();
    write_all({
        {"passwd", ""},
        {"shadow", ""},
        {"group",  ""}
    });
    owner_ = opened();
    char **names = nullptr;
    GList *entries = nullptr;
    ASSERT_TRUE(usermgmt_get_all_users(owner_.get(), &names, &entries, error_.out()));
    ASSERT_NE(names, nullptr);
    EXPECT_EQ(take_strings(names), lines());
    EXPECT_EQ(entries, nullptr);
}

TEST_F(Queries, AllUsersWithOneThatCannotBeFilledFails) {
    add_lost_user();
    user_database_add(&owner_->user_db, new_user({.name = "behind", .uid = 1002}));
    char **names = nullptr;
    GList *entries = nullptr;
    EXPECT_FALSE(usermgmt_get_all_users(ctx_, &names, &entries, error_.out()));
    EXPECT_EQ(error_.text(),
              "usermgmt 16: Failed to retrieve details for users, position #4:no corresponding "
              "group for GID '5'");
    EXPECT_EQ(names, nullptr);
    EXPECT_EQ(entries, nullptr);
    EXPECT_FALSE(usermgmt_get_all_users(ctx_, nullptr, &entries, nullptr));

    // Names alone need no group.
    ASSERT_TRUE(usermgmt_get_all_users(ctx_, &names, nullptr, error_.out()));
    EXPECT_EQ(take_strings(names), (lines{"root", "daemon", "alice", "nobody", "lost", "behind"}));
}

TEST_F(Queries, AllUsersNeedsContextThenASlot) {
    for (const auto &[bad] : unusable_contexts) {
        EXPECT_FALSE(usermgmt_get_all_users(bad, nullptr, nullptr, error_.out()));
        EXPECT_EQ(error_.text(),
                  "usermgmt 17: Failed to get all users: Invalid or uninitialised context");
    }
    EXPECT_FALSE(usermgmt_get_all_users(ctx_, nullptr, nullptr, error_.out()));
    EXPECT_EQ(error_.text(), "usermgmt 17:  as at least one of user/entries is required");
}

TEST_F(Queries, AllGroupsInDatabaseOrder) {
    char **names = nullptr;
    ASSERT_TRUE(usermgmt_get_all_groups(ctx_, &names, error_.out()));
    EXPECT_EQ(take_strings(names), (lines{"root", "daemon", "video", "users", "nogroup"}));
}

TEST_F(Queries, AllGroupsNeedsContextThenASlot) {
    for (const auto &[bad] : unusable_contexts) {
        EXPECT_FALSE(usermgmt_get_all_groups(bad, nullptr, error_.out()));
        EXPECT_EQ(error_.text(),
                  "usermgmt 17: Failed to retrieve all groups: Invalid or uninitialised context");
    }
    EXPECT_FALSE(usermgmt_get_all_groups(ctx_, nullptr, error_.out()));
    EXPECT_EQ(
        error_.text(),
        "usermgmt 17: Failed to retrieve all groups: Invalid or missing 'groupnames' argument");
}

TEST_F(Queries, TypesOfUsers) {
    EXPECT_EQ(usermgmt_get_user_type(ctx_, "root"), 1U);
    EXPECT_EQ(usermgmt_get_user_type(ctx_, "daemon"), 2U);
    EXPECT_EQ(usermgmt_get_user_type(ctx_, "alice"), 4U);
    EXPECT_EQ(usermgmt_get_user_type(ctx_, "nobody"), 5U);
    EXPECT_EQ(usermgmt_get_user_type(ctx_, "video"), 0U);
    EXPECT_EQ(usermgmt_get_user_type(ctx_, ""), 0U);
    EXPECT_EQ(usermgmt_get_user_type(ctx_, nullptr), 6U);
    for (const auto &[bad] : unusable_contexts)
        EXPECT_EQ(usermgmt_get_user_type(bad, "root"), 6U);
}

TEST_F(Queries, TypesOfGroups) {
    EXPECT_EQ(usermgmt_get_group_type(ctx_, "root"), 1U);
    EXPECT_EQ(usermgmt_get_group_type(ctx_, "video"), 2U);
    EXPECT_EQ(usermgmt_get_group_type(ctx_, "nogroup"), 4U);
    EXPECT_EQ(usermgmt_get_group_type(ctx_, "alice"), 0U);
    EXPECT_EQ(usermgmt_get_group_type(ctx_, ""), 0U);
    EXPECT_EQ(usermgmt_get_group_type(ctx_, nullptr), 6U);
    for (const auto &[bad] : unusable_contexts)
        EXPECT_EQ(usermgmt_get_group_type(bad, "root"), 6U);
}

TEST_F(Queries, UsableContextAndMissingArgumentTexts) {
    EXPECT_TRUE(context_is_usable(ctx_, "do it", error_.out()));
    EXPECT_EQ(error_.text(), "");
    EXPECT_FALSE(context_is_usable(nullptr, "do it", error_.out()));
    EXPECT_EQ(error_.text(), "usermgmt 17: Failed to do it: Invalid or uninitialised context");
    EXPECT_FALSE(context_is_usable(nullptr, "do it", nullptr));
    EXPECT_FALSE(fail_missing_argument("do it", "thing", error_.out()));
    EXPECT_EQ(error_.text(), "usermgmt 17: Failed to do it: Invalid or missing 'thing' argument");
}

TEST_F(Queries, QueriesChangeNothing) {
    guint32 gid;
    (void)usermgmt_get_user(ctx_, "alice", &entry_, nullptr);
    (void)usermgmt_get_user(ctx_, "nosuch", &entry_, nullptr);
    (void)usermgmt_get_group(ctx_, "video", &gid, nullptr, nullptr);
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_FALSE(ctx_->group_db.dirty);
}
