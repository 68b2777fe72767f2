// tests/unit/usermgmt/core_file_fault_test.cpp: every step of a write failing, for every file.
#include <cerrno>
#include <cstring>

#include "tests/unit/usermgmt/io_trace.h"
#include "tests/unit/usermgmt/outgoing_files.h"

enum phase { WRITE, RENAME, DIRECTORY };

// NAME, LIVE, TMP and CAUSE stand for the file's own.
struct step {
    const char *call;
    const char *path;
    int nth;
    phase when;
    const char *text;
};

static constexpr step steps[] = {
    {"stat",   "LIVE", 1, WRITE,     "could not stat() core file at 'LIVE': CAUSE"       },
    {"unlink", "TMP",  1, WRITE,     "could not fopen/fileno temporary file 'TMP': CAUSE"},
    {"open",   "TMP",  1, WRITE,     "could not fopen/fileno temporary file 'TMP': CAUSE"},
    {"fdopen", "TMP",  1, WRITE,     "could not fopen/fileno temporary file 'TMP': CAUSE"},
    {"fchmod", "TMP",  1, WRITE,     "could not chmod() temporary file 'TMP': CAUSE"     },
    {"put",    "TMP",  1, WRITE,     "could not write entry #0 to TMP: CAUSE"            },
    {"put",    "TMP",  2, WRITE,     "could not write entry #1 to TMP: CAUSE"            },
    {"fflush", "TMP",  1, WRITE,     "could not fflush() file 'TMP': CAUSE"              },
    {"fchmod", "TMP",  2, WRITE,     "could not fchmod() file 'TMP': CAUSE"              },
    {"fsync",  "TMP",  1, WRITE,     "could not fsync() file 'TMP': CAUSE"               },
    {"fclose", "TMP",  1, WRITE,     "could not fclose() file 'TMP': CAUSE"              },
    {"rename", "TMP",  1, RENAME,    "NAME: could not rename file 'TMP' -> 'LIVE', CAUSE"},
    {"open",   "etc",  1, DIRECTORY, "NAME: could not open/sync directory 'etc/', CAUSE" },
    {"fsync",  "etc",  1, DIRECTORY, "NAME: could not open/sync directory 'etc/', CAUSE" },
};

struct cause {
    const char *name;
    int number;
    const char *text;
};

static constexpr cause causes[] = {
    {"EIO",     EIO,    "Input/output error"     },
    {"ENOSPC",  ENOSPC, "No space left on device"},
    {"NoErrno", 0,      "Unknown error"          },
};

// How a failing case names its parameters.
static void PrintTo(const step &row, std::ostream *out) {
    *out << row.call << " " << row.path;
}
static void PrintTo(const cause &row, std::ostream *out) {
    *out << row.name;
}

// Replaces every occurrence of the words in a text.
static std::string filled_in(const char *text, const core_file &cf, const char *cause_text) {
    g_autoptr(GString) filled = g_string_new(text);
    const std::string tmp = std::string(cf.path) + ".tmp";
    (void)g_string_replace(filled, "NAME", cf.name, 0);
    (void)g_string_replace(filled, "LIVE", cf.path, 0);
    (void)g_string_replace(filled, "TMP", tmp.c_str(), 0);
    (void)g_string_replace(filled, "CAUSE", cause_text, 0);
    return filled->str;
}

using fault = std::tuple<step, int, cause>;

class CoreFileFault : public OutgoingFiles, public testing::WithParamInterface<fault> {
  protected:
    static constexpr const char *PUTS[] = {"putpwent", "putspent", "putgrent"};

    // Arms the trace for a step of a file. The directory is opened and synced once for each file.
    static void arm(io_trace *trace, const step &failing, int row, int error_number) {
        const core_file &cf = core_file_table[row];
        const std::string call = failing.call == std::string("put") ? PUTS[row] : failing.call;
        const int nth = failing.when == DIRECTORY ? row + 1 : failing.nth;
        trace->fail(call, filled_in(failing.path, cf, ""), nth, error_number);
    }
};

static std::string fault_name(const testing::TestParamInfo<fault> &info) {
    const auto &[failing, row, why] = info.param;
    return failing.call + std::string(failing.when == DIRECTORY ? "_directory" : "") +
           std::to_string(failing.nth) + "_" + core_file_table[row].name + "_" + why.name;
}

INSTANTIATE_TEST_SUITE_P(EachStep, CoreFileFault,
                         testing::Combine(testing::ValuesIn(steps),
                                          testing::Range(0, int{CORE_FILE_COUNT}),
                                          testing::ValuesIn(causes)),
                         fault_name);

TEST_P(CoreFileFault, LeavesNothingHalfDone) {
    const auto &[failing, row, why] = GetParam();
    const int descriptors = count_open_descriptors();
    {
        io_trace trace;
        arm(&trace, failing, row, why.number);
        EXPECT_FALSE(sync());
    }
    EXPECT_EQ(error_.text(), std::string("corefile 101: failed to write 1/3 core file(s) ") +
                                 core_file_table[row].name + ": " +
                                 filled_in(failing.text, core_file_table[row], why.text));

    lines expected_states(CORE_FILE_COUNT, "old");
    std::string expected_dirty(CORE_FILE_COUNT, '1');
    for (int i = 0; i < CORE_FILE_COUNT; i++) {
        const auto index = static_cast<std::size_t>(i);
        // A failed rename stops the files behind it, a failed sync of the directory does not.
        const bool renamed = failing.when == DIRECTORY || (failing.when == RENAME && i < row);
        if (renamed)
            expected_states[index] = "new";
        if (renamed && i != row)
            expected_dirty[index] = '0';
    }
    EXPECT_EQ(states(), expected_states);
    EXPECT_EQ(dirty(), expected_dirty);
    EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
    EXPECT_EQ(count_open_descriptors(), descriptors);
}

// The next write must succeed, with whatever the failed one left.
TEST_P(CoreFileFault, DoesNotSpoilTheNextWrite) {
    const auto &[failing, row, why] = GetParam();
    {
        io_trace trace;
        arm(&trace, failing, row, why.number);
        EXPECT_FALSE(sync());
    }
    for (core_file_data &file : data_)
        file.dirty = TRUE;
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(states(), (lines{"new", "new", "new"}));
    EXPECT_EQ(dirty(), "000");
}

TEST_P(CoreFileFault, FailsAlsoWithoutAnErrorSlot) {
    const auto &[failing, row, why] = GetParam();
    io_trace trace;
    arm(&trace, failing, row, why.number);
    EXPECT_FALSE(core_file_sync_all(core_file_table, data_, TRUE, nullptr));
}
