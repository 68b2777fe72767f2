// tests/unit/usermgmt/user_add_test.cpp: adding users, down to the bytes of the files.
#include <sys/stat.h>

#include <cerrno>

#include "tests/unit/usermgmt/changed_accounts.h"

class UserAdd : public ChangedAccounts {
  protected:
    // An "ornet" user that can be added.
    static entry_fields carol() {
        return {.type = USER_TYPE_ORNET, .name = "carol", .password = "secret", .group = "users"};
    }
    // A "dynamic system" user without a password.
    static entry_fields svc() {
        return {.type = USER_TYPE_DYNAMIC_SYSTEM, .name = "svc", .group = "users"};
    }
    static std::string with_carol(std::string group_file) {
        return edited(std::move(group_file), "users:x:100:alice,bob\n",
                      "users:x:100:alice,bob,carol\n");
    }
    void fill_up_ornet_users() {
        std::string passwd = PASSWD;
        for (int i = 0; i < 98; i++)
            passwd += "u" + std::to_string(i) + ":*:" + std::to_string(2000 + i) + ":100:::\n";
        write("passwd", passwd);
        reopen();
    }
};

TEST_F(UserAdd, MissingArguments) {
    const filled_entry entry(carol());
    usermgmt_ctx closed = {};
    error_slot error;
    static constexpr const char *UNUSABLE =
        "usermgmt 17: Failed to add user: Invalid or uninitialised context";
    EXPECT_FALSE(usermgmt_add_user(nullptr, "carol", entry.get(), error.out()));
    EXPECT_EQ(error.text(), UNUSABLE);
    EXPECT_FALSE(usermgmt_add_user(&closed, nullptr, nullptr, error.out()));
    EXPECT_EQ(error.text(), UNUSABLE);
    EXPECT_FALSE(usermgmt_add_user(ctx_.get(), nullptr, nullptr, error.out()));
    EXPECT_EQ(error.text(),
              "usermgmt 17: Failed to add user: Invalid or missing 'username' argument");
    EXPECT_FALSE(usermgmt_add_user(ctx_.get(), "carol", nullptr, error.out()));
    EXPECT_EQ(error.text(),
              "usermgmt 17: Failed to add user: Invalid or missing 'new_user' argument");
    EXPECT_FALSE(usermgmt_add_user(ctx_.get(), "carol", nullptr, nullptr));
    expect_nothing_changed();
}

TEST_F(UserAdd, RefusalsChangeNothing) {
    const auto check = [this](const char *username, const entry_fields &fields, const char *error) {
        EXPECT_EQ(add(username, fields), error);
        expect_nothing_changed();
        const filled_entry entry(fields);
        EXPECT_FALSE(usermgmt_add_user(ctx_.get(), username, entry.get(), nullptr));
    };
    check("carol", {.type = 4, .password = "p", .group = "users"},
          "usermgmt 17: Failed to add user 'carol', usernames must match");
    check("carol", {.type = 4, .name = "Carol", .password = "p", .group = "users"},
          "usermgmt 17: Failed to add user 'carol', usernames must match");
    check("alice", {.type = 4, .name = "alice", .password = "p", .group = "users"},
          "usermgmt 6: Failed to add user 'alice', user already exists");
    check("root", {.type = 3, .name = "root", .group = "users"},
          "usermgmt 6: Failed to add user 'root', user already exists");
    check("alice", {.type = 4, .name = "bob"},
          "usermgmt 17: Failed to add user 'alice', usernames must match");
    check("carol", {.type = 4, .name = "carol", .password = "p"},
          "usermgmt 4: Failed to add user 'carol', no primary group specified");
    check(
        "carol", {.type = 1, .name = "carol", .password = "p", .group = "users"},
        "usermgmt 5: Failed to add user 'carol', only the password can be modified for root user");
    check("guest2", {.type = 2, .name = "guest2", .password = "p", .group = "users"},
          "usermgmt 5: Failed to add user 'guest2', permanent system users cannot be modified");
    check("carol", {.type = 0, .name = "carol", .password = "p", .group = "users"},
          "usermgmt 5: Failed to add user 'carol', invalid user type 'none'");
    check("carol", {.type = 5, .name = "carol", .password = "p", .group = "users"},
          "usermgmt 5: Failed to add user 'carol', invalid user type 'nobody'");
    check("carol", {.type = 6, .name = "carol", .password = "p", .group = "users"},
          "usermgmt 5: Failed to add user 'carol', invalid user type 'invalid'");
    check("john.doe", {.type = 4, .name = "john.doe", .password = "p", .group = "users"},
          "usermgmt 3: Failed to add user 'john.doe', username contains invalid characters");
    check("", {.type = 4, .name = "", .password = "p", .group = "users"},
          "usermgmt 3: Failed to add user '', username must have at least one character");
    check("abcdefghijklmno",
          {.type = 4, .name = "abcdefghijklmno", .password = "p", .group = "users"},
          "usermgmt 3: Failed to add user 'abcdefghijklmno', username too long, max allowed length "
          "is 14 characters");
    check("carol", {.type = 4, .name = "carol", .group = "users"},
          "usermgmt 10: Failed to add user 'carol', missing password");
    check("carol", {.type = 4, .name = "carol", .password = "", .group = "users"},
          "usermgmt 10: Failed to add user 'carol', password too short, must have at least one "
          "character");
    check("svc", {.type = 3, .name = "svc", .password = "", .group = "users"},
          "usermgmt 10: Failed to add user 'svc', invalid password of size 0");
    check("carol",
          {.type = 4, .name = "carol", .password = "p", .group = "users", .shell = "/bin/sh"},
          "usermgmt 12: Failed to add user 'carol', no shell login allowed for ORNET users");
    check("carol", {.type = 4, .name = "carol", .password = "p", .group = "nosuch"},
          "usermgmt 4: Failed to add user 'carol', primary group 'nosuch' does not exist");
    check("carol",
          {.type = 4, .name = "carol", .password = "p", .group = "users", .groups = {{"a"}}},
          "usermgmt 4: Failed to add user 'carol', secondary group 'a' does not exist");
    check("carol", {.type = 4, .name = "carol", .password = "p", .group = "users", .uid = 999},
          "usermgmt 17: Failed to add user 'carol', invalid UID");
    check("carol", {.type = 4, .name = "carol", .password = "p", .group = "users", .uid = 60001},
          "usermgmt 17: Failed to add user 'carol', invalid UID");
    check("carol", {.type = 4, .name = "carol", .password = "p", .group = "users", .uid = 0},
          "usermgmt 17: Failed to add user 'carol', invalid UID");
    check("svc", {.type = 3, .name = "svc", .group = "users", .uid = 998},
          "usermgmt 17: Failed to add user 'svc', invalid UID");
    check("carol", {.type = 4, .name = "carol", .password = "p", .group = "users", .uid = 1005},
          "usermgmt 17: Failed to add user 'carol', specified UID is unavailable");
    expect_nothing_changed();
}

TEST_F(UserAdd, OrnetUser) {
    EXPECT_EQ(add(carol()), "");
    const std::string hash = fresh_hash("carol", "secret");
    expect_files(PASSWD + "carol:x:1006:100:::/bin/false\n",
                 SHADOW + "carol:" + hash + ":20000:0:99999:7:0::\n", with_carol(GROUP));
    EXPECT_EQ(replaced(), (lines{"group", "passwd", "shadow"}));
    EXPECT_EQ(user("carol")->type, USER_TYPE_ORNET);
    EXPECT_EQ(user("carol")->password, hash);
    EXPECT_EQ(user("carol")->gecos, nullptr);
    EXPECT_EQ(user("carol")->home, nullptr);
    EXPECT_EQ(user("carol")->last_change, DAY * 86400 + 4000);
    expect_memory_on_disk();
}

TEST_F(UserAdd, OrnetUserWithEverything) {
    entry_fields entry = carol();
    entry.groups = {"video", "camera", "audio"};
    entry.gecos = "Carol C.";
    entry.uid = 5000;
    EXPECT_EQ(add(entry), "");
    const std::string hash = fresh_hash("carol", "secret");
    std::string group = with_carol(GROUP);
    group = edited(group, "video:x:44:alice\n", "video:x:44:alice,carol\n");
    group = edited(group, "audio:x:45:alice,bob\n", "audio:x:45:alice,bob,carol\n");
    group = edited(group, "camera:x:995:camd\n", "camera:x:995:camd,carol\n");
    expect_files(PASSWD + "carol:x:5000:100:Carol C.::/bin/false\n",
                 SHADOW + "carol:" + hash + ":20000:0:99999:7:0::\n", group);
    expect_memory_on_disk();
}

TEST_F(UserAdd, DynamicSystemUsers) {
    entry_fields entry = svc();
    EXPECT_EQ(add(entry), "");
    entry.name = "logd";
    entry.group = "root";
    entry.shell = "/bin/sh";
    entry.password = "pw";
    EXPECT_EQ(add(entry), "");
    const std::string hash = fresh_hash("logd", "pw");
    std::string group = edited(GROUP, "users:x:100:alice,bob\n", "users:x:100:alice,bob,svc\n");
    group = edited(group, "root:x:0:\n", "root:x:0:logd\n");
    expect_files(PASSWD +
                     "svc:x:989:100:::/bin/false\n"
                     "logd:x:988:0:::/bin/sh\n",
                 SHADOW + "svc:*:0:0:99999:7:0::\n" + "logd:" + hash + ":20000:0:99999:7:0::\n",
                 group);
    EXPECT_EQ(user("svc")->password, nullptr);
    EXPECT_TRUE(user("svc")->shadowed);
    expect_memory_on_disk();
}

TEST_F(UserAdd, Anonymous) {
    write("passwd", edited(PASSWD, "anonymous:x:100:100:Visitor:/:/bin/false\n", ""));
    write("shadow", edited(SHADOW, "anonymous:!:19002:0:99999:7:0::\n", ""));
    reopen();
    EXPECT_EQ(add({.type = 2, .name = "anonymous", .group = "users", .shell = "/bin/any"}), "");
    EXPECT_EQ(read("passwd"), edited(PASSWD, "anonymous:x:100:100:Visitor:/:/bin/false\n", "") +
                                  "anonymous:x:102:100:::/bin/any\n");
    expect_memory_on_disk();
}

TEST_F(UserAdd, EmptyTextsAreKept) {
    entry_fields entry = svc();
    entry.gecos = "";
    entry.shell = "";
    EXPECT_EQ(add(entry), "");
    EXPECT_EQ(read("passwd"), PASSWD + "svc:x:989:100:::\n");
}

TEST_F(UserAdd, UidsGoOnBehindTheHighest) {
    EXPECT_EQ(add(carol()), "");
    entry_fields entry = carol();
    entry.name = "dave";
    EXPECT_EQ(add(entry), "");
    EXPECT_EQ(user("dave")->uid, 1007U);
    entry.name = "erin";
    entry.uid = 60000;
    EXPECT_EQ(add(entry), "");
    entry.name = "frank";
    entry.uid = -1;
    EXPECT_EQ(add(entry),
              "usermgmt 13: Failed to add user 'frank', No more available UIDs in the ornet range "
              "(1000 - 60000)");
    EXPECT_FALSE(usermgmt_user_exists(ctx_.get(), "frank"));
}

TEST_F(UserAdd, HundredthOrnetUserAndTheNext) {
    fill_up_ornet_users();
    EXPECT_EQ(delete_user("u97"), "");
    EXPECT_EQ(add(carol()), "");
    EXPECT_EQ(user("carol")->uid, 2097U);
    entry_fields entry = carol();
    entry.name = "dave";
    EXPECT_EQ(add(entry),
              "usermgmt 13: Failed to add user 'dave', Max number of ORNET users exceeded "
              "(max=100, current=100)");
    entry.uid = 5000;
    EXPECT_EQ(add(entry), "");
    entry.name = "erin";
    entry.uid = -1;
    EXPECT_EQ(add(entry),
              "usermgmt 13: Failed to add user 'erin', Max number of ORNET users exceeded "
              "(max=100, current=101)");
    EXPECT_EQ(add(svc()), "");
}

// The hash is made before the UID is chosen.
TEST_F(UserAdd, PasswordFailureComesBeforeTheUid) {
    fill_up_ornet_users();
    sources_.read_error = EIO;
    EXPECT_EQ(add(carol()),
              "usermgmt 16: Failed to add user 'carol', could not create password salt");
    EXPECT_EQ(take_syslog().size(), 2U);
    entry_fields entry = carol();
    entry.uid = 1005;
    EXPECT_EQ(add(entry),
              "usermgmt 16: Failed to add user 'carol', could not create password salt");
    EXPECT_EQ(take_syslog().size(), 2U);
    expect_nothing_changed();
}

TEST_F(UserAdd, TooLongForCrypt) {
    const std::string password(512, 'p');
    entry_fields entry = svc();
    entry.password = password.c_str();
    EXPECT_EQ(add(entry),
              "usermgmt 16: Failed to add user 'svc', crypt() failed, Numerical result out of "
              "range");
    expect_nothing_changed();
}

TEST_F(UserAdd, SecondaryListWithThePrimaryGroup) {
    entry_fields entry = carol();
    entry.groups = {"users", "video", "users", "video"};
    EXPECT_EQ(add(entry), "");
    EXPECT_EQ(members("users"), "alice,bob,carol");
    EXPECT_EQ(with_members_sorted(read("group")),
              edited(with_carol(GROUP), "video:x:44:alice\n", "video:x:44:alice,carol\n"));
}

TEST_F(UserAdd, EmptySecondaryList) {
    entry_fields entry = carol();
    entry.groups = {std::vector<const char *>()};
    EXPECT_EQ(add(entry), "");
    EXPECT_EQ(with_members_sorted(read("group")), with_carol(GROUP));
}

// Nobody's membership changes then, so the group file stays.
TEST_F(UserAdd, NameThatIsAMemberAlready) {
    write("group", with_carol(GROUP));
    ctx_.reset();
    ctx_.reset(usermgmt_open(USERMGMT_OPEN_TRYLOCK, nullptr));
    EXPECT_EQ(take_syslog(),
              lines{"4 Group 'users' lists member 'carol', which has no passwd line"});
    remember();
    EXPECT_EQ(add(carol()), "");
    EXPECT_EQ(replaced(), (lines{"passwd", "shadow"}));
    EXPECT_EQ(members("users"), "alice,bob,carol");
}

TEST_F(UserAdd, ModesAreKept) {
    struct stat st = {};
    ASSERT_EQ(chmod("etc/passwd", 0604), 0);
    ASSERT_EQ(chmod("etc/shadow", 0640), 0);
    ASSERT_EQ(chmod("etc/group", 0664), 0);
    EXPECT_EQ(add(carol()), "");
    ASSERT_EQ(stat("etc/passwd", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0604U);
    ASSERT_EQ(stat("etc/shadow", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0640U);
    ASSERT_EQ(stat("etc/group", &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0664U);
}

// Where there is no shadow file at open, the hash goes to the passwd file.
TEST_F(UserAdd, WithoutShadowFileAtOpen) {
    static const std::string plain = "nobody:*:65534:65534:nobody:/:/bin/false\n";
    write("passwd", plain);
    write("group", "users:x:100:\nnogroup:x:65534:\n");
    remove("shadow");
    reopen();
    EXPECT_EQ(add(carol()),
              "corefile 101: Failed to add user 'carol', unable to sync core files, failed to "
              "write 1/3 core file(s) shadow: could not stat() core file at 'etc/shadow': No such "
              "file or directory");
    EXPECT_EQ(read("passwd"), plain);
    // The membership stayed in memory; the next try finds it there.
    write("shadow", "");
    EXPECT_EQ(add(carol()), "");
    EXPECT_EQ(take_syslog(),
              lines{"4 etc/shadow was changed by another program; its changes are lost"});
    EXPECT_FALSE(user("carol")->shadowed);
    const std::string hash = user("carol")->password;
    EXPECT_EQ(hash.rfind("$5$", 0), 0U);
    expect_files(plain + "carol:" + hash + ":1000:100:::/bin/false\n", "",
                 "users:x:100:carol\nnogroup:x:65534:\n");
}

TEST_F(UserAdd, EntryIsOnlyRead) {
    entry_fields fields = carol();
    fields.groups = {"video"};
    const filled_entry entry(fields);
    const user_entry before = *entry.get();
    EXPECT_TRUE(usermgmt_add_user(ctx_.get(), "carol", entry.get(), nullptr));
    EXPECT_EQ(entry.get()->password, before.password);
    EXPECT_STREQ(entry.get()->password, "secret");
    EXPECT_STREQ(entry.get()->name, "carol");
    EXPECT_STREQ(entry.get()->group, "users");
    EXPECT_STREQ(entry.get()->groups[0], "video");
    EXPECT_EQ(entry.get()->uid, -1);
}

TEST_F(UserAdd, AddedUserCanBeAskedForAndAddedOnce) {
    entry_fields fields = carol();
    fields.groups = {"video"};
    EXPECT_EQ(add(fields), "");
    g_auto(user_entry) entry = {};
    ASSERT_TRUE(usermgmt_get_user(ctx_.get(), "carol", &entry, nullptr));
    EXPECT_EQ(entry.type, USER_TYPE_ORNET);
    EXPECT_STREQ(entry.group, "users");
    EXPECT_EQ(take_strings(g_steal_pointer(&entry.groups)), lines{"video"});
    EXPECT_STREQ(entry.shell, "/bin/false");
    EXPECT_EQ(entry.uid, 1006);
    EXPECT_EQ(add(fields), "usermgmt 6: Failed to add user 'carol', user already exists");
}

// A record that is refused after its hash was made takes the hash along.
TEST_F(UserAdd, HashOfARefusedRecordIsWiped) {
    fill_up_ornet_users();
    secret_watch watch;
    sources_.watch = &watch;
    sources_.answers = {
        {"$5$of$secret", 0}
    };
    EXPECT_EQ(add(carol()),
              "usermgmt 13: Failed to add user 'carol', Max number of ORNET users exceeded "
              "(max=100, current=100)");
    sources_.watch = nullptr;
    EXPECT_EQ(watch.wiped(), 1);
    for (const std::string &held : watch.readable())
        EXPECT_NE(held, "$5$of$secret");
}
