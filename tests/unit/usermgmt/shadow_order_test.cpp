// tests/unit/usermgmt/shadow_order_test.cpp: which shadow line is a user's, in whatever order the
// two files are.
#include <algorithm>
#include <random>

#include "tests/unit/usermgmt/account_files.h"
#include "usermgmt/context.h"

class ShadowOrder : public AccountFiles {
  protected:
    // "name hash" of each user that was loaded from the files.
    static lines loaded() {
        error_slot error;
        open_context ctx(usermgmt_open(USERMGMT_OPEN_TRYLOCK, error.out()));
        EXPECT_EQ(error.text(), "");
        lines users;
        for (const internal_user *user : records<const internal_user>(ctx->user_db.entries))
            users.push_back(std::string(user->name) + " " + user->password);
        (void)take_syslog();
        return users;
    }
};

struct named_hash {
    std::string name;
    std::string hash;
};

// The first line of the name; "" where there is none.
static std::string hash_of(const std::vector<named_hash> &shadow, const std::string &name) {
    for (const named_hash &line : shadow)
        if (line.name == name)
            return line.hash;
    return "";
}

// The first of two lines of a user is left out, since its group is missing, after its shadow line
// was passed: the second line's is the first one all the same.
TEST_F(ShadowOrder, UserWhoWasLeftOutDoesNotUseUpAShadowLine) {
    write("passwd", "a:x:1:99:::\na:x:1:0:::\nb:x:2:0:::\n");
    write("shadow", "a:first:1::::::\na:second:1::::::\nb:third:1::::::\n");
    write("group", "root:x:0:\n");
    EXPECT_EQ(loaded(), (lines{"a first", "b third"}));
}

TEST_F(ShadowOrder, NameThatStandsTwiceInBothFilesHasTheFirstLineTwice) {
    write("passwd", "a:x:1:0:::\na:x:2:0:::\nb:x:3:0:::\n");
    write("shadow", "a:first:1::::::\na:second:1::::::\nb:third:1::::::\n");
    write("group", "root:x:0:\n");
    EXPECT_EQ(loaded(), (lines{"a first", "a first", "b third"}));
}

// Few names, so that they come twice or miss; mostly in order, so that both ways of finding a line
// are gone. Group 99 does not exist: its users are left out after their shadow line was found.
TEST_F(ShadowOrder, TheFirstLineOfTheNameCounts) {
    std::mt19937 random(7);
    const auto one_in = [&random](unsigned count) { return random() % count == 0; };
    int loads = 0;
    for (int round = 0; round < 600; round++) {
        std::vector<named_hash> shadow;
        std::vector<std::string> names;
        const auto length = static_cast<unsigned>(random() % 9);
        for (unsigned i = 0; i < length; i++) {
            const std::string name(1, static_cast<char>('a' + (one_in(5) ? random() % 9 : i)));
            names.push_back(name);
            if (one_in(8))
                shadow.push_back({std::string(1, static_cast<char>('a' + random() % 9)),
                                  "stray" + std::to_string(i)});
            if (!one_in(8))
                shadow.push_back({name, "hash" + std::to_string(i)});
        }
        if (one_in(6))
            std::shuffle(shadow.begin(), shadow.end(), random);

        std::string passwd_text;
        std::string shadow_text;
        lines expected;
        for (const std::string &name : names) {
            const bool plain = one_in(8);
            const bool stranded = one_in(8);
            passwd_text += name + (plain ? ":own:1:" : ":x:1:") + (stranded ? "99" : "0") + ":::\n";
            const std::string hash = plain ? "own" : hash_of(shadow, name);
            if (!stranded && !hash.empty())
                expected.push_back(name + " " + hash);
        }
        for (const named_hash &line : shadow)
            shadow_text += line.name + ":" + line.hash + ":1::::::\n";
        write("passwd", passwd_text);
        write("shadow", shadow_text);
        write("group", "root:x:0:\n");
        ASSERT_EQ(loaded(), expected) << passwd_text << "\n" << shadow_text;
        loads += static_cast<int>(expected.size());
    }
    EXPECT_GT(loads, 1000);
}
