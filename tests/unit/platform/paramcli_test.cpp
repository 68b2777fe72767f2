// tests/unit/platform/paramcli_test.cpp: parameters on their way through the option block to the
// file.
#include "platform/paramcli/paramcli.h"

#include <algorithm>
#include <cerrno>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <glib.h>
#include <gtest/gtest.h>

#include "platform/paramcli/param_file.h"
#include "tests/unit/platform/file_calls.h"
#include "tests/unit/platform/process_state.h"
#include "tests/unit/platform/scratch_folder.h"

using texts = std::vector<std::string>;

class Paramcli : public testing::Test {
  protected:
    void SetUp() override { paramcli_reset_options(&options_); }

    // The number of the failure, 0 on success.
    int set(const std::string &name, const std::string &value) {
        int error = 0;
        paramcli_set_custom_param(name.c_str(), value.c_str(), &options_, &error);
        return error;
    }
    int sync() { return param_file_sync(path_.c_str(), &options_); }
    void write(const std::string &text) { folder_.write("parameters", text); }
    std::string read() { return folder_.read("parameters"); }

    scratch_folder folder_;
    const std::string path_ = folder_.path("parameters");
    paramcli_options options_;
};

TEST_F(Paramcli, SetAddsAtTheEnd) {
    write("one=1\n");

    EXPECT_EQ(set("root.System.RootPwdSet", "yes"), 0);
    EXPECT_EQ(read(), "one=1\n") << "before the sync";
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read(), "one=1\nroot.System.RootPwdSet=yes\n");
}

TEST_F(Paramcli, SetChangesInPlace) {
    write("one=1\ntwo=2\n\nthree=3\ntwo=22\n");

    EXPECT_EQ(set("two", "new"), 0);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read(), "one=1\ntwo=new\n\nthree=3\n");
}

TEST_F(Paramcli, LastValueCounts) {
    EXPECT_EQ(set("a", "1"), 0);
    EXPECT_EQ(set("b", "2"), 0);
    EXPECT_EQ(set("a", "3"), 0);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read(), "b=2\na=3\n");
}

TEST_F(Paramcli, AllGoInOneReplacement) {
    EXPECT_EQ(set("a", "1"), 0);
    EXPECT_EQ(set("b", "2"), 0);

    file_calls calls;
    EXPECT_EQ(sync(), 0);
    int renames = 0;
    for (const std::string &line : calls.lines())
        renames += line.rfind("renameat", 0) == 0 ? 1 : 0;
    EXPECT_EQ(renames, 1);
    EXPECT_EQ(read(), "a=1\nb=2\n");
}

TEST_F(Paramcli, OtherLinesStay) {
    const std::string others = "# a=comment\n\nno equals sign\n a=blank\na =blank\nA=1\n=x\n\xff\n";
    write(others + "a=1\r\n" + "ab=2");

    EXPECT_EQ(set("a", "new"), 0);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read(), others + "a=new\nab=2\n");
}

TEST_F(Paramcli, ValueIsStoredAsItIs) {
    for (const char *value : {"", " ", "=", "a=b", "#", "\\n", "'quo\"tes", "tab\t", "\x01", "åäö",
                              "\xff", " blanks "}) {
        EXPECT_EQ(set("name", value), 0) << value;
        EXPECT_EQ(sync(), 0);
        EXPECT_EQ(read(), std::string("name=") + value + "\n");
    }
}

TEST_F(Paramcli, BadValueIsRefused) {
    for (const char *value : {"\n", "a\nb=c", "a\n", "\r", "a\r"}) {
        EXPECT_EQ(set("name", value), PARAMCLI_ERROR_VALUE);
        EXPECT_EQ(sync(), 0);
        EXPECT_FALSE(folder_.exists("parameters"));
    }
}

TEST_F(Paramcli, BadNameIsRefused) {
    for (const char *name :
         {"", "=", "a=b", "a=", "#a", "a\nb", "a\r", "\ta", "a\t", " a", "a ", " ", "a\x7f"}) {
        EXPECT_EQ(set(name, "x"), PARAMCLI_ERROR_NAME) << name;
        EXPECT_EQ(sync(), 0);
        EXPECT_FALSE(folder_.exists("parameters"));
    }
    for (const char *name : {"a", "a b", "a#", "root.Å", "\xff", "a.b-c_d[0]"})
        EXPECT_EQ(set(name, "x"), 0) << name;
}

TEST_F(Paramcli, FailureLeavesWhatIsPending) {
    EXPECT_EQ(set("a", "1"), 0);
    EXPECT_EQ(set("a", "\n"), PARAMCLI_ERROR_VALUE);
    EXPECT_EQ(set("", "2"), PARAMCLI_ERROR_NAME);
    EXPECT_EQ(set("b", std::string(5000, 'x')), PARAMCLI_ERROR_FULL);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read(), "a=1\n");
}

TEST_F(Paramcli, BlockHoldsWhatIsPromised) {
    const std::size_t capacity = sizeof options_.pending;

    EXPECT_EQ(set("a", std::string(capacity - 2, 'x')), PARAMCLI_ERROR_FULL);
    EXPECT_EQ(set("a", std::string(capacity - 3, 'x')), 0);
    EXPECT_EQ(set("b", ""), PARAMCLI_ERROR_FULL);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read(), "a=" + std::string(capacity - 3, 'x') + "\n");

    EXPECT_EQ(set("b", "room again"), 0);
    paramcli_reset_options(&options_);
    for (int i = 0; i < 4088 / 8; i++)
        EXPECT_EQ(set("p" + std::to_string(1000 + i), "x"), 0) << i;
    EXPECT_EQ(set("q", ""), PARAMCLI_ERROR_FULL);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read().size(), capacity + capacity);
}

TEST_F(Paramcli, ResetForgets) {
    EXPECT_EQ(set("a", "1"), 0);
    paramcli_reset_options(&options_);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(folder_.names(), texts{});
    paramcli_reset_options(nullptr);
}

TEST_F(Paramcli, SyncEmptiesTheBlock) {
    EXPECT_EQ(set("a", "1"), 0);
    EXPECT_EQ(sync(), 0);
    write("a=other\n");
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read(), "a=other\n");
}

TEST_F(Paramcli, FailedSyncCanBeRepeated) {
    EXPECT_EQ(set("a", "1"), 0);
    {
        file_calls calls;
        calls.fail("fsync parameters.tmp", EIO);
        EXPECT_EQ(sync(), PARAMCLI_ERROR_WRITE);
    }
    EXPECT_FALSE(folder_.exists("parameters"));
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(read(), "a=1\n");
}

TEST_F(Paramcli, UnchangedFileIsNotWritten) {
    write("a=1\n");
    const ino_t before = folder_.status("parameters").st_ino;

    EXPECT_EQ(set("a", "1"), 0);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(folder_.status("parameters").st_ino, before);
}

TEST_F(Paramcli, AccessIsKept) {
    write("a=1\n");
    ASSERT_EQ(chmod(path_.c_str(), 0660), 0);

    EXPECT_EQ(set("a", "2"), 0);
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(folder_.status("parameters").st_mode, S_IFREG | 0660U);
}

TEST_F(Paramcli, NewFileAndFolderCanBeReadByAll) {
    const std::string path = folder_.path("privane/parameters");
    const std::string name = folder_.path().substr(folder_.path().rfind('/') + 1);

    EXPECT_EQ(set("a", "1"), 0);
    const mode_t old_mask = umask(022);
    file_calls calls;
    EXPECT_EQ(param_file_sync(path.c_str(), &options_), 0);
    (void)umask(old_mask);
    EXPECT_EQ(folder_.read("privane/parameters"), "a=1\n");
    EXPECT_EQ(folder_.status("privane").st_mode, S_IFDIR | 0755U);
    EXPECT_EQ(folder_.status("privane/parameters").st_mode, S_IFREG | 0644U);
    EXPECT_EQ(folder_.status("privane/parameters").st_gid, folder_.status("privane").st_gid);
    // The new folder is as safe from a power cut as the file.
    ASSERT_GE(calls.lines().size(), 3U);
    EXPECT_EQ(calls.lines()[0], "mkdir privane 0755");
    EXPECT_EQ(calls.lines()[1], "open " + name + " DIRECTORY CLOEXEC");
    EXPECT_EQ(calls.lines()[2], "fsync " + name);
}

struct fault_case {
    const char *line;
    int number;
};

static constexpr fault_case fault_cases[] = {
    {"mkdir privane 0755",                                          PARAMCLI_ERROR_FOLDER},
    {"open FOLDER DIRECTORY CLOEXEC",                               PARAMCLI_ERROR_FOLDER},
    {"fsync FOLDER",                                                PARAMCLI_ERROR_FOLDER},
    {"open privane DIRECTORY CLOEXEC",                              PARAMCLI_ERROR_FOLDER},
    {"openat parameters.lock CREAT NOFOLLOW NONBLOCK CLOEXEC 0600", PARAMCLI_ERROR_LOCK  },
    {"flock parameters.lock",                                       PARAMCLI_ERROR_LOCK  },
    {"openat parameters NOFOLLOW NONBLOCK CLOEXEC",                 PARAMCLI_ERROR_READ  },
    {"fstat privane",                                               PARAMCLI_ERROR_FOLDER},
    {"write parameters.tmp",                                        PARAMCLI_ERROR_WRITE },
    {"renameat parameters.tmp parameters",                          PARAMCLI_ERROR_WRITE },
    {"fsync privane",                                               PARAMCLI_ERROR_SYNC  },
};

TEST_F(Paramcli, FailureHasItsNumberAndLeavesNothing) {
    for (const fault_case &row : fault_cases) {
        const scratch_folder folder;
        const std::string path = folder.path("privane/parameters");
        const texts descriptors = list_descriptors();
        const std::string parent = folder.path().substr(folder.path().rfind('/') + 1);
        std::string line = row.line;
        if (const std::size_t word = line.find("FOLDER"); word != line.npos)
            line.replace(word, 6, parent);

        paramcli_reset_options(&options_);
        EXPECT_EQ(set("a", "1"), 0);
        {
            file_calls calls;
            calls.fail(line, EIO);
            EXPECT_EQ(param_file_sync(path.c_str(), &options_), row.number) << row.line;
        }
        EXPECT_EQ(list_descriptors(), descriptors);
        EXPECT_EQ(folder.read("privane/parameters"), "[missing]");
        EXPECT_FALSE(folder.exists("privane/parameters.tmp"));
        file_calls calls;
        EXPECT_EQ(param_file_sync(path.c_str(), &options_), 0) << "the next try, " << row.line;
        // The first try may have made the folder and not synced it.
        EXPECT_EQ(std::count(calls.lines().begin(), calls.lines().end(), "fsync " + parent), 1);
        EXPECT_EQ(folder.read("privane/parameters"), "a=1\n");
    }
}

TEST_F(Paramcli, OtherKindsAndSizesOfFilesAreRefused) {
    EXPECT_EQ(set("a", "1"), 0);
    ASSERT_EQ(symlink("elsewhere", path_.c_str()), 0);
    EXPECT_EQ(sync(), PARAMCLI_ERROR_NOT_REGULAR);
    EXPECT_FALSE(folder_.exists("elsewhere"));

    ASSERT_EQ(unlink(path_.c_str()), 0);
    write(std::string(1024 * 1024, 'x'));
    EXPECT_EQ(sync(), PARAMCLI_ERROR_TOO_BIG);
    EXPECT_EQ(read().size(), 1024U * 1024U);
}

TEST_F(Paramcli, StuckWriterIsNotWaitedForForever) {
    const int holder = open((path_ + ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    ASSERT_EQ(flock(holder, LOCK_EX), 0);

    EXPECT_EQ(set("a", "1"), 0);
    const gint64 start = g_get_monotonic_time();
    EXPECT_EQ(sync(), PARAMCLI_ERROR_BUSY);
    EXPECT_LT(g_get_monotonic_time() - start, 6 * G_USEC_PER_SEC);
    (void)close(holder);
    EXPECT_EQ(sync(), 0);
}

TEST_F(Paramcli, WritersAtTheSameTimeLoseNothing) {
    pid_t writers[2] = {};

    for (int writer = 0; writer < 2; writer++) {
        writers[writer] = fork();
        if (writers[writer] != 0)
            continue;
        int failed = 0;
        for (int i = 0; i < 60; i++) {
            failed += set("p" + std::to_string(writer) + "." + std::to_string(i), "x");
            failed += sync();
        }
        _exit(failed);
    }
    for (const pid_t writer : writers) {
        int status = -1;
        ASSERT_EQ(waitpid(writer, &status, 0), writer);
        EXPECT_EQ(status, 0);
    }
    const std::string text = "\n" + read();
    for (int i = 0; i < 60; i++) {
        EXPECT_NE(text.find("\np0." + std::to_string(i) + "=x\n"), text.npos);
        EXPECT_NE(text.find("\np1." + std::to_string(i) + "=x\n"), text.npos);
    }
}
