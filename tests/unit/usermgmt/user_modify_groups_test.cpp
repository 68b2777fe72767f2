// tests/unit/usermgmt/user_modify_groups_test.cpp: replacing the secondary groups of a user.
#include "tests/unit/usermgmt/changed_accounts.h"

class UserModifyGroups : public ChangedAccounts {
  protected:
    // Members of the groups a test may change, in the order of the file.
    lines memberships() {
        return {members("root"), members("video"), members("audio"), members("users"),
                members("camera")};
    }
    // Takes a group out of the name index while its record stays.
    void hide(const char *name) {
        ASSERT_TRUE(g_hash_table_remove(ctx_->group_db.name_hash, name));
    }
};

TEST_F(UserModifyGroups, Lists) {
    static const lines BEFORE = {"", "alice", "alice,bob", "alice,bob", "camd"};
    const auto check = [this](const char *username, const std::vector<const char *> &wanted,
                              const lines &after) {
        write("group", GROUP);
        reopen();
        EXPECT_EQ(memberships(), BEFORE);
        EXPECT_EQ(modify(username, {.groups = wanted}), "");
        EXPECT_EQ(memberships(), after);
        EXPECT_EQ(replaced(), after == BEFORE ? lines() : lines{"group"});
        expect_memory_on_disk();
    };
    check("alice", {}, {"", "", "bob", "alice,bob", "camd"});
    check("alice", {"video"}, {"", "alice", "bob", "alice,bob", "camd"});
    check("alice", {"camera"}, {"", "", "bob", "alice,bob", "alice,camd"});
    check("alice", {"camera", "video"}, {"", "alice", "bob", "alice,bob", "alice,camd"});
    check("alice", {"root", "camera"}, {"alice", "", "bob", "alice,bob", "alice,camd"});
    check("alice", {"audio", "video"}, BEFORE);
    check("alice", {"video", "audio", "video"}, BEFORE);
    // The primary group is neither joined nor left.
    check("alice", {"users", "video", "audio"}, BEFORE);
    check("alice", {"users"}, {"", "", "bob", "alice,bob", "camd"});
    check("bob", {}, {"", "alice", "alice", "alice,bob", "camd"});
    check("bob", {"video"}, {"", "alice,bob", "alice", "alice,bob", "camd"});
    check("camd", {}, BEFORE);
    check("camd", {"users"}, {"", "alice", "alice,bob", "alice,bob,camd", "camd"});
}

TEST_F(UserModifyGroups, FileOfAnEmptiedList) {
    EXPECT_EQ(modify("alice", {.groups = {{}}}), "");
    expect_files(PASSWD, SHADOW,
                 edited(edited(GROUP, "video:x:44:alice\n", "video:x:44:\n"),
                        "audio:x:45:alice,bob\n", "audio:x:45:bob\n"));
}

TEST_F(UserModifyGroups, FileOfAReplacedList) {
    EXPECT_EQ(modify("alice", {.groups = {{"nvr", "video"}}}), "");
    expect_files(PASSWD, SHADOW,
                 edited(edited(GROUP, "nvr:x:60005:\n", "nvr:x:60005:alice\n"),
                        "audio:x:45:alice,bob\n", "audio:x:45:bob\n"));
}

// A user whose primary group does not list it: that group is neither left nor joined.
TEST_F(UserModifyGroups, PrimaryGroupThatDoesNotListTheUser) {
    const std::string group = edited(GROUP, "users:x:100:alice,bob\n", "users:x:100:bob\n");
    write("group", group);
    reopen();
    EXPECT_EQ(modify("alice", {.groups = {{"users", "video"}}}), "");
    EXPECT_EQ(members("users"), "bob");
    EXPECT_EQ(with_members_sorted(read("group")),
              edited(group, "audio:x:45:alice,bob\n", "audio:x:45:bob\n"));
}

TEST_F(UserModifyGroups, TogetherWithANewPrimaryGroup) {
    struct both_case {
        const char *group;
        std::vector<const char *> wanted;
        lines memberships;
    };
    const both_case cases[] = {
        {"camera", {},                  {"", "", "bob", "bob", "alice,camd"}      },
        {"camera", {"users"},           {"", "", "bob", "alice,bob", "alice,camd"}},
        {"camera", {"camera", "video"}, {"", "alice", "bob", "bob", "alice,camd"} },
        {"video",  {},                  {"", "alice", "bob", "bob", "camd"}       },
        {"video",  {"audio"},           {"", "alice", "alice,bob", "bob", "camd"} },
    };
    for (const both_case &row : cases) {
        write("passwd", PASSWD);
        write("group", GROUP);
        reopen();
        EXPECT_EQ(modify("alice", {.group = row.group, .groups = row.wanted}), "");
        EXPECT_EQ(memberships(), row.memberships) << row.group;
        EXPECT_EQ(user("alice")->gid, group(row.group)->gid);
        expect_memory_on_disk();
    }
}

// A second group with the GID of the primary one is a secondary group like any other.
TEST_F(UserModifyGroups, GroupsWithOneGid) {
    write("group", GROUP + "twin:x:100:alice\n");
    reopen();
    // The index leads to the later record, which so is the primary group.
    EXPECT_EQ(modify("alice", {.groups = {{"video"}}}), "");
    EXPECT_EQ(members("twin"), "alice");
    EXPECT_EQ(members("users"), "bob");
    EXPECT_EQ(modify("bob", {.group = "users"}), "");
    EXPECT_EQ(user("bob")->gid, 100U);
    EXPECT_EQ(members("users"), "bob");
}

TEST_F(UserModifyGroups, EmptyListWarnsOfGroupsThatAreGone) {
    hide("video");
    EXPECT_EQ(modify("alice", {.groups = {{}}}), "");
    EXPECT_EQ(take_syslog(),
              lines{"4 Attempted to remove 'alice' from non-existing group 'video'"});
    expect_files(PASSWD, SHADOW, edited(GROUP, "audio:x:45:alice,bob\n", "audio:x:45:bob\n"));
}

// The group that was joined before stays so in memory, but does not count as changed.
TEST_F(UserModifyGroups, GroupToLeaveThatIsGoneFails) {
    hide("video");
    EXPECT_EQ(modify("alice", {.groups = {{"camera", "audio"}}}),
              "usermgmt 4: Failed to modify user 'alice', sec. groups: could not update groups: "
              "could not remove user from non-existent group 'video'");
    EXPECT_EQ(members("camera"), "alice,camd");
    EXPECT_FALSE(ctx_->group_db.dirty);
    EXPECT_EQ(replaced(), lines());

    EXPECT_EQ(add_group("another"), "");
    EXPECT_EQ(
        with_members_sorted(read("group")),
        edited(GROUP, "camera:x:995:camd\n", "camera:x:995:alice,camd\n") + "another::994:\n");
}

TEST_F(UserModifyGroups, NameThatNoGroupCanListIsRefused) {
    write("passwd", PASSWD + "a,b:x:950:100:::/bin/false\n");
    write("shadow", SHADOW + "a,b:*:19000:0:99999:7:0::\n");
    reopen();
    EXPECT_EQ(modify("a,b", {.groups = {{"nvr", "audio"}}}),
              "corefile 101: Failed to modify user 'a,b', unable to sync core files, failed to "
              "write 1/3 core file(s) group: could not write entry #3 to etc/group.tmp: Invalid "
              "argument");
    expect_nothing_changed();
    EXPECT_EQ(modify("a,b", {.group = "camera", .groups = {{"nvr"}}}),
              "corefile 101: Failed to modify user 'a,b', unable to sync core files, failed to "
              "write 1/3 core file(s) group: could not write entry #5 to etc/group.tmp: Invalid "
              "argument");
    expect_nothing_changed();
    // Where no list changes, the name does no harm.
    EXPECT_EQ(modify("a,b", {.groups = {{}}, .gecos = "comma", .shell = "/bin/sh"}), "");
    EXPECT_EQ(modify("a,b", {.group = "users", .groups = {{"users"}}}), "");
    EXPECT_EQ(read("passwd"), PASSWD + "a,b:x:950:100:comma::/bin/sh\n");
}
