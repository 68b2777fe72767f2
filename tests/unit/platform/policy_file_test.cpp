// tests/unit/platform/policy_file_test.cpp: what is a policy and what is not, and what one grants.
#include "platform/authz/policy/policy_file.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

using std::string_literals::operator""s;

// "ok", or the error.
static std::string parse(const std::string &text) {
    g_autoptr(GError) error = nullptr;
    g_autoptr(policy) rules = policy_parse(text, &error);

    if (rules != nullptr)
        return error == nullptr ? "ok" : "a policy with an error";
    return std::string(g_quark_to_string(error->domain)) + " " + std::to_string(error->code) + " " +
           error->message;
}

static std::string refusal(const std::string &why) {
    return "authz 2 " + why;
}

static const std::string ROLE = "[role a]\nusers=u\nactions=x.y\n";

TEST(PolicyFile, RolesWithCommentsAndBlankLinesAreAPolicy) {
    EXPECT_EQ(parse(ROLE), "ok");
    EXPECT_EQ(parse("# Who may do what\n\n   \n[role a]\n#users=b\ngroups=g;h\n\n"
                    "actions=x.y;x.z.*\n[role b]\nactions=x.y\nusers=u\ngroups=g\n"),
              "ok");
    EXPECT_EQ(parse("# \xc3\xa4 is UTF-8: [role a = b]\n" + ROLE), "ok");
}

TEST(PolicyFile, FileWithoutARoleIsRefused) {
    EXPECT_EQ(parse(""), refusal("1: no role in the file"));
    EXPECT_EQ(parse("\n"), refusal("1: no role in the file"));
    EXPECT_EQ(parse("# nobody\n\n  \n"), refusal("3: no role in the file"));
    EXPECT_EQ(parse("#[role a]\n#users=u\n#actions=x.y\n"), refusal("3: no role in the file"));
}

TEST(PolicyFile, UnknownSectionIsRefused) {
    EXPECT_EQ(parse("[roles]\n"), refusal("1: unknown section '[roles]'"));
    EXPECT_EQ(parse("[role]\n"), refusal("1: unknown section '[role]'"));
    EXPECT_EQ(parse("[Role a]\n"), refusal("1: unknown section '[Role a]'"));
    EXPECT_EQ(parse("[role a\n"), refusal("1: unknown section '[role a'"));
    EXPECT_EQ(parse("[role a] \n"), refusal("1: unknown section '[role a] '"));
    EXPECT_EQ(parse("[role a] # b\n"), refusal("1: unknown section '[role a] # b'"));
    EXPECT_EQ(parse("[\n"), refusal("1: unknown section '['"));
    EXPECT_EQ(parse(ROLE + "[group b]\n"), refusal("4: unknown section '[group b]'"));
}

TEST(PolicyFile, UnknownKeyIsRefused) {
    EXPECT_EQ(parse("[role a]\nuser=u\n"), refusal("2: unknown key 'user'"));
    EXPECT_EQ(parse("[role a]\nUsers=u\n"), refusal("2: unknown key 'Users'"));
    EXPECT_EQ(parse("[role a]\nusers =u\n"), refusal("2: unknown key 'users '"));
    EXPECT_EQ(parse("[role a]\n users=u\n"), refusal("2: unknown key ' users'"));
    EXPECT_EQ(parse("[role a]\n # no comment=\n"), refusal("2: unknown key ' # no comment'"));
    EXPECT_EQ(parse("[role a]\n=u\n"), refusal("2: unknown key ''"));
    EXPECT_EQ(parse("user=u\n"), refusal("1: unknown key 'user'"));
}

TEST(PolicyFile, KeyOutsideARoleIsRefused) {
    EXPECT_EQ(parse("users=u\n" + ROLE), refusal("1: key 'users' outside a role"));
    EXPECT_EQ(parse("\nactions=x.y\n"), refusal("2: key 'actions' outside a role"));
}

TEST(PolicyFile, RepetitionIsRefused) {
    EXPECT_EQ(parse(ROLE + ROLE), refusal("4: repeated role 'a'"));
    EXPECT_EQ(parse("[role a]\nusers=u\nusers=v\n"), refusal("3: repeated key 'users'"));
    EXPECT_EQ(parse("[role a]\ngroups=u\nusers=v\ngroups=u\n"),
              refusal("4: repeated key 'groups'"));
    EXPECT_EQ(parse("[role a]\nactions=x.y\nactions=x.y\n"), refusal("3: repeated key 'actions'"));
    EXPECT_EQ(parse("[role a]\nusers=u;v;u\n"), refusal("2: repeated element 'u'"));
    EXPECT_EQ(parse("[role a]\ngroups=u;u\n"), refusal("2: repeated element 'u'"));
    EXPECT_EQ(parse("[role a]\nactions=x.y;x.*;x.y\n"), refusal("2: repeated element 'x.y'"));
}

TEST(PolicyFile, EmptyElementIsRefused) {
    for (const std::string key : {"users", "groups", "actions"}) {
        for (const std::string list : {"", ";", ";a.b", "a.b;", "a.b;;c.d"}) {
            EXPECT_EQ(parse("[role a]\n" + key + "=" + list + "\n"),
                      refusal("2: empty element in '" + key + "'"))
                << list;
        }
    }
}

TEST(PolicyFile, RoleWithoutActionsIsRefused) {
    EXPECT_EQ(parse("\n[role a]\nusers=u\n"), refusal("2: role 'a' has no actions"));
    EXPECT_EQ(parse("[role a]\nusers=u\n[role b]\nusers=u\nactions=x.y\n"),
              refusal("1: role 'a' has no actions"));
    EXPECT_EQ(parse("[role a]\n"), refusal("1: role 'a' has no actions"));
}

TEST(PolicyFile, RoleOfNobodyIsRefused) {
    EXPECT_EQ(parse(ROLE + "[role b]\nactions=x.y\n"),
              refusal("4: role 'b' has neither users nor groups"));
    EXPECT_EQ(parse("[role b]\nactions=x.y\n" + ROLE),
              refusal("1: role 'b' has neither users nor groups"));
}

TEST(PolicyFile, LineWithoutEqualsSignIsRefused) {
    EXPECT_EQ(parse("[role a]\nusers\n"), refusal("2: no '=' in the line"));
    EXPECT_EQ(parse("role a\n"), refusal("1: no '=' in the line"));
    EXPECT_EQ(parse(" #\n"), refusal("1: no '=' in the line"));
}

TEST(PolicyFile, OtherBytesThanTextAreRefused) {
    for (const std::string &bytes : {"\xff"s, "\xc3"s, "\xc0\x80"s, "\xed\xa0\x80"s, "\0"s}) {
        EXPECT_EQ(parse("#\n# " + bytes + "\n" + ROLE), refusal("2: not UTF-8"));
        EXPECT_EQ(parse("[role a]\nusers=" + bytes + "\n"), refusal("2: not UTF-8"));
    }
}

// In the characters of a text that is UTF-8.
struct hidden_character {
    const char *bytes;
    const char *number;
};

static void expect_refused(const hidden_character &character, const std::string &kind) {
    const std::string why = kind + ", U+" + character.number;
    EXPECT_EQ(parse("#\n# a" + std::string(character.bytes) + "b\n" + ROLE), refusal("2: " + why));
    EXPECT_EQ(parse("[role a]" + std::string(character.bytes) + "\n"), refusal("1: " + why));
    EXPECT_EQ(parse(ROLE + character.bytes + "\n"), refusal("4: " + why));
}

TEST(PolicyFile, ControlCharacterIsRefused) {
    for (const hidden_character &character : {
             hidden_character{"\r",       "000D"},
             {"\t",       "0009"},
             {"\x1b",     "001B"},
             {"\x7f",     "007F"},
             {"\xc2\x85", "0085"},
             {"\x01",     "0001"}
    })
        expect_refused(character, "a control character");
}

// Those that turn the direction of what is shown, those that show nothing, and ends of lines that
// are none here.
TEST(PolicyFile, HiddenCharacterIsRefused) {
    for (const hidden_character &character : {
             hidden_character{"\xe2\x80\xaa",     "202A" },
             {"\xe2\x80\xab",     "202B" },
             {"\xe2\x80\xac",     "202C" },
             {"\xe2\x80\xad",     "202D" },
             {"\xe2\x80\xae",     "202E" },
             {"\xe2\x81\xa6",     "2066" },
             {"\xe2\x81\xa7",     "2067" },
             {"\xe2\x81\xa8",     "2068" },
             {"\xe2\x81\xa9",     "2069" },
             {"\xe2\x80\x8e",     "200E" },
             {"\xe2\x80\x8f",     "200F" },
             {"\xd8\x9c",         "061C" },
             {"\xe2\x80\x8b",     "200B" },
             {"\xe2\x80\x8c",     "200C" },
             {"\xe2\x80\x8d",     "200D" },
             {"\xe2\x81\xa0",     "2060" },
             {"\xef\xbb\xbf",     "FEFF" },
             {"\xc2\xad",         "00AD" },
             {"\xf3\xa0\x81\x81", "E0041"},
             {"\xe2\x80\xa8",     "2028" },
             {"\xe2\x80\xa9",     "2029" }
    })
        expect_refused(character, "a hidden character");
    EXPECT_EQ(parse("\xef\xbb\xbf" + ROLE), refusal("1: a hidden character, U+FEFF"));
}

TEST(PolicyFile, CommentMayBeInAnyLanguage) {
    EXPECT_EQ(
        parse("# \xd7\xa9\xd7\x9c\xd7\x95\xd7\x9d, e\xcc\x81, \xe2\x9a\xa0\xef\xb8\x8f\xc2\xa0!\n" +
              ROLE),
        "ok");
}

TEST(PolicyFile, TextThatWasCutOffIsRefused) {
    for (std::size_t length = 1; length < ROLE.size(); length++) {
        EXPECT_NE(parse(ROLE.substr(0, length)), "ok") << length;
    }
    EXPECT_EQ(parse("[role a]\nusers=u\nactions=x.y"), refusal("3: the last line does not end"));
    EXPECT_EQ(parse(ROLE + "#"), refusal("4: the last line does not end"));
}

TEST(PolicyFile, NameThatNoAccountHasIsRefused) {
    for (const std::string name :
         {" u",  "u ",  "a b", "-u", "+u", ".",    "..",       ".u",    "*",  "u:v",
          "u,v", "u/v", "a$b", "$",  "0",  "1000", "\xc3\xa4", "\"u\"", "@g", "u=v"}) {
        EXPECT_EQ(parse("[role a]\nusers=" + name + "\nactions=x.y\n"),
                  refusal("2: '" + name + "' is no name of a user"));
        EXPECT_EQ(parse("[role a]\ngroups=g;" + name + "\nactions=x.y\n"),
                  refusal("2: '" + name + "' is no name of a group"));
        EXPECT_EQ(parse("[role " + name + "]\n"),
                  refusal("1: '" + name + "' is no name of a role"));
    }
    EXPECT_EQ(parse("[role ]\n"), refusal("1: '' is no name of a role"));
    EXPECT_EQ(parse("[role  a]\n"), refusal("1: ' a' is no name of a role"));
}

TEST(PolicyFile, NameOfAnAccountIsTaken) {
    for (const std::string name :
         {"u", "U", "_apt", "systemd-network", "a.b", "host$", "7of9", "u_", "u-"}) {
        EXPECT_EQ(
            parse("[role " + name + "]\nusers=" + name + "\ngroups=" + name + "\nactions=x.y\n"),
            "ok");
    }
    EXPECT_EQ(parse("[role a]\nactions=x.y\nusers=" + std::string(255, 'u') + "\n"), "ok");
    EXPECT_EQ(parse("[role a]\nactions=x.y\nusers=" + std::string(256, 'u') + "\n"),
              refusal("3: '" + std::string(64, 'u') + "...' is no name of a user"));
}

TEST(PolicyFile, PatternOfNoActionIsRefused) {
    for (const std::string pattern :
         {"*",          ".*",       "x",    "x.",    ".x",   "x..y", "x.*y", "x.*.y",
          "x*",         "x.y*",     "x.**", "x.*.*", "*.y",  "x._",  "x.y ", " x.y",
          "x.\xc3\xa4", "x.getty@", "x,y",  "x.y=z", "x..*", "."}) {
        EXPECT_EQ(parse("[role a]\nusers=u\nactions=" + pattern + "\n"),
                  refusal("3: '" + pattern + "' is no pattern of action IDs"));
    }
}

TEST(PolicyFile, QuotationIsShort) {
    std::string umlauts;
    for (int i = 0; i < 64; i++)
        umlauts += "\xc3\xa4";

    EXPECT_EQ(parse(umlauts + "=\n"), refusal("1: unknown key '" + umlauts + "'"));
    EXPECT_EQ(parse(umlauts + "u=\n"), refusal("1: unknown key '" + umlauts + "...'"));
    EXPECT_EQ(parse("[" + umlauts + "\n"),
              refusal("1: unknown section '[" + umlauts.substr(2) + "...'"));
}

// A policy with two accounts of each kind that are known, and one that is not.
class PolicyDecision : public testing::Test {
  protected:
    void SetUp() override {
        add(ids_.users, "root", 0);
        add(ids_.users, "clerk", 701);
        add(ids_.groups, "root", 0);
        add(ids_.groups, "viewers", 750);
    }

    void TearDown() override {
        g_hash_table_unref(ids_.users);
        g_hash_table_unref(ids_.groups);
    }

    bool allows(const std::string &text, guint32 uid, const std::vector<guint32> &gids,
                const char *action) {
        g_autoptr(policy) rules = policy_parse(text, nullptr);
        const policy_caller caller = {uid, gids.data(), gids.size()};

        if (rules == nullptr)
            ADD_FAILURE() << "no policy: " << text;
        return rules != nullptr && policy_allows(rules, ids_, caller, action);
    }

  private:
    static void add(GHashTable *ids, const char *name, guint id) {
        g_hash_table_insert(ids, const_cast<char *>(name), GUINT_TO_POINTER(id));
    }

    policy_ids ids_ = {g_hash_table_new(g_str_hash, g_str_equal),
                       g_hash_table_new(g_str_hash, g_str_equal)};
};

TEST_F(PolicyDecision, UserOfARoleIsAllowedItsActions) {
    const std::string text = "[role a]\nusers=root;clerk\nactions=x.y;x.z\n";

    EXPECT_TRUE(allows(text, 701, {}, "x.y"));
    EXPECT_TRUE(allows(text, 701, {}, "x.z"));
    EXPECT_FALSE(allows(text, 701, {}, "x.a"));
    EXPECT_FALSE(allows(text, 702, {}, "x.y"));
}

TEST_F(PolicyDecision, MemberOfAGroupIsAllowedItsActions) {
    const std::string text = "[role a]\ngroups=viewers\nactions=x.y\n";

    EXPECT_TRUE(allows(text, 701, {750}, "x.y"));
    EXPECT_TRUE(allows(text, 701, {5, 750, 6}, "x.y"));
    EXPECT_FALSE(allows(text, 701, {5, 751}, "x.y"));
    EXPECT_FALSE(allows(text, 750, {701}, "x.y"));
    EXPECT_FALSE(allows(text, 750, {}, "x.y"));
}

TEST_F(PolicyDecision, UserIsNoGroupOfItsName) {
    EXPECT_FALSE(allows("[role a]\nusers=root\nactions=x.y\n", 701, {0}, "x.y"));
    EXPECT_FALSE(allows("[role a]\ngroups=root\nactions=x.y\n", 0, {701}, "x.y"));
    EXPECT_TRUE(allows("[role a]\nusers=clerk\ngroups=root\nactions=x.y\n", 5, {0}, "x.y"));
    EXPECT_TRUE(allows("[role a]\nusers=clerk\ngroups=root\nactions=x.y\n", 701, {5}, "x.y"));
}

TEST_F(PolicyDecision, RootHasNothingThatNoRoleGrants) {
    EXPECT_FALSE(allows("[role a]\nusers=clerk\nactions=x.*\n", 0, {0}, "x.y"));
    EXPECT_TRUE(allows("[role a]\nusers=root\nactions=x.*\n", 0, {0}, "x.y"));
}

// An ID of 0 must not come from a name that was not found.
TEST_F(PolicyDecision, UnknownNameIsNobody) {
    const std::string text = "[role a]\nusers=nosuch\ngroups=nosuch\nactions=x.y\n";

    for (const guint32 id : {0U, 701U, 4294967295U}) {
        EXPECT_FALSE(allows(text, id, {id}, "x.y"));
    }
}

TEST_F(PolicyDecision, RolesAddUpAndDoNotMix) {
    const std::string text =
        "[role a]\nusers=root\nactions=x.y\n"
        "[role b]\nusers=clerk\nactions=x.z\n"
        "[role c]\nusers=clerk\nactions=x.a\n";

    EXPECT_TRUE(allows(text, 701, {}, "x.z"));
    EXPECT_TRUE(allows(text, 701, {}, "x.a"));
    EXPECT_FALSE(allows(text, 701, {}, "x.y"));
    EXPECT_FALSE(allows(text, 0, {}, "x.z"));
}

TEST_F(PolicyDecision, ExactPatternIsOneAction) {
    const std::string text = "[role a]\nusers=clerk\nactions=p.start.ssh\n";

    EXPECT_TRUE(allows(text, 701, {}, "p.start.ssh"));
    for (const char *action : {"p.start.sshd", "p.start.ss", "p.start", "p.start.ssh.any",
                               "p.start.Ssh", "q.p.start.ssh", "p.start.ssh."}) {
        EXPECT_FALSE(allows(text, 701, {}, action)) << action;
    }
}

TEST_F(PolicyDecision, PatternWithAStarIsAnythingBelow) {
    const std::string text = "[role a]\nusers=clerk\nactions=p.start.*\n";

    for (const char *action : {"p.start.ssh", "p.start.getty.any", "p.start.a", "p.start.-"}) {
        EXPECT_TRUE(allows(text, 701, {}, action)) << action;
    }
    for (const char *action : {"p.start", "p.start.", "p.starts.ssh", "p.star.ssh", "p.stop.ssh",
                               "q.p.start.ssh", "P.start.ssh", "p-start.ssh"}) {
        EXPECT_FALSE(allows(text, 701, {}, action)) << action;
    }
}
