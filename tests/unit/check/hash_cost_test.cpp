// tests/unit/check/hash_cost_test.cpp: which hashes keep a login check for too long.
#include "check/hash_cost.h"

#include <string>

#include <crypt.h>
#include <gtest/gtest.h>

namespace {

constexpr guint64 MIB = 1 << 20;
constexpr guint64 LARGEST = G_MAXUINT64;

struct cost_case {
    const char *hash;
    hash_work work;
    guint64 amount;
    bool is_absurd;
};

constexpr cost_case COST_CASES[] = {
    {"",                                     hash_work::NOTHING, 0,              false},
    {"*",                                    hash_work::NOTHING, 0,              false},
    {"!$6$rounds=9999999$s$h",               hash_work::NOTHING, 0,              false},
    {"x",                                    hash_work::NOTHING, 0,              false},
    {"abJnggxhB/yWI",                        hash_work::NOTHING, 0,              false},
    {"$1$salt$hash",                         hash_work::NOTHING, 0,              false},
    {"$3$$8846f7eaee8fb117ad06bdd830b7586c", hash_work::NOTHING, 0,              false},
    {"$5$salt$hash",                         hash_work::ROUNDS,  0,              false},
    {"$5$rounds=1000000$s$h",                hash_work::ROUNDS,  1'000'000,      false},
    {"$5$rounds=1000001$s$h",                hash_work::ROUNDS,  1'000'001,      true },
    {"$6$rounds=1000000$s$h",                hash_work::ROUNDS,  1'000'000,      false},
    {"$6$rounds=1000001$s$h",                hash_work::ROUNDS,  1'000'001,      true },
    {"$6$rounds=99999999999999999999$s$h",   hash_work::ROUNDS,  LARGEST,        true },
    {"$6$rounds=x$s$h",                      hash_work::ROUNDS,  0,              false},
    {"$6$rounds=1000001",                    hash_work::ROUNDS,  1'000'001,      true },
    {"$2b$14$saltandhash",                   hash_work::ROUNDS,  1U << 14,       false},
    {"$2b$15$saltandhash",                   hash_work::ROUNDS,  1U << 15,       true },
    {"$2a$15$saltandhash",                   hash_work::ROUNDS,  1U << 15,       true },
    {"$2x$31$saltandhash",                   hash_work::ROUNDS,  1U << 31,       true },
    {"$2y$15$saltandhash",                   hash_work::ROUNDS,  1U << 15,       true },
    {"$2b$",                                 hash_work::ROUNDS,  0,              false},
    {"$sha1$1000000$salt$hash",              hash_work::ROUNDS,  1'000'000,      false},
    {"$sha1$4294967295$salt$hash",           hash_work::ROUNDS,  G_MAXUINT32,    true },
    {"$md5$salt$hash",                       hash_work::NOTHING, 0,              false},
    {"$md5,rounds=250000$salt$hash",         hash_work::ROUNDS,  250'000,        false},
    {"$md5,rounds=250001$salt$hash",         hash_work::ROUNDS,  250'001,        true },
    {"_J9..k2XA4mxxzqRVPRk",                 hash_work::ROUNDS,  725,            false},
    {"_...6k2XA4mxxzqRVPRk",                 hash_work::ROUNDS,  1U << 21,       false},
    {"_/..6k2XA4mxxzqRVPRk",                 hash_work::ROUNDS,  (1U << 21) + 1, true },
    {"_zz",                                  hash_work::ROUNDS,  0,              false},
    {"$9$salt$hash",                         hash_work::UNKNOWN, 0,              false},
    {"$2$10$hash",                           hash_work::UNKNOWN, 0,              false},
    {"$argon2id$v=19$m=65536$hash",          hash_work::UNKNOWN, 0,              false},
 // 1024 blocks of 1 KiB, 4096 of 4 KiB, and so on.
    {"$y$j75$salt$hash",                     hash_work::MEMORY,  MIB,            false},
    {"$y$j9T$salt$hash",                     hash_work::MEMORY,  16 * MIB,       false},
    {"$y$jCT$salt$hash",                     hash_work::MEMORY,  128 * MIB,      false},
    {"$y$jDT$salt$hash",                     hash_work::MEMORY,  256 * MIB,      true },
    {"$gy$jFT$salt$hash",                    hash_work::MEMORY,  1024 * MIB,     true },
    {"$y$jCT..$salt$hash",                   hash_work::MEMORY,  256 * MIB,      true },
    {"$y$jCT/.$salt$hash",                   hash_work::MEMORY,  128 * MIB,      false},
    {"$y$jCT//$salt$hash",                   hash_work::MEMORY,  256 * MIB,      true },
    {"$y$j9T0..$salt$hash",                  hash_work::MEMORY,  32 * MIB,       false},
    {"$y$j",                                 hash_work::MEMORY,  0,              false},
    {"$y$j9",                                hash_work::MEMORY,  0,              false},
    {"$y$:9T$salt$hash",                     hash_work::MEMORY,  0,              false},
    {"$7$CU..../....salt$hash",              hash_work::MEMORY,  64 * MIB,       false},
    {"$7$DU..../....salt$hash",              hash_work::MEMORY,  128 * MIB,      false},
    {"$7$EU..../....salt$hash",              hash_work::MEMORY,  256 * MIB,      true },
    {"$7$DU....0....salt$hash",              hash_work::MEMORY,  256 * MIB,      true },
    {"$7$zzzzzzzzzzz",                       hash_work::MEMORY,  LARGEST,        true },
    {"$7$CU...",                             hash_work::MEMORY,  0,              false},
};

TEST(HashCost, IsReadFromTheHash) {
    for (const cost_case &one : COST_CASES) {
        const hash_cost cost = find_hash_cost(one.hash);
        EXPECT_EQ(cost.work, one.work) << one.hash;
        EXPECT_EQ(cost.amount, one.amount) << one.hash;
        EXPECT_EQ(cost.is_absurd, one.is_absurd) << one.hash;
    }
}

// The C library's own settings, of which each step up doubles the cost.
TEST(HashCost, GrowsWithTheSettingsOfTheCLibrary) {
    static constexpr struct {
        const char *prefix;
        unsigned long lowest;
        unsigned long highest;
        guint64 least;
    } METHODS[] = {
        {"$y$",  3, 11, 4 * MIB },
        {"$gy$", 3, 11, 4 * MIB },
        {"$7$",  6, 11, 32 * MIB},
        {"$2b$", 4, 31, 16      },
        {"$2y$", 4, 31, 16      },
    };
    static constexpr char RANDOM[] = "0123456789abcdef0123456789abcdef";

    for (const auto &method : METHODS)
        for (unsigned long count = method.lowest; count <= method.highest; count++) {
            const char *setting = crypt_gensalt(method.prefix, count, RANDOM, sizeof RANDOM - 1);
            ASSERT_NE(setting, nullptr) << method.prefix << count;
            EXPECT_EQ(find_hash_cost(setting).amount, method.least << (count - method.lowest))
                << setting;
        }
}

TEST(HashCost, IsThatOfTheSettingWhereItIsANumber) {
    static constexpr char RANDOM[] = "0123456789abcdef0123456789abcdef";
    const std::string sha = crypt_gensalt("$6$", 2'000'000, RANDOM, sizeof RANDOM - 1);
    const std::string des = crypt_gensalt("_", 16'777'215, RANDOM, sizeof RANDOM - 1);

    EXPECT_EQ(find_hash_cost(sha).amount, 2'000'000U);
    EXPECT_EQ(find_hash_cost(des).amount, 16'777'215U);
    EXPECT_TRUE(find_hash_cost(des).is_absurd);
}

std::string described(const char *hash) {
    g_autofree char *text = describe_hash(hash);
    return text != nullptr ? text : "";
}

TEST(HashCost, IsDescribedWithoutTheHash) {
    EXPECT_EQ(described("$5$salt$hash"), "");
    EXPECT_EQ(described("$gy$jFT$salt$hash"),
              "each check of the password works through 1024 MiB of memory, in which the service "
              "serves nobody else");
    EXPECT_EQ(described("$argon2id$v=19$hash"),
              "the method of its hash, $argon2id$, is none of crypt(5): whether anybody can log in "
              "by it is not known, nor what a check costs");
    // Somebody may have put the password itself there.
    for (const char *hash : {"$secret", "$Secret$x", "$$secret", "$secretsecretsecret$", "$"})
        EXPECT_EQ(described(hash),
                  "the method of its hash is none of crypt(5): whether anybody can log in by it is "
                  "not known, nor what a check costs")
            << hash;
}

}  // namespace
