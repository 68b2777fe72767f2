// tests/unit/client/system_verbs_test.cpp: times, words and results of the system commands.
#include "client/system_verbs.h"

#include <initializer_list>
#include <string>

#include <gtest/gtest.h>

#include "client/account_verbs.h"
#include "client/client_error.h"

namespace {

using builder = GVariant *(*)(const command_line &, GError **);

// The arguments as text, or the text of a usage error.
std::string built(builder build, std::initializer_list<const char *> words) {
    g_autoptr(GPtrArray) given = g_ptr_array_new();
    g_autoptr(GError) error = nullptr;
    command_line line = {};

    for (const char *word : words)
        g_ptr_array_add(given, const_cast<char *>(word));
    line.words = given;
    GVariant *arguments = build(line, &error);
    if (arguments == nullptr) {
        EXPECT_TRUE(g_error_matches(error, CLIENT_ERROR, CLIENT_ERROR_USAGE));
        return error != nullptr ? error->message : "no error";
    }
    g_autoptr(GVariant) owned = g_variant_ref_sink(arguments);
    g_autofree char *text = g_variant_print(owned, FALSE);
    return text;
}

TEST(ClockAdjust, HasBothPartsOfOneSign) {
    static constexpr struct {
        const char *written;
        const char *arguments;
    } CASES[] = {
        {"1",            "(1, 0)"              },
        {"-1",           "(-1, 0)"             },
        {"1.5",          "(1, 500000)"         },
        {"-1.5",         "(-1, -500000)"       },
        {"-0.5",         "(0, -500000)"        },
        {"0.000001",     "(0, 1)"              },
        {"-0.25",        "(0, -250000)"        },
        {"2147483647.9", "(2147483647, 900000)"},
    };
    for (const auto &row : CASES)
        EXPECT_EQ(built(build_clock_adjust, {"clock", "adjust", row.written}), row.arguments);
}

TEST(ClockAdjust, RefusesWhatTheBusCannotCarry) {
    for (const char *written : {"2147483648", "-2147483649", "1.", ".5", "1.1234567", "1.-5", "x"})
        EXPECT_EQ(built(build_clock_adjust, {"clock", "adjust", written}),
                  std::string("'") + written + "' is no number of seconds");
}

TEST(ClockSet, TakesSecondsAndDates) {
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "@1700000000.25"}), "(1700000000, 250000)");
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "1970-01-01T00:00:01.5Z"}), "(1, 500000)");
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "2038-01-19 03:14:07Z"}), "(2147483647, 0)");
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "2038-01-19 03:14:08Z"}),
              "'2038-01-19 03:14:08Z' is no time; write \"2026-01-31 23:59:59\" or @SECONDS");
}

// The kernel takes no microseconds below 0.
TEST(ClockSet, CountsMicrosecondsUpwardsBeforeTheEpoch) {
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "@-5.5"}), "(-6, 500000)");
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "@-0.000001"}), "(-1, 999999)");
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "@-5"}), "(-5, 0)");
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "@-2147483647.5"}), "(-2147483648, 500000)");
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "@-2147483648"}), "(-2147483648, 0)");
    EXPECT_EQ(built(build_clock_set, {"clock", "set", "@-2147483648.5"}),
              "'@-2147483648.5' is no time; write \"2026-01-31 23:59:59\" or @SECONDS");
}

TEST(Pinsrv, HasItsOwnNameInFront) {
    EXPECT_EQ(built(build_pinsrv, {"pinsrv"}), "(['pinsrv'],)");
    EXPECT_EQ(built(build_pinsrv, {"pinsrv", "-d", ""}), "(['pinsrv', '-d', ''],)");
}

TEST(Reset, HasTheWordOfItsKind) {
    EXPECT_EQ(built(build_reset, {"reset", "arm", "hard"}), "('ONVIF_HARD_RESET',)");
    EXPECT_EQ(built(build_reset, {"reset", "arm", "soft"}), "('SOFT_RESET',)");
    EXPECT_EQ(built(build_reset, {"reset", "arm", "har"}), "KIND is one of hard|soft, not 'har'");
}

TEST(DigestDelete, HasALineForEachName) {
    EXPECT_EQ(built(build_digest_delete, {"digest", "delete", "a", "b c"}),
              "(['delete', 'a\\nb c\\n'],)");
}

// Another login than the one that is named could go with it.
TEST(DigestDelete, TakesNoNameThatIsMoreThanOne) {
    for (const char *name : {"a:PRIVANE", "a\nb", ":", ""})
        EXPECT_EQ(built(build_digest_delete, {"digest", "delete", "c", name}),
                  std::string("no web login can be named '") + name + "'");
}

std::string verdict(bool (*judge)(GVariant *, GError **), int result) {
    g_autoptr(GVariant) results = g_variant_ref_sink(g_variant_new("(i)", result));
    g_autoptr(GError) error = nullptr;

    if (judge(results, &error))
        return "done";
    EXPECT_TRUE(g_error_matches(error, CLIENT_ERROR, CLIENT_ERROR_FAILED));
    return error != nullptr ? error->message : "no error";
}

TEST(Results, MayTellAFailure) {
    EXPECT_EQ(verdict(judge_clock, 0), "done");
    EXPECT_EQ(verdict(judge_clock, -1), "The kernel refused the time");
    EXPECT_EQ(verdict(judge_pinsrv, 17), "done");
    EXPECT_EQ(verdict(judge_pinsrv, -1), "The PIN server could not be started");
    EXPECT_EQ(verdict(judge_reboot, 0), "done");
    EXPECT_EQ(verdict(judge_reboot, -1), "The tool that reboots could not be started");
    EXPECT_EQ(verdict(judge_reboot, 256 * 3), "The tool that reboots failed with status 3");
    EXPECT_EQ(verdict(judge_reboot, 9), "The tool that reboots was ended by signal 9");
}

}  // namespace
