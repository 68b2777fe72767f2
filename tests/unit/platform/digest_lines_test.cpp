// tests/unit/platform/digest_lines_test.cpp: the lines of a digest file, read as Apache reads them.
#include "platform/digest_entry/digest_lines.h"

#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

static constexpr line_format FORMAT = {digest_read_line, nullptr};

static const std::string HASH = "427f14472e033f24869b1602e6871ed7";
static const std::string OTHER_HASH = "00000000000000000000000000000000";
static const std::string ALICE = "alice:PRIVANE:" + HASH;

static std::string apply(const std::string &text, std::string_view user, std::string_view line) {
    const line_change change = {user, line};
    wiped_text changed;

    keyed_lines_apply(text, FORMAT, {&change, 1}, &changed);
    return std::string(changed.view());
}

static std::string without_alice(const std::string &text) {
    return apply(text, "alice", "");
}

// Each is a line of alice's to Apache.
TEST(DigestLines, EveryFormOfAUsersLineIsOne) {
    using namespace std::string_literals;
    const std::vector<std::string> forms = {
        ALICE + "\n",
        ALICE,
        ALICE + "\r\n",
        " \t\v\f\r" + ALICE + " \t\n",
        "alice::PRIVANE:::" + HASH + "\n",
        "alice:PRIVANE\n",
        "alice:PRIVANE   \n",
        "alice:PRIVANE:\n",
        "alice:PRIVANE:" + HASH + ":more:fields\n",
        "al\\\nice:PRIVANE:" + HASH + "\n",
        "al\\\r\nice:PRI\\\n\\\nVANE:" + HASH + "\n",
        "\\\n" + ALICE + "\n",
        ALICE + "\\\n",
        // It is one as soon as it has the end that the next change gives it.
        "alice:PRIVANE\\",
        ALICE + "\\\n# this line is a part of it\n",
        "alice:PRIVANE\0 hidden\\\n"s,
        // The second backslash is found when the empty line has been put behind the first.
        "alice:PRIVANE:\\\\\n\n# this line is a part of it\n",
    };
    for (const std::string &form : forms) {
        EXPECT_EQ(without_alice("before\n" + form), "before\n") << form;
        EXPECT_EQ(apply(form, "alice", ALICE), ALICE + "\n") << form;
    }
}

// None is, so each of them stays.
TEST(DigestLines, OtherLinesAreKept) {
    using namespace std::string_literals;
    const std::vector<std::string> others = {
        "#" + ALICE + "\n",
        " \t#" + ALICE + "\n",
        "# comment \\\n" + ALICE + "\n",
        "\n",
        "  \n",
        "\\\n\n",
        "alice\n",
        "alice:\n",
        "alice:privane:" + HASH + "\n",
        "alice:PRIVANE :" + HASH + "\n",
        "alice: PRIVANE:" + HASH + "\n",
        "alice:OTHER:PRIVANE:" + HASH + "\n",
        "alice :PRIVANE:" + HASH + "\n",
        ":alice:PRIVANE:" + HASH + "\n",
        "Alice:PRIVANE:" + HASH + "\n",
        "al\0ice:PRIVANE:"s + HASH + "\n",
        "alice\0:PRIVANE:"s + HASH + "\n",
        "bob\\\n" + ALICE + "\n",
    };
    for (const std::string &other : others) {
        EXPECT_EQ(without_alice(other), other);
        EXPECT_EQ(without_alice(other + ALICE + "\n" + other), other + other);
        EXPECT_EQ(apply(other, "alice", ALICE), other + ALICE + "\n");
    }
}

// What is put behind a line that goes on would be a part of it.
TEST(DigestLines, NewLineIsALineOfItsOwn) {
    using namespace std::string_literals;
    const std::string added = ALICE + "\n";

    EXPECT_EQ(apply("# comment", "alice", ALICE), "# comment\n" + added);
    EXPECT_EQ(apply("# comment\\\n", "alice", ALICE), "# comment\\\n \n" + added);
    EXPECT_EQ(apply("# comment\\", "alice", ALICE), "# comment\\\n \n" + added);
    EXPECT_EQ(apply("# comment\\\r", "alice", ALICE), "# comment\\\r\n \n" + added);
    EXPECT_EQ(apply("# comment\\\r\n", "alice", ALICE), "# comment\\\r\n \n" + added);
    EXPECT_EQ(apply("# a\\\nb\\\n", "alice", ALICE), "# a\\\nb\\\n \n" + added);
    EXPECT_EQ(apply("# comment\0\\\n"s, "alice", ALICE), "# comment\0\\\n"s + added);
    EXPECT_EQ(apply("# a\\\\\\\n", "alice", ALICE), "# a\\\\\\\n \n" + added);
    EXPECT_EQ(apply("bob:PRIVANE:x\\\n", "bob", ""), "");
    // Nothing is put behind it, so it stays.
    EXPECT_EQ(apply("# comment\\\n", "alice", ""), "# comment\\\n");
    EXPECT_EQ(apply(ALICE + "\n# comment\\\n", "alice", ALICE), ALICE + "\n# comment\\\n");
}

// A second, plain account of how Apache reads a file: lines as it joins them, and their parts.
struct apache_line {
    std::string raw;
    std::string text;
};

static std::vector<apache_line> apache_lines(std::string file) {
    std::vector<apache_line> lines;

    while (!file.empty()) {
        apache_line line;
        bool more = true;
        while (more && !file.empty()) {
            const std::string part = file.substr(0, file.find('\n') + 1);
            const std::string taken = part.empty() ? file : part;
            file.erase(0, taken.size());
            line.raw += taken;
            line.text += taken.c_str();  // Up to a NUL.
            more = false;
            for (const std::string end : {"\\\n", "\\\r\n"}) {
                if (!more && line.text.ends_with(end)) {
                    line.text.erase(line.text.size() - end.size());
                    more = true;
                }
            }
        }
        lines.push_back(line);
    }
    return lines;
}

static bool is_line_of(const apache_line &line, const std::string &user) {
    const std::string blanks = " \t\n\v\f\r";
    std::string text = line.text;

    while (!text.empty() && blanks.find(text.front()) != blanks.npos)
        text.erase(0, 1);
    while (!text.empty() && blanks.find(text.back()) != blanks.npos)
        text.pop_back();
    std::string word;
    std::vector<std::string> words;
    for (std::size_t i = 0; i <= text.size(); i++) {
        if (i < text.size() && text[i] != ':') {
            word += text[i];
        } else if (i == text.size() || text[i - (i > 0 ? 1 : 0)] != ':' || i == 0) {
            words.push_back(word);
            word.clear();
        }
    }
    return words.size() >= 2 && text.front() != '#' && words[0] == user && words[1] == "PRIVANE";
}

static std::vector<apache_line> lines_of_others(const std::string &file, int *out_own) {
    std::vector<apache_line> others;

    *out_own = 0;
    for (const apache_line &line : apache_lines(file)) {
        if (is_line_of(line, "alice"))
            *out_own += 1;
        else
            others.push_back(line);
    }
    return others;
}

static std::string random_text(std::mt19937 *random) {
    static const std::vector<std::string> pieces = {
        "alice",
        "bob",
        "al",
        "ice",
        ":",
        ":",
        "::",
        "PRIVANE",
        "OTHER",
        "\n",
        "\n",
        "\r\n",
        "\r",
        "\\\n",
        "\\\n",
        "\\",
        "\\\r\n",
        " ",
        "\t",
        "#",
        "\xff",
        HASH,
        ALICE,
        "alice:PRIVANE:x\n",
        std::string(1, '\0'),
        ALICE + "\n",
        "bob:PRIVANE:" + HASH + "\n",
    };
    std::string text;

    for (std::size_t count = (*random)() % 24; count > 0; count--)
        text += pieces[(*random)() % pieces.size()];
    return text;
}

// The others' lines stay as they are, but the last one, which may get an end, and a blank line that
// keeps it from going on.
static void expect_others_kept(const std::vector<apache_line> &before,
                               const std::vector<apache_line> &after) {
    ASSERT_EQ(after.size(), before.size());
    for (std::size_t i = 0; i < before.size(); i++) {
        if (i + 1 < before.size()) {
            EXPECT_EQ(after[i].raw, before[i].raw);
            continue;
        }
        ASSERT_TRUE(after[i].raw.starts_with(before[i].raw));
        const std::string added = after[i].raw.substr(before[i].raw.size());
        EXPECT_TRUE(added.empty() || added == "\n" || added == " \n" || added == "\n \n");
    }
}

TEST(DigestLines, AnyTextIsChangedOnlyWhereItIsTheUsers) {
    std::mt19937 random(20200714);
    const std::string line = "alice:PRIVANE:" + OTHER_HASH;

    for (int i = 0; i < 4000; i++) {
        const std::string text = random_text(&random);
        SCOPED_TRACE(testing::PrintToString(text));
        int own = 0;
        int own_after = 0;
        const auto before = lines_of_others(text, &own);

        const std::string set = apply(text, "alice", line);
        expect_others_kept(before, lines_of_others(set, &own_after));
        EXPECT_EQ(own_after, 1);
        EXPECT_NE(set.find(line + "\n"), set.npos);
        EXPECT_EQ(apply(set, "alice", line), set);

        const std::string removed = apply(text, "alice", "");
        expect_others_kept(before, lines_of_others(removed, &own_after));
        EXPECT_EQ(own_after, 0);
        EXPECT_EQ(apply(removed, "alice", ""), removed);
        if (HasFailure())
            break;
    }
}
