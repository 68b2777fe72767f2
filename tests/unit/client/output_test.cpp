// tests/unit/client/output_test.cpp: tables, records, widths and escapes.
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "client/table_output.h"
#include "output/display_text.h"

namespace {

std::string take(char *text) {
    g_autofree char *owned = text;
    return owned;
}

std::string table(std::vector<table_column> columns, std::vector<std::vector<const char *>> rows,
                  table_style style = {true, false}) {
    g_autoptr(GPtrArray) cells = g_ptr_array_new();
    for (auto &row : rows) {
        row.push_back(nullptr);
        g_ptr_array_add(cells, row.data());
    }
    return take(table_format(columns, cells, style));
}

TEST(Table, AlignsColumns) {
    EXPECT_EQ(table(
                  {
                      {"NAME",    false},
                      {"GID",     true },
                      {"MEMBERS", false}
    },
                  {{"root", "0", ""}, {"administrators", "60005", "a b"}}),
              "NAME             GID MEMBERS\n"
              "root               0\n"
              "administrators 60005 a b\n");
}

TEST(Table, CountsColumnsOfTheTerminal) {
    // Two columns for each of the wide ones, none for a combining accent.
    EXPECT_EQ(table(
                  {
                      {"N", false},
                      {"M", false}
    },
                  {{"日本", "x"}, {"abcd", "x"}, {"e\u0301e\u0301", "x"}, {"né", "x"}}),
              "N    M\n"
              "日本 x\n"
              "abcd x\n"
              "e\u0301e\u0301   x\n"
              "né   x\n");
}

TEST(Table, EscapesWhatWouldBreakItsLines) {
    EXPECT_EQ(table(
                  {
                      {"A", false},
                      {"B", false}
    },
                  {{"a\nb", "\x1b[2J"}, {"c", "d\te"}}),
              "A      B\n"
              "a\\x0ab \\x1b[2J\n"
              "c      d\\x09e\n");
}

TEST(Table, HasNoTitlesWithoutALegend) {
    EXPECT_EQ(table(
                  {
                      {"LONG TITLE", false},
                      {"B",          false}
    },
                  {{"a", "b"}}, {false, true}),
              "a b\n");
}

TEST(Table, UnderlinesItsTitlesInColor) {
    EXPECT_EQ(table(
                  {
                      {"A", false}
    },
                  {{"a"}}, {true, true}),
              "\x1b[4mA\x1b[0m\na\n");
}

TEST(Table, MayBeEmpty) {
    EXPECT_EQ(table(
                  {
                      {"NAME", false}
    },
                  {}),
              "NAME\n");
}

TEST(Record, HasItsColonsBelowEachOther) {
    const char *labels[] = {"A", "Länge", "Empty", nullptr};
    const char *values[] = {"x\ny", "z", "", nullptr};
    EXPECT_EQ(take(record_format(const_cast<char **>(labels), const_cast<char **>(values))),
              "    A: x\\x0ay\nLänge: z\nEmpty:\n");
}

TEST(Escape, ShowsWhatATerminalWouldObey) {
    static constexpr struct {
        const char *text;
        const char *line;
        const char *lines;
    } CASES[] = {
        {"plain né 日本 \\",      "plain né 日本 \\",          "plain né 日本 \\"},
        {"a\nb\tc",                  "a\\x0ab\\x09c",                "a\nb\tc"            },
        {"\r\x7f\x01",               "\\x0d\\x7f\\x01",              "\\x0d\\x7f\\x01"    },
        {"\u0085\u009b",             "\\x85\\x9b",                   "\\x85\\x9b"         },
        {"\u200e\u202e\u2066\u2028", "\\u200e\\u202e\\u2066\\u2028",
         "\\u200e\\u202e\\u2066\\u2028"                                                   },
        {"\U000e0001",               "\\U000e0001",                  "\\U000e0001"        },
        {"\xff",                     "\ufffd",                       "\ufffd"             },
        {"",                         "",                             ""                   },
    };
    for (const auto &row : CASES) {
        EXPECT_EQ(take(display_escape(row.text, false)), row.line);
        EXPECT_EQ(take(display_escape(row.text, true)), row.lines);
    }
}

TEST(Width, IsThatOfTheTerminal) {
    EXPECT_EQ(display_width(""), 0);
    EXPECT_EQ(display_width("né"), 2);
    EXPECT_EQ(display_width("ne\u0301"), 2);
    EXPECT_EQ(display_width("日本"), 4);
}

}  // namespace
