// tests/unit/usermgmt/line_length_test.cpp: lines of any length are read as the C library's own
// readers would, in a time that their length allows.
#include <grp.h>
#include <pwd.h>
#include <shadow.h>

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/reread_lines.h"

class LineLength : public AccountFiles {
  protected:
    void TearDown() override {
        g_clear_pointer(&data_.data, g_ptr_array_unref);
        AccountFiles::TearDown();
    }

    const GPtrArray *records_of(core_file_row row, const std::string &text) {
        g_clear_pointer(&data_.data, g_ptr_array_unref);
        write(core_file_table[row].name, text);
        EXPECT_TRUE(core_file_read_data(&core_file_table[row], &data_, nullptr));
        return data_.data;
    }

    // A member list of that many bytes: of ten-letter names, and one that fills it up.
    static std::string members(std::size_t size) {
        std::string text;
        while (text.size() + 20 < size)
            text += "m" + std::to_string(100000000 + text.size()) + ",";
        return text + std::string(size - text.size(), 'z');
    }

    core_file_data data_ = {};
};

static std::string joined(char *const *names) {
    std::string text;
    for (; *names != nullptr; names++)
        text += (text.empty() ? "" : ",") + std::string(*names);
    return text;
}

// Around each size that the room takes, and that the stream's buffer has; a blank, a comment and a
// damaged line before, which are read on the way.
TEST_F(LineLength, GroupsAroundEveryRoomAreWhole) {
    for (std::size_t size = 512 - 30; size <= 131072; size = 2 * size + 30)
        for (std::size_t more = 0; more <= 40; more++) {
            const std::string listed = members(size + more);
            const GPtrArray *groups =
                records_of(CORE_FILE_ROW_GROUP, "before:x:1:a\n\n# no\ndamaged\nbig:h:2:" + listed +
                                                    "\nafter:x:3:b,c\n");
            ASSERT_EQ(groups->len, 3U) << size + more;
            const auto *big = static_cast<const struct group *>(g_ptr_array_index(groups, 1));
            ASSERT_EQ(joined(big->gr_mem), listed) << size + more;
            ASSERT_STREQ(big->gr_passwd, "h");
            const auto *after = static_cast<const struct group *>(g_ptr_array_index(groups, 2));
            ASSERT_EQ(joined(after->gr_mem), "b,c") << size + more;
        }
}

TEST_F(LineLength, UsersAroundEveryRoomAreWhole) {
    for (std::size_t size = 512 - 40; size <= 131072; size = 2 * size + 40)
        for (std::size_t more = 0; more <= 44; more++) {
            const std::string text(size + more, 't');
            const GPtrArray *users = records_of(CORE_FILE_ROW_PASSWD,
                                                "bad\na:x:1:2:" + text + ":/h:/s\nb:y:3:4:g:h:s\n");
            ASSERT_EQ(users->len, 2U);
            ASSERT_EQ(static_cast<const struct passwd *>(g_ptr_array_index(users, 0))->pw_gecos,
                      text);
            ASSERT_STREQ(static_cast<const struct passwd *>(g_ptr_array_index(users, 1))->pw_shell,
                         "s");
            const GPtrArray *shadows =
                records_of(CORE_FILE_ROW_SHADOW, "a:" + text + ":5::::::7\nb:*:6::::::\n");
            ASSERT_EQ(shadows->len, 2U);
            const auto *shadow = static_cast<const struct spwd *>(g_ptr_array_index(shadows, 0));
            ASSERT_EQ(shadow->sp_pwdp, text);
            ASSERT_EQ(shadow->sp_flag, 7U);
        }
}

// A line of a megabyte takes the doublings of its room, not a try for each kilobyte.
TEST_F(LineLength, ALongLineIsTriedAFewTimes) {
    const std::string listed = members(std::size_t{1} << 20);
    reread_lines reread;
    ASSERT_EQ(records_of(CORE_FILE_ROW_GROUP, "big:x:2:" + listed + "\n")->len, 1U);
    EXPECT_GT(reread.calls, 2);
    EXPECT_LT(reread.calls, 20);
}

// The room stays to the end of the file, and is gone then.
TEST_F(LineLength, RoomIsKeptForTheNextLine) {
    const std::string listed = members(std::size_t{1} << 16);
    reread_lines reread;
    (void)records_of(CORE_FILE_ROW_GROUP, "a:x:1:" + listed + "\n");
    const int once = reread.calls;
    (void)records_of(CORE_FILE_ROW_GROUP, "a:x:1:" + listed + "\nb:x:2:" + listed + "\n");
    EXPECT_EQ(reread.calls - once, once + 1);
}
