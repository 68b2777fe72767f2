// tests/unit/platform/policy_store_test.cpp: which files are read, and that a change counts at
// once.
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "tests/unit/platform/policy_store_fixture.h"

using std::string_literals::operator""s;

TEST_F(PolicyStore, NamesAreThoseOfTheAccountFiles) {
    EXPECT_EQ(ask(701), "yes");
    EXPECT_EQ(ask(0), "no");
    grant("groups=viewers", "x.y");
    EXPECT_EQ(ask(701), "no");
    EXPECT_EQ(ask(701, {701, 750}), "yes");
    // The list of members is not asked: the bus tells the groups of a caller.
    EXPECT_EQ(ask(701, {701}), "no");
}

TEST_F(PolicyStore, FaultNamesFileAndLine) {
    folder_.write("policy", "# one\n[role a]\nuser=clerk\n");
    EXPECT_EQ(ask(701), "authz 2 policy:3: unknown key 'user'");
    // It is refused until it changes, and then not.
    EXPECT_EQ(ask(701), "authz 2 policy:3: unknown key 'user'");
    grant("users=clerk", "x.y");
    EXPECT_EQ(ask(701), "yes");
}

TEST_F(PolicyStore, MissingFileRefusesUntilItIsThere) {
    ASSERT_EQ(unlink(policy_.c_str()), 0);
    EXPECT_EQ(ask(701), "authz 2 policy: No such file or directory");
    grant("users=clerk", "x.y");
    EXPECT_EQ(ask(701), "yes");
    ASSERT_EQ(unlink(policy_.c_str()), 0);
    EXPECT_EQ(ask(701), "authz 2 policy: No such file or directory");
}

TEST_F(PolicyStore, FileThatOthersMayWriteIsRefused) {
    EXPECT_EQ(ask(701), "yes");
    for (const mode_t mode : {0664U, 0646U, 0620U, 0602U}) {
        ASSERT_EQ(chmod(policy_.c_str(), mode), 0);
        EXPECT_EQ(ask(701), "authz 2 policy: others than root may write it");
    }
    for (const mode_t mode : {0644U, 0600U, 0640U, 0755U}) {
        ASSERT_EQ(chmod(policy_.c_str(), mode), 0);
        EXPECT_EQ(ask(701), "yes");
    }
}

// Nobody else can give a file away; the bus ring has the same test.
TEST_F(PolicyStore, FileOfAnotherOwnerIsRefused) {
    if (geteuid() == 0) {
        EXPECT_EQ(ask(701), "yes");
        ASSERT_EQ(chown(policy_.c_str(), 701, 0), 0);
        EXPECT_EQ(ask(701), "authz 2 policy: does not belong to root");
    }
}

TEST_F(PolicyStore, FolderThatOthersMayWriteIsRefused) {
    const std::string folder = folder_.path();
    const mode_t mode = folder_.status(".").st_mode & 07777;

    EXPECT_EQ(ask(701), "yes");
    for (const mode_t wrong : {0770U, 0707U, 0720U, 0702U, 01777U}) {
        ASSERT_EQ(chmod(folder.c_str(), wrong), 0);
        EXPECT_EQ(ask(701), "authz 2 " + folder + ": others than root may write it");
        EXPECT_EQ(ask(701), "authz 2 " + folder + ": others than root may write it");
    }
    for (const mode_t right : {0755U, 0711U, 0700U}) {
        ASSERT_EQ(chmod(folder.c_str(), right), 0);
        EXPECT_EQ(ask(701), "yes");
    }
    ASSERT_EQ(chmod(folder.c_str(), mode), 0);
}

TEST_F(PolicyStore, FolderOfAnotherOwnerIsRefused) {
    open(geteuid() + 1);
    EXPECT_EQ(ask(701), "authz 2 " + folder_.path() + ": does not belong to root");
}

// A link leads to the folder that counts.
TEST_F(PolicyStore, FolderBehindALinkIsLookedAt) {
    const std::string path = folder_.path("link/policy");
    ASSERT_EQ(mkdir(folder_.path("there").c_str(), 0700), 0);
    ASSERT_EQ(symlink("there", folder_.path("link").c_str()), 0);
    ASSERT_EQ(rename(policy_.c_str(), folder_.path("there/policy").c_str()), 0);
    policy_store_free(store_);
    store_ = policy_store_new({path.c_str(), passwd_.c_str(), group_.c_str(), geteuid()});
    EXPECT_EQ(ask(701), "yes");
    ASSERT_EQ(chmod(folder_.path("there").c_str(), 0770), 0);
    EXPECT_EQ(ask(701), "authz 2 link: others than root may write it");
}

TEST_F(PolicyStore, OnlyARegularFileIsRead) {
    ASSERT_EQ(rename(policy_.c_str(), folder_.path("other").c_str()), 0);
    ASSERT_EQ(symlink("other", policy_.c_str()), 0);
    EXPECT_EQ(ask(701), "authz 2 policy: not a regular file");

    ASSERT_EQ(unlink(policy_.c_str()), 0);
    ASSERT_EQ(mkfifo(policy_.c_str(), 0600), 0);
    EXPECT_EQ(ask(701), "authz 2 policy: not a regular file");

    ASSERT_EQ(unlink(policy_.c_str()), 0);
    ASSERT_EQ(mkdir(policy_.c_str(), 0700), 0);
    EXPECT_EQ(ask(701), "authz 2 policy: not a regular file");

    ASSERT_EQ(rmdir(policy_.c_str()), 0);
    ASSERT_EQ(rename(folder_.path("other").c_str(), policy_.c_str()), 0);
    EXPECT_EQ(ask(701), "yes");
}

TEST_F(PolicyStore, LinkThatTakesTheFilesPlaceIsSeen) {
    EXPECT_EQ(ask(701), "yes");
    ASSERT_EQ(rename(policy_.c_str(), folder_.path("other").c_str()), 0);
    ASSERT_EQ(symlink("other", policy_.c_str()), 0);
    EXPECT_EQ(ask(701), "authz 2 policy: not a regular file");
}

// It leads to the very file that was read, which nobody has touched.
TEST_F(PolicyStore, LinkBehindAnotherFolderIsSeen) {
    const std::string path = folder_.path("now/policy");
    ASSERT_EQ(mkdir(folder_.path("old").c_str(), 0700), 0);
    ASSERT_EQ(mkdir(folder_.path("new").c_str(), 0700), 0);
    ASSERT_EQ(rename(policy_.c_str(), folder_.path("old/policy").c_str()), 0);
    ASSERT_EQ(symlink("../old/policy", folder_.path("new/policy").c_str()), 0);
    ASSERT_EQ(symlink("old", folder_.path("now").c_str()), 0);
    policy_store_free(store_);
    store_ = policy_store_new({path.c_str(), passwd_.c_str(), group_.c_str(), geteuid()});
    g_usleep(50000);
    EXPECT_EQ(ask(701), "yes");

    ASSERT_EQ(symlink("new", folder_.path("next").c_str()), 0);
    ASSERT_EQ(rename(folder_.path("next").c_str(), folder_.path("now").c_str()), 0);
    EXPECT_EQ(ask(701), "authz 2 now/policy: not a regular file");
}

TEST_F(PolicyStore, FileHas64KibibytesAtMost) {
    const std::string role = "[role a]\nusers=clerk\nactions=x.y\n";
    const std::string filler(65536 - role.size() - 1, '#');

    folder_.write("policy", role + filler + "\n");
    EXPECT_EQ(ask(701), "yes");
    folder_.write("policy", role + filler + "#\n");
    EXPECT_EQ(ask(701), "authz 2 policy: larger than 64 KiB");
}

// Each time the file is as long as before, in its place or in the same moment.
TEST_F(PolicyStore, EveryChangeOfThePolicyCountsAtOnce) {
    for (int i = 0; i < 500; i++) {
        grant("users=clerk", "x.y");
        ASSERT_EQ(ask(701), "yes") << i;
        grant("users=clerk", "x.z");
        ASSERT_EQ(ask(701), "no") << i;
        replace("policy", "[role a]\nusers=clerk\nactions=x.y\n");
        ASSERT_EQ(ask(701), "yes") << i;
        replace("policy", "[role a]\nusers=clerk\nactions=x.z\n");
        ASSERT_EQ(ask(701), "no") << i;
    }
}

// Where two changes one after the other have the same time: within a tick of the kernel's clock, or
// within a second on a file system that keeps whole ones.
TEST_F(PolicyStore, EveryChangeInOneMomentCounts) {
    for (const long step : {10'000'000L, 1'000'000'000L}) {
        set_time_step(step);
        for (int i = 0; i < 100; i++) {
            grant("users=clerk", "x.y");
            ASSERT_EQ(ask(701), "yes") << step << " " << i;
            grant("users=clerk", "x.z");
            ASSERT_EQ(ask(701), "no") << step << " " << i;
        }
        grant("users=clerk", "x.y");
        for (int i = 0; i < 100; i++) {
            folder_.write("passwd", "clerk:x:702:701::/:/bin/sh\n");
            ASSERT_EQ(ask(701), "no") << step << " " << i;
            folder_.write("passwd", "clerk:x:701:701::/:/bin/sh\n");
            ASSERT_EQ(ask(701), "yes") << step << " " << i;
        }
    }
}

// Of two changes in the same second, the later one comes while or right after the file is read, and
// the second is over when the clock is asked.
TEST_F(PolicyStore, ChangeWhileItIsReadCounts) {
    for (int calls = 1; calls <= 4; calls++) {
        reset_times();
        set_time_step(1'000'000'000L);
        open(geteuid());
        grant("users=clerk", "x.y");
        at_clock(
            calls, [this] { grant("users=clerk", "x.z"); }, 3);
        (void)ask(701);
        EXPECT_EQ(ask(701), "no") << calls;
    }
}

TEST_F(PolicyStore, EveryChangeOfTheAccountsCountsAtOnce) {
    for (int i = 0; i < 500; i++) {
        folder_.write("passwd", "clerk:x:702:701::/:/bin/sh\n");
        ASSERT_EQ(ask(701), "no") << i;
        folder_.write("passwd", "clerk:x:701:701::/:/bin/sh\n");
        ASSERT_EQ(ask(701), "yes") << i;
    }
    grant("groups=viewers", "x.y");
    for (int i = 0; i < 500; i++) {
        replace("group", "viewers:x:751:\n");
        ASSERT_EQ(ask(701, {750}), "no") << i;
        replace("group", "viewers:x:750:\n");
        ASSERT_EQ(ask(701, {750}), "yes") << i;
    }
}

// The times of the content can be set back; that of the change cannot.
TEST_F(PolicyStore, ChangeUnderTheOldTimeCounts) {
    const struct timespec long_ago[2] = {
        {1000, 0},
        {1000, 0}
    };
    ASSERT_EQ(utimensat(AT_FDCWD, policy_.c_str(), long_ago, 0), 0);
    EXPECT_EQ(ask(701), "yes");
    g_usleep(2100000);  // Also where a file system keeps no fractions of a second.
    EXPECT_EQ(ask(701), "yes");
    grant("users=clerk", "x.z");
    ASSERT_EQ(utimensat(AT_FDCWD, policy_.c_str(), long_ago, 0), 0);
    EXPECT_EQ(ask(701), "no");
}

TEST_F(PolicyStore, AccountMayComeAndGo) {
    folder_.write("passwd", "root:x:0:0:::\n");
    EXPECT_EQ(ask(701), "no");
    folder_.write("passwd", PASSWD);
    EXPECT_EQ(ask(701), "yes");
    ASSERT_EQ(unlink(passwd_.c_str()), 0);
    EXPECT_EQ(ask(701), "no");
    EXPECT_EQ(ask(0), "no");
    EXPECT_EQ(ask(701), "no");
    folder_.write("passwd", PASSWD);
    EXPECT_EQ(ask(701), "yes");
}

TEST_F(PolicyStore, FirstLineOfANameCounts) {
    folder_.write("passwd",
                  "clerks:x:703:1:::\n#clerk:x:705:1:::\n\n"
                  "clerk::701:1:::\nclerk:x:702:1:::\nroot:x:0:0:::");
    EXPECT_EQ(ask(701), "yes");
    for (const guint32 uid : {0U, 702U, 703U, 705U}) {
        EXPECT_EQ(ask(uid), "no") << uid;
    }
    grant("groups=viewers", "x.y");
    folder_.write("group", "viewer:x:1:\nviewers::750:\nviewers:x:751:a,b");
    EXPECT_EQ(ask(701, {750}), "yes");
    EXPECT_EQ(ask(701, {751}), "no");
}

// Other readers may take it, or the line behind it.
TEST_F(PolicyStore, NameOfALineOfAnotherFormIsNobody) {
    for (const std::string &line : {"clerk"s,
                                    "clerk:x"s,
                                    "clerk:x:"s,
                                    "clerk:x:701"s,
                                    "clerk:x:701:1"s,
                                    "clerk:x:701:1:a"s,
                                    "clerk:x:701:1:a:/"s,
                                    "clerk:x:701:1:a:/:/bin/sh:"s,
                                    "clerk:x:701:1:a:/:/bin/sh:a"s,
                                    "clerk:x:7o1:1:::"s,
                                    "clerk:x:-701:1:::"s,
                                    "clerk:x:+701:1:::"s,
                                    "clerk:x: 701:1:::"s,
                                    "clerk:x:701 :1:::"s,
                                    "clerk:x::1:::"s,
                                    "clerk:x:4294967295:1:::"s,
                                    "clerk:x:4294967997:1:::"s,
                                    "clerk:x:701::::"s,
                                    "clerk:x:701:a:::"s,
                                    "clerk:x:701:4294967296:::"s,
                                    " clerk:x:701:1:::"s,
                                    "\tclerk:x:701:1:::"s,
                                    "\vclerk:x:701:1:::"s,
                                    "clerk:x:701:1:::\0:"s,
                                    "clerk:x:701:1:::\0"s}) {
        folder_.write("passwd", line + "\nclerk:x:701:1:::\n");
        EXPECT_EQ(ask(701), "no") << line;
    }
    grant("groups=viewers", "x.y");
    for (const std::string &line :
         {"viewers"s, "viewers:x:750"s, "viewers:x:750::"s, "viewers:x:750:a:b"s, "viewers:x::"s,
          "viewers:x:75O:"s, " viewers:x:750:"s, "viewers:x:750:\0"s}) {
        folder_.write("group", line + "\nviewers:x:750:\n");
        EXPECT_EQ(ask(701, {750}), "no") << line;
    }
}

TEST_F(PolicyStore, TwoNamesMayHaveOneId) {
    folder_.write("passwd", "boss:x:701:1:::\nclerk:x:701:1:::");
    EXPECT_EQ(ask(701), "yes");
}

TEST_F(PolicyStore, AccountFilesAreReadNoFurtherThanNeeded) {
    folder_.write("passwd", PASSWD + "one:x:1:1:::\ntwo:x:2:2:::\n");
    watch_line_calls();
    EXPECT_EQ(ask(701), "yes");
    EXPECT_EQ(line_calls(), 2);  // Of no group is anything asked.

    grant("groups=root", "x.y");
    watch_line_calls();
    EXPECT_EQ(ask(701, {0}), "yes");
    EXPECT_EQ(line_calls(), 1);

    grant("users=clerk;nobody", "x.y");
    watch_line_calls();
    EXPECT_EQ(ask(701), "yes");
    EXPECT_EQ(line_calls(), 5);
}

// Also whose lines were read before the error.
TEST_F(PolicyStore, WithAnAccountFileThatFailsNobodyIsKnown) {
    grant("users=clerk;nobody", "x.y");
    watch_line_calls(3);
    EXPECT_EQ(ask(701), "no");
    EXPECT_EQ(line_calls(), 3);
    watch_line_calls();
    EXPECT_EQ(ask(701), "yes");
    EXPECT_EQ(line_calls(), 3);

    grant("groups=viewers;nobody", "x.y");
    watch_line_calls(3);
    EXPECT_EQ(ask(701, {750}), "no");
    EXPECT_EQ(line_calls(), 3);
    watch_line_calls();
    EXPECT_EQ(ask(701, {750}), "yes");
}

static gsize open_descriptors() {
    gsize count = 0;
    g_autoptr(GDir) folder = g_dir_open("/proc/self/fd", 0, nullptr);
    while (g_dir_read_name(folder) != nullptr)
        count++;
    return count;
}

TEST_F(PolicyStore, NoDescriptorIsLeft) {
    const gsize before = open_descriptors();

    EXPECT_EQ(ask(701), "yes");
    ASSERT_EQ(chmod(policy_.c_str(), 0666), 0);
    EXPECT_EQ(ask(701), "authz 2 policy: others than root may write it");
    folder_.write("policy", "broken\n");
    ASSERT_EQ(chmod(policy_.c_str(), 0600), 0);
    EXPECT_EQ(ask(701), "authz 2 policy:1: no '=' in the line");
    EXPECT_EQ(open_descriptors(), before);
}
