// tests/unit/check/hash_cost_test.cpp: which hashes keep a login check for too long.
#include "check/hash_cost.h"

#include <gtest/gtest.h>

struct cost_case {
    const char *hash;
    guint64 rounds;
    bool is_absurd;
};

static constexpr cost_case cost_cases[] = {
    {"",                      0,         false},
    {"*",                     0,         false},
    {"$5$salt$hash",          0,         false},
    {"$5$rounds=1000000$s$h", 1'000'000, false},
    {"$5$rounds=1000001$s$h", 1'000'001, true },
    {"$6$rounds=1000000$s$h", 1'000'000, false},
    {"$6$rounds=1000001$s$h", 1'000'001, true },
    {"$6$rounds=x$s$h",       0,         false},
    {"$2b$14$saltandhash",    1U << 14,  false},
    {"$2b$15$saltandhash",    1U << 15,  true },
    {"$2y$15$saltandhash",    1U << 15,  true },
    {"$2b$",                  0,         false},
    {"$6$rounds=1000001",     1'000'001, true },
};

TEST(HashCost, IsReadFromTheHash) {
    for (const cost_case &one : cost_cases) {
        EXPECT_EQ(hash_rounds(one.hash), one.rounds) << one.hash;
        EXPECT_EQ(is_absurd_hash(one.hash), one.is_absurd) << one.hash;
    }
}
