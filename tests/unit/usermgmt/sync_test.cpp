// tests/unit/usermgmt/sync_test.cpp: writing the databases of a context.
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/io_trace.h"
#include "usermgmt/context.h"

class Sync : public AccountFiles {
  protected:
    void SetUp() override {
        AccountFiles::SetUp();
        write_typical();
        before_ = contents();
        ctx_ = opened();
    }
    void TearDown() override {
        ctx_.reset();
        AccountFiles::TearDown();
    }
    bool sync() { return usermgmt_sync(ctx_.get(), error_.out()) != FALSE; }
    void add_user(const char *name) {
        user_database_add(&ctx_->user_db,
                          new_user({.name = name, .shadowed = true, .password = "hash"}));
    }
    void add_group(const char *name) {
        group_database_add(&ctx_->group_db, new_group({.name = name, .gid = 7}));
    }
    static lines contents() { return {read("passwd"), read("shadow"), read("group")}; }

    lines before_;
    open_context ctx_;
    error_slot error_;
};

TEST_F(Sync, NothingChangedWritesNothing) {
    io_trace trace;
    EXPECT_TRUE(sync());
    for (const std::string &call : trace.calls())
        EXPECT_EQ(call.rfind("stat ", 0), 0U) << call;
    EXPECT_EQ(contents(), before_);
}

TEST_F(Sync, UnchangedDatabasesAreWrittenAsTheyWereRead) {
    ctx_->user_db.dirty = ctx_->group_db.dirty = TRUE;
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(contents(), before_);
    EXPECT_FALSE(ctx_->user_db.dirty);
    EXPECT_FALSE(ctx_->group_db.dirty);
}

TEST_F(Sync, ChangedGroupsWriteOnlyTheGroupFile) {
    add_group("new");
    io_trace trace;
    EXPECT_TRUE(sync()) << error_.text();
    for (const std::string &call : trace.calls())
        EXPECT_TRUE(call.find("passwd") == std::string::npos &&
                    call.find("shadow") == std::string::npos)
            << call;
    EXPECT_EQ(contents(), (lines{before_[0], before_[1], before_[2] + "new::7:\n"}));
    EXPECT_FALSE(ctx_->group_db.dirty);
}

TEST_F(Sync, ChangedUsersWritePasswdAndShadow) {
    add_user("new");
    io_trace trace;
    EXPECT_TRUE(sync()) << error_.text();
    for (const std::string &call : trace.calls())
        EXPECT_EQ(call.find("etc/group"), std::string::npos) << call;
    EXPECT_EQ(contents(), (lines{before_[0] + "new:x:1000:100:::\n",
                                 before_[1] + "new:hash:0:0:99999:7:0::\n", before_[2]}));
    EXPECT_FALSE(ctx_->user_db.dirty);
}

TEST_F(Sync, FailureIsPrefixedAndLeavesBothDatabasesChanged) {
    add_user("new");
    add_group("new");
    io_trace trace;
    trace.fail("fsync", "etc/group.tmp", 1, EIO);
    EXPECT_FALSE(sync());
    EXPECT_EQ(error_.text(),
              "corefile 101: unable to sync core files, failed to write 1/3 core file(s) group: "
              "could not fsync() file 'etc/group.tmp': Input/output error");
    EXPECT_EQ(contents(), before_);
    EXPECT_TRUE(ctx_->user_db.dirty);
    EXPECT_TRUE(ctx_->group_db.dirty);
}

TEST_F(Sync, FailureInTheMiddleOfTheRenamesLeavesBothDatabasesChanged) {
    add_user("new");
    add_group("new");
    {
        io_trace trace;
        trace.fail("rename", "etc/shadow.tmp", 1, EROFS);
        EXPECT_FALSE(usermgmt_sync(ctx_.get(), nullptr));
    }
    EXPECT_EQ(read("passwd"), before_[0] + "new:x:1000:100:::\n");
    EXPECT_EQ(read("shadow"), before_[1]);
    EXPECT_TRUE(ctx_->user_db.dirty);
    EXPECT_TRUE(ctx_->group_db.dirty);
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(read("shadow"), before_[1] + "new:hash:0:0:99999:7:0::\n");
}

TEST_F(Sync, DirectoryFailureLeavesTheFilesReplaced) {
    add_group("new");
    io_trace trace;
    trace.fail("fsync", "etc", 1, EIO);
    EXPECT_FALSE(sync());
    EXPECT_EQ(error_.text(),
              "corefile 101: unable to sync core files, failed to write 1/3 core file(s) group: "
              "group: could not open/sync directory 'etc/', Input/output error");
    EXPECT_EQ(read("group"), before_[2] + "new::7:\n");
    EXPECT_TRUE(ctx_->group_db.dirty);

    // The file in place is the context's own, so the next write has nobody to warn of.
    EXPECT_TRUE(sync());
    EXPECT_EQ(take_syslog(), lines{});
    EXPECT_FALSE(ctx_->group_db.dirty);
}

// The shadow file is written with the passwd file, also where there was none at open.
TEST_F(Sync, WithoutShadowFileUsersCannotBeWritten) {
    ctx_.reset();
    remove("shadow");
    write("passwd", "nobody:*:65534:65534:nobody:/:/bin/false\n");
    write("group", "nogroup:x:65534:\n");
    ctx_ = opened();
    add_user("new");
    EXPECT_FALSE(sync());
    EXPECT_EQ(error_.text(),
              "corefile 101: unable to sync core files, failed to write 1/3 core file(s) shadow: "
              "could not stat() core file at 'etc/shadow': No such file or directory");
    EXPECT_EQ(read("passwd"), "nobody:*:65534:65534:nobody:/:/bin/false\n");
    EXPECT_EQ(files(), (lines{"group", "passwd"}));
}

TEST_F(Sync, ForeignChangeOfAFileToBeWrittenIsLogged) {
    write("group", read("group") + "foreign:x:9:\n");
    add_group("new");
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(take_syslog(),
              lines{"4 etc/group was changed by another program; its changes are lost"});
    EXPECT_EQ(read("group"), before_[2] + "new::7:\n");
}

TEST_F(Sync, ForeignReplacementWithTheSameTextIsLogged) {
    write("copy", before_[0]);
    ASSERT_EQ(rename("etc/copy", "etc/passwd"), 0);
    add_user("new");
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(take_syslog(),
              lines{"4 etc/passwd was changed by another program; its changes are lost"});
}

// In place, where only one thing about the file tells.
TEST_F(Sync, EverySignOfAForeignChangeCounts) {
    struct change {
        const char *what;
        std::string text;
        time_t seconds;
        long nanoseconds;
    };
    const change changes[] = {
        {"size",        before_[2] + "foreign:x:9:\n", 0, 0},
        {"seconds",     before_[2],                    1, 0},
        {"nanoseconds", before_[2],                    0, 1},
    };
    for (const change &row : changes) {
        ctx_.reset();
        write("group", before_[2]);
        timespec times[2] = {
            {.tv_sec = 1000, .tv_nsec = 5},
            {.tv_sec = 1000, .tv_nsec = 5}
        };
        ASSERT_EQ(utimensat(AT_FDCWD, "etc/group", times, 0), 0);
        ctx_ = opened();
        write("group", row.text);
        times[1].tv_sec += row.seconds;
        times[1].tv_nsec += row.nanoseconds;
        ASSERT_EQ(utimensat(AT_FDCWD, "etc/group", times, 0), 0);
        ctx_->group_db.dirty = TRUE;
        EXPECT_TRUE(sync()) << error_.text();
        EXPECT_EQ(take_syslog(),
                  lines{"4 etc/group was changed by another program; its changes are lost"})
            << row.what;
    }
}

TEST_F(Sync, ForeignChangeOfAFileThatStaysIsNotLogged) {
    write("passwd", read("passwd") + "foreign:*:1001:100:::\n");
    add_group("new");
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(take_syslog(), lines());
    EXPECT_NE(read("passwd").find("foreign"), std::string::npos);
}

TEST_F(Sync, OwnWritesAreNotForeign) {
    for (const char *name : {"one", "two", "three"}) {
        add_user(name);
        add_group(name);
        EXPECT_TRUE(sync()) << error_.text();
    }
    EXPECT_EQ(take_syslog(), lines());
}

TEST_F(Sync, ForeignChangeAfterAnOwnWriteIsLogged) {
    add_group("one");
    EXPECT_TRUE(sync()) << error_.text();
    write("group", "");
    add_group("two");
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(take_syslog(),
              lines{"4 etc/group was changed by another program; its changes are lost"});
}

// What was renamed before a failure is the context's own too.
TEST_F(Sync, OwnHalfOfAFailedWriteIsNotForeign) {
    add_user("new");
    {
        io_trace trace;
        trace.fail("rename", "etc/shadow.tmp", 1, EIO);
        EXPECT_FALSE(sync());
    }
    EXPECT_TRUE(sync()) << error_.text();
    EXPECT_EQ(take_syslog(), lines());
}
