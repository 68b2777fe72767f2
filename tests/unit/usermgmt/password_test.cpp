// tests/unit/usermgmt/password_test.cpp: rules for clear text, ciphers and salts.
#include "usermgmt/password.h"

#include <cerrno>
#include <cstdlib>
#include <set>

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/hashing_sources.h"
#include "tests/unit/usermgmt/io_trace.h"

static constexpr const char *ALPHABET =
    "./0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";

TEST(Password, Rules) {
    struct rule_case {
        const char *password;
        int max;
        const char *error;
    };
    static constexpr const char *MISSING = "usermgmt 10: missing password";
    static constexpr const char *SHORT =
        "usermgmt 10: password too short, must have at least one character";
    static constexpr const char *ABOVE_64 =
        "usermgmt 10: password too long, max allowed length is 64 characters";
    static constexpr const char *ABOVE_1 =
        "usermgmt 10: password too long, max allowed length is 1 characters";
    // Bytes count, not characters.
    static const std::string of_64(64, 'a');
    static const std::string of_65 = of_64 + "a";
    static const std::string of_65_with_umlaut = of_64.substr(1) + "\xc3\xa4";
    static const std::string of_5000(5000, 'a');
    const rule_case cases[] = {
        {nullptr,                   64, MISSING },
        {nullptr,                   -1, MISSING },
        {"",                        64, SHORT   },
        {"",                        -1, SHORT   },
        {"a",                       64, ""      },
        {of_64.c_str(),             64, ""      },
        {of_65.c_str(),             64, ABOVE_64},
        {of_65.c_str(),             65, ""      },
        {of_65_with_umlaut.c_str(), 64, ABOVE_64},
        {of_65_with_umlaut.c_str(), 65, ""      },
        {of_65.c_str(),             -1, ""      },
        {of_65.c_str(),             0,  ""      },
        {of_5000.c_str(),           -1, ""      },
        {"a",                       1,  ""      },
        {"ab",                      1,  ABOVE_1 },
        {" ",                       64, ""      },
        {"\n",                      64, ""      },
    };
    for (const rule_case &row : cases) {
        error_slot error;
        EXPECT_EQ(check_password_rules(row.password, row.max, error.out()), *row.error == '\0');
        EXPECT_EQ(error.text(), row.error) << row.max;
        EXPECT_EQ(check_password_rules(row.password, row.max, nullptr), *row.error == '\0');
    }
}

TEST(Password, CipherNames) {
    const lines names = {"DES",       "MD5",       "Invalid", "Invalid", "Invalid",
                         "SHA2/-256", "SHA2/-512", "Unknown", "Invalid", "Invalid"};
    for (guint cipher = 0; cipher < names.size(); cipher++)
        EXPECT_EQ(cipher_name(cipher), names[cipher]) << cipher;
    EXPECT_STREQ(cipher_name(G_MAXUINT), "Invalid");
}

TEST(Password, CipherOfAHash) {
    struct hash_case {
        const char *hash;
        int cipher;
    };
    static constexpr hash_case cases[] = {
        {nullptr,   8},
        {"",        0},
        {"abJnggx", 0},
        {"*",       0},
        {"!",       0},
        {"!$5$a$b", 0},
        {"$1$a$b",  1},
        {"$5$a$b",  5},
        {"$6$a$b",  6},
        {"$5$",     5},
        {"$5",      7},
        {"$",       7},
        {"$y$a$b",  7},
        {"$2b$a$b", 7},
        {"$15$a$b", 7},
    };
    for (const hash_case &row : cases)
        EXPECT_EQ(cipher_from_hash(row.hash), row.cipher) << (row.hash ? row.hash : "(none)");
}

// Salts from fixed sources, unless a test says otherwise.
class Salt : public testing::Test {
  protected:
    void SetUp() override {
        (void)take_syslog();
        sources_.random = "\x01\x02\x03\x04\x05\x06\x07\x08\x09\x0a";
    }
    void TearDown() override { EXPECT_EQ(take_syslog(), lines()); }

    static std::string salt_of(int cipher) {
        g_autofree char *salt = make_salt(cipher);
        return salt != nullptr ? salt : "(none)";
    }

    hashing_sources sources_;
};

TEST_F(Salt, FormatOfEachCipher) {
    struct format_case {
        int cipher;
        const char *begin;
        std::size_t size;
        const char *end;
    };
    static constexpr format_case cases[] = {
        {CIPHER_DES,    "",    2,  ""           },
        {CIPHER_MD5,    "$1$", 16, "/012345678$"},
        {CIPHER_SHA256, "$5$", 16, "/012345678$"},
        {CIPHER_SHA512, "$6$", 16, "/012345678$"},
    };
    for (const format_case &row : cases) {
        const std::string salt = salt_of(row.cipher);
        EXPECT_EQ(salt.size(), row.size) << salt;
        EXPECT_EQ(salt.rfind(row.begin, 0), 0U) << salt;
        EXPECT_EQ(salt.substr(salt.size() - std::string(row.end).size()), row.end);
        for (const char c : salt.substr(std::string(row.begin).size(), 2))
            EXPECT_NE(std::string(ALPHABET).find(c), std::string::npos) << salt;
    }
}

TEST_F(Salt, OtherCiphersAreRefused) {
    for (const int cipher : {2, 3, 4, 7, 8, 9, -1, 255}) {
        io_trace trace;
        EXPECT_EQ(salt_of(cipher), "(none)");
        EXPECT_EQ(take_syslog(), lines{"3 Unsupported cipher '" + std::to_string(cipher) + "'"});
        EXPECT_EQ(trace.calls(), lines());
    }
}

TEST_F(Salt, RandomnessIsReadOnceWhereNeeded) {
    io_trace trace;
    (void)salt_of(CIPHER_DES);
    EXPECT_EQ(trace.calls(), lines());
    EXPECT_EQ(sources_.reads, std::vector<std::size_t>());
    (void)salt_of(CIPHER_SHA256);
    EXPECT_EQ(trace.calls(), lines{"open /dev/urandom O_CLOEXEC"});
    EXPECT_EQ(sources_.reads, std::vector<std::size_t>{10});
}

TEST_F(Salt, EachByteGivesItsCharacter) {
    for (unsigned first = 0; first < 250; first += 10) {
        std::string bytes;
        std::string expected;
        for (unsigned byte = first; byte < first + 10; byte++) {
            bytes += static_cast<char>(byte);
            expected += ALPHABET[byte % 64];
        }
        sources_.random = bytes;
        EXPECT_EQ(salt_of(CIPHER_SHA256).substr(5), expected + "$");
    }
    sources_.random = "\xfa\xfb\xfc\xfd\xfe\xff\xc0\x80\x40\x7f";
    EXPECT_EQ(salt_of(CIPHER_SHA256).substr(5), "uvwxyz...z$");
}

// The first salts of a process, where the seed began at 0: the sum of the three sources is added
// each time, and the first two characters follow from it.
[[noreturn]] static void print_first_salts() {
    hashing_sources sources;
    sources.now = 1700000000;
    sources.pid = 4242;
    sources.ticks = 98765;
    sources.random = "0123456789";
    for (const int cipher : {CIPHER_DES, CIPHER_DES, CIPHER_SHA256}) {
        g_autofree char *salt = make_salt(cipher);
        (void)fprintf(stderr, "%s ", salt);
    }
    g_autofree char *none = make_salt(2);
    g_autofree char *last = make_salt(CIPHER_DES);
    (void)fprintf(stderr, "%s.", last);
    _exit(none == nullptr ? 7 : 8);
}

TEST(SaltDeathTest, SeedRunsOnFromZero) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(print_first_salts(), testing::ExitedWithCode(7),
                "M5 kC \\$5\\$cJklmnopqrst\\$ dW\\.");
}

TEST_F(Salt, SourcesOfTheSeedWrapAround) {
    sources_.now = G_MAXUINT32;
    sources_.pid = G_MAXINT32;
    sources_.ticks = -1;
    std::set<std::string> salts;
    for (int i = 0; i < 20; i++)
        salts.insert(salt_of(CIPHER_DES));
    EXPECT_GT(salts.size(), 1U);
}

TEST_F(Salt, SaltsDiffer) {
    std::set<std::string> seeds;
    for (int i = 0; i < 50; i++)
        seeds.insert(salt_of(CIPHER_SHA256));
    EXPECT_GT(seeds.size(), 40U);

    sources_.random.reset();
    std::set<std::string> randoms;
    for (int i = 0; i < 200; i++)
        randoms.insert(salt_of(CIPHER_SHA256).substr(5, 10));
    EXPECT_EQ(randoms.size(), 200U);
}

TEST_F(Salt, WithoutRandomnessThereIsNone) {
    static constexpr const char *GENERAL = "3 Failed to generate salt. Expect 10 bytes, got -1";
    const int descriptors = count_open_descriptors();
    {
        io_trace trace;
        trace.fail("open", "/dev/urandom", 1, EMFILE);
        EXPECT_EQ(salt_of(CIPHER_SHA256), "(none)");
        EXPECT_EQ(take_syslog(),
                  (lines{"3 Failed to open /dev/urandom: Too many open files", GENERAL}));
    }
    sources_.read_error = EIO;
    EXPECT_EQ(salt_of(CIPHER_SHA256), "(none)");
    EXPECT_EQ(take_syslog(),
              (lines{"3 Failed to read from /dev/urandom: Input/output error", GENERAL}));
    sources_.read_error = EINTR;
    EXPECT_EQ(salt_of(CIPHER_SHA512), "(none)");
    EXPECT_EQ(take_syslog(),
              (lines{"3 Failed to read from /dev/urandom: Interrupted system call", GENERAL}));
    sources_.read_error = 0;
    for (const char *bytes : {"", "1", "123456789"}) {
        sources_.random = bytes;
        EXPECT_EQ(salt_of(CIPHER_MD5), "(none)");
        EXPECT_EQ(take_syslog(),
                  (lines{"3 Failed to read from /dev/urandom: Short read", GENERAL}));
    }
    EXPECT_EQ(sources_.reads.size(), 5U);
    EXPECT_EQ(count_open_descriptors(), descriptors);
}
