// tests/unit/usermgmt/record_check_test.cpp: records that would come back as others are refused.
#include "usermgmt/record_check.h"

#include <cerrno>
#include <cstring>
#include <random>

#include "tests/unit/usermgmt/changed_accounts.h"
#include "tests/unit/usermgmt/reread_lines.h"

static std::string refused(const char *file, int index, const char *cause = "Invalid argument") {
    return "corefile 101: unable to sync core files, failed to write 1/3 core file(s) " +
           std::string(file) + ": could not write entry #" + std::to_string(index) + " to etc/" +
           file + ".tmp: " + cause;
}

class RecordCheck : public testing::Test {
  protected:
    static std::string user_error(const user_fields &fields, guint index = 3) {
        g_autoptr(internal_user) user = new_user(fields);
        error_slot error;
        const bool survives = check_user_record(user, index, error.out());
        EXPECT_EQ(survives, !error.is_set());
        EXPECT_EQ(check_user_record(user, index, nullptr), survives);
        return error.text();
    }
    static std::string member_error(const char *name, guint index = 3) {
        error_slot error;
        const bool survives = check_member_name(name, index, error.out());
        EXPECT_EQ(survives, !error.is_set());
        return error.text();
    }
};

static const std::string IN_PASSWD = refused("passwd", 3);
static const std::string IN_SHADOW = refused("shadow", 3);
static const std::string IN_GROUP = refused("group", 3);
static const std::string ACCEPTED;

TEST_F(RecordCheck, NamesOfUsers) {
    struct name_case {
        const char *name;
        const std::string &error;
    };
    const name_case cases[] = {
        {"root",                  ACCEPTED },
        {"with space",            ACCEPTED },
        {"root ",                 ACCEPTED },
        {"root\t",                ACCEPTED },
        {"a,b",                   ACCEPTED },
        {"a#b",                   ACCEPTED },
        {"a+",                    ACCEPTED },
        {"\xff\xfe",              ACCEPTED },
        {"\xc3\xa4",              ACCEPTED },
        {"",                      ACCEPTED },
        {" root",                 IN_PASSWD},
        {"\troot",                IN_PASSWD},
        {"\rroot",                IN_PASSWD},
        {"\vroot",                IN_PASSWD},
        {"\froot",                IN_PASSWD},
        {"\nroot",                IN_PASSWD},
        {" ",                     IN_PASSWD},
        {"+x",                    IN_PASSWD},
        {"-x",                    IN_PASSWD},
        {"+",                     IN_PASSWD},
        {"+@x",                   IN_PASSWD},
        {"#x",                    IN_PASSWD},
        {"a:b",                   IN_PASSWD},
        {"a\nb",                  IN_PASSWD},
        {"root:x:0:0::/:/bin/sh", IN_PASSWD},
    };
    for (const name_case &row : cases)
        for (const bool shadowed : {false, true})
            EXPECT_EQ(user_error({.name = row.name, .shadowed = shadowed}), row.error)
                << "name '" << row.name << "'";
    EXPECT_EQ(user_error({.name = nullptr}), IN_PASSWD);
}

TEST_F(RecordCheck, NamesOfMembers) {
    struct name_case {
        const char *name;
        const std::string &error;
    };
    const name_case cases[] = {
        {"root",   ACCEPTED},
        {"root ",  ACCEPTED},
        {"a b",    ACCEPTED},
        {"+x",     ACCEPTED},
        {"#x",     ACCEPTED},
        {"\xff",   ACCEPTED},
        {"",       IN_GROUP},
        {" ",      IN_GROUP},
        {" root",  IN_GROUP},
        {"\troot", IN_GROUP},
        {"a,b",    IN_GROUP},
        {",",      IN_GROUP},
        {"a,",     IN_GROUP},
        {"a:b",    IN_GROUP},
        {"a\nb",   IN_GROUP},
        {"a\n",    IN_GROUP},
    };
    for (const name_case &row : cases)
        EXPECT_EQ(member_error(row.name), row.error) << "name '" << row.name << "'";
}

TEST_F(RecordCheck, HomesAndShells) {
    struct text_case {
        const char *text;
        const std::string &error;
    };
    const text_case cases[] = {
        {nullptr,     ACCEPTED },
        {"",          ACCEPTED },
        {"/bin/sh",   ACCEPTED },
        {" /bin/sh",  ACCEPTED },
        {"/bin/sh ",  ACCEPTED },
        {" ",         ACCEPTED },
        {"/bin/s,h",  ACCEPTED },
        {"\xff",      ACCEPTED },
        {"/bin/sh:",  IN_PASSWD},
        {":",         IN_PASSWD},
        {"/bin/s\nh", IN_PASSWD},
        {"/bin/sh\n", IN_PASSWD},
        {"\n",        IN_PASSWD},
    };
    for (const text_case &row : cases) {
        EXPECT_EQ(user_error({.shell = row.text}), row.error);
        EXPECT_EQ(user_error({.home = row.text}), row.error);
    }
    EXPECT_EQ(user_error({.shell = std::string(100000, 's').c_str()}), ACCEPTED);
}

TEST_F(RecordCheck, PasswordFields) {
    struct hash_case {
        const char *hash;
        bool survives;
    };
    static constexpr hash_case cases[] = {
        {nullptr,    true },
        {"",         true },
        {"*",        true },
        {"!",        true },
        {"$5$a$b",   true },
        {" $5$a$b",  true },
        {"x",        true },
        {"a:b",      false},
        {"a\nb",     false},
        {"$5$a$b\n", false},
        {":",        false},
    };
    for (const hash_case &row : cases) {
        EXPECT_EQ(user_error({.shadowed = true, .password = row.hash}),
                  row.survives ? ACCEPTED : IN_SHADOW);
        EXPECT_EQ(user_error({.shadowed = false, .password = row.hash}),
                  row.survives ? ACCEPTED : IN_PASSWD);
    }
}

TEST_F(RecordCheck, NumbersOfEverySizeSurvive) {
    for (const guint32 id : {0U, 1U, 65534U, 65535U, 2147483648U, 4294967295U})
        EXPECT_EQ(user_error({.shadowed = true, .uid = id, .gid = id}), ACCEPTED) << id;
    for (const gint64 seconds : {gint64{0}, gint64{-86400}, gint64{86400} * 99999})
        EXPECT_EQ(user_error({.shadowed = true, .last_change = seconds}), ACCEPTED) << seconds;
}

// The C library stores blanks for what a comment cannot hold.
TEST_F(RecordCheck, CommentsAreExempt) {
    for (const char *gecos : {"a:b", "a\nb", ":", "\n", "root:x:0:0", "", " ", "\xff"})
        EXPECT_EQ(user_error({.shadowed = true, .gecos = gecos}), ACCEPTED) << gecos;
}

TEST_F(RecordCheck, IndexIsPartOfTheMessage) {
    EXPECT_EQ(user_error({.name = "a:b"}, 0), refused("passwd", 0));
    EXPECT_EQ(user_error({.shadowed = true, .password = ":"}, 4711), refused("shadow", 4711));
    EXPECT_EQ(member_error("a,b", 12), refused("group", 12));
}

// The IDs of such a line are not written; where both are 0 anyway, nothing is lost.
TEST_F(RecordCheck, NamesThatLoseTheirIds) {
    for (const char *name : {"+x", "-x"}) {
        EXPECT_EQ(user_error({.name = name, .uid = 0, .gid = 100}), IN_PASSWD);
        EXPECT_EQ(user_error({.name = name, .uid = 1000, .gid = 0}), IN_PASSWD);
        EXPECT_EQ(user_error({.name = name, .uid = 0, .gid = 0}), ACCEPTED);
    }
}

TEST_F(RecordCheck, NoDescriptorIsLeftOpen) {
    const int descriptors = count_open_descriptors();
    EXPECT_EQ(user_error({.name = " root", .shadowed = true}), IN_PASSWD);
    EXPECT_EQ(member_error("a:b"), IN_GROUP);
    EXPECT_EQ(count_open_descriptors(), descriptors);
}

static char nothing[] = "";

// A text of another's, whole again at every use: a password is wiped where it was read.
static char *other() {
    static char text[6];
    std::strcpy(text, "other");
    return text;
}

static char **two_members() {
    static char *members[] = {other(), other(), nullptr};
    return members;
}

TEST_F(RecordCheck, EveryFieldOfAPasswdLineCounts) {
    struct field_case {
        const char *name;
        void (*alter)(struct passwd *line);
        const std::string &error;
    };
    const field_case cases[] = {
        {"nothing",  [](struct passwd *) {},                                 ACCEPTED },
        {"name",     [](struct passwd *line) { line->pw_name = other(); },   IN_PASSWD},
        {"no name",  [](struct passwd *line) { line->pw_name = nullptr; },   IN_PASSWD},
        {"password", [](struct passwd *line) { line->pw_passwd = other(); }, IN_PASSWD},
        {"uid",      [](struct passwd *line) { line->pw_uid++; },            IN_PASSWD},
        {"gid",      [](struct passwd *line) { line->pw_gid++; },            IN_PASSWD},
        {"home",     [](struct passwd *line) { line->pw_dir = other(); },    IN_PASSWD},
        {"shell",    [](struct passwd *line) { line->pw_shell = other(); },  IN_PASSWD},
        {"no shell", [](struct passwd *line) { line->pw_shell = nullptr; },  IN_PASSWD},
        {"comment",  [](struct passwd *line) { line->pw_gecos = other(); },  ACCEPTED },
    };
    for (const field_case &row : cases) {
        reread_lines reread;
        reread.on_passwd = row.alter;
        EXPECT_EQ(user_error({.shadowed = true, .password = "h"}), row.error) << row.name;
        EXPECT_EQ(user_error({.shadowed = false, .password = "h"}), row.error) << row.name;
    }
}

TEST_F(RecordCheck, NameAndPasswordOfAShadowLineCount) {
    struct field_case {
        const char *name;
        void (*alter)(struct spwd *line);
        const std::string &error;
    };
    const field_case cases[] = {
        {"nothing",     [](struct spwd *) {},                               ACCEPTED },
        {"name",        [](struct spwd *line) { line->sp_namp = other(); }, IN_SHADOW},
        {"password",    [](struct spwd *line) { line->sp_pwdp = other(); }, IN_SHADOW},
        {"empty",       [](struct spwd *line) { line->sp_pwdp = nothing; }, IN_SHADOW},
        {"last change", [](struct spwd *line) { line->sp_lstchg++; },       ACCEPTED },
    };
    for (const field_case &row : cases) {
        reread_lines reread;
        reread.on_shadow = row.alter;
        EXPECT_EQ(user_error({.shadowed = true, .password = "h"}), row.error) << row.name;
        EXPECT_EQ(user_error({.shadowed = true}), row.error) << row.name;
        EXPECT_EQ(user_error({.shadowed = false}), ACCEPTED) << row.name;
    }
}

TEST_F(RecordCheck, NameIdAndMembersOfAGroupLineCount) {
    struct field_case {
        const char *name;
        void (*alter)(struct group *line);
        const std::string &error;
    };
    const field_case cases[] = {
        {"nothing",        [](struct group *) {},                                    ACCEPTED},
        {"name",           [](struct group *line) { line->gr_name = other(); },      IN_GROUP},
        {"gid",            [](struct group *line) { line->gr_gid++; },               IN_GROUP},
        {"other member",   [](struct group *line) { line->gr_mem[0] = other(); },    IN_GROUP},
        {"no member",      [](struct group *line) { line->gr_mem[0] = nullptr; },    IN_GROUP},
        {"no list",        [](struct group *line) { line->gr_mem = nullptr; },       IN_GROUP},
        {"another member", [](struct group *line) { line->gr_mem = two_members(); }, IN_GROUP},
    };
    for (const field_case &row : cases) {
        reread_lines reread;
        reread.on_group = row.alter;
        EXPECT_EQ(member_error("someone"), row.error) << row.name;
    }
    reread_lines reread;
    reread.on_group = [](struct group *line) { line->gr_mem = two_members(); };
    EXPECT_EQ(member_error("other"), IN_GROUP);
}

TEST_F(RecordCheck, SecondLineIsRefused) {
    reread_lines reread;
    reread.repeat_last = true;
    EXPECT_EQ(user_error({.shadowed = false}), IN_PASSWD);
    EXPECT_EQ(member_error("someone"), IN_GROUP);
    reread.repeat_last = false;
    EXPECT_EQ(member_error("someone"), ACCEPTED);
}

TEST_F(RecordCheck, WithoutStreamsInMemoryNothingSurvives) {
    reread_lines reread;
    reread.write_stream_error = ENOMEM;
    EXPECT_EQ(user_error({.shadowed = true}), refused("passwd", 3, "Cannot allocate memory"));
    EXPECT_EQ(member_error("someone"), refused("group", 3, "Cannot allocate memory"));
    reread.write_stream_error = 0;
    reread.read_stream_error = ENOMEM;
    EXPECT_EQ(user_error({.shadowed = true}), IN_PASSWD);
    EXPECT_EQ(member_error("someone"), IN_GROUP);
}
