// tests/unit/usermgmt/user_modify_test.cpp: changing users in place, down to the bytes of the
// files.
#include <cerrno>

#include "tests/unit/usermgmt/changed_accounts.h"

class UserModify : public ChangedAccounts {};

TEST_F(UserModify, MissingArguments) {
    const filled_entry entry({.gecos = "x"});
    usermgmt_ctx closed = {};
    error_slot error;
    static constexpr const char *UNUSABLE =
        "usermgmt 17: Failed to modify user: Invalid or uninitialised context";
    EXPECT_FALSE(usermgmt_modify_user(nullptr, "alice", entry.get(), error.out()));
    EXPECT_EQ(error.text(), UNUSABLE);
    EXPECT_FALSE(usermgmt_modify_user(&closed, nullptr, nullptr, error.out()));
    EXPECT_EQ(error.text(), UNUSABLE);
    EXPECT_FALSE(usermgmt_modify_user(ctx_.get(), nullptr, nullptr, error.out()));
    EXPECT_EQ(error.text(),
              "usermgmt 17: Failed to modify user: Invalid or missing 'username' argument");
    EXPECT_FALSE(usermgmt_modify_user(ctx_.get(), "alice", nullptr, error.out()));
    EXPECT_EQ(error.text(),
              "usermgmt 17: Failed to modify user: Invalid or missing 'mod_user' argument");
    expect_nothing_changed();
}

TEST_F(UserModify, RefusalsChangeNothing) {
    const auto check = [this](const char *username, const entry_fields &fields, const char *error) {
        EXPECT_EQ(modify(username, fields), error);
        expect_nothing_changed();
        const filled_entry entry(fields);
        EXPECT_FALSE(usermgmt_modify_user(ctx_.get(), username, entry.get(), nullptr));
    };
    const std::string long_password(65, 'p');
    check("alice", {.name = "bob", .gecos = "x"},
          "usermgmt 17: Failed to modify user 'alice', changing username is not permitted");
    check("nosuch", {.name = "bob"},
          "usermgmt 17: Failed to modify user 'nosuch', changing username is not permitted");
    check("nosuch", {.gecos = "x"},
          "usermgmt 3: Failed to modify user 'nosuch', user does not exist");
    check("nosuch", {}, "usermgmt 3: Failed to modify user 'nosuch', user does not exist");
    check("alice", {.type = 3, .gecos = "x"},
          "usermgmt 17: Failed to modify user 'alice', changing user type is not permitted");
    check("alice", {.type = 3},
          "usermgmt 17: Failed to modify user 'alice', changing user type is not permitted");
    check("alice", {.shell = "/bin/sh"},
          "usermgmt 12: Failed to modify user 'alice', no shell login allowed for ORNET users");
    check("alice", {.shell = ""},
          "usermgmt 12: Failed to modify user 'alice', no shell login allowed for ORNET users");
    check("alice", {.password = ""},
          "usermgmt 10: Failed to modify user 'alice', password too short, must have at least one "
          "character");
    check("alice", {.password = long_password.c_str()},
          "usermgmt 10: Failed to modify user 'alice', password too long, max allowed length is 64 "
          "characters");
    check("alice", {.group = "nosuch"},
          "usermgmt 4: Failed to modify user 'alice', primary group 'nosuch' does not exist");
    check("alice", {.groups = {{"video", "nosuch"}}},
          "usermgmt 4: Failed to modify user 'alice', secondary group 'nosuch' does not exist");
    check("root", {.gecos = "x"},
          "usermgmt 5: Failed to modify user 'root', only the password can be modified for root "
          "user");
    check("root", {.password = "p", .shell = "/bin/sh"},
          "usermgmt 5: Failed to modify user 'root', only the password can be modified for root "
          "user");
    check("root", {.password = "p", .groups = {{}}},
          "usermgmt 5: Failed to modify user 'root', only the password can be modified for root "
          "user");
    check("root", {.password = ""},
          "usermgmt 10: Failed to modify user 'root', password too short, must have at least one "
          "character");
    check("guest", {.groups = {{"video"}}},
          "usermgmt 5: Failed to modify user 'guest', permanent system users cannot be modified");
    check("daemon", {.password = "p"},
          "usermgmt 5: Failed to modify user 'daemon', permanent system users cannot be modified");
    check("anonymous", {.password = "p"},
          "usermgmt 5: Failed to modify user 'anonymous', permanent system users cannot be "
          "modified");
    check("nobody", {.gecos = "x"},
          "usermgmt 5: Failed to modify user 'nobody', invalid user type 'nobody'");
    check("camd", {.password = ""},
          "usermgmt 10: Failed to modify user 'camd', invalid password of size 0");
    expect_nothing_changed();
}

TEST_F(UserModify, NothingPresentTouchesNothing) {
    io_trace trace;
    for (const char *name : {"alice", "root", "guest", "nobody"}) {
        EXPECT_EQ(modify(name, {}), "");
        EXPECT_EQ(modify(name, {.name = name}), "");
        EXPECT_EQ(modify(name, {.uid = 5}), "");
    }
    EXPECT_EQ(modify("alice", {.type = 4, .name = "alice", .uid = 0}), "");
    EXPECT_EQ(trace.calls(), lines());
    expect_nothing_changed();
}

TEST_F(UserModify, UidIsIgnored) {
    EXPECT_EQ(modify("alice", {.gecos = "New", .uid = 4711}), "");
    expect_files(edited(PASSWD, ":Alice:", ":New:"), SHADOW, GROUP);
}

TEST_F(UserModify, Gecos) {
    EXPECT_EQ(modify("alice", {.gecos = "Alice A."}), "");
    expect_files(edited(PASSWD, ":Alice:", ":Alice A.:"), SHADOW, GROUP);
    EXPECT_EQ(replaced(), (lines{"passwd", "shadow"}));
    expect_memory_on_disk();

    EXPECT_EQ(modify("alice", {.gecos = ""}), "");
    expect_files(edited(PASSWD, ":Alice:", "::"), SHADOW, GROUP);
    expect_memory_on_disk();

    remember();
    EXPECT_EQ(modify("alice", {.gecos = ""}), "");
    expect_nothing_changed();
}

TEST_F(UserModify, Shell) {
    EXPECT_EQ(modify("camd", {.shell = "/bin/sh"}), "");
    expect_files(edited(PASSWD, "/var/lib/camd:/bin/false\n", "/var/lib/camd:/bin/sh\n"), SHADOW,
                 GROUP);
    EXPECT_EQ(replaced(), (lines{"passwd", "shadow"}));
    EXPECT_EQ(modify("camd", {.shell = ""}), "");
    expect_files(edited(PASSWD, "/var/lib/camd:/bin/false\n", "/var/lib/camd:\n"), SHADOW, GROUP);
    expect_memory_on_disk();
    remember();
    EXPECT_EQ(modify("camd", {.shell = ""}), "");
    expect_nothing_changed();
}

TEST_F(UserModify, SameValuesWriteNothing) {
    EXPECT_EQ(modify("camd", {.password = "camdpass",
                              .group = "camera",
                              .groups = {{}},
                              .gecos = "Camera",
                              .shell = "/bin/false"}),
              "");
    EXPECT_EQ(modify("alice", {.password = "alicepass",
                               .group = "users",
                               .groups = {{"audio", "video", "audio"}},
                               .gecos = "Alice"}),
              "");
    expect_nothing_changed();
}

TEST_F(UserModify, Password) {
    EXPECT_EQ(modify("alice", {.password = "another"}), "");
    const std::string hash = fresh_hash("alice", "another");
    const std::string shadow = edited(
        SHADOW, std::string("alice:") + ALICES_HASH + ":19005:", "alice:" + hash + ":20000:");
    expect_files(PASSWD, shadow, GROUP);
    EXPECT_EQ(replaced(), (lines{"passwd", "shadow"}));

    sources_.now = (DAY + 1) * 86400;
    remember();
    EXPECT_EQ(modify("alice", {.password = "another"}), "");
    expect_nothing_changed();
    expect_memory_on_disk();
}

TEST_F(UserModify, PasswordOfRoot) {
    const std::string long_password(511, 'p');
    for (const char *password : {"r", "rootpass", long_password.c_str()}) {
        EXPECT_EQ(modify("root", {.password = password}), "");
        const std::string hash = fresh_hash("root", password);
        expect_files(PASSWD,
                     edited(SHADOW, "root:$6$rootsalt$roothash:19000:", "root:" + hash + ":20000:"),
                     GROUP);
    }
    const std::string shadow = read("shadow");
    remember();
    EXPECT_EQ(modify("root", {.password = std::string(512, 'p').c_str()}),
              "usermgmt 16: Failed to modify user 'root', crypt() failed, Numerical result out of "
              "range");
    expect_nothing_changed();
    EXPECT_EQ(read("shadow"), shadow);
    EXPECT_EQ(shadow.find("*0"), std::string::npos);
}

// Where the hash is kept never changes here.
TEST_F(UserModify, PasswordStaysInItsFile) {
    write("passwd", edited(PASSWD, "alice:x:", "alice:*:"));
    write("shadow",
          edited(SHADOW, std::string("alice:") + ALICES_HASH + ":19005:0:99999:7:0::\n", ""));
    reopen();
    EXPECT_EQ(modify("alice", {.password = "plain"}), "");
    const std::string hash = user("alice")->password;
    EXPECT_EQ(hash.rfind("$5$", 0), 0U);
    EXPECT_FALSE(user("alice")->shadowed);
    expect_files(edited(PASSWD, "alice:x:", "alice:" + hash + ":"),
                 edited(SHADOW, std::string("alice:") + ALICES_HASH + ":19005:0:99999:7:0::\n", ""),
                 GROUP);
}

TEST_F(UserModify, PrimaryGroup) {
    EXPECT_EQ(modify("alice", {.group = "camera"}), "");
    expect_files(edited(PASSWD, "alice:x:1000:100:", "alice:x:1000:995:"), SHADOW,
                 edited(edited(GROUP, "users:x:100:alice,bob\n", "users:x:100:bob\n"),
                        "camera:x:995:camd\n", "camera:x:995:alice,camd\n"));
    EXPECT_EQ(replaced(), (lines{"group", "passwd", "shadow"}));
    expect_memory_on_disk();
}

TEST_F(UserModify, PrimaryGroupThatIsASecondaryOne) {
    EXPECT_EQ(modify("alice", {.group = "video"}), "");
    expect_files(edited(PASSWD, "alice:x:1000:100:", "alice:x:1000:44:"), SHADOW,
                 edited(GROUP, "users:x:100:alice,bob\n", "users:x:100:bob\n"));
    expect_memory_on_disk();
}

TEST_F(UserModify, PrimaryGroupThatDidNotListTheUser) {
    write("group", edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"));
    reopen();
    EXPECT_EQ(modify("camd", {.group = "users"}), "");
    expect_files(edited(PASSWD, "camd:x:990:995:", "camd:x:990:100:"), SHADOW,
                 edited(edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"),
                        "users:x:100:alice,bob\n", "users:x:100:alice,bob,camd\n"));
}

// Neither list changes, so nothing counts as changed, though the GID did.
TEST_F(UserModify, NewGidAloneIsNotWritten) {
    write("group", edited(edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"), "nvr:x:60005:\n",
                          "nvr:x:60005:camd\n"));
    reopen();
    EXPECT_EQ(modify("camd", {.group = "nvr"}), "");
    EXPECT_EQ(user("camd")->gid, 60005U);
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_FALSE(ctx_->group_db.dirty);
    EXPECT_EQ(replaced(), lines());
    EXPECT_EQ(read("passwd"), PASSWD);

    EXPECT_EQ(modify("alice", {.gecos = "New"}), "");
    EXPECT_EQ(read("passwd"),
              edited(edited(PASSWD, ":Alice:", ":New:"), "camd:x:990:995:", "camd:x:990:60005:"));
}

TEST_F(UserModify, EverythingAtOnce) {
    EXPECT_EQ(modify("camd", {.type = 3,
                              .name = "camd",
                              .password = "fresh",
                              .group = "users",
                              .groups = {{"video", "camera"}},
                              .gecos = "New",
                              .shell = "/bin/sh",
                              .uid = 1}),
              "");
    const std::string hash = fresh_hash("camd", "fresh");
    const std::string old_hash = "$5$ZZZZZZZZZZZZ$zudeleVaZfzgzvtsL.HxHI5hndEd6eifjOotGYM6oD5";
    expect_files(edited(PASSWD, "camd:x:990:995:Camera:/var/lib/camd:/bin/false",
                        "camd:x:990:100:New:/var/lib/camd:/bin/sh"),
                 edited(SHADOW, "camd:" + old_hash + ":19004", "camd:" + hash + ":20000"),
                 edited(edited(GROUP, "users:x:100:alice,bob\n", "users:x:100:alice,bob,camd\n"),
                        "video:x:44:alice\n", "video:x:44:alice,camd\n"));
    expect_memory_on_disk();
}

// The one permanent user that may be changed, and only along with a secondary list.
TEST_F(UserModify, AnonymousWithASecondaryList) {
    EXPECT_EQ(modify("anonymous", {.password = std::string(100, 'p').c_str(),
                                   .groups = {{"video"}},
                                   .gecos = "Anyone",
                                   .shell = "/bin/sh"}),
              "");
    const std::string hash = fresh_hash("anonymous", std::string(100, 'p').c_str());
    expect_files(edited(PASSWD, ":Visitor:/:/bin/false", ":Anyone:/:/bin/sh"),
                 edited(SHADOW, "anonymous:!:19002", "anonymous:" + hash + ":20000"),
                 edited(GROUP, "video:x:44:alice\n", "video:x:44:alice,anonymous\n"));
    EXPECT_EQ(modify("anonymous", {.groups = {{}}}), "");
    EXPECT_EQ(with_members_sorted(read("group")), GROUP);
    EXPECT_EQ(modify("anonymous", {.password = "", .groups = {{}}}),
              "usermgmt 10: Failed to modify user 'anonymous', invalid password of size 0");
}

// What an earlier failure left changed is told, and written along.
TEST_F(UserModify, ChangedDatabasesOnEntryAreWarnedOf) {
    ctx_->user_db.dirty = TRUE;
    ctx_->group_db.dirty = TRUE;
    const lines log = glib_log_of([this] { EXPECT_EQ(modify("alice", {.gecos = "New"}), ""); });
    ASSERT_EQ(log.size(), 2U);
    EXPECT_EQ(log[0].rfind("usermgmt-WARNING: (user_modify:", 0), 0U) << log[0];
    EXPECT_NE(log[0].find(":usermgmt_modify_user: runtime check failed: (user_db->dirty == FALSE)"),
              std::string::npos)
        << log[0];
    EXPECT_NE(
        log[1].find(":usermgmt_modify_user: runtime check failed: (group_db->dirty == FALSE)"),
        std::string::npos)
        << log[1];
    EXPECT_EQ(replaced(), (lines{"group", "passwd", "shadow"}));

    ctx_->group_db.dirty = TRUE;
    EXPECT_EQ(glib_log_of([this] { EXPECT_EQ(modify("alice", {}), ""); }).size(), 1U);
    EXPECT_TRUE(ctx_->group_db.dirty);
    EXPECT_EQ(replaced(), lines());
}

// A group that is gone while a user that it did not list still has its GID.
TEST_F(UserModify, UserWithoutPrimaryGroup) {
    write("group", edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"));
    reopen();
    EXPECT_EQ(delete_group("camera"), "");
    EXPECT_EQ(modify("camd", {.groups = {{"video"}}}),
              "usermgmt 4: Failed to modify user 'camd', could not get primary group!");
    EXPECT_FALSE(usermgmt_group_exists(ctx_.get(), "camera"));

    EXPECT_EQ(modify("camd", {.group = "users"}),
              "usermgmt 16: Failed to modify user 'camd', primary group (995) for user does not "
              "exist!!");
    EXPECT_EQ(take_syslog(),
              lines{"3 Mis-match in user/group DB! (Pri grp '995' missing for 'camd')"});
    // Everything was loaded again, as it was at open.
    EXPECT_TRUE(usermgmt_group_exists(ctx_.get(), "camera"));
    EXPECT_EQ(user("camd")->gid, 995U);
}

TEST_F(UserModify, UserWithoutPrimaryGroupCanChangeTheRest) {
    write("group", edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"));
    reopen();
    EXPECT_EQ(delete_group("camera"), "");
    EXPECT_EQ(modify("camd", {.gecos = "New"}), "");
    EXPECT_EQ(read("passwd"), edited(PASSWD, ":Camera:", ":New:"));
}

TEST_F(UserModify, ReplacedHashIsWiped) {
    secret_watch watch;
    watch.add(user("alice")->password);
    EXPECT_EQ(modify("alice", {.password = "another"}), "");
    EXPECT_EQ(watch.wiped(), 1);
    for (const std::string &held : watch.readable())
        EXPECT_NE(held, ALICES_HASH);
}
