// tests/unit/usermgmt/change_reload_test.cpp: what a change that failed leaves in memory, and what
// becomes of it. Most of it looks odd and is meant so.
#include <cerrno>

#include "tests/unit/usermgmt/changed_accounts.h"

class ChangeReload : public ChangedAccounts {
  protected:
    static entry_fields named(const char *name) {
        return {.type = USER_TYPE_DYNAMIC_SYSTEM, .name = name, .group = "users"};
    }
    // The error of an action whose write fails at the first file it writes.
    std::string failing(const std::function<std::string()> &action) {
        io_trace trace;
        for (const char *name : {"passwd", "group"})
            trace.fail("fsync", std::string("etc/") + name + ".tmp", 1, EIO);
        return action();
    }
    static std::string error_of(const char *action, const char *file) {
        return std::string("corefile 101: Failed to ") + action +
               ", unable to sync core files, failed to write 1/3 core file(s) " + file +
               ": could not fsync() file 'etc/" + file + ".tmp': Input/output error";
    }
    std::string gecos_of(const char *name) { return user(name)->gecos; }
    bool has_user(const char *name) { return user(name) != nullptr; }
    bool has_group(const char *name) { return group(name) != nullptr; }
    // Runs an action that has to warn of databases that are changed on entry.
    static void with_warnings(std::size_t count, const std::function<void()> &action) {
        EXPECT_EQ(glib_log_of(action).size(), count);
    }
};

// The users come back, the memberships do not: the next write carries them.
TEST_F(ChangeReload, FailedAddLeavesTheMemberships) {
    entry_fields svc = named("svc");
    svc.groups = {"video"};
    EXPECT_EQ(failing([&] { return add(svc); }), error_of("add user 'svc'", "passwd"));
    EXPECT_FALSE(has_user("svc"));
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_EQ(members("users"), "alice,bob,svc");
    EXPECT_EQ(members("video"), "alice,svc");
    EXPECT_TRUE(ctx_->group_db.dirty);
    expect_files(PASSWD, SHADOW, GROUP);

    EXPECT_EQ(disable("camd"), "");
    EXPECT_EQ(with_members_sorted(read("group")),
              edited(edited(GROUP, "users:x:100:alice,bob\n", "users:x:100:alice,bob,svc\n"),
                     "video:x:44:alice\n", "video:x:44:alice,svc\n"));
    EXPECT_FALSE(ctx_->group_db.dirty);

    // The next try finds the membership there.
    EXPECT_EQ(add(named("svc")), "");
    EXPECT_EQ(members("users"), "alice,bob,svc");
    expect_memory_on_disk();
}

TEST_F(ChangeReload, FailedAddDropsTheUsersOfEarlierChanges) {
    EXPECT_EQ(add(named("first")), "");
    EXPECT_EQ(failing([&] { return add(named("second")); }),
              error_of("add user 'second'", "passwd"));
    // The cache holds the state at open, not that of the last write.
    EXPECT_FALSE(has_user("first"));
    EXPECT_NE(read("passwd").find("first:"), std::string::npos);

    EXPECT_EQ(add(named("third")), "");
    EXPECT_EQ(read("passwd"), PASSWD + "third:x:989:100:::/bin/false\n");
    EXPECT_EQ(members("users"), "alice,bob,first,second,third");
}

// Without a cache the files are read again, the groups first: nothing of the failed change is left.
TEST_F(ChangeReload, WithoutCacheTheLastWriteComesBack) {
    reopen(USERMGMT_OPEN_NO_CACHE);
    EXPECT_EQ(add(named("first")), "");
    remember();
    EXPECT_EQ(failing([&] { return add(named("second")); }),
              error_of("add user 'second'", "passwd"));
    EXPECT_TRUE(has_user("first"));
    EXPECT_FALSE(has_user("second"));
    EXPECT_EQ(members("users"), "alice,bob,first");
    EXPECT_FALSE(ctx_->group_db.dirty);
    EXPECT_EQ(ctx_->cached[CORE_FILE_ROW_PASSWD].data, nullptr);
}

// 1 selects nothing: a modification of users alone stays in memory, marked, and is written next.
TEST_F(ChangeReload, FailedModificationOfUsersStays) {
    EXPECT_EQ(failing([&] { return modify("alice", {.gecos = "New"}); }),
              error_of("modify user 'alice'", "passwd"));
    EXPECT_EQ(gecos_of("alice"), "New");
    EXPECT_TRUE(ctx_->user_db.dirty);
    EXPECT_FALSE(ctx_->group_db.dirty);
    expect_files(PASSWD, SHADOW, GROUP);

    with_warnings(1, [this] { EXPECT_EQ(modify("bob", {.gecos = "Bob"}), ""); });
    EXPECT_EQ(read("passwd"), edited(edited(PASSWD, ":Alice:", ":New:"),
                                     "bob:x:1005:100::", "bob:x:1005:100:Bob:"));
}

TEST_F(ChangeReload, FailedModificationOfUsersReadsNothingWithoutCache) {
    reopen(USERMGMT_OPEN_NO_CACHE);
    EXPECT_EQ(failing([&] { return modify("alice", {.gecos = "New"}); }),
              error_of("modify user 'alice'", "passwd"));
    EXPECT_EQ(gecos_of("alice"), "New");
    EXPECT_TRUE(ctx_->user_db.dirty);
}

// 2 is the passwd file: a modification of groups alone drops users, and the groups stay.
TEST_F(ChangeReload, FailedModificationOfGroupsDropsUsers) {
    EXPECT_EQ(modify("bob", {.gecos = "Bob"}), "");
    EXPECT_EQ(failing([&] { return modify("alice", {.groups = {{"camera"}}}); }),
              error_of("modify user 'alice'", "group"));
    EXPECT_EQ(members("camera"), "alice,camd");
    EXPECT_EQ(members("video"), "");
    EXPECT_TRUE(ctx_->group_db.dirty);
    EXPECT_EQ(gecos_of("bob"), "");
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_EQ(with_members_sorted(read("group")), GROUP);

    EXPECT_EQ(add_group("another"), "");
    EXPECT_EQ(with_members_sorted(read("group")),
              edited(edited(edited(GROUP, "video:x:44:alice\n", "video:x:44:\n"),
                            "audio:x:45:alice,bob\n", "audio:x:45:bob\n"),
                     "camera:x:995:camd\n", "camera:x:995:alice,camd\n") +
                  "another::994:\n");
}

TEST_F(ChangeReload, FailedModificationOfGroupsWithoutCache) {
    reopen(USERMGMT_OPEN_NO_CACHE);
    EXPECT_EQ(failing([&] { return modify("alice", {.groups = {{"camera"}}}); }),
              error_of("modify user 'alice'", "group"));
    // The passwd file's bit brings the groups along then.
    EXPECT_EQ(members("camera"), "camd");
    EXPECT_FALSE(ctx_->group_db.dirty);
    expect_nothing_changed();
}

TEST_F(ChangeReload, FailedModificationOfBothDropsTheUsersOnly) {
    EXPECT_EQ(failing([&] { return modify("alice", {.groups = {{"camera"}}, .gecos = "New"}); }),
              error_of("modify user 'alice'", "passwd"));
    EXPECT_EQ(gecos_of("alice"), "Alice");
    EXPECT_EQ(members("camera"), "alice,camd");
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_TRUE(ctx_->group_db.dirty);
}

TEST_F(ChangeReload, FailedMoveToAnotherPrimaryGroupDropsBoth) {
    EXPECT_EQ(failing([&] {
                  return modify("alice", {.group = "camera", .groups = {{"nvr"}}, .gecos = "New"});
              }),
              error_of("modify user 'alice'", "passwd"));
    expect_nothing_changed();
}

// The primary group was replaced, but no list changed: the mask stands all the same.
TEST_F(ChangeReload, FailureAfterANewGidAloneDropsBoth) {
    write("group", edited(edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"), "nvr:x:60005:\n",
                          "nvr:x:60005:camd\n"));
    reopen();
    EXPECT_EQ(add_group("sound"), "");
    EXPECT_EQ(failing([&] { return modify("camd", {.group = "nvr", .gecos = "New"}); }),
              error_of("modify user 'camd'", "passwd"));
    EXPECT_EQ(user("camd")->gid, 995U);
    EXPECT_EQ(gecos_of("camd"), "Camera");
    EXPECT_FALSE(has_group("sound"));
}

// "Same group" replaces nothing.
TEST_F(ChangeReload, FailureWithTheOldPrimaryGroupKeepsUsers) {
    EXPECT_EQ(add_group("sound"), "");
    EXPECT_EQ(failing([&] { return modify("alice", {.group = "users", .gecos = "New"}); }),
              error_of("modify user 'alice'", "passwd"));
    EXPECT_EQ(gecos_of("alice"), "New");
    EXPECT_TRUE(has_group("sound"));
}

// The order of the steps: groups before the password, the password before comment and shell.
TEST_F(ChangeReload, PasswordThatFailsInTheMiddle) {
    sources_.read_error = EIO;
    EXPECT_EQ(
        modify("camd",
               {.password = "new", .groups = {{"audio"}}, .gecos = "New", .shell = "/bin/sh"}),
        "usermgmt 16: Failed to modify user 'camd', could not create password salt");
    EXPECT_EQ(take_syslog().size(), 2U);
    EXPECT_EQ(members("audio"), "alice,bob,camd");
    EXPECT_TRUE(ctx_->group_db.dirty);
    EXPECT_EQ(gecos_of("camd"), "Camera");
    EXPECT_STREQ(user("camd")->shell, "/bin/false");
    EXPECT_EQ(replaced(), lines());
    sources_.read_error = 0;
    EXPECT_EQ(disable("guest"), "");
    EXPECT_EQ(with_members_sorted(read("group")),
              edited(GROUP, "audio:x:45:alice,bob\n", "audio:x:45:alice,bob,camd\n"));
}

TEST_F(ChangeReload, PasswordThatFailsAfterANewPrimaryGroup) {
    sources_.read_error = EIO;
    EXPECT_EQ(modify("camd", {.password = "new", .group = "users"}),
              "usermgmt 16: Failed to modify user 'camd', could not create password salt");
    EXPECT_EQ(take_syslog().size(), 2U);
    expect_nothing_changed();
}

// The mask looks at the databases, not at what this call did.
TEST_F(ChangeReload, RefusalWithChangedGroupsDropsUsers) {
    EXPECT_EQ(modify("bob", {.gecos = "Bob"}), "");
    ctx_->group_db.dirty = TRUE;
    with_warnings(1, [this] {
        EXPECT_EQ(modify("alice", {.shell = "/bin/sh"}),
                  "usermgmt 12: Failed to modify user 'alice', no shell login allowed for ORNET "
                  "users");
    });
    EXPECT_EQ(gecos_of("bob"), "");
    EXPECT_TRUE(ctx_->group_db.dirty);
}

TEST_F(ChangeReload, RefusalWithChangedUsersKeepsThem) {
    ctx_->user_db.dirty = TRUE;
    with_warnings(1, [this] {
        EXPECT_EQ(modify("nosuch", {.shell = "/bin/sh"}),
                  "usermgmt 3: Failed to modify user 'nosuch', user does not exist");
    });
    EXPECT_TRUE(ctx_->user_db.dirty);
}

TEST_F(ChangeReload, RefusedRecordInAModificationTakesTheUsualMask) {
    EXPECT_EQ(modify("bob", {.gecos = "Bob"}), "");
    EXPECT_NE(modify("camd", {.shell = "a:b"}), "");
    EXPECT_EQ(gecos_of("bob"), "Bob");
    ctx_->group_db.dirty = TRUE;
    with_warnings(1, [this] { EXPECT_NE(modify("camd", {.shell = "a:b"}), ""); });
    EXPECT_EQ(gecos_of("bob"), "");
}

TEST_F(ChangeReload, RefusedRecordInAnAddReloadsNothing) {
    EXPECT_EQ(modify("bob", {.gecos = "Bob"}), "");
    EXPECT_EQ(add_group("sound"), "");
    remember();
    EXPECT_NE(add(named(" root")), "");
    EXPECT_NE(add(named("a,b")), "");
    EXPECT_NE(add(named("alice")), "");
    expect_nothing_changed();
}

TEST_F(ChangeReload, FailedDeletionDropsBoth) {
    EXPECT_EQ(modify("bob", {.gecos = "Bob"}), "");
    EXPECT_EQ(add_group("sound"), "");
    EXPECT_EQ(failing([&] { return delete_user("alice"); }),
              error_of("delete user 'alice'", "passwd"));
    EXPECT_TRUE(has_user("alice"));
    EXPECT_EQ(members("users"), "alice,bob");
    EXPECT_EQ(gecos_of("bob"), "");
    EXPECT_FALSE(has_group("sound"));
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_FALSE(ctx_->group_db.dirty);
}

TEST_F(ChangeReload, RefusedDeletionReloadsNothing) {
    EXPECT_EQ(modify("bob", {.gecos = "Bob"}), "");
    EXPECT_EQ(add_group("sound"), "");
    remember();
    EXPECT_NE(delete_user("root"), "");
    EXPECT_NE(delete_user("nosuch"), "");
    EXPECT_NE(disable("root"), "");
    EXPECT_NE(disable("nosuch"), "");
    EXPECT_NE(delete_group("camera"), "");
    EXPECT_NE(delete_group("nosuch"), "");
    EXPECT_NE(add_group("video"), "");
    EXPECT_NE(add_group("new", {"nosuch"}), "");
    expect_nothing_changed();
}

TEST_F(ChangeReload, FailedDisablingDropsTheUsersOnly) {
    EXPECT_EQ(modify("bob", {.gecos = "Bob"}), "");
    EXPECT_EQ(add_group("sound"), "");
    EXPECT_EQ(failing([&] { return disable("camd"); }),
              error_of("disable password for  'camd'", "passwd"));
    EXPECT_NE(user("camd")->password, nullptr);
    EXPECT_EQ(gecos_of("bob"), "");
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_TRUE(has_group("sound"));
}

TEST_F(ChangeReload, FailedGroupChangesDropTheGroupsOnly) {
    EXPECT_EQ(modify("bob", {.gecos = "Bob"}), "");
    EXPECT_EQ(add_group("sound"), "");
    EXPECT_EQ(failing([&] { return add_group("light"); }), error_of("add group 'light'", "group"));
    EXPECT_FALSE(has_group("light"));
    EXPECT_FALSE(has_group("sound"));
    EXPECT_FALSE(ctx_->group_db.dirty);
    EXPECT_EQ(gecos_of("bob"), "Bob");

    EXPECT_EQ(failing([&] { return delete_group("nvr"); }),
              error_of("delete group 'nvr'", "group"));
    EXPECT_TRUE(has_group("nvr"));
    EXPECT_FALSE(ctx_->group_db.dirty);
    EXPECT_EQ(gecos_of("bob"), "Bob");
    // The next write goes by memory.
    EXPECT_EQ(add_group("light"), "");
    EXPECT_EQ(with_members_sorted(read("group")), GROUP + "light::994:\n");
}
