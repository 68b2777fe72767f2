// tests/unit/usermgmt/user_validation_test.cpp: what a user of each type may have.
#include "usermgmt/user_validation.h"

#include "tests/unit/usermgmt/changed_accounts.h"

static constexpr const char *MISMATCH = "usermgmt 17: mismatch of supplied username/type";
static constexpr const char *NO_GROUP = "usermgmt 4: no primary group specified";
static constexpr const char *ROOT_ONLY =
    "usermgmt 5: only the password can be modified for root user";
static constexpr const char *PERMANENT = "usermgmt 5: permanent system users cannot be modified";
static constexpr const char *CHARACTERS = "usermgmt 3: username contains invalid characters";
static constexpr const char *TOO_LONG =
    "usermgmt 3: username too long, max allowed length is 14 characters";
static constexpr const char *NO_SHELL = "usermgmt 12: no shell login allowed for ORNET users";
static constexpr const char *BAD_UID = "usermgmt 17: invalid UID";
static constexpr const char *MISSING_PASSWORD = "usermgmt 10: missing password";
static constexpr const char *SHORT_PASSWORD =
    "usermgmt 10: password too short, must have at least one character";
static constexpr const char *LONG_PASSWORD =
    "usermgmt 10: password too long, max allowed length is 64 characters";

static constexpr guint32 ALL = USER_FIELD_ALL;
static const std::string BYTES_64(64, 'p');
static const std::string BYTES_65(65, 'p');
static const std::string BYTES_600(600, 'p');

class UserValidation : public ChangedAccounts {
  protected:
    void TearDown() override {
        expect_nothing_changed();
        ChangedAccounts::TearDown();
    }
    void check(const char *username, guint32 type, const entry_fields &fields, guint32 flags,
               const char *text) {
        SCOPED_TRACE(std::string(username) + ", type " + std::to_string(type) + ", flags " +
                     std::to_string(flags));
        error_slot error;
        const filled_entry entry(fields);
        const bool valid =
            validate_user(ctx_.get(), username, type, entry.get(), flags, error.out());
        EXPECT_EQ(error.text(), text);
        EXPECT_EQ(valid, *text == '\0');
        EXPECT_EQ(validate_user(ctx_.get(), username, type, entry.get(), flags, nullptr), valid);
    }
    void check_name(const char *name, const char *text) {
        check(name, USER_TYPE_ORNET, {.name = name}, USER_FIELD_NAME, text);
    }
};

TEST(UserField, BitsFollowTheRecord) {
    EXPECT_EQ(USER_FIELD_TYPE, 1U);
    EXPECT_EQ(USER_FIELD_NAME, 2U);
    EXPECT_EQ(USER_FIELD_PASSWORD, 4U);
    EXPECT_EQ(USER_FIELD_GROUP, 8U);
    EXPECT_EQ(USER_FIELD_GROUPS, 16U);
    EXPECT_EQ(USER_FIELD_GECOS, 32U);
    EXPECT_EQ(USER_FIELD_SHELL, 64U);
    EXPECT_EQ(USER_FIELD_UID, 128U);
    EXPECT_EQ(USER_FIELD_ALL, 255U);
}

// The rules that come before those of the types, in their order.
TEST_F(UserValidation, NameTypeAndPrimaryGroup) {
    check("carol", 4, {.type = 4, .name = "other"}, 0, MISMATCH);
    check("carol", 4, {.type = 4, .name = ""}, 0, MISMATCH);
    check("carol", 4, {.type = 4, .name = "Carol"}, 0, MISMATCH);
    check("carol", 4, {.type = 4}, 0, "");
    check("carol", 4, {.type = 3}, 0, MISMATCH);
    check("carol", 4, {.type = 6}, 0, MISMATCH);
    check("carol", 4, {.type = 0}, 0, "");
    check("carol", 0, {.type = 4}, 0, MISMATCH);
    check("carol", 1, {.name = "other"}, 0, MISMATCH);
    check("carol", 4, {.name = "carol"}, USER_FIELD_GROUP, NO_GROUP);
    check("carol", 1, {}, USER_FIELD_GROUP, NO_GROUP);
    check("carol", 2, {}, ALL, NO_GROUP);
    check("carol", 3, {}, USER_FIELD_GROUP, NO_GROUP);
    check("carol", 0, {}, USER_FIELD_GROUP, NO_GROUP);
    check("carol", 5, {}, USER_FIELD_GROUP, NO_GROUP);
    check("carol", 6, {}, ALL, NO_GROUP);
    check("carol", 4, {.name = "other", .group = nullptr}, ALL, MISMATCH);
}

TEST_F(UserValidation, Root) {
    check("root", 1, {.password = "a"}, USER_FIELD_PASSWORD, "");
    check("root", 1, {.password = BYTES_600.c_str()}, USER_FIELD_PASSWORD, "");
    check("root", 1, {}, USER_FIELD_PASSWORD, MISSING_PASSWORD);
    check("root", 1, {.password = ""}, USER_FIELD_PASSWORD, SHORT_PASSWORD);
    // Nothing else is looked at then, whatever the entry holds.
    check("root", 1, {.password = "a", .group = "nosuch", .shell = "/x", .uid = 5},
          USER_FIELD_PASSWORD, "");
    check("root", 1, {}, 0, ROOT_ONLY);
    check("root", 1, {.password = "a"}, USER_FIELD_PASSWORD | USER_FIELD_TYPE, ROOT_ONLY);
    check("root", 1, {.password = "a"}, USER_FIELD_PASSWORD | USER_FIELD_NAME, ROOT_ONLY);
    check("root", 1, {.password = "a", .gecos = ""}, USER_FIELD_PASSWORD | USER_FIELD_GECOS,
          ROOT_ONLY);
    check("root", 1, {.password = "a", .groups = {{}}}, USER_FIELD_PASSWORD | USER_FIELD_GROUPS,
          ROOT_ONLY);
    check("root", 1, {.shell = "/bin/sh"}, USER_FIELD_SHELL, ROOT_ONLY);
    check("root", 1, {.group = "users"}, USER_FIELD_GROUP, ROOT_ONLY);
    check("root", 1, {.type = 1, .name = "root", .password = "a", .group = "users"}, ALL,
          ROOT_ONLY);
}

TEST_F(UserValidation, Permanent) {
    static constexpr guint32 SOME = USER_FIELD_GROUPS | USER_FIELD_PASSWORD | USER_FIELD_SHELL;
    check("guest", 2, {.groups = {{"video"}}}, USER_FIELD_GROUPS, PERMANENT);
    check("guest", 2, {.type = 2, .name = "guest", .group = "users"}, ALL, PERMANENT);
    check("anonymous", 2, {}, 0, PERMANENT);
    check("anonymous", 2, {.password = "a"}, USER_FIELD_PASSWORD, PERMANENT);
    check("anonymous", 2, {.group = "users"}, USER_FIELD_GROUP, PERMANENT);
    check("anonymous ", 2, {.groups = {{"video"}}}, USER_FIELD_GROUPS, PERMANENT);
    check("Anonymous", 2, {.groups = {{"video"}}}, USER_FIELD_GROUPS, PERMANENT);
    check("anonymou", 2, {.groups = {{"video"}}}, USER_FIELD_GROUPS, PERMANENT);
    check("anonymous", 2, {.groups = {{"video"}}}, USER_FIELD_GROUPS, "");
    check("anonymous", 2, {.groups = {{}}}, USER_FIELD_GROUPS, "");
    // The bit counts, not the list.
    check("anonymous", 2, {}, USER_FIELD_GROUPS, "");
    check("anonymous", 2, {.password = "", .groups = {{}}, .shell = "/bin/sh"}, SOME, "");
    check("anonymous", 2, {.password = BYTES_65.c_str(), .groups = {{}}}, SOME, "");
    check("anonymous", 2, {.type = 2, .name = "anonymous", .group = "users"}, ALL, "");
    check("anonymous", 2, {.groups = {{"video", "nosuch"}}}, USER_FIELD_GROUPS,
          "usermgmt 4: secondary group 'nosuch' does not exist");
    check("anonymous", 2, {.type = 2, .group = "users", .uid = 1000}, ALL, BAD_UID);
}

TEST_F(UserValidation, DynamicSystem) {
    check("x", 3, {}, 0, "");
    check("name.with-any", 3, {.name = "name.with-any"}, USER_FIELD_NAME, "");
    check("x", 3, {}, USER_FIELD_NAME, "");
    check("x", 3, {}, USER_FIELD_PASSWORD, "");
    check("x", 3, {.password = ""}, USER_FIELD_PASSWORD, "");
    check("x", 3, {.password = BYTES_65.c_str()}, USER_FIELD_PASSWORD, "");
    check("x", 3, {.shell = "/bin/sh"}, USER_FIELD_SHELL, "");
    check("x", 3, {.type = 3, .name = "x", .group = "users"}, ALL, "");
}

TEST_F(UserValidation, OrnetName) {
    check_name("a", "");
    check_name("Z", "");
    check_name("0", "");
    check_name("azAZ09", "");
    check_name("abcdefghijklmn", "");
    check_name("abcdefghijklmno", TOO_LONG);
    check_name("abcdefghijklmn.", TOO_LONG);
    check_name("\xc3\xa4\xc3\xa4\xc3\xa4\xc3\xa4\xc3\xa4\xc3\xa4\xc3\xa4\xc3\xa4", TOO_LONG);
    check_name("", "usermgmt 3: username must have at least one character");
    check_name("john.doe", CHARACTERS);
    check_name("a_b", CHARACTERS);
    check_name("a-b", CHARACTERS);
    check_name(" a", CHARACTERS);
    check_name("a ", CHARACTERS);
    check_name("a:b", CHARACTERS);
    check_name("a/b", CHARACTERS);
    check_name("a@b", CHARACTERS);
    check_name("a[b", CHARACTERS);
    check_name("a`b", CHARACTERS);
    check_name("a{b", CHARACTERS);
    check_name("a\nb", CHARACTERS);
    check_name("host$", CHARACTERS);
    check_name("\xc3\xa4", CHARACTERS);
    check_name("a\xe4", CHARACTERS);
    check("carol", 4, {}, USER_FIELD_NAME, "usermgmt 3: missing username");
    // Without the bit the name is not looked at.
    check("john.doe", 4, {.name = "john.doe"}, 0, "");
}

TEST_F(UserValidation, OrnetPasswordAndShell) {
    static constexpr guint32 PASSWORD = USER_FIELD_PASSWORD;
    check("carol", 4, {}, PASSWORD, MISSING_PASSWORD);
    check("carol", 4, {.password = ""}, PASSWORD, SHORT_PASSWORD);
    check("carol", 4, {.password = "a"}, PASSWORD, "");
    check("carol", 4, {.password = BYTES_64.c_str()}, PASSWORD, "");
    check("carol", 4, {.password = BYTES_65.c_str()}, PASSWORD, LONG_PASSWORD);
    check("carol", 4, {.password = BYTES_65.c_str()}, 0, "");
    check("carol", 4, {.shell = "/bin/false"}, USER_FIELD_SHELL, NO_SHELL);
    check("carol", 4, {.shell = ""}, USER_FIELD_SHELL, NO_SHELL);
    check("carol", 4, {}, USER_FIELD_SHELL, "");
    check("carol", 4, {.shell = "/bin/sh"}, 0, "");
    check("carol", 4, {.gecos = "any: thing"}, USER_FIELD_GECOS, "");
}

TEST_F(UserValidation, OrnetRulesInTheirOrder) {
    check("a.b", 4, {.name = "a.b", .password = "", .group = "nosuch", .shell = "/x", .uid = 1},
          ALL, CHARACTERS);
    check("carol", 4, {.name = "carol", .password = "", .group = "nosuch", .shell = "/x", .uid = 1},
          ALL, SHORT_PASSWORD);
    check("carol", 4,
          {.name = "carol", .password = "p", .group = "nosuch", .shell = "/x", .uid = 1}, ALL,
          NO_SHELL);
    check("carol", 4,
          {.name = "carol", .password = "p", .group = "nosuch", .groups = {{"none"}}, .uid = 1},
          ALL, "usermgmt 4: primary group 'nosuch' does not exist");
    check("carol", 4,
          {.name = "carol", .password = "p", .group = "users", .groups = {{"none"}}, .uid = 1}, ALL,
          "usermgmt 4: secondary group 'none' does not exist");
    check("carol", 4,
          {.name = "carol", .password = "p", .group = "users", .groups = {{"video"}}, .uid = 1},
          ALL, BAD_UID);
    check("carol", 4, {.name = "carol", .password = "p", .group = "users", .groups = {{"video"}}},
          ALL, "");
}

TEST_F(UserValidation, TypesThatCannotBe) {
    static constexpr const char *INVALID = "usermgmt 5: invalid user type 'invalid'";
    static constexpr const char *NOBODY = "usermgmt 5: invalid user type 'nobody'";
    check("carol", 0, {}, 0, "usermgmt 5: invalid user type 'none'");
    check("nobody", 5, {.password = "a"}, USER_FIELD_PASSWORD, NOBODY);
    check("carol", 5, {.group = "nosuch"}, ALL, NOBODY);
    check("carol", 6, {}, 0, INVALID);
    check("carol", G_MAXUINT32, {}, 0, INVALID);
}

TEST_F(UserValidation, Groups) {
    static constexpr guint32 ONE = USER_FIELD_GROUP;
    static constexpr guint32 MANY = USER_FIELD_GROUPS;
    check("x", 3, {.group = "users"}, ONE, "");
    check("x", 3, {.group = "Users"}, ONE, "usermgmt 4: primary group 'Users' does not exist");
    check("x", 3, {.group = ""}, ONE, "usermgmt 4: primary group '' does not exist");
    check("x", 3, {.group = "nosuch"}, 0, "");
    check("x", 3, {.groups = {{}}}, MANY, "");
    check("x", 3, {}, MANY, "");
    check("x", 3, {.groups = {{"video", "audio", "users"}}}, MANY, "");
    check("x", 3, {.groups = {{"video", "one", "two"}}}, MANY,
          "usermgmt 4: secondary group 'one' does not exist");
    check("x", 3, {.groups = {{""}}}, MANY, "usermgmt 4: secondary group '' does not exist");
    check("x", 3, {.groups = {{"nosuch"}}}, 0, "");
    check("x", 3, {.group = "none", .groups = {{"nosuch"}}}, ONE | MANY,
          "usermgmt 4: primary group 'none' does not exist");
}

// The entry's own type counts, not the type given.
TEST_F(UserValidation, Uid) {
    static constexpr guint32 UID = USER_FIELD_UID;
    check("x", 4, {.type = 4, .uid = -1}, UID, "");
    check("x", 4, {.type = 4, .uid = 1000}, UID, "");
    check("x", 4, {.type = 4, .uid = 60000}, UID, "");
    check("x", 4, {.type = 4, .uid = 999}, UID, BAD_UID);
    check("x", 4, {.type = 4, .uid = 60001}, UID, BAD_UID);
    check("x", 4, {.type = 4, .uid = 0}, UID, BAD_UID);
    check("x", 4, {.type = 4, .uid = -2}, UID, BAD_UID);
    check("x", 4, {.type = 4, .uid = G_MININT32}, UID, BAD_UID);
    check("x", 4, {.type = 4, .uid = G_MAXINT32}, UID, BAD_UID);
    check("x", 4, {.type = 0, .uid = 1000}, UID, BAD_UID);
    check("x", 4, {.type = 0, .uid = -1}, UID, "");
    check("x", 3, {.type = 3, .uid = 1000}, UID, BAD_UID);
    check("x", 3, {.type = 3, .uid = 999}, UID, BAD_UID);
    check("x", 3, {.type = 3, .uid = -1}, UID, "");
    check("x", 3, {.type = 3, .uid = 999}, 0, "");
}

TEST_F(UserValidation, MissingArgumentsAreCriticalsWithoutError) {
    const filled_entry entry({.password = "a"});
    error_slot error;
    const auto log_of = [&](const usermgmt_ctx *ctx, const char *username, const user_entry *user) {
        return glib_log_of([&] {
            EXPECT_FALSE(validate_user(ctx, username, 1, user, USER_FIELD_PASSWORD, error.out()));
        });
    };
    const std::string start = "usermgmt-CRITICAL: validate_user: assertion '";
    EXPECT_EQ(log_of(nullptr, "root", entry.get()), lines{start + "ctx != NULL' failed"});
    EXPECT_EQ(log_of(ctx_.get(), nullptr, entry.get()), lines{start + "username != NULL' failed"});
    EXPECT_EQ(log_of(ctx_.get(), "root", nullptr), lines{start + "new_user != NULL' failed"});
    EXPECT_EQ(log_of(nullptr, nullptr, nullptr), lines{start + "ctx != NULL' failed"});
    EXPECT_EQ(log_of(ctx_.get(), nullptr, nullptr), lines{start + "username != NULL' failed"});
    EXPECT_FALSE(error.is_set());
}
