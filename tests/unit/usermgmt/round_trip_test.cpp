// tests/unit/usermgmt/round_trip_test.cpp: what loading and writing does to files of any content.
#include <algorithm>
#include <random>

#include "tests/unit/usermgmt/account_files.h"
#include "usermgmt/context.h"

using contents = std::map<std::string, std::string>;

class RoundTrip : public AccountFiles {
  protected:
    static contents current() {
        return {
            {"passwd", read("passwd")                    },
            {"shadow", read("shadow")                    },
            {"group",  with_members_sorted(read("group"))}
        };
    }
    // Loads the files, which must succeed, and writes them as they were understood. The error of
    // that write.
    static std::string error_of_rewrite() {
        error_slot error;
        const open_context ctx(usermgmt_open(USERMGMT_OPEN_TRYLOCK, error.out()));
        if (ctx == nullptr) {
            ADD_FAILURE() << error.text();
            return "";
        }
        GList *entries = nullptr;
        EXPECT_TRUE(usermgmt_get_all_users(ctx.get(), nullptr, &entries, error.out()))
            << error.text();
        g_list_free_full(entries, [](gpointer entry) {
            usermgmt_free_user_entry(static_cast<user_entry *>(entry));
            g_free(entry);
        });
        ctx->user_db.dirty = ctx->group_db.dirty = TRUE;
        (void)usermgmt_sync(ctx.get(), error.out());
        return error.text();
    }
    // The files after a rewrite that must succeed.
    static contents rewritten() {
        EXPECT_EQ(error_of_rewrite(), "");
        return current();
    }
};

// Files made up from a seed, and what must become of them.
class made_up_files {
  public:
    explicit made_up_files(unsigned seed) : random_(seed) {
        const std::size_t groups = below(8) + 1;
        for (std::size_t i = 0; i < groups; i++)
            gids_.push_back(pick<guint32>({0, 1, 44, 499, 500, 999, 60001, 60010, 65534}));
        const std::size_t users = below(12);
        for (std::size_t i = 0; i < users; i++)
            add_user("u" + std::to_string(i));
        std::shuffle(shadow_lines_.begin(), shadow_lines_.end(), random_);
        for (const std::string &line : shadow_lines_)
            before["shadow"] += line + noise();
        for (std::size_t i = 0; i < groups; i++)
            add_group("g" + std::to_string(i), gids_[i]);
    }

    contents before = {
        {"passwd", ""},
        {"shadow", ""},
        {"group",  ""}
    };
    contents after = {
        {"passwd", ""},
        {"shadow", ""},
        {"group",  ""}
    };

  private:
    std::size_t below(std::size_t limit) {
        return std::uniform_int_distribution<std::size_t>(0, limit - 1)(random_);
    }
    template <typename value>
    value pick(const std::vector<value> &values) {
        return values[below(values.size())];
    }
    std::string text(const lines &values) { return pick<std::string>(values); }

    // Lines that hold no record.
    std::string noise() { return text({"", "", "", "\n", "# a comment\n", "too:few\n"}); }

    void add_user(const std::string &name) {
        names_.push_back(name);
        const std::string hash = text({"$5$salt$hash", "*", "!", "!!", "", "$6$rounds=5000$a$b"});
        const bool shadowed = below(3) > 0;
        const std::string tail =
            ":" + std::to_string(pick<guint32>({0, 1, 499, 500, 999, 1000, 60000, 65534})) + ":" +
            std::to_string(pick(gids_)) + ":" +
            text({"", "A Comment,,,", "ümlaut", "with  blanks"}) + ":" +
            text({"", "/", "/home/" + name}) + ":" + text({"", "/bin/sh", "/bin/false"}) + "\n";
        const std::string line = name + ":" + (shadowed ? "x" : hash) + tail;
        before["passwd"] += line + noise();
        after["passwd"] += line;
        if (!shadowed)
            return;
        const std::string day = text({"", "0", "1", "19000", "24855", "24856", "99999"});
        const std::string ageing = text(
            {":0:99999:7:0::", ":::::" + std::string(":"), ":1:90:14:30:20000:", ":0:99999:7:::"});
        shadow_lines_.push_back(name + ":" + hash + ":" + day + ageing + "\n");
        after["shadow"] += name + ":" + hash + ":" + day + ":0:99999:7:0::\n";
    }

    void add_group(const std::string &name, guint32 gid) {
        lines members;
        for (const std::string &user : names_)
            if (below(2) == 0)
                members.push_back(user);
        std::shuffle(members.begin(), members.end(), random_);
        std::string line = name + ":" + text({"", "x", "$5$s$h"}) + ":" + std::to_string(gid) + ":";
        for (std::size_t i = 0; i < members.size(); i++)
            line += (i == 0 ? "" : ",") + members[i];
        before["group"] += line + "\n" + noise();
        after["group"] += with_members_sorted(line);
    }

    std::mt19937 random_;
    std::vector<guint32> gids_;
    lines names_;
    lines shadow_lines_;
};

TEST_F(RoundTrip, EveryRecordIsWrittenByTheMappingInOrder) {
    for (unsigned seed = 0; seed < 60; seed++) {
        const made_up_files files(seed);
        write_all(files.before);
        EXPECT_EQ(rewritten(), files.after) << "seed " << seed;
        EXPECT_EQ(take_syslog(), lines()) << "seed " << seed;
    }
}

TEST_F(RoundTrip, SecondRoundChangesNothing) {
    for (unsigned seed = 100; seed < 130; seed++) {
        write_all(made_up_files(seed).before);
        const contents once = rewritten();
        EXPECT_EQ(rewritten(), once) << "seed " << seed;
    }
}

// A text made of what account files are made of, in no sensible order.
static std::string torn_text(std::mt19937 *random) {
    static const lines pieces = {"root",
                                 "alice",
                                 "x",
                                 "*",
                                 ":",
                                 ":",
                                 ":",
                                 ":",
                                 "::",
                                 "\n",
                                 "\n",
                                 "\n",
                                 "0",
                                 "1",
                                 "1000",
                                 "65534",
                                 "100",
                                 "-1",
                                 "4294967295",
                                 "4294967296",
                                 "99999999999999999999",
                                 "+",
                                 "-",
                                 "#",
                                 " ",
                                 "\t",
                                 ",",
                                 ",,",
                                 "\r",
                                 "\xff",
                                 "\xc3",
                                 "$5$s$h",
                                 "%s%n",
                                 "/bin/sh",
                                 "\x01",
                                 "alice:x:1000:100:::\n",
                                 "+::::::\n",
                                 "-x\n",
                                 "users:x:100:alice,root\n",
                                 "root:h:1::::::\n"};
    std::string text;
    const auto size = std::uniform_int_distribution<int>(0, 60)(*random);
    for (int i = 0; i < size; i++)
        text += pieces[std::uniform_int_distribution<std::size_t>(0, pieces.size() - 1)(*random)];
    return text;
}

// Whatever is in the files, they can be loaded. A write either settles them for good or is refused,
// with all of them as they were.
TEST_F(RoundTrip, TornFilesSettleOrStay) {
    std::mt19937 random(1);
    int settled = 0;
    int refused = 0;
    for (int i = 0; i < 200; i++) {
        const contents torn = {
            {"passwd", torn_text(&random)},
            {"shadow", torn_text(&random)},
            {"group",  torn_text(&random)}
        };
        write_all(torn);
        const contents before = current();
        const std::string error = error_of_rewrite();
        const contents once = current();
        SCOPED_TRACE("passwd:\n" + torn.at("passwd") + "\nshadow:\n" + torn.at("shadow") +
                     "\ngroup:\n" + torn.at("group"));
        if (error.empty()) {
            settled++;
            EXPECT_EQ(rewritten(), once);
        } else {
            refused++;
            EXPECT_NE(error.find("could not write entry #"), std::string::npos) << error;
            EXPECT_EQ(once, before);
        }
        EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
        (void)take_syslog();
    }
    EXPECT_GT(settled, 50);
    EXPECT_GT(refused, 0);
}

// The C library reads a member with ":" but does not write one: the group file then stays as it is
// until the line is mended.
TEST_F(RoundTrip, GroupLineWithAColonTooManyStopsItsFile) {
    write_all({
        {"passwd", ""                         },
        {"shadow", ""                         },
        {"group",  "good:x:1:\ntorn:x:2:a:b\n"}
    });
    EXPECT_EQ(error_of_rewrite(),
              "corefile 101: unable to sync core files, failed to write 1/3 core file(s) group: "
              "could not write entry #1 to etc/group.tmp: Invalid argument");
    EXPECT_EQ(read("group"), "good:x:1:\ntorn:x:2:a:b\n");
    EXPECT_EQ(take_syslog(), lines{"4 Group 'torn' lists member 'a:b', which has no passwd line"});
}

// A text with bytes of zero in it.
template <std::size_t size>
static std::string with_nul(const char (&text)[size]) {
    return {text, size - 1};
}

TEST_F(RoundTrip, NulBytesDoNotEndTheProcess) {
    write("passwd", with_nul("root:x:0:0:\0:/:/s\n\0\n\0:x:0:0:::\nalice:*:1000:0:::\n"));
    write("shadow", with_nul("root:h\0:1::::::\n\0"));
    write("group", with_nul("root:x:0:\0\nusers\0:x:100:a\0b,c\n"));
    (void)rewritten();
    (void)take_syslog();
    EXPECT_NE(read("passwd").find("alice:*:1000:0:::\n"), std::string::npos);
}

TEST_F(RoundTrip, ManyAccountsStayInOrder) {
    contents files = {
        {"shadow", ""              },
        {"group",  "users:x:100:\n"}
    };
    for (int i = 0; i < 3000; i++) {
        const std::string name = "user" + std::to_string(i);
        files["passwd"] += name + ":x:" + std::to_string(60000 - i) + ":100:::\n";
        files["shadow"] += name + ":h:1:0:99999:7:0::\n";
    }
    write_all(files);
    EXPECT_EQ(rewritten(), files);
}
