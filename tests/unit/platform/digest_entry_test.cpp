// tests/unit/platform/digest_entry_test.cpp: users of the digest file, added, changed and removed.
#include "platform/digest_entry/digest_entry.h"

#include <string>
#include <vector>

#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "platform/digest_entry/digest_file.h"
#include "tests/unit/platform/file_calls.h"
#include "tests/unit/platform/scratch_folder.h"

using texts = std::vector<std::string>;

// Of the passwords "secret" and "other", by md5sum.
static const std::string ALICE = "alice:PRIVANE:427f14472e033f24869b1602e6871ed7\n";
static const std::string ALICE_OTHER = "alice:PRIVANE:526f88b0c082f7082a4b37b47e8558fa\n";
static const std::string BOB = "bob:PRIVANE:e11156835ef8bd106909acd79344c936\n";
static const std::string CAROL = "carol:PRIVANE:00000000000000000000000000000000\n";

class DigestEntry : public testing::Test {
  protected:
    // A file that is there, since a new one needs the right to give it to the web server's group.
    void SetUp() override { write(""); }

    int set(const char *user, const char *password) {
        return digest_file_set(path_.c_str(), user, password);
    }
    int remove(const char *user) { return digest_file_delete(path_.c_str(), user); }
    int set_list(const std::string &list) {
        return digest_file_set_list(path_.c_str(), list.c_str());
    }
    int remove_list(const std::string &list) {
        return digest_file_delete_list(path_.c_str(), list.c_str());
    }

    void write(const std::string &text) { folder_.write("digest", text); }
    std::string read() { return folder_.read("digest"); }

    scratch_folder folder_;
    const std::string path_ = folder_.path("digest");
};

TEST_F(DigestEntry, SetAddsAtTheEnd) {
    write(BOB);

    EXPECT_EQ(set("alice", "secret"), 0);
    EXPECT_EQ(read(), BOB + ALICE);
}

TEST_F(DigestEntry, SetChangesInPlace) {
    write(CAROL + ALICE + BOB);

    EXPECT_EQ(set("alice", "other"), 0);
    EXPECT_EQ(read(), CAROL + ALICE_OTHER + BOB);
}

TEST_F(DigestEntry, SetLeavesOneLineForAUser) {
    write(ALICE + BOB + ALICE + "# comment\n" + ALICE);

    EXPECT_EQ(set("alice", "other"), 0);
    EXPECT_EQ(read(), ALICE_OTHER + BOB + "# comment\n");
}

TEST_F(DigestEntry, DeleteRemovesEveryLineOfAUser) {
    write(ALICE + BOB + ALICE_OTHER);

    EXPECT_EQ(remove("alice"), 0);
    EXPECT_EQ(read(), BOB);
    EXPECT_EQ(remove("bob"), 0);
    EXPECT_EQ(read(), "");
}

TEST_F(DigestEntry, DeleteOfNobodySucceeds) {
    write(BOB);

    EXPECT_EQ(remove("alice"), 0);
    EXPECT_EQ(read(), BOB);
    EXPECT_EQ(unlink(path_.c_str()), 0);
    EXPECT_EQ(remove("alice"), 0);
    EXPECT_FALSE(folder_.exists("digest"));
}

TEST_F(DigestEntry, OtherRealmsAndLinesStay) {
    const std::string before = "# comment: alice:PRIVANE:x\n\nno colon\nalice:OTHER:hash\n";
    const std::string behind = "alice\n:PRIVANE:x\nalice:privane:x\n\xff\xfe\r\n:::\n";
    write(before + ALICE + behind);

    EXPECT_EQ(set("alice", "other"), 0);
    EXPECT_EQ(read(), before + ALICE_OTHER + behind);
    EXPECT_EQ(remove("alice"), 0);
    EXPECT_EQ(read(), before + behind);
}

TEST_F(DigestEntry, LastLineGetsAnEnd) {
    write("bob:OTHER:hash");

    EXPECT_EQ(set("alice", "secret"), 0);
    EXPECT_EQ(read(), "bob:OTHER:hash\n" + ALICE);

    write("bob:OTHER:hash");
    EXPECT_EQ(remove("alice"), 0);
    EXPECT_EQ(read(), "bob:OTHER:hash\n");
}

TEST_F(DigestEntry, UnchangedFileIsNotWritten) {
    write(ALICE + BOB);
    const ino_t before = folder_.status("digest").st_ino;

    EXPECT_EQ(set("alice", "secret"), 0);
    EXPECT_EQ(remove("carol"), 0);
    EXPECT_EQ(set_list(BOB + ALICE), 0);
    EXPECT_EQ(set_list(""), 0);
    EXPECT_EQ(remove_list(""), 0);
    EXPECT_EQ(folder_.status("digest").st_ino, before);
    EXPECT_EQ(read(), ALICE + BOB);
}

struct name_case {
    const char *what;
    std::string name;
    bool valid;
};

static const std::vector<name_case> &name_cases() {
    static const std::vector<name_case> cases = {
        {"plain",              "alice",           true            },
        {"one byte",           "a",               true            },
        {"inner blank",        "al ice",          true            },
        {"blank at the end",   "alice ",          true            },
        {"number sign inside", "a#b",             true            },
        {"backslash",          "alice\\",         true            },
        {"quote",              "\"",              true            },
        {"UTF-8",              "ål\xe2\x82\xac", true            },
        {"Latin-1",            "\xe5",            true            },
        {"longest",            std::string(255,   'x'),             true},
        {"too long",                    std::string(256,                            'x'),          false},
        {"empty",               "",                                false                                },
        {"colon",               "al:ice", false},
        {"only colon",               ":",                                false                                                          },
        {"newline",               "al\nice", false},
        {"newline at the end",               "alice\n",                                false                                                                              },
        {"carriage return",               "alice\r", false},
        {"number sign",               "#alice",                                false                                                                                                                 },
        {"blank",               " alice", false},
        {"tab",               "\talice",                                false                                                                                                                                                  },
        {"vertical tab",               "\valice", false},
        {"form feed",               "\falice",                                false                                                                                                                                                                                    },
        {"only blank",               " ", false},
    };
    return cases;
}

TEST_F(DigestEntry, NamesThatApacheCannotMatchAreRefused) {
    for (const name_case &row : name_cases()) {
        const std::string line = row.name + ":PRIVANE:00000000000000000000000000000000\n";
        write(BOB);
        EXPECT_EQ(set(row.name.c_str(), "x"), row.valid ? 0 : DIGEST_ENTRY_ERROR_USER) << row.what;
        EXPECT_EQ(read().size(), BOB.size() + (row.valid ? line.size() : 0)) << row.what;
        EXPECT_EQ(remove(row.name.c_str()), row.valid ? 0 : DIGEST_ENTRY_ERROR_USER) << row.what;
        EXPECT_EQ(read(), BOB) << row.what;

        if (row.name.empty())
            continue;  // As a list, that is an empty one.
        EXPECT_EQ(set_list(line), row.valid ? 0 : DIGEST_ENTRY_ERROR_LIST) << row.what;
        EXPECT_EQ(read(), row.valid ? BOB + line : BOB) << row.what;
        write(BOB + line);
        if (row.name.find('\n') != row.name.npos)
            continue;  // That would be a list of two.
        EXPECT_EQ(remove_list(row.name), row.valid ? 0 : DIGEST_ENTRY_ERROR_LIST) << row.what;
        EXPECT_EQ(read(), row.valid ? BOB : BOB + line) << row.what;
    }
}

TEST_F(DigestEntry, EmptyPasswordIsRefused) {
    write(ALICE);

    EXPECT_EQ(set("alice", ""), DIGEST_ENTRY_ERROR_PASSWORD);
    EXPECT_EQ(set("bob", ""), DIGEST_ENTRY_ERROR_PASSWORD);
    EXPECT_EQ(read(), ALICE);
}

TEST_F(DigestEntry, ListIsSetInOneReplacement) {
    write(ALICE + "# comment\n");
    const std::string dave = "dave:PRIVANE:abcdef0123456789abcdef0123456789";

    file_calls calls;
    EXPECT_EQ(set_list(BOB + ALICE_OTHER + CAROL + dave), 0);
    EXPECT_EQ(read(), ALICE_OTHER + "# comment\n" + BOB + CAROL + dave + "\n");
    int renames = 0;
    for (const std::string &line : calls.lines())
        renames += line.rfind("renameat", 0) == 0 ? 1 : 0;
    EXPECT_EQ(renames, 1);
}

TEST_F(DigestEntry, LastLineForAUserCounts) {
    EXPECT_EQ(set_list(ALICE + BOB + ALICE_OTHER), 0);
    EXPECT_EQ(read(), BOB + ALICE_OTHER);
}

TEST_F(DigestEntry, ListIsDeletedByNameOrLine) {
    write("# comment\n" + ALICE + BOB + CAROL + "alice:OTHER:hash\n");

    EXPECT_EQ(remove_list("alice\n" + CAROL + "nobody"), 0);
    EXPECT_EQ(read(), "# comment\n" + BOB + "alice:OTHER:hash\n");
}

static const texts &bad_lines() {
    static const texts lines = {
        "",
        "alice",
        "alice:PRIVANE",
        "alice:PRIVANE:",
        "alice:PRIVANE:427f14472e033f24869b1602e6871ed",     // a digit short
        "alice:PRIVANE:427f14472e033f24869b1602e6871ed77",   // one too many
        "alice:PRIVANE:427F14472E033F24869B1602E6871ED7",    // never matches
        "alice:PRIVANE:427f14472e033f24869b1602e6871edg",    // no digit
        "alice:PRIVANE:427f14472e033f24869b1602e6871ed7:",   // another field
        "alice:PRIVANE:427f14472e033f24869b1602e6871ed7\r",  // a foreign line end
        "alice:PRIVANE:secret",
        "alice:OTHER:427f14472e033f24869b1602e6871ed7",
        "alice:PRIVANX:427f14472e033f24869b1602e6871ed7",
        "alice::427f14472e033f24869b1602e6871ed7",
        "alice:PRIVANE;427f14472e033f24869b1602e6871ed7",
        ":PRIVANE:427f14472e033f24869b1602e6871ed7",
        " alice:PRIVANE:427f14472e033f24869b1602e6871ed7",
        "# comment",
    };
    return lines;
}

TEST_F(DigestEntry, OneBadLineRefusesTheList) {
    for (const std::string &line : bad_lines()) {
        for (const std::string &list :
             {line + "\n", line + "\n" + BOB, BOB + line + "\n" + CAROL, BOB + line + "\n"}) {
            write(ALICE);
            EXPECT_EQ(set_list(list), DIGEST_ENTRY_ERROR_LIST) << "'" << list << "'";
            EXPECT_EQ(read(), ALICE);
            if (line == "alice")
                continue;
            EXPECT_EQ(remove_list("alice\n" + list), DIGEST_ENTRY_ERROR_LIST) << "'" << list << "'";
            EXPECT_EQ(read(), ALICE);
        }
    }
}

// As many as fit: a list and a file of the largest size, in a time that a caller can wait for.
TEST_F(DigestEntry, ManyUsers) {
    std::string list;
    for (int i = 0; list.size() + 64 < 1024 * 1024; i++) {
        const std::string number = std::to_string(i * 7919 % 100003);
        list += "user" + number + ":PRIVANE:0123456789abcdef0123456789abcdef\n";
    }
    EXPECT_EQ(set_list(list), 0);
    EXPECT_TRUE(read() == list);
    EXPECT_EQ(set("user0", "secret"), 0);
    EXPECT_EQ(read().size(), list.size());
    EXPECT_EQ(set_list(list), 0);
    EXPECT_TRUE(read() == list);
    EXPECT_EQ(remove_list(list), 0);
    EXPECT_EQ(read(), "");
}

TEST_F(DigestEntry, SizesAreLimited) {
    const std::string comment = "#" + std::string(1024 * 1024 - 2, 'x') + "\n";
    write(comment);
    EXPECT_EQ(remove("alice"), 0);
    EXPECT_EQ(set("alice", "secret"), DIGEST_ENTRY_ERROR_TOO_BIG);
    EXPECT_TRUE(read() == comment);

    write("#" + comment);
    EXPECT_EQ(remove("alice"), DIGEST_ENTRY_ERROR_TOO_BIG);

    std::string list;
    while (list.size() <= 1024 * 1024)
        list += ALICE;
    write(BOB);
    EXPECT_EQ(set_list(list), DIGEST_ENTRY_ERROR_TOO_BIG);
    EXPECT_EQ(remove_list(list), DIGEST_ENTRY_ERROR_TOO_BIG);
    EXPECT_EQ(read(), BOB);
}
