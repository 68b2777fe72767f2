// tests/unit/usermgmt/core_file_write_test.cpp: the lines that records become.
#include "tests/unit/usermgmt/account_files.h"

class CoreFileWrite : public AccountFiles {
  protected:
    void SetUp() override {
        AccountFiles::SetUp();
        for (const core_file &cf : core_file_table)
            write(cf.name, "old\n");
        array_ = nullptr;
    }
    void TearDown() override {
        g_clear_pointer(&array_, g_ptr_array_unref);
        AccountFiles::TearDown();
    }

    // What the file of a row holds after the array was written to it.
    std::string write_row(int row) {
        core_file_data data = {array_, TRUE, FALSE};
        error_slot error;
        EXPECT_TRUE(core_file_sync(&core_file_table[row], &data, error.out())) << error.text();
        EXPECT_FALSE(data.dirty);
        EXPECT_EQ(data.data, array_);
        return read(core_file_table[row].name);
    }

    std::string user_line(int row, const user_fields &fields) {
        g_clear_pointer(&array_, g_ptr_array_unref);
        array_ = g_ptr_array_new_with_free_func(
            [](gpointer user) { internal_user_free(static_cast<internal_user *>(user)); });
        g_ptr_array_add(array_, new_user(fields));
        return write_row(row);
    }

    std::string group_line(const group_fields &fields) {
        g_clear_pointer(&array_, g_ptr_array_unref);
        array_ = g_ptr_array_new_with_free_func(
            [](gpointer group) { internal_group_free(static_cast<internal_group *>(group)); });
        g_ptr_array_add(array_, new_group(fields));
        return write_row(CORE_FILE_ROW_GROUP);
    }

    GPtrArray *array_;
};

struct user_case {
    const char *what;
    user_fields user;
    const char *passwd;
    const char *shadow;
};

TEST_F(CoreFileWrite, UsersBecomePasswdAndShadowLines) {
    static constexpr gint64 DAY = 86400;
    const user_case cases[] = {
        {"shadowed",
         {"alice", true, "$5$s$h", 1000, 100, "Alice", "/home/alice", "/bin/sh", 19000 * DAY},
         "alice:x:1000:100:Alice:/home/alice:/bin/sh\n",                                                              "alice:$5$s$h:19000:0:99999:7:0::\n"},
        {"shadowed without password",
         {"bob", true, nullptr, 1, 2, "B", "/", "/s", DAY},
         "bob:x:1:2:B:/:/s\n",                                                                                        "bob:*:1:0:99999:7:0::\n"           },
        {"shadowed with empty password",
         {"bob", true, "", 1, 2, "B", "/", "/s", DAY},
         "bob:x:1:2:B:/:/s\n",                                                                                        "bob::1:0:99999:7:0::\n"            },
        {"hash in passwd",
         {"carol", false, "$5$s$h", 1, 2, "C", "/", "/s", 19000 * DAY},
         "carol:$5$s$h:1:2:C:/:/s\n",                                                                                 ""                                  },
        {"no password",
         {"dave", false, nullptr, 1, 2, "D", "/", "/s", 0},
         "dave:*:1:2:D:/:/s\n",                                                                                       ""                                  },
        {"empty password",               {"dave", false, "", 1, 2, "D", "/", "/s", 0},         "dave::1:2:D:/:/s\n",  ""                                  },
        {"locked",                       {"erin", false, "!", 1, 2, "E", "/", "/s", 0},        "erin:!:1:2:E:/:/s\n", ""                                  },
        {"absent texts",
         {"frank", false, "*", 1, 2, nullptr, nullptr, nullptr, 0},
         "frank:*:1:2:::\n",                                                                                          ""                                  },
        {"empty texts",                  {"frank", false, "*", 1, 2, "", "", "", 0},           "frank:*:1:2:::\n",    ""                                  },
        {"largest IDs",
         {"max", false, "*", 4294967294, 4294967295, "", "", "", 0},
         "max:*:4294967294:4294967295:::\n",                                                                          ""                                  },
        {"line ends in the comment",
         {"gil", false, "*", 1, 2, "a:b\nc", "/", "/s", 0},
         "gil:*:1:2:a b c:/:/s\n",                                                                                    ""                                  },
    };
    for (const user_case &row : cases) {
        EXPECT_EQ(user_line(CORE_FILE_ROW_PASSWD, row.user), row.passwd) << row.what;
        EXPECT_EQ(user_line(CORE_FILE_ROW_SHADOW, row.user), row.shadow) << row.what;
    }
}

struct day_case {
    gint64 last_change;
    const char *field;
};

TEST_F(CoreFileWrite, LastChangeIsWrittenInWholeDays) {
    static constexpr day_case cases[] = {
        {0,                    "0"         },
        {1,                    "0"         },
        {86399,                "0"         },
        {86400,                "1"         },
        {172799,               "1"         },
        {1641600000,           "19000"     },
        {24855LL * 86400,      "24855"     }, // the last day that 32-bit seconds hold
        {24856LL * 86400,      "24856"     },
        {99999LL * 86400,      "99999"     },
        {4000000000LL * 86400, "4000000000"},
        {-86400,               ""          }, // unknown
        {-86399,               "0"         },
        {-2 * 86400,           "-2"        },
    };
    for (const day_case &row : cases)
        EXPECT_EQ(
            user_line(
                CORE_FILE_ROW_SHADOW,
                {.name = "a", .shadowed = true, .password = "h", .last_change = row.last_change}),
            std::string("a:h:") + row.field + ":0:99999:7:0::\n")
            << row.last_change;
}

struct group_case {
    group_fields group;
    const char *line;
};

TEST_F(CoreFileWrite, GroupsBecomeLines) {
    const group_case cases[] = {
        {{"users", "x", 100, {"alice"}},   "users:x:100:alice\n"},
        {{"empty", "x", 7, {}},            "empty:x:7:\n"       },
        {{"open", nullptr, 7, {"bob"}},    "open::7:bob\n"      },
        {{"bare", nullptr, 0, {}},         "bare::0:\n"         },
        {{"locked", "$5$s$h", 7, {}},      "locked:$5$s$h:7:\n" },
        {{"max", nullptr, 4294967295, {}}, "max::4294967295:\n" },
    };
    for (const group_case &row : cases)
        EXPECT_EQ(group_line(row.group), row.line);
}

TEST_F(CoreFileWrite, GroupListsEveryMemberOnce) {
    EXPECT_EQ(with_members_sorted(group_line({
                  "g", "x", 7, {"c", "a", "b", "a"}
    })),
              "g:x:7:a,b,c\n");
}

TEST_F(CoreFileWrite, RecordsKeepTheirOrder) {
    (void)user_line(CORE_FILE_ROW_PASSWD, {.name = "z", .uid = 9});
    g_ptr_array_add(array_, new_user({.name = "a", .uid = 3}));
    g_ptr_array_add(array_, new_user({.name = "m", .uid = 5}));
    EXPECT_EQ(write_row(CORE_FILE_ROW_PASSWD), "z:*:9:100:::\na:*:3:100:::\nm:*:5:100:::\n");
}

TEST_F(CoreFileWrite, NoRecordsBecomeAnEmptyFile) {
    array_ = g_ptr_array_new();
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        EXPECT_EQ(write_row(row), "");
}

struct refused_case {
    const char *what;
    int row;
    user_fields user;
};

// The C library refuses what would become two fields or two lines.
TEST_F(CoreFileWrite, NamesThatWouldBreakTheLineFail) {
    static const refused_case cases[] = {
        {"name",  CORE_FILE_ROW_PASSWD, {.name = "a:b"}                                   },
        {"name",  CORE_FILE_ROW_PASSWD, {.name = "a\nb"}                                  },
        {"home",  CORE_FILE_ROW_PASSWD, {.name = "a", .home = "/a:b"}                     },
        {"shell", CORE_FILE_ROW_PASSWD, {.name = "a", .shell = "/a\nb"}                   },
        {"name",  CORE_FILE_ROW_SHADOW, {.name = "a:b", .shadowed = true, .password = "h"}},
        {"hash",  CORE_FILE_ROW_SHADOW, {.name = "a", .shadowed = true, .password = "h:i"}},
    };
    for (const refused_case &row : cases) {
        g_autoptr(GPtrArray) array = g_ptr_array_new();
        g_autoptr(internal_user) user = new_user(row.user);
        g_ptr_array_add(array, user);
        core_file_data data = {array, TRUE, FALSE};
        error_slot error;
        const core_file &cf = core_file_table[row.row];
        EXPECT_FALSE(core_file_sync(&cf, &data, error.out()));
        EXPECT_EQ(error.text(), std::string("corefile 101: failed to write 1/1 core file(s) ") +
                                    cf.name + ": could not write entry #0 to " + cf.path +
                                    ".tmp: Invalid argument")
            << row.what;
        EXPECT_TRUE(data.dirty);
        EXPECT_EQ(read(cf.name), "old\n");
        EXPECT_FALSE(exists(std::string(cf.name) + ".tmp"));
    }
}

TEST_F(CoreFileWrite, MemberThatWouldBecomeTwoFails) {
    g_autoptr(GPtrArray) array = g_ptr_array_new();
    g_autoptr(internal_group) good = new_group({.name = "good", .gid = 1});
    g_autoptr(internal_group) bad = new_group({.name = "bad", .gid = 2, .members = {"a,b"}});
    g_ptr_array_add(array, good);
    g_ptr_array_add(array, bad);
    core_file_data data = {array, TRUE, FALSE};
    error_slot error;
    EXPECT_FALSE(core_file_sync(&core_file_table[CORE_FILE_ROW_GROUP], &data, error.out()));
    EXPECT_EQ(error.text(),
              "corefile 101: failed to write 1/1 core file(s) group: could not write entry #1 to "
              "etc/group.tmp: Invalid argument");
    EXPECT_EQ(read("group"), "old\n");
}
