// tests/unit/client/command_line_test.cpp: words, options and numbers of a command line.
#include "client/command_line.h"

#include <initializer_list>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "client/client_error.h"

namespace {

class CommandLine : public testing::Test {
  protected:
    ~CommandLine() override {
        command_line_clear(&line_);
        g_clear_error(&error_);
        g_strfreev(argv_);
    }

    bool parse(std::initializer_list<const char *> arguments, bool on_terminal = false) {
        g_autoptr(GStrvBuilder) builder = g_strv_builder_new();
        g_strv_builder_add(builder, "privanectl");
        for (const char *argument : arguments)
            g_strv_builder_add(builder, argument);
        g_strfreev(argv_);
        argv_ = g_strv_builder_end(builder);
        g_clear_error(&error_);
        return command_line_parse(static_cast<int>(g_strv_length(argv_)), argv_, on_terminal,
                                  &line_, &error_);
    }

    std::string refusal(std::initializer_list<const char *> arguments) {
        if (parse(arguments))
            return "accepted";
        EXPECT_TRUE(g_error_matches(error_, CLIENT_ERROR, CLIENT_ERROR_USAGE));
        EXPECT_EQ(line_.words, nullptr);
        return error_ != nullptr ? error_->message : "refused without an error";
    }

    std::vector<std::string> words() const {
        std::vector<std::string> all;
        for (guint i = 0; word_at(line_, i) != nullptr; i++)
            all.emplace_back(word_at(line_, i));
        return all;
    }

    char **argv_ = nullptr;
    command_line line_ = {};
    GError *error_ = nullptr;
};

using Words = std::vector<std::string>;

TEST_F(CommandLine, HasWordsInTheirOrderAmidOptions) {
    ASSERT_TRUE(parse({"user", "--group=a", "add", "-j", "x", "--comment", "two words"}));
    EXPECT_EQ(words(), (Words{"user", "add", "x"}));
    EXPECT_STREQ(line_.options[OPTION_GROUP], "a");
    EXPECT_STREQ(line_.options[OPTION_COMMENT], "two words");
    EXPECT_EQ(line_.options[OPTION_GROUPS], nullptr);
}

TEST_F(CommandLine, HasDefaults) {
    ASSERT_TRUE(parse({}));
    EXPECT_EQ(words(), Words{});
    EXPECT_EQ(line_.json, json_mode::OFF);
    EXPECT_EQ(line_.timeout_ms, 60000);
    for (const char *value : line_.options)
        EXPECT_EQ(value, nullptr);
}

TEST_F(CommandLine, TakesNegativeNumbersForWords) {
    ASSERT_TRUE(parse({"clock", "adjust", "-1.5", "-0", "-.5", "-12"}));
    EXPECT_EQ(words(), (Words{"clock", "adjust", "-1.5", "-0", "-.5", "-12"}));
}

TEST_F(CommandLine, EndsOptionsAtTwoHyphens) {
    ASSERT_TRUE(parse({"pinsrv", "--", "-d", "--json=short", "--", "-5"}));
    EXPECT_EQ(words(), (Words{"pinsrv", "-d", "--json=short", "--", "-5"}));
    EXPECT_EQ(line_.json, json_mode::OFF);
}

TEST_F(CommandLine, TakesALoneHyphenAndAnEmptyWord) {
    ASSERT_TRUE(parse({"log", "-", ""}));
    EXPECT_EQ(words(), (Words{"log", "-", ""}));
}

TEST_F(CommandLine, KnowsShortOptions) {
    ASSERT_TRUE(parse({"-hj"}));
    EXPECT_STREQ(line_.options[OPTION_HELP], "");
    EXPECT_EQ(line_.json, json_mode::SHORT);
}

TEST_F(CommandLine, IsPrettyOnATerminal) {
    ASSERT_TRUE(parse({"-j"}, true));
    EXPECT_EQ(line_.json, json_mode::PRETTY);
}

TEST_F(CommandLine, TakesTheLastModeOfJson) {
    ASSERT_TRUE(parse({"-j", "--json=pretty", "--json=off"}));
    EXPECT_EQ(line_.json, json_mode::OFF);
}

TEST_F(CommandLine, WaitsForEverWithoutATimeout) {
    ASSERT_TRUE(parse({"--timeout=0"}));
    EXPECT_EQ(line_.timeout_ms, G_MAXINT);
}

TEST_F(CommandLine, WaitsForADayAtMost) {
    ASSERT_TRUE(parse({"--timeout=86400"}));
    EXPECT_EQ(line_.timeout_ms, 86400000);
    command_line_clear(&line_);
    EXPECT_EQ(refusal({"--timeout=86401"}),
              "--timeout takes a number of seconds up to 86400, not '86401'");
}

TEST_F(CommandLine, RefusesAnUnknownOption) {
    EXPECT_EQ(refusal({"user", "--nothing", "x"}), "unknown option --nothing");
}

TEST_F(CommandLine, RefusesAnUnknownCharacter) {
    EXPECT_EQ(refusal({"user", "-jx"}), "unknown option -x");
}

// Else a password would be taken for the number of a descriptor, and every beginning bind us.
TEST_F(CommandLine, RefusesTheBeginningOfAnOption) {
    EXPECT_EQ(refusal({"--passw=1"}), "unknown option --passw");
    EXPECT_EQ(refusal({"--password=1234"}), "unknown option --password");
    EXPECT_EQ(refusal({"user", "--no-leg"}), "unknown option --no-leg");
}

TEST_F(CommandLine, TakesWordsBehindTheEndOfTheOptions) {
    EXPECT_EQ(refusal({"--", "--password=1234"}), "accepted");
}

TEST_F(CommandLine, TakesAValueThatLooksLikeAnOption) {
    EXPECT_EQ(refusal({"--comment", "--password=1234"}), "accepted");
}

TEST_F(CommandLine, RefusesAMissingValue) {
    EXPECT_EQ(refusal({"--address"}), "option --address needs a value");
}

TEST_F(CommandLine, RefusesAValueThatIsNotTaken) {
    EXPECT_EQ(refusal({"--system=yes"}), "option --system takes no value");
}

TEST_F(CommandLine, RefusesWhatIsNoUtf8) {
    EXPECT_EQ(refusal({"user", "\xff"}), "'\xef\xbf\xbd' is no UTF-8");
}

TEST(ParseNumber, KeepsToItsLimits) {
    static constexpr struct {
        const char *text;
        bool is_number;
    } CASES[] = {
        {"0",                    true },
        {"-3",                   true },
        {"3",                    true },
        {"4",                    false},
        {"-4",                   false},
        {"",                     false},
        {"1 ",                   false},
        {" 1",                   false},
        {"1a",                   false},
        {"0x1",                  false},
        {"99999999999999999999", false},
    };
    for (const auto &row : CASES) {
        gint64 number = 77;
        EXPECT_EQ(parse_number(row.text, -3, 3, &number), row.is_number) << row.text;
    }
}

TEST(Choice, IsAWholeWord) {
    EXPECT_TRUE(is_choice("all tcp-udp", "all"));
    EXPECT_TRUE(is_choice("all tcp-udp", "tcp-udp"));
    EXPECT_FALSE(is_choice("all tcp-udp", "tcp"));
    EXPECT_FALSE(is_choice("all tcp-udp", ""));
    EXPECT_FALSE(is_choice("all tcp-udp", "all tcp-udp"));
}

}  // namespace
