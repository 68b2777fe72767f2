// tests/unit/usermgmt/account_types_test.cpp: ID ranges, the type of an ID, the names of types.
#include "usermgmt/account_types.h"

#include <string>

#include <gtest/gtest.h>

#include "usermgmt/usermgmt.h"

static std::string row_text(const id_range &row) {
    return std::to_string(row.type) + " " + row.name + ": " + std::to_string(row.range_type) + " " +
           std::to_string(row.descending) + " " + std::to_string(row.min) + " " +
           std::to_string(row.max);
}

static void expect_rows(std::span<const id_range> table, std::span<const char *const> expected) {
    ASSERT_EQ(table.size(), expected.size());
    for (std::size_t i = 0; i < table.size(); i++)
        EXPECT_EQ(row_text(table[i]), expected[i]);
}

TEST(AccountTypes, UserRangesAreTheDevices) {
    static constexpr const char *rows[] = {
        "0 none: 0 0 0 0",
        "1 root: 1 0 0 0",
        "2 permanent system: 1 0 1 499",
        "3 dynamic system: 1 1 500 999",
        "4 ornet: 1 0 1000 60000",
        "5 nobody: 1 0 65534 65534",
    };
    expect_rows(user_range_table, rows);
}

TEST(AccountTypes, GroupRangesAreTheDevices) {
    static constexpr const char *rows[] = {
        "0 none: 0 0 0 0",
        "1 root: 2 0 0 0",
        "2 permanent system: 2 0 1 499",
        "3 dynamic system: 2 1 500 999",
        "4 nobody: 2 1 65534 65534",
        "5 permanent system nvr: 2 0 60001 60010",
    };
    expect_rows(group_range_table, rows);
}

struct id_and_type {
    guint32 id;
    guint32 type;
};

TEST(AccountTypes, TypeOfUidAtEveryEdge) {
    static constexpr id_and_type cases[] = {
        {0,          1},
        {1,          2},
        {499,        2},
        {500,        3},
        {999,        3},
        {1000,       4},
        {60000,      4},
        {60001,      0},
        {60010,      0},
        {65533,      0},
        {65534,      5},
        {65535,      0},
        {65536,      0},
        {131070,     0},
        {2147483647, 0},
        {2147483648, 0},
        {4294967294, 0},
        {4294967295, 0},
    };
    for (const id_and_type &row : cases)
        EXPECT_EQ(user_type_of_uid(row.id), row.type) << "uid " << row.id;
}

TEST(AccountTypes, TypeOfGidAtEveryEdge) {
    static constexpr id_and_type cases[] = {
        {0,          1},
        {1,          2},
        {499,        2},
        {500,        3},
        {999,        3},
        {1000,       0},
        {5000,       0},
        {60000,      0},
        {60001,      5},
        {60005,      5},
        {60010,      5},
        {60011,      0},
        {65533,      0},
        {65534,      4},
        {65535,      0},
        {65536,      0},
        {2147483648, 0},
        {4294967295, 0},
    };
    for (const id_and_type &row : cases)
        EXPECT_EQ(group_type_of_gid(row.id), row.type) << "gid " << row.id;
}

TEST(AccountTypes, UserTypeNames) {
    static constexpr const char *names[] = {"none",  "root",   "permanent", "dynamic system",
                                            "ornet", "nobody", "invalid",   "invalid"};
    for (guint32 type = 0; type < std::size(names); type++)
        EXPECT_STREQ(user_type_name(type), names[type]);
    EXPECT_STREQ(user_type_name(G_MAXUINT32), "invalid");
}

TEST(AccountTypes, GroupTypeNames) {
    static constexpr const char *names[] = {"none",           "root",   "permanent system",
                                            "dynamic system", "nobody", "permanent system nvr",
                                            "invalid",        "invalid"};
    for (guint32 type = 0; type < std::size(names); type++)
        EXPECT_STREQ(group_type_name(type), names[type]);
    EXPECT_STREQ(group_type_name(G_MAXUINT32), "invalid");
}
