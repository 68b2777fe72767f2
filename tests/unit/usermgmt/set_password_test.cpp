// tests/unit/usermgmt/set_password_test.cpp: setting and removing the password of a user.
#include <cerrno>
#include <memory>

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/hashing_sources.h"
#include "tests/unit/usermgmt/io_trace.h"
#include "usermgmt/password.h"

static constexpr const char *SHA256_OF_ALICEPASS =
    "$5$abcdefghijkl$ZhmwPkHXQKf6apCu9HM2IbJzghxfHTPgWq9JleS3MrD";

class SetPassword : public testing::Test {
  protected:
    static constexpr gint64 NOW = 1728000123;

    void SetUp() override {
        (void)take_syslog();
        sources_.now = NOW;
        sources_.random = "0123456789";
        have(nullptr);
    }
    void TearDown() override {
        EXPECT_EQ(take_syslog(), lines());
        internal_user_free(user_);
    }

    // A record with that hash, of day 1.
    void have(const char *hash, bool shadowed = true) {
        internal_user_free(user_);
        user_ = new_user({.shadowed = shadowed, .password = hash, .last_change = 86400});
        changed_ = FALSE;
        sources_.settings.clear();
    }
    // The text of the error; "" on success.
    std::string set(const char *clear_text, bool shadowed = true) {
        error_slot error;
        const bool done =
            internal_user_set_password(user_, clear_text, shadowed, &changed_, error.out());
        EXPECT_EQ(done, !error.is_set());
        return error.text();
    }
    void expect_record(const char *hash, bool shadowed, gint64 last_change) const {
        EXPECT_STREQ(user_->password, hash);
        EXPECT_EQ(user_->shadowed != FALSE, shadowed);
        EXPECT_EQ(user_->last_change, last_change);
    }
    // A fresh hash as it has to look with the fixed random bytes.
    void expect_fresh() const {
        ASSERT_NE(user_->password, nullptr);
        EXPECT_TRUE(g_regex_match_simple("^\\$5\\$[./0-9A-Za-z]{2}klmnopqrst\\$[./0-9A-Za-z]{43}$",
                                         user_->password, G_REGEX_DEFAULT, G_REGEX_MATCH_DEFAULT))
            << user_->password;
        EXPECT_EQ(user_->last_change, NOW);
        EXPECT_TRUE(changed_);
    }

    hashing_sources sources_;
    internal_user *user_ = nullptr;
    gboolean changed_ = FALSE;
};

TEST_F(SetPassword, NewHashHasAFreshSalt) {
    EXPECT_EQ(set("secret"), "");
    expect_fresh();
    ASSERT_EQ(sources_.settings.size(), 1U);
    // The whole setting: cipher, twelve characters, the closing mark.
    EXPECT_EQ(sources_.settings[0], std::string(user_->password).substr(0, 16));
    EXPECT_EQ(sources_.settings[0].back(), '$');
}

TEST_F(SetPassword, NewHashIsOfThePassword) {
    EXPECT_EQ(set("secret"), "");
    const std::string hash = user_->password;
    EXPECT_EQ(set("secret"), "");
    EXPECT_EQ(user_->password, hash);
    EXPECT_EQ(sources_.settings.back(), hash);
    EXPECT_EQ(set("Secret"), "");
    EXPECT_NE(user_->password, hash);
}

// Whatever cipher the old hash has.
TEST_F(SetPassword, SamePasswordKeepsTheRecord) {
    struct same_case {
        const char *hash;
        const char *clear_text;
    };
    static constexpr same_case cases[] = {
        {SHA256_OF_ALICEPASS,                  "alicepass"},
        {"ab2RmhfeGz9J6",                      "despass"  },
        {"$1$saltsalt$cCPENxTVtU4kpnV2ngztX0", "md5pass"  },
        {"$6$rootsalt$z1KTOR/AyScU1WCtytE4EXrs.MTDxE6ACo74ajwK/.6qPB3XZKD2U2P38f3H5Swlk7mzkSvCp4Nr2"
         "hhasRNJe1",                 "rootpass" },
    };
    for (const same_case &row : cases) {
        have(row.hash);
        const char *memory = user_->password;
        EXPECT_EQ(set(row.clear_text), "");
        expect_record(row.hash, true, 86400);
        EXPECT_EQ(user_->password, memory);
        EXPECT_FALSE(changed_);
        EXPECT_EQ(sources_.settings, lines{row.hash});
    }
    EXPECT_EQ(sources_.reads, std::vector<std::size_t>());
}

TEST_F(SetPassword, SamePasswordElsewhereIsAChange) {
    for (const bool shadowed : {false, true}) {
        have(SHA256_OF_ALICEPASS, !shadowed);
        EXPECT_EQ(set("alicepass", shadowed), "");
        expect_record(SHA256_OF_ALICEPASS, shadowed, 86400);
        EXPECT_TRUE(changed_);
    }
}

TEST_F(SetPassword, OtherPasswordReplacesTheHash) {
    for (const bool shadowed : {false, true}) {
        have(SHA256_OF_ALICEPASS, true);
        EXPECT_EQ(set("other", shadowed), "");
        expect_fresh();
        EXPECT_EQ(user_->shadowed != FALSE, shadowed);
        ASSERT_EQ(sources_.settings.size(), 2U);
        EXPECT_EQ(sources_.settings[0], SHA256_OF_ALICEPASS);
        EXPECT_EQ(sources_.settings[1], std::string(user_->password).substr(0, 16));
    }
}

TEST_F(SetPassword, WhatIsNoHashMeansADifferentPassword) {
    for (const char *hash : {"*", "!", "!!", "", "*0", "*1", "x", "!$5$a$b", "$5", "$9$a$b"}) {
        for (const char *clear_text : {"secret", "*", "*0", "*1", "!"}) {
            have(hash);
            EXPECT_EQ(set(clear_text), "") << hash;
            expect_fresh();
        }
    }
}

// An answer that happens to be what the record holds is still no hash.
TEST_F(SetPassword, FailureTokenIsNeverTheSamePassword) {
    have("*0");
    sources_.answers = {
        {"*0", EINVAL}
    };
    EXPECT_EQ(set("secret"), "");
    expect_fresh();
}

TEST_F(SetPassword, RemovingThePassword) {
    struct removal_case {
        const char *hash;
        bool shadowed_before;
        bool shadowed;
        bool changed;
    };
    static constexpr removal_case cases[] = {
        {"hash",  true,  true,  true },
        {"*",     true,  true,  true },
        {"",      true,  true,  true },
        {"hash",  true,  false, true },
        {nullptr, true,  true,  false},
        {nullptr, false, false, false},
        {nullptr, true,  false, true },
        {nullptr, false, true,  true },
    };
    for (const removal_case &row : cases) {
        have(row.hash, row.shadowed_before);
        EXPECT_EQ(set(nullptr, row.shadowed), "");
        expect_record(nullptr, row.shadowed, 86400);
        EXPECT_EQ(changed_ != FALSE, row.changed);
    }
    EXPECT_EQ(sources_.settings, lines());
}

TEST_F(SetPassword, EmptyPasswordIsRefused) {
    for (const char *hash : {static_cast<const char *>(nullptr), "*", SHA256_OF_ALICEPASS}) {
        have(hash);
        EXPECT_EQ(set("", false), "usermgmt 10: invalid password of size 0");
        expect_record(hash, true, 86400);
        EXPECT_FALSE(changed_);
    }
    EXPECT_EQ(sources_.settings, lines());
}

TEST_F(SetPassword, FlagIsOptionalAndNeverCleared) {
    have(SHA256_OF_ALICEPASS);
    changed_ = TRUE;
    EXPECT_EQ(set("alicepass"), "");
    EXPECT_TRUE(changed_);
    have(nullptr);
    changed_ = TRUE;
    EXPECT_EQ(set(nullptr), "");
    EXPECT_TRUE(changed_);
    EXPECT_TRUE(internal_user_set_password(user_, "secret", true, nullptr, nullptr));
    EXPECT_TRUE(internal_user_set_password(user_, nullptr, false, nullptr, nullptr));
    EXPECT_FALSE(internal_user_set_password(user_, "", true, nullptr, nullptr));
}

TEST_F(SetPassword, CryptTakes511Bytes) {
    for (const char *hash : {static_cast<const char *>(nullptr), "*", SHA256_OF_ALICEPASS}) {
        have(hash);
        EXPECT_EQ(set(std::string(511, 'p').c_str()), "");
        expect_fresh();
        have(hash);
        EXPECT_EQ(set(std::string(512, 'p').c_str(), false),
                  "usermgmt 16: crypt() failed, Numerical result out of range");
        expect_record(hash, true, 86400);
        EXPECT_FALSE(changed_);
    }
}

TEST_F(SetPassword, FailuresOfCrypt) {
    const auto check = [this](const char *hash, const std::vector<hashing_sources::answer> &answers,
                              const char *error) {
        have(hash);
        sources_.answers = answers;
        errno = EBADF;  // of an earlier call, no part of the message
        EXPECT_EQ(set("secret", false), error);
        expect_record(hash, true, 86400);
        EXPECT_FALSE(changed_);
        EXPECT_TRUE(sources_.answers.empty());
    };
    static constexpr const char *INVALID = "usermgmt 16: crypt() failed, Invalid argument";
    static constexpr const char *NO_CAUSE = "usermgmt 16: crypt() failed, Success";
    check("old",
          {
              {nullptr, EINVAL}
    },
          "usermgmt 16: could not perform crypt() check: Invalid argument");
    check("old",
          {
              {nullptr, ENOSYS}
    },
          "usermgmt 16: could not perform crypt() check: Function not implemented");
    check("old",
          {
              {nullptr, 0}
    },
          "usermgmt 16: could not perform crypt() check: Success");
    check("old",
          {
              {"new",   0    },
              {nullptr, EPERM}
    },
          "usermgmt 16: crypt() failed, Operation not permitted");
    check("old",
          {
              {"*0", ERANGE},
              {"*0", EINVAL}
    },
          INVALID);
    check(nullptr,
          {
              {nullptr, EINVAL}
    },
          INVALID);
    check(nullptr,
          {
              {"*0", EINVAL}
    },
          INVALID);
    check(nullptr,
          {
              {"*1", ERANGE}
    },
          "usermgmt 16: crypt() failed, Numerical result out of range");
    check(nullptr,
          {
              {"*", 0}
    },
          NO_CAUSE);
    check(nullptr,
          {
              {nullptr, 0}
    },
          NO_CAUSE);
}

TEST_F(SetPassword, WithoutASaltTheRecordStays) {
    for (const char *hash : {static_cast<const char *>(nullptr), "*", SHA256_OF_ALICEPASS}) {
        have(hash);
        sources_.read_error = EIO;
        EXPECT_EQ(set("secret", false), "usermgmt 16: could not create password salt");
        expect_record(hash, true, 86400);
        EXPECT_FALSE(changed_);
        EXPECT_EQ(take_syslog(), (lines{"3 Failed to read from /dev/urandom: Input/output error",
                                        "3 Failed to generate salt. Expect 10 bytes, got -1"}));
    }
}

TEST_F(SetPassword, MissingRecordIsACriticalWithoutError) {
    error_slot error;
    EXPECT_EQ(
        glib_log_of([&] {
            EXPECT_FALSE(internal_user_set_password(nullptr, "a", true, &changed_, error.out()));
        }),
        lines{"usermgmt-CRITICAL: internal_user_set_password: assertion 'intern != NULL' "
              "failed"});
    EXPECT_FALSE(error.is_set());
    EXPECT_FALSE(changed_);
}

TEST_F(SetPassword, ReplacedAndRemovedHashesAreWiped) {
    for (const char *clear_text : {"other", static_cast<const char *>(nullptr)}) {
        have(SHA256_OF_ALICEPASS);
        secret_watch watch;
        watch.add(user_->password);
        EXPECT_EQ(set(clear_text), "");
        EXPECT_EQ(watch.wiped(), 1);
        for (const std::string &held : watch.readable())
            EXPECT_NE(held, SHA256_OF_ALICEPASS);
    }
}

TEST_F(SetPassword, AnswersOfCryptAreWiped) {
    have("old");
    sources_.answers = {
        {"$5$answer$one", 0},
        {"$5$answer$two", 0}
    };
    EXPECT_EQ(set("secret"), "");
    EXPECT_STREQ(user_->password, "$5$answer$two");
    EXPECT_EQ(sources_.left_of_answer(), std::string(13, '\0'));

    sources_.answers = {
        {"$5$answer$two", 0}
    };
    EXPECT_EQ(set("secret"), "");
    EXPECT_EQ(sources_.left_of_answer(), std::string(13, '\0'));
}

// The copy that only served the comparison, and that of an answer that is no hash.
TEST_F(SetPassword, CopiesOfAnswersAreWiped) {
    struct copies_case {
        std::vector<hashing_sources::answer> answers;
        int wiped;
    };
    const copies_case cases[] = {
        {{{"old hash", 0}},                      1},
        {{{"$5$another", 0}, {"$5$new", 0}},     1},
        {{{"$5$another", 0}, {"*0", ERANGE}},    2},
        {{{"$5$another", 0}, {nullptr, ERANGE}}, 1},
    };
    for (const copies_case &row : cases) {
        have("old hash");
        secret_watch watch;
        sources_.watch = &watch;
        sources_.answers = row.answers;
        (void)set("secret");
        sources_.watch = nullptr;
        EXPECT_EQ(watch.wiped(), row.wiped);
        for (const std::string &held : watch.readable())
            for (const hashing_sources::answer &given : row.answers)
                EXPECT_NE(held, given.hash != nullptr ? given.hash : "");
    }
}
