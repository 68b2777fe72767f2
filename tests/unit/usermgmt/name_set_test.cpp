// tests/unit/usermgmt/name_set_test.cpp: lists and sets of names.
#include "usermgmt/name_set.h"

#include <algorithm>

#include <gtest/gtest.h>

#include "tests/unit/usermgmt/log_capture.h"

static constexpr const char *empty[] = {nullptr};
static constexpr const char *abc[] = {"a", "b", "c", nullptr};
static constexpr const char *bcd[] = {"b", "c", "d", nullptr};

static GHashTable *borrowing_set() {
    return g_hash_table_new(g_str_hash, g_str_equal);
}

static lines sorted_keys(GHashTable *set) {
    lines names;
    GHashTableIter iter;
    gpointer name;
    g_hash_table_iter_init(&iter, set);
    while (g_hash_table_iter_next(&iter, &name, nullptr))
        names.emplace_back(static_cast<const char *>(name));
    std::sort(names.begin(), names.end());
    return names;
}

static lines take_sorted(GList *list) {
    lines names;
    for (const GList *link = list; link != nullptr; link = link->next)
        names.emplace_back(static_cast<const char *>(link->data));
    g_list_free_full(list, g_free);
    std::sort(names.begin(), names.end());
    return names;
}

TEST(NameSet, ListContainsOnlyEqualStrings) {
    const std::string equal_by_value("b");
    EXPECT_TRUE(list_contains(equal_by_value.c_str(), abc));
    EXPECT_TRUE(list_contains("a", abc));
    EXPECT_TRUE(list_contains("c", abc));
    EXPECT_FALSE(list_contains("d", abc));
    EXPECT_FALSE(list_contains("", abc));
    EXPECT_FALSE(list_contains("B", abc));
    EXPECT_FALSE(list_contains("a", empty));
    EXPECT_FALSE(list_contains("a", nullptr));
}

TEST(NameSet, MembershipSplitsListAndBorrowsStrings) {
    g_autoptr(GHashTable) both = borrowing_set();
    g_autoptr(GHashTable) only = borrowing_set();
    list_membership_to_hash(abc, bcd, both, only);
    EXPECT_EQ(sorted_keys(both), (lines{"b", "c"}));
    EXPECT_EQ(sorted_keys(only), lines{"a"});

    gpointer key = nullptr;
    ASSERT_TRUE(g_hash_table_lookup_extended(both, "b", &key, nullptr));
    EXPECT_EQ(key, static_cast<const void *>(abc[1]));
}

TEST(NameSet, MembershipInMissingListIsNone) {
    g_autoptr(GHashTable) both = borrowing_set();
    g_autoptr(GHashTable) only = borrowing_set();
    list_membership_to_hash(abc, nullptr, both, only);
    EXPECT_EQ(sorted_keys(both), lines());
    EXPECT_EQ(sorted_keys(only), (lines{"a", "b", "c"}));
}

TEST(NameSet, GlistHoldsCopies) {
    g_autoptr(GHashTable) set = g_hash_table_new_full(g_str_hash, g_str_equal, g_free, nullptr);
    (void)g_hash_table_add(set, g_strdup("x"));
    (void)g_hash_table_add(set, g_strdup("y"));
    GList *list = str_hash_to_glist(set);
    g_hash_table_remove_all(set);
    EXPECT_EQ(take_sorted(list), (lines{"x", "y"}));
    EXPECT_EQ(str_hash_to_glist(set), nullptr);
}

struct array_form {
    bool terminate;
    bool copy;
};

class NameSetArray : public testing::TestWithParam<array_form> {};

TEST_P(NameSetArray, HoldsEveryName) {
    g_autoptr(GHashTable) set = borrowing_set();
    g_autoptr(GPtrArray) array = nullptr;
    for (std::size_t i = 0; abc[i] != nullptr; i++)
        (void)g_hash_table_add(set, const_cast<char *>(abc[i]));
    str_hash_to_ptr_array(set, &array, GetParam().terminate, GetParam().copy);
    ASSERT_NE(array, nullptr);
    ASSERT_EQ(array->len, GetParam().terminate ? 4U : 3U);

    lines names;
    for (guint i = 0; i < 3; i++) {
        const auto *name = static_cast<const char *>(g_ptr_array_index(array, i));
        names.emplace_back(name);
        gpointer key = nullptr;
        ASSERT_TRUE(g_hash_table_lookup_extended(set, name, &key, nullptr));
        EXPECT_EQ(key != name, GetParam().copy);
    }
    std::sort(names.begin(), names.end());
    EXPECT_EQ(names, (lines{"a", "b", "c"}));
    if (GetParam().terminate) {
        EXPECT_EQ(g_ptr_array_index(array, 3), nullptr);
    }
}

static std::string form_name(const testing::TestParamInfo<array_form> &form) {
    return std::string(form.param.copy ? "Copied" : "Borrowed") +
           (form.param.terminate ? "Terminated" : "");
}

INSTANTIATE_TEST_SUITE_P(Forms, NameSetArray,
                         testing::Values(array_form{false, false}, array_form{false, true},
                                         array_form{true, false}, array_form{true, true}),
                         form_name);

TEST(NameSet, ArrayOfEmptySet) {
    g_autoptr(GHashTable) set = borrowing_set();
    g_autoptr(GPtrArray) bare = nullptr;
    g_autoptr(GPtrArray) terminated = nullptr;
    str_hash_to_ptr_array(set, &bare, FALSE, FALSE);
    str_hash_to_ptr_array(set, &terminated, TRUE, TRUE);
    EXPECT_EQ(bare->len, 0U);
    ASSERT_EQ(terminated->len, 1U);
    EXPECT_EQ(g_ptr_array_index(terminated, 0), nullptr);
}

TEST(NameSet, ArrayRefusesFilledResult) {
    g_autoptr(GHashTable) set = borrowing_set();
    g_autoptr(GPtrArray) filled = g_ptr_array_new();
    GPtrArray *result = filled;
    EXPECT_EQ(glib_log_of([&] { str_hash_to_ptr_array(set, &result, TRUE, TRUE); }),
              lines{"usermgmt-CRITICAL: str_hash_to_ptr_array: assertion '*dst == NULL' failed"});
    EXPECT_EQ(result, filled);
    EXPECT_EQ(filled->len, 0U);
}

TEST(NameSet, ArrayRefusesMissingResult) {
    g_autoptr(GHashTable) set = borrowing_set();
    EXPECT_EQ(glib_log_of([&] { str_hash_to_ptr_array(set, nullptr, TRUE, TRUE); }),
              lines{"usermgmt-CRITICAL: str_hash_to_ptr_array: assertion 'dst != NULL' failed"});
}

struct diff_case {
    const char *const *a;
    const char *const *b;
    lines only_a;
    lines both;
    lines only_b;
};

TEST(NameSet, DiffSplitsTwoLists) {
    static constexpr const char *repeated[] = {"b", "b", "e", "e", nullptr};
    const diff_case cases[] = {
        {abc,      bcd,     {"a"},           {"b", "c"},      {"d"}          },
        {abc,      abc,     {},              {"a", "b", "c"}, {}             },
        {abc,      empty,   {"a", "b", "c"}, {},              {}             },
        {empty,    abc,     {},              {},              {"a", "b", "c"}},
        {empty,    empty,   {},              {},              {}             },
        {nullptr,  abc,     {},              {},              {"a", "b", "c"}},
        {abc,      nullptr, {"a", "b", "c"}, {},              {}             },
        {repeated, abc,     {"e"},           {"b"},           {"a", "c"}     },
    };
    for (const diff_case &row : cases) {
        GList *only_a = nullptr;
        GList *both = nullptr;
        GList *only_b = nullptr;
        list_diff(row.a, row.b, &only_a, &both, &only_b);
        EXPECT_EQ(take_sorted(only_a), row.only_a);
        EXPECT_EQ(take_sorted(both), row.both);
        EXPECT_EQ(take_sorted(only_b), row.only_b);
    }
}
