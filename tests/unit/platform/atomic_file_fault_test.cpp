// tests/unit/platform/atomic_file_fault_test.cpp: every call of a replacement failing.
#include <cerrno>
#include <cstddef>
#include <iterator>
#include <string>
#include <tuple>
#include <vector>

#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "platform/atomic_file.h"
#include "tests/unit/platform/file_calls.h"
#include "tests/unit/platform/process_state.h"
#include "tests/unit/platform/scratch_folder.h"

using texts = std::vector<std::string>;

static constexpr const char *OLD_TEXT = "old text\n";
static constexpr const char *NEW_TEXT = "new text\n";

struct step {
    const char *name;
    const char *call;  // how its line begins; FOLDER stands for the folder's name
    int nth;           // of the calls that begin like that
    file_result result;
};

// In the order of the calls.
static constexpr step steps[] = {
    {"FolderOpen",   "open FOLDER",       1, file_result::NO_FOLDER  },
    {"LockOpen",     "openat file.lock",  1, file_result::NO_LOCK    },
    {"LockStat",     "fstat file.lock",   1, file_result::NO_LOCK    },
    {"Lock",         "flock file.lock",   1, file_result::NO_LOCK    },
    {"Open",         "openat file NOF",   1, file_result::NOT_READ   },
    {"Stat",         "fstat file",        2, file_result::NOT_READ   },
    {"Read",         "read file",         1, file_result::NOT_READ   },
    {"ReadOfTheEnd", "read file",         2, file_result::NOT_READ   },
    {"CloseOfOld",   "close file",        1, file_result::DONE       },
    {"Unlink",       "unlinkat file.tmp", 1, file_result::NOT_WRITTEN},
    {"Create",       "openat file.tmp",   1, file_result::NOT_WRITTEN},
    {"Write",        "write file.tmp",    1, file_result::NOT_WRITTEN},
    {"Owner",        "fchown file.tmp",   1, file_result::NOT_WRITTEN},
    {"Mode",         "fchmod file.tmp",   1, file_result::NOT_WRITTEN},
    {"Sync",         "fsync file.tmp",    1, file_result::NOT_WRITTEN},
    {"Close",        "close file.tmp",    1, file_result::NOT_WRITTEN},
    {"Rename",       "renameat file.tmp", 1, file_result::NOT_WRITTEN},
    {"FolderSync",   "fsync FOLDER",      1, file_result::NOT_SYNCED },
    {"LockClose",    "close file.lock",   1, file_result::DONE       },
    {"FolderClose",  "close FOLDER",      1, file_result::DONE       },
};

class AtomicFileFault : public testing::TestWithParam<std::tuple<step, int>> {
  protected:
    void SetUp() override { folder_.write("file", OLD_TEXT); }

    file_result rewrite() {
        const std::string path = folder_.path("file");
        atomic_file file(path.c_str());
        wiped_text old_text;

        file_result result = file.lock(0);
        if (result == file_result::DONE)
            result = file.read(&old_text);
        if (result == file_result::DONE)
            result = file.replace(NEW_TEXT, {geteuid(), getegid(), 0600});
        return result;
    }

    // The index of the step's call among all of a rewrite; past their end where it is not there.
    std::size_t index_of(const step &wanted, const texts &lines) const {
        std::string begin = wanted.call;
        const std::size_t word = begin.find("FOLDER");
        if (word != begin.npos)
            begin.replace(word, 6, folder_.path().substr(folder_.path().rfind('/') + 1));

        int countdown = wanted.nth;
        std::size_t index = 0;
        while (index < lines.size() && (lines[index].rfind(begin, 0) != 0 || --countdown != 0))
            index++;
        return index;
    }

    texts lines_of_a_rewrite() {
        file_calls calls;
        EXPECT_EQ(rewrite(), file_result::DONE);
        folder_.write("file", OLD_TEXT);
        return calls.lines();
    }

    scratch_folder folder_;
};

static std::string fault_name(const testing::TestParamInfo<std::tuple<step, int>> &info) {
    return std::string(std::get<0>(info.param).name) +
           (std::get<1>(info.param) == EIO ? "_EIO" : "_ENOSPC");
}

INSTANTIATE_TEST_SUITE_P(EachStep, AtomicFileFault,
                         testing::Combine(testing::ValuesIn(steps), testing::Values(EIO, ENOSPC)),
                         fault_name);

TEST_P(AtomicFileFault, LeavesTheOldFileOrTheNewOne) {
    const auto &[failing, error] = GetParam();
    const texts lines = lines_of_a_rewrite();
    const std::size_t index = index_of(failing, lines);
    ASSERT_LT(index, lines.size()) << "no such call: " << failing.call;
    const texts descriptors = list_descriptors();
    {
        file_calls calls;
        calls.fail(index, error);
        EXPECT_EQ(rewrite(), failing.result);
    }
    const bool replaced =
        failing.result == file_result::DONE || failing.result == file_result::NOT_SYNCED;
    EXPECT_EQ(folder_.read("file"), replaced ? NEW_TEXT : OLD_TEXT);
    EXPECT_EQ(folder_.names(), (texts{"file", "file.lock"}));
    EXPECT_EQ(list_descriptors(), descriptors);

    EXPECT_EQ(rewrite(), file_result::DONE) << "the failure spoils the next try";
    EXPECT_EQ(folder_.read("file"), NEW_TEXT);
}

// Keeps the table complete: each call of a rewrite is a step.
TEST_F(AtomicFileFault, EveryCallIsAStep) {
    const texts lines = lines_of_a_rewrite();

    ASSERT_EQ(lines.size(), std::size(steps));
    for (std::size_t i = 0; i < lines.size(); i++)
        EXPECT_EQ(index_of(steps[i], lines), i) << steps[i].name;
}

TEST_F(AtomicFileFault, InterruptedCallsAreRepeated) {
    file_calls calls;
    calls.fail("flock file.lock", EINTR, 3);
    calls.fail("read file", EINTR, 3);
    calls.fail("write file.tmp", EINTR, 3);

    EXPECT_EQ(rewrite(), file_result::BUSY) << "interrupted until the deadline";
    calls.fail("flock file.lock", EINTR, 0);
    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(folder_.read("file"), NEW_TEXT);
}

TEST_F(AtomicFileFault, ShortWritesAreContinued) {
    file_calls calls;
    calls.limit_writes(2);

    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(folder_.read("file"), NEW_TEXT);
}

TEST_F(AtomicFileFault, WriteThatTakesNothingEnds) {
    file_calls calls;
    calls.limit_writes(0);

    EXPECT_EQ(rewrite(), file_result::NOT_WRITTEN);
    EXPECT_EQ(folder_.read("file"), OLD_TEXT);
    EXPECT_EQ(folder_.names(), (texts{"file", "file.lock"}));
}

// A folder in the temporary file's place cannot be unlinked.
TEST_F(AtomicFileFault, LeftoverThatStaysEndsIt) {
    ASSERT_EQ(mkdir(folder_.path("file.tmp").c_str(), 0700), 0);

    EXPECT_EQ(rewrite(), file_result::NOT_WRITTEN);
    EXPECT_EQ(folder_.read("file"), OLD_TEXT);
}

TEST_F(AtomicFileFault, FolderGroupNeedsTheFolder) {
    const std::string path = folder_.path("file");
    atomic_file file(path.c_str());
    gid_t group = 99;
    file_calls calls;

    ASSERT_EQ(file.lock(0), file_result::DONE);
    calls.fail("fstat " + folder_.path().substr(folder_.path().rfind('/') + 1), EIO);
    EXPECT_EQ(file.folder_group(&group), file_result::NO_FOLDER);
    EXPECT_EQ(group, 99U);
    EXPECT_EQ(file.folder_group(&group), file_result::DONE);
    EXPECT_EQ(group, getegid());
}
