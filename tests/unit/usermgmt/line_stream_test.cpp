// tests/unit/usermgmt/line_stream_test.cpp: the readers of the rows on streams that fail, and
// beside the C library's own on lines by chance.
#include <grp.h>
#include <pwd.h>
#include <shadow.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <random>
#include <vector>

#include "tests/unit/usermgmt/account_files.h"

// A file as its stream sees it.
struct made_stream {
    std::string text;
    std::size_t fails_at;  // reading further is an error
    bool tells_place;      // where the reading stands
    bool goes_back;
    std::size_t place;

    static ssize_t on_read(void *cookie, char *out, size_t size) {
        auto *made = static_cast<made_stream *>(cookie);
        const std::size_t end = std::min(made->text.size(), made->fails_at);
        const std::size_t count = std::min(size, end - made->place);
        if (count == 0 && made->fails_at <= made->text.size()) {
            errno = EIO;
            return -1;
        }
        std::memcpy(out, made->text.data() + made->place, count);
        made->place += count;
        return static_cast<ssize_t>(count);
    }

    static int on_seek(void *cookie, off64_t *place, int from) {
        auto *made = static_cast<made_stream *>(cookie);
        const bool is_question = from == SEEK_CUR && *place == 0;
        if (from == SEEK_END || !(is_question ? made->tells_place : made->goes_back)) {
            errno = ESPIPE;
            return -1;
        }
        const auto base = from == SEEK_CUR ? static_cast<off64_t>(made->place) : 0;
        made->place = static_cast<std::size_t>(base + *place);
        *place = static_cast<off64_t>(made->place);
        return 0;
    }
};

static constexpr std::size_t NEVER = ~std::size_t{0};

struct stream_close {
    void operator()(FILE *stream) const { (void)fclose(stream); }
};
using open_stream = std::unique_ptr<FILE, stream_close>;

static open_stream open_made(made_stream *made) {
    return open_stream(
        fopencookie(made, "r", {made_stream::on_read, nullptr, made_stream::on_seek, nullptr}));
}

static std::string field(const char *text) {
    return text != nullptr ? "'" + std::string(text) + "' " : "null ";
}

static std::string number(long value) {
    return std::to_string(value) + " ";
}

static std::string text_of(const struct passwd *line) {
    return field(line->pw_name) + field(line->pw_passwd) + number(line->pw_uid) +
           number(line->pw_gid) + field(line->pw_gecos) + field(line->pw_dir) +
           field(line->pw_shell);
}

static std::string text_of(const struct spwd *line) {
    return field(line->sp_namp) + field(line->sp_pwdp) + number(line->sp_lstchg) +
           number(line->sp_min) + number(line->sp_max) + number(line->sp_warn) +
           number(line->sp_inact) + number(line->sp_expire) +
           number(static_cast<long>(line->sp_flag));
}

static std::string text_of(const struct group *line) {
    std::string text = field(line->gr_name) + field(line->gr_passwd) + number(line->gr_gid);
    for (char **member = line->gr_mem; member != nullptr && *member != nullptr; member++)
        text += field(*member);
    return text + (line->gr_mem == nullptr ? "no list" : "");
}

static std::string record_text(int row, const void *record) {
    if (row == CORE_FILE_ROW_PASSWD)
        return text_of(static_cast<const struct passwd *>(record));
    return row == CORE_FILE_ROW_SHADOW ? text_of(static_cast<const struct spwd *>(record))
                                       : text_of(static_cast<const struct group *>(record));
}

// The records of a stream, and last the name of the error that ended it.
static lines fetch_all(int row, FILE *stream) {
    const core_file &file = core_file_table[row];
    lines texts;
    errno = 0;
    while (gpointer record = file.fetch(stream)) {
        texts.push_back(record_text(row, record));
        file.free_record(record);
    }
    texts.emplace_back(strerrorname_np(errno));
    return texts;
}

// The same by the C library's readers, with room enough for any line.
template <typename record>
static lines read_all(FILE *stream,
                      int (*reader)(FILE *, record *, char *, std::size_t, record **)) {
    std::vector<char> room(std::size_t{4} * 1024 * 1024);
    record line = {};
    record *found = nullptr;
    lines texts;
    int error = 0;
    while ((error = reader(stream, &line, room.data(), room.size(), &found)) == 0)
        texts.push_back(text_of(found));
    texts.emplace_back(strerrorname_np(error));
    return texts;
}

static lines read_plainly(int row, FILE *stream) {
    if (row == CORE_FILE_ROW_PASSWD)
        return read_all<struct passwd>(stream, fgetpwent_r);
    return row == CORE_FILE_ROW_SHADOW ? read_all<struct spwd>(stream, fgetspent_r)
                                       : read_all<struct group>(stream, fgetgrent_r);
}

static const std::string SHORT[CORE_FILE_COUNT] = {
    "a:x:1:2:g:h:s\nb:y:3:4:::\n", "a:$5$s$h:5:1:2:3:4:6:7\nb:*:6::::::\n", "a:x:1:b,c\nd:y:2:\n"};
static const lines SHORT_RECORDS[CORE_FILE_COUNT] = {
    {"'a' 'x' 1 2 'g' 'h' 's' ",    "'b' 'y' 3 4 '' '' '' "       },
    {"'a' '$5$s$h' 5 1 2 3 4 6 7 ", "'b' '*' 6 -1 -1 -1 -1 -1 -1 "},
    {"'a' 'x' 1 'b' 'c' ",          "'d' 'y' 2 "                  },
};

// A line that the room of a stream's first line does not hold.
static std::string long_line(int row) {
    const std::string text(5000, 't');
    if (row == CORE_FILE_ROW_PASSWD)
        return "a:x:1:2:" + text + ":h:s\n";
    return row == CORE_FILE_ROW_SHADOW ? "a:" + text + ":5::::::\n" : "a:x:1:" + text + "\n";
}

// Whole records up to where the reading failed, and then the error: no half of a line, and no end
// of the file.
TEST(LineStream, ReadErrorIsNoEnd) {
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        const std::string &text = SHORT[row];
        for (std::size_t place = 0; place <= text.size(); place++) {
            made_stream made = {text, place, true, true, 0};
            const open_stream stream = open_made(&made);
            lines wanted(SHORT_RECORDS[row].begin(),
                         SHORT_RECORDS[row].begin() +
                             std::count(text.begin(),
                                        text.begin() + static_cast<std::ptrdiff_t>(place), '\n'));
            wanted.emplace_back("EIO");
            EXPECT_EQ(fetch_all(row, stream.get()), wanted) << row << " " << place;
        }
    }
}

TEST(LineStream, ReadErrorInALongLineIsNoEnd) {
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        for (const std::size_t place : {500U, 1023U, 1024U, 1025U, 4096U, 5000U}) {
            made_stream made = {long_line(row), place, true, true, 0};
            const open_stream stream = open_made(&made);
            EXPECT_EQ(fetch_all(row, stream.get()), lines{"EIO"}) << row << " " << place;
        }
}

TEST(LineStream, StreamWithoutAPlaceIsAnError) {
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        made_stream made = {SHORT[row], NEVER, false, false, 0};
        const open_stream stream = open_made(&made);
        EXPECT_EQ(fetch_all(row, stream.get()), lines{"ESPIPE"}) << row;
    }
}

// The line would have to be read anew.
TEST(LineStream, LongLineOfAStreamThatDoesNotGoBackIsAnError) {
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        made_stream made = {SHORT[row] + long_line(row), NEVER, true, false, 0};
        const open_stream stream = open_made(&made);
        lines wanted = SHORT_RECORDS[row];
        wanted.emplace_back("ESPIPE");
        EXPECT_EQ(fetch_all(row, stream.get()), wanted) << row;
    }
}

TEST(LineStream, WhatFailedOnceLeavesNothingForTheNext) {
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        made_stream failing = {long_line(row), 3000, true, true, 0};
        (void)fetch_all(row, open_made(&failing).get());
        made_stream made = {SHORT[row], NEVER, true, true, 0};
        lines wanted = SHORT_RECORDS[row];
        wanted.emplace_back("ENOENT");
        EXPECT_EQ(fetch_all(row, open_made(&made).get()), wanted) << row;
    }
}

// Lines that are nearly always those of an account file, of pieces that mean something to a reader.
class chance_lines {
  public:
    explicit chance_lines(unsigned seed) : random_(seed) {}

    std::string file(int row) {
        std::string text;
        for (unsigned count = below(30); count > 0; count--)
            text += line(row) + "\n";
        // The last line may have no end, and any byte may be anything.
        if (!text.empty() && below(3) == 0)
            text.pop_back();
        while (!text.empty() && below(4) == 0)
            text[below(static_cast<unsigned>(text.size()))] = static_cast<char>(below(256));
        return text;
    }

  private:
    unsigned below(unsigned limit) { return static_cast<unsigned>(random_() % limit); }

    std::string word() {
        static const std::string words[] = {"",   "a",   "root", "+",    "-",  "+a",
                                            "-a", " a",  "a ",   "#",    "#a", "x",
                                            "*",  "a,b", ",",    ",a,,", "\t", "\xff"};
        if (below(12) == 0)
            return std::string(below(below(8) == 0 ? 9000 : 1200), 'l');
        return words[below(std::size(words))];
    }

    std::string id() {
        static const std::string ids[] = {
            "",   "-1", "+5",         " 7",         "007",
            "1z", "0x", "4294967295", "4294967296", "99999999999999999999"};
        return below(4) == 0 ? ids[below(std::size(ids))] : std::to_string(below(70000));
    }

    std::string members() {
        std::string text;
        for (unsigned count = below(below(6) == 0 ? 900 : 5); count > 0; count--)
            text += (text.empty() ? "" : ",") + word();
        return text;
    }

    // Which of the fields are numbers, and how many fields there are.
    std::string line(int row) {
        static constexpr unsigned counts[CORE_FILE_COUNT] = {7, 9, 4};
        const unsigned count = below(6) == 0 ? below(11) : counts[row];
        std::string text;
        for (unsigned i = 0; i < count; i++) {
            const bool is_number = row == CORE_FILE_ROW_PASSWD   ? i == 2 || i == 3
                                   : row == CORE_FILE_ROW_SHADOW ? i >= 2
                                                                 : i == 2;
            const bool is_list = row == CORE_FILE_ROW_GROUP && i == 3;
            text += (i > 0 ? ":" : "") + (is_number ? id() : is_list ? members() : word());
        }
        return text;
    }

    std::mt19937 random_;
};

// The room of the C library's readers and that of the rows differ, and nothing else may.
TEST(LineStream, LinesByChanceAreReadAsByTheCLibrary) {
    std::size_t records = 0;
    std::size_t lengths = 0;
    for (unsigned seed = 0; seed < 600; seed++) {
        chance_lines chance(20261121 + seed);
        for (int row = 0; row < CORE_FILE_COUNT; row++) {
            made_stream made = {chance.file(row), NEVER, true, true, 0};
            const lines read = fetch_all(row, open_made(&made).get());
            made.place = 0;
            const lines wanted = read_plainly(row, open_made(&made).get());
            ASSERT_TRUE(read == wanted) << "seed " << seed << ", row " << row << ": " << read.size()
                                        << " records instead of " << wanted.size();
            records += wanted.size() - 1;
            lengths += static_cast<std::size_t>(
                std::count_if(wanted.begin(), wanted.end(),
                              [](const std::string &text) { return text.size() > 1100; }));
        }
    }
    EXPECT_GT(records, 5000U);
    EXPECT_GT(lengths, 500U);
}
