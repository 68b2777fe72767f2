// tests/unit/usermgmt/core_file_replace_test.cpp: how the account files are replaced.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <glib/gstdio.h>

#include "tests/unit/usermgmt/io_trace.h"
#include "tests/unit/usermgmt/outgoing_files.h"

static mode_t mode_of(const std::string &path) {
    struct stat st = {};
    EXPECT_EQ(lstat(path.c_str(), &st), 0) << path;
    return st.st_mode & 07777;
}

// What changes when a file is replaced, written or only touched.
static std::string identity_of(const std::string &path) {
    struct stat st = {};
    EXPECT_EQ(lstat(path.c_str(), &st), 0) << path;
    return std::to_string(st.st_ino) + " " + std::to_string(st.st_mtim.tv_sec) + "." +
           std::to_string(st.st_mtim.tv_nsec) + " " + std::to_string(st.st_ctim.tv_sec) + "." +
           std::to_string(st.st_ctim.tv_nsec);
}

class CoreFileReplace : public OutgoingFiles {};

TEST_F(CoreFileReplace, AllDirtyFilesAreReplacedAndClean) {
    const int descriptors = count_open_descriptors();
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(states(), (lines{"new", "new", "new"}));
    EXPECT_EQ(dirty(), "000");
    EXPECT_EQ(files(), (lines{"group", "passwd", "shadow"}));
    EXPECT_EQ(count_open_descriptors(), descriptors);
}

TEST_F(CoreFileReplace, EveryFileIsSafeOnDiskBeforeTheFirstIsRenamed) {
    static const lines steps = {
        "stat etc/FILE",
        "unlink etc/FILE.tmp",
        "open etc/FILE.tmp 0600 O_EXCL O_NOFOLLOW O_CLOEXEC",
        "fdopen etc/FILE.tmp w",
        "fchmod etc/FILE.tmp 0600",
        "PUT etc/FILE.tmp",
        "PUT etc/FILE.tmp",
        "fflush etc/FILE.tmp",
        "fchmod etc/FILE.tmp 0640",
        "fsync etc/FILE.tmp",
        "fclose etc/FILE.tmp",
    };
    static constexpr const char *puts[] = {"putpwent", "putspent", "putgrent"};
    lines expected;
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        ASSERT_EQ(g_chmod(core_file_table[row].path, 0640), 0);
        for (const std::string &step : steps) {
            g_autoptr(GString) line = g_string_new(step.c_str());
            (void)g_string_replace(line, "FILE", core_file_table[row].name, 0);
            (void)g_string_replace(line, "PUT", puts[row], 0);
            expected.emplace_back(line->str);
        }
    }
    for (const core_file &cf : core_file_table) {
        expected.push_back(std::string("rename ") + cf.path + ".tmp " + cf.path);
        expected.emplace_back("open etc O_DIRECTORY O_CLOEXEC");
        expected.emplace_back("fsync etc");
    }

    io_trace trace;
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(trace.calls(), expected);
}

// A watcher must never find a temporary file that others can read, whatever the process's umask.
TEST_F(CoreFileReplace, TemporaryIsPrivateFromItsBirthUntilItIsWhole) {
    ASSERT_EQ(g_chmod("etc/passwd", 0666), 0);
    const mode_t old_umask = umask(0);
    io_trace trace;
    lines modes;
    trace.before = [&modes](const std::string &line) {
        if (access("etc/passwd.tmp", F_OK) != 0)
            return;
        const mode_t mode = mode_of("etc/passwd.tmp");
        if (mode != 0600)
            modes.push_back(line + " at " + std::to_string(mode));
    };
    EXPECT_TRUE(sync()) << error_.text();
    (void)umask(old_umask);

    // Only once the mode of the live file was set may it be seen: here before fsync.
    ASSERT_FALSE(modes.empty());
    EXPECT_EQ(modes.front(), "fsync etc/passwd.tmp at " + std::to_string(0666));
    EXPECT_EQ(mode_of("etc/passwd"), 0666U);
}

TEST_F(CoreFileReplace, ModeIsKeptAndUmaskLeftAlone) {
    static constexpr mode_t modes[] = {0644, 0600, 0640, 0666, 0400, 0000, 04755, 02644, 01777};
    const mode_t old_umask = umask(0077);
    for (const mode_t mode : modes) {
        ASSERT_EQ(chmod("etc/shadow", mode), 0);
        data_[CORE_FILE_ROW_SHADOW].dirty = TRUE;
        EXPECT_TRUE(sync()) << error_.text();
        EXPECT_EQ(mode_of("etc/shadow"), mode);
    }
    EXPECT_EQ(umask(old_umask), 0077U);
}

TEST_F(CoreFileReplace, NothingDirtyTouchesNothing) {
    lines before;
    for (core_file_data &file : data_)
        file.dirty = FALSE;
    for (const core_file &cf : core_file_table)
        before.push_back(identity_of(cf.path));

    io_trace trace;
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(trace.calls(), lines());
    lines after;
    for (const core_file &cf : core_file_table)
        after.push_back(identity_of(cf.path));
    EXPECT_EQ(after, before);
}

TEST_F(CoreFileReplace, OnlyTheDirtyFileIsTouched) {
    const std::string passwd = identity_of("etc/passwd");
    const std::string shadow = identity_of("etc/shadow");
    data_[CORE_FILE_ROW_PASSWD].dirty = FALSE;
    data_[CORE_FILE_ROW_SHADOW].dirty = FALSE;

    io_trace trace;
    EXPECT_TRUE(sync()) << error_.text();
    for (const std::string &call : trace.calls())
        EXPECT_TRUE(call.find("passwd") == std::string::npos &&
                    call.find("shadow") == std::string::npos)
            << call;
    EXPECT_EQ(states(), (lines{"old", "old", "new"}));
    EXPECT_EQ(identity_of("etc/passwd"), passwd);
    EXPECT_EQ(identity_of("etc/shadow"), shadow);
}

TEST_F(CoreFileReplace, CleanFileNeedsNoData) {
    data_[CORE_FILE_ROW_SHADOW] = {nullptr, FALSE, FALSE};
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(states(), (lines{"new", "old", "new"}));
}

TEST_F(CoreFileReplace, LeftoverIsReplaced) {
    write("passwd.tmp", std::string(10000, 'x'));
    ASSERT_EQ(g_chmod("etc/passwd.tmp", 0666), 0);
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(states(), (lines{"new", "new", "new"}));
    EXPECT_FALSE(exists("passwd.tmp"));
}

// A reader that holds the leftover open must not see what is written now.
TEST_F(CoreFileReplace, LeftoverIsNotWrittenInto) {
    write("shadow.tmp", "leftover");
    const int reader = open("etc/shadow.tmp", O_RDONLY | O_CLOEXEC);
    ASSERT_GE(reader, 0);
    EXPECT_TRUE(sync()) << error_.text();
    char bytes[100] = {};
    EXPECT_EQ(::read(reader, bytes, sizeof bytes - 1), 8);
    EXPECT_STREQ(bytes, "leftover");
    EXPECT_EQ(close(reader), 0);
}

TEST_F(CoreFileReplace, PlantedLinkIsNotFollowed) {
    write("victim", "victim\n");
    const std::string before = identity_of("etc/victim");
    ASSERT_EQ(symlink("victim", "etc/group.tmp"), 0);
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(read("victim"), "victim\n");
    EXPECT_EQ(identity_of("etc/victim"), before);
    EXPECT_EQ(states(), (lines{"new", "new", "new"}));
    EXPECT_FALSE(exists("group.tmp"));
}

TEST_F(CoreFileReplace, DirectoryInTheWayFails) {
    ASSERT_EQ(g_mkdir("etc/passwd.tmp", 0755), 0);
    EXPECT_FALSE(sync());
    EXPECT_EQ(error_.text(),
              "corefile 101: failed to write 1/3 core file(s) passwd: could not fopen/fileno "
              "temporary file 'etc/passwd.tmp': Is a directory");
    EXPECT_EQ(states(), (lines{"old", "old", "old"}));
    EXPECT_EQ(dirty(), "111");
    EXPECT_TRUE(exists("passwd.tmp"));
}

TEST_F(CoreFileReplace, MissingLiveFileFailsAtStat) {
    remove("shadow");
    EXPECT_FALSE(sync());
    EXPECT_EQ(
        error_.text(),
        "corefile 101: failed to write 1/3 core file(s) shadow: could not stat() core file at "
        "'etc/shadow': No such file or directory");
    EXPECT_EQ(files(), (lines{"group", "passwd"}));
    EXPECT_EQ(read("passwd"), "old passwd\n");
    EXPECT_EQ(dirty(), "111");
}

TEST_F(CoreFileReplace, OneFileAloneSucceedsAndFailsAsOneOfOne) {
    EXPECT_TRUE(core_file_sync(&core_file_table[CORE_FILE_ROW_GROUP], &data_[CORE_FILE_ROW_GROUP],
                               error_.out()));
    EXPECT_EQ(states(), (lines{"old", "old", "new"}));
    EXPECT_EQ(dirty(), "110");

    remove("passwd");
    EXPECT_FALSE(core_file_sync(&core_file_table[CORE_FILE_ROW_PASSWD],
                                &data_[CORE_FILE_ROW_PASSWD], error_.out()));
    EXPECT_EQ(
        error_.text(),
        "corefile 101: failed to write 1/1 core file(s) passwd: could not stat() core file at "
        "'etc/passwd': No such file or directory");
}

TEST_F(CoreFileReplace, SyncOfOneFileNeedsBothArguments) {
    EXPECT_EQ(
        glib_log_of([this] { EXPECT_FALSE(core_file_sync(nullptr, &data_[0], error_.out())); }),
        lines{"usermgmt-CRITICAL: core_file_sync: assertion 'cf != NULL' failed"});
    EXPECT_FALSE(error_.is_set());
    EXPECT_EQ(glib_log_of([this] {
                  EXPECT_FALSE(core_file_sync(&core_file_table[0], nullptr, error_.out()));
              }),
              lines{"usermgmt-CRITICAL: core_file_sync: assertion 'src_data != NULL' failed"});
    EXPECT_FALSE(error_.is_set());
}
