// tests/unit/usermgmt/core_file_failure_test.cpp: several files failing, and what was never
// written.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "tests/unit/usermgmt/io_trace.h"
#include "tests/unit/usermgmt/outgoing_files.h"

class CoreFileFailure : public OutgoingFiles {};

TEST_F(CoreFileFailure, FirstFailureStopsTheWriting) {
    io_trace trace;
    trace.fail("fsync", "etc/passwd.tmp", 1, EIO);
    EXPECT_FALSE(sync());
    for (const std::string &call : trace.calls())
        EXPECT_NE(call.find("passwd"), std::string::npos) << call;
}

// The descriptor of a file that was closed may belong to somebody else by the time another fails.
TEST_F(CoreFileFailure, CleaningUpClosesNoDescriptorTwice) {
    const int foreign = open("/dev/null", O_RDONLY | O_CLOEXEC);
    io_trace trace;
    int reused = -1;
    trace.before = [foreign, &reused](const std::string &line) {
        if (line == "stat etc/shadow")
            reused = fcntl(foreign, F_DUPFD_CLOEXEC, 0);
    };
    trace.fail("fsync", "etc/shadow.tmp", 1, EIO);
    EXPECT_FALSE(sync());
    EXPECT_GE(fcntl(reused, F_GETFD), 0);
    EXPECT_EQ(close(reused), 0);
    EXPECT_EQ(close(foreign), 0);
}

TEST_F(CoreFileFailure, AFailedFlushIsNoticedBeforeTheMode) {
    io_trace trace;
    trace.fail("fflush", "etc/group.tmp", 1, ENOSPC);
    EXPECT_FALSE(sync());
    EXPECT_EQ(error_.text(),
              "corefile 101: failed to write 1/3 core file(s) group: could not fflush() file "
              "'etc/group.tmp': No space left on device");
    EXPECT_EQ(trace.calls().back(), "unlink etc/shadow.tmp");
}

TEST_F(CoreFileFailure, WithoutStoppingTheOtherFilesAreWritten) {
    io_trace trace;
    trace.fail("fsync", "etc/passwd.tmp", 1, EIO);
    EXPECT_FALSE(sync(false));
    EXPECT_EQ(error_.text(),
              "corefile 101: failed to write 1/3 core file(s) passwd: could not fsync() file "
              "'etc/passwd.tmp': Input/output error");
    EXPECT_EQ(states(), (lines{"old", "new", "new"}));
    EXPECT_EQ(dirty(), "100");
    EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
}

TEST_F(CoreFileFailure, WithoutStoppingAFailedRenameLeavesTheOthersToBeRenamed) {
    io_trace trace;
    trace.fail("rename", "etc/passwd.tmp", 1, EXDEV);
    EXPECT_FALSE(sync(false));
    EXPECT_EQ(
        error_.text(),
        "corefile 101: failed to write 1/3 core file(s) passwd: passwd: could not rename file "
        "'etc/passwd.tmp' -> 'etc/passwd', Invalid cross-device link");
    EXPECT_EQ(states(), (lines{"old", "new", "new"}));
    EXPECT_EQ(dirty(), "100");
    EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
}

TEST_F(CoreFileFailure, AFailedDirectoryIsNamedWithItsFileTwice) {
    io_trace trace;
    trace.fail("fsync", "etc", 2, EIO);
    EXPECT_FALSE(sync());
    EXPECT_EQ(error_.text(),
              "corefile 101: failed to write 1/3 core file(s) shadow: shadow: could not open/sync "
              "directory 'etc/', Input/output error");
    EXPECT_EQ(states(), (lines{"new", "new", "new"}));
    EXPECT_EQ(dirty(), "010");
}

TEST_F(CoreFileFailure, TwoFailedDirectorySyncsAreBothReported) {
    io_trace trace;
    trace.fail("open", "etc", 1, EMFILE);
    trace.fail("fsync", "etc", 2, EIO);  // the third file's: the first was never opened
    EXPECT_FALSE(sync());
    EXPECT_EQ(error_.text(),
              "corefile 103: failed to write 2/3 core file(s) group: group: could not open/sync "
              "directory 'etc/', Input/output error\npasswd: passwd: could not open/sync directory "
              "'etc/', Too many open files");
    EXPECT_EQ(dirty(), "101");
}

TEST_F(CoreFileFailure, SeveralFailuresAreJoinedLastFileFirst) {
    remove("group");
    io_trace trace;
    trace.fail("fsync", "etc/passwd.tmp", 1, EIO);
    EXPECT_FALSE(sync(false));
    EXPECT_EQ(error_.text(),
              "corefile 103: failed to write 2/3 core file(s) group: could not stat() core file at "
              "'etc/group': No such file or directory\npasswd: could not fsync() file "
              "'etc/passwd.tmp': Input/output error");
    EXPECT_EQ(read("shadow"), NEW_TEXT[CORE_FILE_ROW_SHADOW]);
    EXPECT_EQ(files(), (lines{"passwd", "shadow"}));
}

TEST_F(CoreFileFailure, AllThreeFailuresAreJoined) {
    for (const core_file &cf : core_file_table)
        remove(cf.name);
    EXPECT_FALSE(sync(false));
    EXPECT_EQ(error_.text(),
              "corefile 103: failed to write 3/3 core file(s) "
              "group: could not stat() core file at 'etc/group': No such file or directory\n"
              "shadow: could not stat() core file at 'etc/shadow': No such file or directory\n"
              "passwd: could not stat() core file at 'etc/passwd': No such file or directory");
    EXPECT_EQ(files(), lines());
}

TEST_F(CoreFileFailure, MissingDataIsTheCallersError) {
    data_[CORE_FILE_ROW_SHADOW].data = nullptr;
    EXPECT_FALSE(sync());
    EXPECT_EQ(error_.text(),
              "corefile 104: failed to write 1/3 core file(s) missing output data for cf 'shadow'");
    EXPECT_EQ(states(), (lines{"old", "old", "old"}));
    EXPECT_EQ(dirty(), "111");
    EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
}

TEST_F(CoreFileFailure, MissingDataWithoutStoppingLeavesTheOthersWritten) {
    data_[CORE_FILE_ROW_PASSWD].data = nullptr;
    EXPECT_FALSE(sync(false));
    EXPECT_EQ(error_.text(),
              "corefile 104: failed to write 1/3 core file(s) missing output data for cf 'passwd'");
    EXPECT_EQ(states(), (lines{"old", "new", "new"}));
    EXPECT_EQ(dirty(), "100");
}

TEST_F(CoreFileFailure, MissingDataOfSeveralFilesIsCounted) {
    data_[CORE_FILE_ROW_PASSWD].data = nullptr;
    data_[CORE_FILE_ROW_GROUP].data = nullptr;
    remove("shadow");
    EXPECT_FALSE(sync(false));
    EXPECT_EQ(error_.text(),
              "corefile 104: failed to write 3/3 core file(s) missing output data for cf 'passwd'");
}

TEST_F(CoreFileFailure, MissingDataFailsAlsoWithoutAnErrorSlot) {
    data_[CORE_FILE_ROW_PASSWD].data = nullptr;
    EXPECT_FALSE(core_file_sync_all(core_file_table, data_, TRUE, nullptr));
    EXPECT_EQ(states(), (lines{"old", "old", "old"}));
}

TEST_F(CoreFileFailure, DescriptorWithoutWriter) {
    static constexpr core_file deaf = {9, "deaf", "etc/missing", nullptr, nullptr, nullptr};
    EXPECT_FALSE(core_file_sync(&deaf, &data_[0], error_.out()));
    EXPECT_EQ(
        error_.text(),
        "corefile 102: failed to write 1/1 core file(s) deaf: no support for writing entries");
    EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
}

TEST_F(CoreFileFailure, LongDescriptorNameIsCutInTheMessage) {
    static constexpr core_file deaf = {
        9, "a-name-of-thirty-bytes-or-more!!", "etc/x", nullptr, nullptr, nullptr};
    EXPECT_FALSE(core_file_sync(&deaf, &data_[0], error_.out()));
    EXPECT_EQ(error_.text(),
              "corefile 102: failed to write 1/1 core file(s) a-name-of-thirty-bytes-or-mor: no "
              "support for writing entries");
}

TEST_F(CoreFileFailure, LiveFileOfAnotherDirectorySyncsThatDirectory) {
    static const core_file elsewhere = {
        9, "elsewhere", "elsewhere", nullptr, core_file_table[0].write, nullptr};
    ASSERT_TRUE(g_file_set_contents("elsewhere", "", 0, nullptr));
    io_trace trace;
    trace.fail("fsync", ".", 1, EIO);
    EXPECT_FALSE(core_file_sync(&elsewhere, &data_[0], error_.out()));
    EXPECT_EQ(error_.text(),
              "corefile 101: failed to write 1/1 core file(s) elsewhere: elsewhere: could not "
              "open/sync directory './', Input/output error");
}
