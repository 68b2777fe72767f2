// tests/unit/client/json_output_test.cpp: answers as JSON.
#include "client/json_output.h"

#include <string>

#include <gtest/gtest.h>

#include "client/verbs.h"

namespace {

std::string text_of(JsonNode *node, json_mode mode = json_mode::SHORT) {
    g_autoptr(JsonNode) owned = node;
    g_autofree char *text = json_format(owned, mode);
    return text;
}

GVariant *parse(const char *text) {
    return g_variant_ref_sink(g_variant_new_parsed(text));
}

TEST(JsonList, HasAnObjectForEachElement) {
    g_autoptr(GVariant) results = parse("(['a', 'b'], [1, -2], [@as [], ['x', 'y']])");
    EXPECT_EQ(text_of(json_of_list(results, "name gid members")),
              "[{\"name\":\"a\",\"gid\":1,\"members\":[]},"
              "{\"name\":\"b\",\"gid\":-2,\"members\":[\"x\",\"y\"]}]\n");
}

TEST(JsonList, MayBeEmpty) {
    g_autoptr(GVariant) results = parse("(@as [],)");
    EXPECT_EQ(text_of(json_of_list(results, "name")), "[]\n");
}

TEST(JsonList, EndsWithItsShortestArray) {
    g_autoptr(GVariant) results = parse("(['a', 'b'], [1])");
    EXPECT_EQ(text_of(json_of_list(results, "name gid")), "[{\"name\":\"a\",\"gid\":1}]\n");
}

TEST(JsonResults, HaveTheNamesOfTheInterface) {
    g_autoptr(GVariant) results = parse("(true, 'users', ['a', 'b'], 'né \"\\\\\\n', 1000)");
    EXPECT_EQ(text_of(json_of_results(results, method_find("GetUser"), "x")),
              "{\"name\":\"x\",\"has_password\":true,\"primary_group\":\"users\","
              "\"secondary_groups\":[\"a\",\"b\"],\"comment\":\"né \\\"\\\\\\n\",\"uid\":1000}\n");
}

TEST(JsonResults, OfAMethodWithoutAnyAreAnEmptyObject) {
    g_autoptr(GVariant) results = parse("()");
    EXPECT_EQ(text_of(json_of_results(results, method_find("StartNtp"), nullptr)), "{}\n");
}

TEST(JsonResults, MayBePretty) {
    g_autoptr(GVariant) results = parse("(false,)");
    EXPECT_EQ(
        text_of(json_of_results(results, method_find("CheckUser"), nullptr), json_mode::PRETTY),
        "{\n  \"exists\" : false\n}\n");
}

}  // namespace
