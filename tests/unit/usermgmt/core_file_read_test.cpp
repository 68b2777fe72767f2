// tests/unit/usermgmt/core_file_read_test.cpp: reading the account files.
#include <grp.h>
#include <pwd.h>
#include <shadow.h>

#include <cerrno>

#include <glib/gstdio.h>

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/io_trace.h"

static std::string text_of(const char *text) {
    return text != nullptr ? text : "(null)";
}

static std::string passwd_text(const struct passwd *line) {
    return text_of(line->pw_name) + " " + text_of(line->pw_passwd) + " " +
           std::to_string(line->pw_uid) + " " + std::to_string(line->pw_gid) + " " +
           text_of(line->pw_gecos) + " " + text_of(line->pw_dir) + " " + text_of(line->pw_shell);
}

static std::string shadow_text(const struct spwd *line) {
    return text_of(line->sp_namp) + " " + text_of(line->sp_pwdp) + " " +
           std::to_string(line->sp_lstchg);
}

static std::string group_text(const struct group *line) {
    std::string text = text_of(line->gr_name) + " " + text_of(line->gr_passwd) + " " +
                       std::to_string(line->gr_gid);
    for (char **member = line->gr_mem; member != nullptr && *member != nullptr; member++)
        text += std::string(" ") + *member;
    return text;
}

class CoreFileRead : public AccountFiles {
  protected:
    void TearDown() override {
        g_clear_pointer(&data_.data, g_ptr_array_unref);
        AccountFiles::TearDown();
    }

    bool read_row(int row) {
        return core_file_read_data(&core_file_table[row], &data_, error_.out()) != FALSE;
    }

    // The records of a file with that text, after its own name in etc.
    lines read_text(int row, const std::string &text) {
        write(core_file_table[row].name, text);
        g_clear_pointer(&data_.data, g_ptr_array_unref);
        EXPECT_TRUE(read_row(row)) << error_.text();
        lines texts;
        for (const void *record : records<const void>(data_.data))
            texts.push_back(row == CORE_FILE_ROW_PASSWD
                                ? passwd_text(static_cast<const struct passwd *>(record))
                            : row == CORE_FILE_ROW_SHADOW
                                ? shadow_text(static_cast<const struct spwd *>(record))
                                : group_text(static_cast<const struct group *>(record)));
        return texts;
    }

    core_file_data data_ = {};
    error_slot error_;
};

TEST_F(CoreFileRead, PasswdRecordsInOrder) {
    EXPECT_EQ(read_text(CORE_FILE_ROW_PASSWD, "b:x:2:3:B b:/b:/bin/b\na:*:0:0:::\n"),
              (lines{"b x 2 3 B b /b /bin/b", "a * 0 0   "}));
}

TEST_F(CoreFileRead, ShadowRecordsInOrder) {
    EXPECT_EQ(read_text(CORE_FILE_ROW_SHADOW, "b:$5$s$h:19000:0:99999:7:0::\na:!:::::::\n"),
              (lines{"b $5$s$h 19000", "a ! -1"}));
}

TEST_F(CoreFileRead, GroupRecordsInOrder) {
    EXPECT_EQ(read_text(CORE_FILE_ROW_GROUP, "b:x:2:c,a\na::0:\n"), (lines{"b x 2 c a", "a  0"}));
}

TEST_F(CoreFileRead, EmptyFilesHoldNothing) {
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        EXPECT_EQ(read_text(row, ""), lines());
}

TEST_F(CoreFileRead, LastLineNeedsNoNewline) {
    EXPECT_EQ(read_text(CORE_FILE_ROW_PASSWD, "a:x:1:2:::\nb:x:3:4:g:h:s"),
              (lines{"a x 1 2   ", "b x 3 4 g h s"}));
    EXPECT_EQ(read_text(CORE_FILE_ROW_SHADOW, "a:h:5::::::"), lines{"a h 5"});
    EXPECT_EQ(read_text(CORE_FILE_ROW_GROUP, "a:x:1:b"), lines{"a x 1 b"});
}

struct damaged_line {
    const char *what;
    int row;
    const char *text;
};

TEST_F(CoreFileRead, LinesThatAreNoRecordsAreLeftOut) {
    static constexpr damaged_line cases[] = {
        {"blank",           CORE_FILE_ROW_PASSWD, ""                                },
        {"only blanks",     CORE_FILE_ROW_PASSWD, "   \t "                          },
        {"comment",         CORE_FILE_ROW_PASSWD, "#a:x:1:2:g:h:s"                  },
        {"too few fields",  CORE_FILE_ROW_PASSWD, "a:x"                             },
        {"only a name",     CORE_FILE_ROW_PASSWD, "a"                               },
        {"no uid",          CORE_FILE_ROW_PASSWD, "a:x::2:g:h:s"                    },
        {"no gid",          CORE_FILE_ROW_PASSWD, "a:x:1::g:h:s"                    },
        {"uid is a word",   CORE_FILE_ROW_PASSWD, "a:x:one:2:g:h:s"                 },
        {"uid with a tail", CORE_FILE_ROW_PASSWD, "a:x:1z:2:g:h:s"                  },
        {"uid of 33 bits",  CORE_FILE_ROW_PASSWD, "a:x:4294967296:2:g:h:s"          },
        {"uid of 65 bits",  CORE_FILE_ROW_PASSWD, "a:x:99999999999999999999:2:g:h:s"},
        {"negative uid",    CORE_FILE_ROW_PASSWD, "a:x:-1:2:g:h:s"                  },
        {"gid of 33 bits",  CORE_FILE_ROW_PASSWD, "a:x:1:4294967296:g:h:s"          },
        {"blank",           CORE_FILE_ROW_SHADOW, ""                                },
        {"comment",         CORE_FILE_ROW_SHADOW, "#a:h:1::::::"                    },
        {"day is a word",   CORE_FILE_ROW_SHADOW, "a:h:one::::::"                   },
        {"blank",           CORE_FILE_ROW_GROUP,  ""                                },
        {"comment",         CORE_FILE_ROW_GROUP,  "#a:x:1:b"                        },
        {"too few fields",  CORE_FILE_ROW_GROUP,  "a:x"                             },
        {"no gid",          CORE_FILE_ROW_GROUP,  "a:x::b"                          },
        {"gid is a word",   CORE_FILE_ROW_GROUP,  "a:x:one:b"                       },
        {"gid of 33 bits",  CORE_FILE_ROW_GROUP,  "a:x:4294967296:b"                },
        {"negative gid",    CORE_FILE_ROW_GROUP,  "a:x:-1:b"                        },
    };
    static constexpr const char *good[] = {"good:x:7:8:::", "good:h:7::::::", "good:x:7:"};
    static constexpr const char *good_text[] = {"good x 7 8   ", "good h 7", "good x 7"};
    for (const damaged_line &line : cases)
        EXPECT_EQ(read_text(line.row, std::string(good[line.row]) + "\n" + line.text + "\n" +
                                          good[line.row] + "\n"),
                  (lines{good_text[line.row], good_text[line.row]}))
            << core_file_table[line.row].name << ": " << line.what;
}

// The network information service's marks: a record without IDs, of which the short forms have no
// strings at all beyond the name.
TEST_F(CoreFileRead, CompatibilityLinesAreRecords) {
    EXPECT_EQ(read_text(CORE_FILE_ROW_PASSWD, "+\n+::::::\n-x::::::\n-x\n"),
              (lines{"+ (null) 0 0 (null) (null) (null)", "+  0 0   ", "-x  0 0   ",
                     "-x (null) 0 0 (null) (null) (null)"}));
    EXPECT_EQ(read_text(CORE_FILE_ROW_SHADOW, "+\n+::::::::\n-x::::::::\n"),
              (lines{"+ (null) 0", "+  -1", "-x  -1"}));
    EXPECT_EQ(read_text(CORE_FILE_ROW_GROUP, "+\n+:::\n-x:::\n"),
              (lines{"+ (null) 0", "+  0", "-x  0"}));
}

TEST_F(CoreFileRead, LargestIdsAreRead) {
    EXPECT_EQ(read_text(CORE_FILE_ROW_PASSWD, "a:x:4294967295:4294967294:::\n"),
              lines{"a x 4294967295 4294967294   "});
    EXPECT_EQ(read_text(CORE_FILE_ROW_GROUP, "a:x:4294967295:\n"), lines{"a x 4294967295"});
}

TEST_F(CoreFileRead, LongLinesAreWhole) {
    const std::string comment(100000, 'c');
    EXPECT_EQ(read_text(CORE_FILE_ROW_PASSWD, "a:x:1:2:" + comment + ":/:/s\n"),
              lines{"a x 1 2 " + comment + " / /s"});
    const std::string hash(100000, 'h');
    EXPECT_EQ(read_text(CORE_FILE_ROW_SHADOW, "a:" + hash + ":1::::::\n"),
              lines{"a " + hash + " 1"});
}

TEST_F(CoreFileRead, GroupWithAHundredThousandMembers) {
    std::string line = "big:x:1:m0";
    for (int i = 1; i < 100000; i++)
        line += ",m" + std::to_string(i);
    (void)read_text(CORE_FILE_ROW_GROUP, line + "\nnext:x:2:\n");
    ASSERT_EQ(data_.data->len, 2U);
    const auto *group = static_cast<const struct group *>(g_ptr_array_index(data_.data, 0));
    ASSERT_EQ(g_strv_length(group->gr_mem), 100000U);
    EXPECT_STREQ(group->gr_mem[99999], "m99999");
}

TEST_F(CoreFileRead, RecordsAreCopies) {
    (void)read_text(CORE_FILE_ROW_GROUP, "a:x:1:m\nb:y:2:n\n");
    const auto *first = static_cast<const struct group *>(g_ptr_array_index(data_.data, 0));
    const auto *second = static_cast<const struct group *>(g_ptr_array_index(data_.data, 1));
    EXPECT_NE(first->gr_name, second->gr_name);
    EXPECT_NE(first->gr_mem[0], second->gr_mem[0]);
}

TEST_F(CoreFileRead, MissingFile) {
    static constexpr const char *errors[] = {
        "corefile 100: could not open passwd file 'etc/passwd', No such file or directory",
        "corefile 100: could not open shadow file 'etc/shadow', No such file or directory",
        "corefile 100: could not open group file 'etc/group', No such file or directory",
    };
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        EXPECT_FALSE(read_row(row));
        EXPECT_EQ(error_.text(), errors[row]);
        EXPECT_EQ(data_.data, nullptr);
    }
}

TEST_F(CoreFileRead, DirectoryInPlaceOfTheFile) {
    static constexpr const char *errors[] = {
        "corefile 100: could not read 'passwd' entry 0: Is a directory",
        "corefile 100: could not read 'shadow' entry 0: Is a directory",
        "corefile 100: could not read 'group' entry 0: Is a directory",
    };
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        ASSERT_EQ(g_mkdir(core_file_table[row].path, 0755), 0);
        EXPECT_FALSE(read_row(row));
        EXPECT_EQ(error_.text(), errors[row]);
        EXPECT_EQ(data_.data, nullptr);
    }
}

// A descriptor of its own, whose reader hands out two records and then fails with failing_errno.
static constexpr int UNTOUCHED = -1;
static int failing_errno;
static int fetched;
static int freed;

static gpointer fetch_two_and_fail(FILE * /*stream*/) {
    if (fetched == 2) {
        if (failing_errno != UNTOUCHED)
            errno = failing_errno;
        return nullptr;
    }
    fetched++;
    return g_strdup("record");
}

static void free_counted(gpointer record) {
    freed++;
    g_free(record);
}

static constexpr core_file failing_file = {9,       "failing",   "etc/failing", fetch_two_and_fail,
                                           nullptr, free_counted};

TEST_F(CoreFileRead, FailureInTheMiddleFreesWhatWasRead) {
    write("failing", "");
    const int descriptors = count_open_descriptors();
    for (const auto &[error_number, text] : {
             std::pair{EIO, "corefile 100: could not read 'failing' entry 2: Input/output error"},
             std::pair{0,   "corefile 100: could not read 'failing' entry 2: Success"           }
    }) {
        fetched = freed = 0;
        failing_errno = error_number;
        data_ = {nullptr, TRUE, FALSE};
        EXPECT_FALSE(core_file_read_data(&failing_file, &data_, error_.out()));
        EXPECT_EQ(error_.text(), text);
        EXPECT_EQ(data_.data, nullptr);
        EXPECT_FALSE(data_.dirty);
        EXPECT_EQ(freed, 2);
    }
    EXPECT_EQ(count_open_descriptors(), descriptors);
}

// Only an errno that the reader set tells the end of the file.
TEST_F(CoreFileRead, StaleErrnoIsNoEndOfFile) {
    write("failing", "");
    fetched = freed = 0;
    failing_errno = UNTOUCHED;
    errno = ENOENT;
    EXPECT_FALSE(core_file_read_data(&failing_file, &data_, error_.out()));
    EXPECT_EQ(error_.text(), "corefile 100: could not read 'failing' entry 2: Success");
}

TEST_F(CoreFileRead, DescriptorWithoutReader) {
    static constexpr core_file no_reader = {9, "mute", "etc/mute", nullptr, nullptr, nullptr};
    EXPECT_FALSE(core_file_read_data(&no_reader, &data_, error_.out()));
    EXPECT_EQ(error_.text(), "corefile 102: no fetch function for core file type 'mute");
    EXPECT_EQ(data_.data, nullptr);
}

TEST_F(CoreFileRead, FilledDataIsRefused) {
    (void)read_text(CORE_FILE_ROW_GROUP, "a:x:1:\n");
    EXPECT_EQ(glib_log_of([this] { EXPECT_FALSE(read_row(CORE_FILE_ROW_GROUP)); }),
              lines{"usermgmt-CRITICAL: core_file_read_data: assertion 'dst_data->data == NULL' "
                    "failed"});
    EXPECT_FALSE(error_.is_set());
    EXPECT_EQ(data_.data->len, 1U);
}

TEST_F(CoreFileRead, FilesAreOpenedForReadingOnlyAndClosed) {
    write_typical();
    const int descriptors = count_open_descriptors();
    io_trace trace;
    EXPECT_TRUE(read_row(CORE_FILE_ROW_PASSWD));
    EXPECT_EQ(trace.calls(), (lines{"fopen etc/passwd re", "fclose etc/passwd"}));
    EXPECT_EQ(count_open_descriptors(), descriptors);
}
