// tests/unit/usermgmt/user_delete_test.cpp: deleting users and disabling passwords.
#include "tests/unit/usermgmt/changed_accounts.h"

static constexpr const char *ALICES_SHADOW_LINE =
    "alice:$5$abcdefghijkl$ZhmwPkHXQKf6apCu9HM2IbJzghxfHTPgWq9JleS3MrD:19005:0:99999:7:0::\n";
static constexpr const char *CAMDS_SHADOW_LINE =
    "camd:$5$ZZZZZZZZZZZZ$zudeleVaZfzgzvtsL.HxHI5hndEd6eifjOotGYM6oD5:19004:0:99999:7:0::\n";

class UserDelete : public ChangedAccounts {
  protected:
    // Takes the record out of the entries without freeing it, and back in on the way out.
    internal_user *take_out(const char *name) {
        guint index = 0;
        EXPECT_TRUE(g_ptr_array_find(ctx_->user_db.entries, user(name), &index));
        return static_cast<internal_user *>(g_ptr_array_steal_index(ctx_->user_db.entries, index));
    }
};

TEST_F(UserDelete, MissingArguments) {
    usermgmt_ctx closed = {};
    error_slot error;
    for (usermgmt_ctx *ctx : {static_cast<usermgmt_ctx *>(nullptr), &closed}) {
        EXPECT_FALSE(usermgmt_delete_user(ctx, nullptr, error.out()));
        EXPECT_EQ(error.text(),
                  "usermgmt 17: Failed to delete user: Invalid or uninitialised context");
    }
    EXPECT_FALSE(usermgmt_delete_user(ctx_.get(), nullptr, error.out()));
    EXPECT_EQ(error.text(),
              "usermgmt 17: Failed to delete user: Invalid or missing 'username' argument");
    expect_nothing_changed();
}

TEST_F(UserDelete, Refusals) {
    const auto check = [this](const char *username, const char *error) {
        EXPECT_EQ(delete_user(username), error);
        EXPECT_FALSE(usermgmt_delete_user(ctx_.get(), username, nullptr));
        expect_nothing_changed();
    };
    check("nosuch", "usermgmt 3: Failed to delete user 'nosuch', cannot delete non-existent user");
    check("", "usermgmt 3: Failed to delete user '', cannot delete non-existent user");
    check("Alice", "usermgmt 3: Failed to delete user 'Alice', cannot delete non-existent user");
    check("root",
          "usermgmt 11: Failed to delete user 'root', cannot delete 'root' with user type 'root'");
    check("guest",
          "usermgmt 11: Failed to delete user 'guest', cannot delete 'guest' with user type "
          "'permanent'");
    check(
        "anonymous",
        "usermgmt 11: Failed to delete user 'anonymous', cannot delete 'anonymous' with user type "
        "'permanent'");
    check("nobody",
          "usermgmt 11: Failed to delete user 'nobody', cannot delete 'nobody' with user type "
          "'nobody'");
}

TEST_F(UserDelete, OrnetUserLeavesEveryGroup) {
    EXPECT_EQ(delete_user("alice"), "");
    std::string group = edited(GROUP, "video:x:44:alice\n", "video:x:44:\n");
    group = edited(group, "audio:x:45:alice,bob\n", "audio:x:45:bob\n");
    group = edited(group, "users:x:100:alice,bob\n", "users:x:100:bob\n");
    expect_files(edited(PASSWD, "alice:x:1000:100:Alice:/home/alice:/bin/false\n", ""),
                 edited(SHADOW, ALICES_SHADOW_LINE, ""), group);
    EXPECT_EQ(replaced(), (lines{"group", "passwd", "shadow"}));
    EXPECT_FALSE(usermgmt_user_exists(ctx_.get(), "alice"));
    EXPECT_TRUE(usermgmt_group_exists(ctx_.get(), "video"));
    expect_memory_on_disk();
    EXPECT_EQ(delete_user("alice"),
              "usermgmt 3: Failed to delete user 'alice', cannot delete non-existent user");
}

TEST_F(UserDelete, DynamicSystemUser) {
    EXPECT_EQ(delete_user("camd"), "");
    expect_files(edited(PASSWD, "camd:x:990:995:Camera:/var/lib/camd:/bin/false\n", ""),
                 edited(SHADOW, CAMDS_SHADOW_LINE, ""),
                 edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"));
    expect_memory_on_disk();
}

TEST_F(UserDelete, UserThatNoGroupListsLeavesTheGroupFile) {
    write("group", edited(GROUP, "camera:x:995:camd\n", "camera:x:995:\n"));
    reopen();
    EXPECT_EQ(delete_user("camd"), "");
    EXPECT_EQ(replaced(), (lines{"passwd", "shadow"}));
}

TEST_F(UserDelete, HashIsWiped) {
    secret_watch watch;
    watch.add(user("alice")->password);
    EXPECT_EQ(delete_user("alice"), "");
    EXPECT_EQ(watch.wiped(), 1);
    for (const std::string &held : watch.readable())
        EXPECT_NE(held, ALICES_HASH);
}

// The index leads to the later record of a name; the earlier one stays, and is then not found.
TEST_F(UserDelete, OfTwoUsersWithOneNameTheIndexedOneGoes) {
    write("passwd", PASSWD + "alice:x:1010:44:Second::/bin/false\n");
    reopen();
    EXPECT_EQ(delete_user("alice"), "");
    EXPECT_EQ(read("passwd"), PASSWD);
    EXPECT_EQ(read("shadow"), SHADOW);
    EXPECT_EQ(members("users"), "bob");
    EXPECT_FALSE(usermgmt_user_exists(ctx_.get(), "alice"));
    EXPECT_EQ(delete_user("alice"),
              "usermgmt 3: Failed to delete user 'alice', cannot delete non-existent user");
    EXPECT_EQ(delete_user("bob"), "");
    EXPECT_NE(read("passwd").find("alice:x:1000:100:"), std::string::npos);
}

// The memberships come back, the user database stays as it is.
TEST_F(UserDelete, RecordThatIsNotAmongTheEntries) {
    internal_user *alice = take_out("alice");
    EXPECT_EQ(delete_user("alice"),
              "usermgmt 16: Failed to delete user 'alice', could not remove user from internal "
              "structures");
    EXPECT_EQ(members("users"), "alice,bob");
    EXPECT_EQ(members("video"), "alice");
    EXPECT_FALSE(ctx_->group_db.dirty);
    EXPECT_FALSE(usermgmt_user_exists(ctx_.get(), "alice"));
    EXPECT_TRUE(ctx_->user_db.dirty);
    EXPECT_EQ(replaced(), lines());
    internal_user_free(alice);

    EXPECT_EQ(add_group("another"), "");
    EXPECT_EQ(read("passwd"),
              edited(PASSWD, "alice:x:1000:100:Alice:/home/alice:/bin/false\n", ""));
}

TEST_F(UserDelete, WithoutEntriesNothingIsRemoved) {
    GPtrArray *entries = std::exchange(ctx_->user_db.entries, nullptr);
    EXPECT_EQ(glib_log_of([this] {
                  EXPECT_EQ(delete_user("alice"),
                            "usermgmt 16: Failed to delete user 'alice', could not remove user "
                            "from internal structures");
              }),
              lines{"usermgmt-CRITICAL: user_database_remove: assertion 'user_db->entries != NULL' "
                    "failed"});
    ctx_->user_db.entries = entries;
    // Also the group database was loaded again.
    expect_nothing_changed();
}

TEST_F(UserDelete, WithoutGroupsTheDeletionGoesOn) {
    GPtrArray *entries = std::exchange(ctx_->group_db.entries, nullptr);
    EXPECT_EQ(glib_log_of([this] { EXPECT_EQ(delete_user("alice"), ""); }),
              lines{"usermgmt-CRITICAL: remove_user_from_all_groups: assertion 'group_db->entries "
                    "!= NULL' failed"});
    ctx_->group_db.entries = entries;
    expect_files(edited(PASSWD, "alice:x:1000:100:Alice:/home/alice:/bin/false\n", ""),
                 edited(SHADOW, ALICES_SHADOW_LINE, ""), GROUP);
}

TEST_F(UserDelete, RecordWithoutNameIsRemovedAllTheSame) {
    internal_user_replace_text(user("alice"), &internal_user::name, nullptr);
    EXPECT_EQ(glib_log_of([this] { EXPECT_EQ(delete_user("alice"), ""); }),
              lines{"usermgmt-CRITICAL: remove_user_from_all_groups: assertion 'username != NULL' "
                    "failed"});
    expect_files(edited(PASSWD, "alice:x:1000:100:Alice:/home/alice:/bin/false\n", ""),
                 edited(SHADOW, ALICES_SHADOW_LINE, ""), GROUP);
    EXPECT_FALSE(usermgmt_user_exists(ctx_.get(), "alice"));
}

class DisablePassword : public ChangedAccounts {};

TEST_F(DisablePassword, MissingArguments) {
    usermgmt_ctx closed = {};
    error_slot error;
    for (usermgmt_ctx *ctx : {static_cast<usermgmt_ctx *>(nullptr), &closed}) {
        EXPECT_FALSE(usermgmt_disable_password(ctx, nullptr, error.out()));
        EXPECT_EQ(error.text(),
                  "usermgmt 17: Failed to disable password for : Invalid or uninitialised context");
    }
    EXPECT_FALSE(usermgmt_disable_password(ctx_.get(), nullptr, error.out()));
    EXPECT_EQ(
        error.text(),
        "usermgmt 17: Failed to disable password for : Invalid or missing 'username' argument");
    expect_nothing_changed();
}

TEST_F(DisablePassword, Refusals) {
    struct refusal_case {
        const char *username;
        const char *error;
    };
    static constexpr refusal_case cases[] = {
        {"x",      "usermgmt 3: Failed to disable password for  'x', user does not exist"},
        {"root",
         "usermgmt 5: Failed to disable password for  'root', password cannot be disabled for user "
         "type 'root'"                                                                   },
        {"alice",
         "usermgmt 5: Failed to disable password for  'alice', password cannot be disabled for "
         "user type 'ornet'"                                                             },
        {"nobody",
         "usermgmt 5: Failed to disable password for  'nobody', password cannot be disabled for "
         "user type 'nobody'"                                                            },
    };
    for (const refusal_case &row : cases) {
        EXPECT_EQ(disable(row.username), row.error);
        EXPECT_FALSE(usermgmt_disable_password(ctx_.get(), row.username, nullptr));
        expect_nothing_changed();
    }
}

TEST_F(DisablePassword, OfAPermanentAndADynamicSystemUser) {
    EXPECT_EQ(disable("guest"), "");
    const std::string shadow =
        edited(SHADOW, "guest:$1$saltsalt$cCPENxTVtU4kpnV2ngztX0:19003:", "guest:*:19003:");
    expect_files(PASSWD, shadow, GROUP);
    EXPECT_EQ(replaced(), (lines{"passwd", "shadow"}));
    EXPECT_EQ(user("guest")->password, nullptr);

    EXPECT_EQ(disable("camd"), "");
    expect_files(PASSWD, edited(shadow, CAMDS_SHADOW_LINE, "camd:*:19004:0:99999:7:0::\n"), GROUP);
    expect_memory_on_disk();
}

TEST_F(DisablePassword, SecondTimeWritesNothing) {
    EXPECT_EQ(disable("camd"), "");
    remember();
    EXPECT_EQ(disable("camd"), "");
    expect_nothing_changed();
}

// A "*" that was read is a password like any other, until it is dropped.
TEST_F(DisablePassword, StarOfTheFileIsDroppedOnce) {
    EXPECT_EQ(disable("daemon"), "");
    EXPECT_EQ(replaced(), (lines{"passwd", "shadow"}));
    expect_files(PASSWD, SHADOW, GROUP);
    EXPECT_EQ(disable("daemon"), "");
    EXPECT_EQ(replaced(), lines());
}

TEST_F(DisablePassword, UserWithoutPasswordIsNotWritten) {
    EXPECT_EQ(add({.type = 3, .name = "svc", .group = "users"}), "");
    remember();
    EXPECT_EQ(disable("svc"), "");
    expect_nothing_changed();
}

// The shadow file of the context decides where a user without password is kept.
TEST_F(DisablePassword, MovesTheUserToTheShadowFile) {
    write("passwd", edited(PASSWD, "guest:x:", "guest:$1$plain$hash:"));
    write("shadow",
          edited(SHADOW, "guest:$1$saltsalt$cCPENxTVtU4kpnV2ngztX0:19003:0:99999:7:0::\n", ""));
    reopen();
    EXPECT_EQ(disable("guest"), "");
    expect_files(PASSWD,
                 edited(SHADOW, "guest:$1$saltsalt$cCPENxTVtU4kpnV2ngztX0:19003:", "guest:*:0:"),
                 GROUP);
    EXPECT_EQ(disable("guest"), "");
    EXPECT_TRUE(user("guest")->shadowed);
}

TEST_F(DisablePassword, HashIsWiped) {
    secret_watch watch;
    watch.add(user("camd")->password);
    EXPECT_EQ(disable("camd"), "");
    EXPECT_EQ(watch.wiped(), 1);
}

TEST_F(DisablePassword, NewPasswordCanBeSetAfterwards) {
    EXPECT_EQ(disable("camd"), "");
    EXPECT_EQ(modify("camd", {.password = "camdpass"}), "");
    EXPECT_NE(fresh_hash("camd", "camdpass"), "");
}
