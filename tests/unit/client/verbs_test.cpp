// tests/unit/client/verbs_test.cpp: the table of commands against the interface document.
#include "client/verbs.h"

#include <set>
#include <string>

#include <gtest/gtest.h>

#include "privane_system_binding.h"

namespace {

guint count(GDBusArgInfo **arguments) {
    guint number = 0;
    while (arguments != nullptr && arguments[number] != nullptr)
        number++;
    return number;
}

bool is_own(const command &row) {
    return row.run != nullptr;
}

TEST(Verbs, ReachEveryMethod) {
    std::set<std::string> reached;
    std::set<std::string> methods;

    for (const command &row : commands())
        if (row.method != nullptr)
            reached.insert(row.method);
    for (GDBusMethodInfo **method = privane_system__interface_info()->methods; *method != nullptr;
         method++)
        methods.insert((*method)->name);
    EXPECT_EQ(methods.size(), 46U);
    EXPECT_EQ(reached, methods);
}

TEST(Verbs, CallAMethodOrAreTheClientsOwn) {
    for (const command &row : commands())
        EXPECT_NE(row.method != nullptr, is_own(row)) << row.noun;
}

// A row that is built argument by argument has one for each of the method's, of a fitting type.
TEST(Verbs, HaveTheArgumentsOfTheirMethods) {
    for (const command &row : commands()) {
        if (row.method == nullptr || row.build != nullptr)
            continue;
        const GDBusMethodInfo *method = method_find(row.method);
        ASSERT_EQ(arguments_of(row).size(), count(method->in_args)) << row.method;
        for (std::size_t i = 0; i < arguments_of(row).size(); i++) {
            const argument &taken = arguments_of(row)[i];
            const std::string signature = method->in_args[i]->signature;
            const bool is_list = taken.option == OPTION_GROUPS;
            if (taken.from == source::CHOSEN)
                EXPECT_EQ(signature, "b") << row.method;
            else if (taken.option == OPTION_UID)
                EXPECT_EQ(signature, "i") << row.method;
            else
                EXPECT_TRUE(signature == "s" || (is_list && signature == "as")) << row.method;
        }
    }
}

TEST(Verbs, HaveAShapeThatFitsTheAnswer) {
    for (const command &row : commands()) {
        if (row.method == nullptr)
            continue;
        const GDBusMethodInfo *method = method_find(row.method);
        const guint results = count(method->out_args);
        const std::string first = results > 0 ? method->out_args[0]->signature : "";
        switch (row.answer) {
            case shape::NOTHING:
                EXPECT_TRUE(results == 0 || row.judge != nullptr) << row.method;
                break;
            case shape::TEXT:
            case shape::LINE:
                EXPECT_EQ(first, "s") << row.method;
                EXPECT_EQ(results, 1U) << row.method;
                break;
            case shape::ANSWER:
                EXPECT_EQ(first, "b") << row.method;
                break;
            case shape::LIST: {
                g_auto(GStrv) columns = g_strsplit(row.columns, " ", -1);
                EXPECT_EQ(g_strv_length(columns), results) << row.method;
                break;
            }
            case shape::RECORD:
            case shape::SUBJECT:
                EXPECT_GT(results, 0U) << row.method;
                break;
        }
    }
}

TEST(Verbs, OfOneNameDifferByTheirSelectorAndTheLastHasNone) {
    for (const command &row : commands()) {
        const command *last = nullptr;
        guint same = 0;
        for (const command &other : commands())
            if (g_strcmp0(row.noun, other.noun) == 0 && g_strcmp0(row.verb, other.verb) == 0) {
                same += other.selector == row.selector ? 1U : 0U;
                last = &other;
            }
        EXPECT_EQ(same, 1U) << row.noun;
        ASSERT_NE(last, nullptr);
        EXPECT_EQ(last->selector, OPTION_NONE) << row.noun;
    }
}

TEST(Verbs, NeverTakeAPasswordAsAWordOrOption) {
    for (const command &row : commands()) {
        if (row.method == nullptr || row.build != nullptr)
            continue;
        const GDBusMethodInfo *method = method_find(row.method);
        for (std::size_t i = 0; i < arguments_of(row).size(); i++) {
            const source from = arguments_of(row)[i].from;
            const bool is_password = g_strcmp0(method->in_args[i]->name, "password") == 0;
            EXPECT_EQ(is_password, from == source::NEW_PASSWORD ||
                                       from == source::OPTIONAL_PASSWORD ||
                                       from == source::CURRENT_PASSWORD)
                << row.method;
        }
    }
}

TEST(Methods, AreFoundInAnyCase) {
    EXPECT_STREQ(method_find("getuser")->name, "GetUser");
    EXPECT_EQ(method_find("GetUse"), nullptr);
    EXPECT_EQ(method_find(""), nullptr);
}

}  // namespace
