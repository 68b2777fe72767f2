// tests/unit/platform/digest_file_test.cpp: the digest file between its writers, its owner and the
// web server.
#include "platform/digest_entry/digest_file.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <glib.h>
#include <gtest/gtest.h>

#include "platform/digest_entry/digest_entry.h"
#include "tests/unit/platform/child.h"
#include "tests/unit/platform/file_calls.h"
#include "tests/unit/platform/private_etc.h"
#include "tests/unit/platform/process_state.h"
#include "tests/unit/platform/scratch_folder.h"

using texts = std::vector<std::string>;

static const std::string ALICE = "alice:PRIVANE:427f14472e033f24869b1602e6871ed7\n";
static const std::string BOB = "bob:PRIVANE:e11156835ef8bd106909acd79344c936\n";

class DigestFile : public testing::Test {
  protected:
    scratch_folder folder_;
    const std::string path_ = folder_.path("digest");
};

TEST_F(DigestFile, NewOneIsReadableForTheWebServerAlone) {
    const gid_t other_group = geteuid() == 0 ? 23456 : getegid();
    ASSERT_EQ(chown(folder_.path().c_str(), geteuid(), other_group), 0);

    file_calls calls;
    calls.answer_getgrnam(file_calls::groups::OWN);
    EXPECT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), 0);
    EXPECT_EQ(folder_.read("digest"), ALICE);
    EXPECT_EQ(folder_.status("digest").st_mode, S_IFREG | 0640U);
    EXPECT_EQ(folder_.status("digest").st_uid, geteuid());
    EXPECT_EQ(folder_.status("digest").st_gid, getegid());
    EXPECT_NE(calls.lines().end(),
              std::find(calls.lines().begin(), calls.lines().end(), "getgrnam www-data"));
}

TEST_F(DigestFile, NewOneGetsTheFoldersGroupWhereTheWebServerHasNone) {
    const gid_t folder_group = geteuid() == 0 ? 23456 : getegid();
    ASSERT_EQ(chown(folder_.path().c_str(), geteuid(), folder_group), 0);

    file_calls calls;
    calls.answer_getgrnam(file_calls::groups::NONE);
    EXPECT_EQ(digest_file_set_list(path_.c_str(), ALICE.c_str()), 0);
    EXPECT_EQ(folder_.read("digest"), ALICE);
    EXPECT_EQ(folder_.status("digest").st_mode, S_IFREG | 0640U);
    EXPECT_EQ(folder_.status("digest").st_gid, folder_group);
}

TEST_F(DigestFile, OldOneKeepsItsAccess) {
    folder_.write("digest", BOB);
    ASSERT_EQ(chmod(path_.c_str(), 0604), 0);
    const bool privileged = geteuid() == 0;
    ASSERT_EQ(chown(path_.c_str(), privileged ? 12345 : geteuid(), privileged ? 23456 : getegid()),
              0);
    const struct stat before = folder_.status("digest");

    file_calls calls;
    calls.answer_getgrnam(file_calls::groups::OWN);
    EXPECT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), 0);
    EXPECT_EQ(folder_.read("digest"), BOB + ALICE);
    EXPECT_EQ(folder_.status("digest").st_mode, before.st_mode);
    EXPECT_EQ(folder_.status("digest").st_uid, before.st_uid);
    EXPECT_EQ(folder_.status("digest").st_gid, before.st_gid);
}

struct fault_case {
    const char *line;
    int number;
};

static constexpr fault_case fault_cases[] = {
    {"openat digest.lock CREAT NOFOLLOW NONBLOCK CLOEXEC 0600", DIGEST_ENTRY_ERROR_LOCK },
    {"flock digest.lock",                                       DIGEST_ENTRY_ERROR_LOCK },
    {"openat digest NOFOLLOW NONBLOCK CLOEXEC",                 DIGEST_ENTRY_ERROR_READ },
    {"read digest",                                             DIGEST_ENTRY_ERROR_READ },
    {"write digest.tmp",                                        DIGEST_ENTRY_ERROR_WRITE},
    {"fsync digest.tmp",                                        DIGEST_ENTRY_ERROR_WRITE},
    {"renameat digest.tmp digest",                              DIGEST_ENTRY_ERROR_WRITE},
};

TEST_F(DigestFile, FailureHasItsNumberAndLeavesTheFile) {
    const std::string before = "# comment\n" + BOB;
    for (const fault_case &row : fault_cases) {
        folder_.write("digest", before);
        const texts descriptors = list_descriptors();
        for (int operation = 0; operation < 4; operation++) {
            file_calls calls;
            calls.fail(row.line, EIO);
            const char *path = path_.c_str();
            const int number = operation == 0   ? digest_file_set(path, "alice", "secret")
                               : operation == 1 ? digest_file_delete(path, "bob")
                               : operation == 2 ? digest_file_set_list(path, ALICE.c_str())
                                                : digest_file_delete_list(path, "bob\n");
            EXPECT_EQ(number, row.number) << row.line << ", operation " << operation;
            EXPECT_EQ(folder_.read("digest"), before) << row.line;
        }
        EXPECT_EQ(list_descriptors(), descriptors);
    }
    EXPECT_EQ(folder_.names(), (texts{"digest", "digest.lock"}));
}

// Else a user who was not added could log in over the web, or one who was not removed could not.
TEST_F(DigestFile, FolderThatIsNotSyncedBringsTheOldFileBack) {
    const std::string name = folder_.path().substr(folder_.path().rfind('/') + 1);
    for (const std::string &before : {std::string(), ALICE + "\n"}) {
        folder_.write("digest", before);
        for (const char *user : {"alice", "bob"}) {
            file_calls calls;
            calls.fail("fsync " + name, EIO);
            EXPECT_EQ(digest_file_set(path_.c_str(), user, "other"), DIGEST_ENTRY_ERROR_SYNC);
            EXPECT_EQ(folder_.read("digest"), before);
        }
    }
    file_calls calls;
    calls.fail("fsync " + name, EIO);
    EXPECT_EQ(digest_file_delete(path_.c_str(), "alice"), DIGEST_ENTRY_ERROR_SYNC);
    EXPECT_EQ(folder_.read("digest"), ALICE + "\n");
}

TEST_F(DigestFile, NewFileThatIsNotSyncedGoes) {
    const std::string name = folder_.path().substr(folder_.path().rfind('/') + 1);
    file_calls calls;
    calls.answer_getgrnam(file_calls::groups::OWN);
    calls.fail("fsync " + name, EIO);

    EXPECT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), DIGEST_ENTRY_ERROR_SYNC);
    EXPECT_EQ(folder_.names(), (texts{"digest.lock"}));
}

// Such a disk may lose what it shows, so nobody is told yet that it is done.
TEST_F(DigestFile, RepeatedChangeIsDoneWhenTheFolderIsSynced) {
    const std::string sync = "fsync " + folder_.path().substr(folder_.path().rfind('/') + 1);
    folder_.write("digest", BOB);
    {
        file_calls calls;
        calls.fail(sync, EIO);
        calls.before = [&](const std::string &line) {
            if (line == sync)
                calls.fail("renameat digest.tmp digest", EIO);  // nothing can be taken back
        };
        ASSERT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), DIGEST_ENTRY_ERROR_SYNC);
    }
    ASSERT_EQ(folder_.read("digest"), BOB + ALICE);

    file_calls calls;
    calls.fail(sync, EIO);
    EXPECT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), DIGEST_ENTRY_ERROR_SYNC);
    EXPECT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), 0);
    EXPECT_EQ(std::count(calls.lines().begin(), calls.lines().end(), sync), 2);
    EXPECT_EQ(folder_.read("digest"), BOB + ALICE);
}

// A new file that was not synced, and was removed, may come back as well.
TEST_F(DigestFile, RemovalFromAMissingFileIsDoneWhenTheFolderIsSynced) {
    const std::string sync = "fsync " + folder_.path().substr(folder_.path().rfind('/') + 1);
    file_calls calls;
    calls.fail(sync, EIO);
    EXPECT_EQ(digest_file_delete(path_.c_str(), "alice"), DIGEST_ENTRY_ERROR_SYNC);
    EXPECT_EQ(digest_file_delete(path_.c_str(), "alice"), 0);
    EXPECT_EQ(folder_.names(), (texts{"digest.lock"}));
}

TEST_F(DigestFile, FolderMustExist) {
    const std::string path = folder_.path("apache2/digest");

    EXPECT_EQ(digest_file_set(path.c_str(), "alice", "secret"), DIGEST_ENTRY_ERROR_FOLDER);
    EXPECT_EQ(folder_.names(), texts{});
}

TEST_F(DigestFile, LinkIsNotFollowed) {
    folder_.write("target", BOB);
    ASSERT_EQ(symlink("target", path_.c_str()), 0);

    EXPECT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), DIGEST_ENTRY_ERROR_NOT_REGULAR);
    EXPECT_EQ(folder_.read("target"), BOB);
    EXPECT_TRUE(S_ISLNK(folder_.status("digest").st_mode));
}

TEST_F(DigestFile, StuckWriterIsNotWaitedForForever) {
    folder_.write("digest", BOB);
    const int holder = open((path_ + ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    ASSERT_EQ(flock(holder, LOCK_EX), 0);

    const gint64 start = g_get_monotonic_time();
    EXPECT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), DIGEST_ENTRY_ERROR_BUSY);
    const gint64 taken_ms = (g_get_monotonic_time() - start) / 1000;
    EXPECT_GE(taken_ms, 3000);
    EXPECT_LT(taken_ms, 6000);
    EXPECT_EQ(folder_.read("digest"), BOB);

    (void)close(holder);
    EXPECT_EQ(digest_file_set(path_.c_str(), "alice", "secret"), 0);
}

// Adds users of its own, changes and removes some, and ends with the number of what failed.
[[noreturn]] static void write_busily(const char *path, int writer) {
    int failed = 0;

    for (int i = 0; i < 40; i++) {
        const std::string user = "u" + std::to_string(writer) + "-" + std::to_string(i);
        failed += digest_file_set(path, user.c_str(), "first") != 0 ? 1 : 0;
        failed += digest_file_set(path, user.c_str(), "second") != 0 ? 1 : 0;
        if (i % 2 != 0)
            failed += digest_file_delete(path, user.c_str()) != 0 ? 1 : 0;
    }
    _exit(failed);
}

TEST_F(DigestFile, WritersAtTheSameTimeLoseNothing) {
    pid_t writers[2] = {};
    folder_.write("digest", "");

    for (int i = 0; i < 2; i++) {
        writers[i] = fork();
        if (writers[i] == 0)
            write_busily(path_.c_str(), i);
    }
    for (const pid_t writer : writers) {
        int status = -1;
        ASSERT_EQ(waitpid(writer, &status, 0), writer);
        EXPECT_EQ(status, 0);
    }

    const std::string text = folder_.read("digest");
    int lines = 0;
    for (const char byte : text)
        lines += byte == '\n' ? 1 : 0;
    EXPECT_EQ(lines, 40);
    for (int writer = 0; writer < 2; writer++) {
        for (int i = 0; i < 40; i += 2) {
            const std::string user = "u" + std::to_string(writer) + "-" + std::to_string(i);
            g_autofree char *hash = g_compute_checksum_for_string(
                G_CHECKSUM_MD5, (user + ":PRIVANE:second").c_str(), -1);
            EXPECT_NE(text.find(user + ":PRIVANE:" + hash + "\n"), text.npos) << user;
        }
    }
    EXPECT_EQ(folder_.names(), (texts{"digest", "digest.lock"}));
}

// The tool asks for a password twice, on its standard input where there is no terminal.
static bool run_htdigest(const texts &arguments, const std::string &password) {
    int ends[2] = {-1, -1};
    const std::string input = password + "\n" + password + "\n";
    int status = -1;

    if (pipe2(ends, O_CLOEXEC) != 0)
        return false;
    const pid_t child = fork();
    if (child == 0) {
        std::vector<const char *> argv = {"htdigest"};
        for (const std::string &argument : arguments)
            argv.push_back(argument.c_str());
        argv.push_back(nullptr);
        const int nowhere = open("/dev/null", O_WRONLY | O_CLOEXEC);
        if (setsid() > 0 && dup2(ends[0], STDIN_FILENO) >= 0 && dup2(nowhere, STDOUT_FILENO) >= 0 &&
            dup2(nowhere, STDERR_FILENO) >= 0)
            execv("/usr/bin/htdigest", const_cast<char **>(argv.data()));
        _exit(127);
    }
    const bool asked = write(ends[1], input.data(), input.size()) > 0;
    (void)close(ends[0]);
    (void)close(ends[1]);
    return waitpid(child, &status, 0) == child && status == 0 && asked;
}

TEST_F(DigestFile, AgreesWithHtdigest) {
    const struct {
        const char *user;
        const char *password;
    } cases[] = {
        {"alice",           "secret"                                                                },
        {"Bob Miller",      "with blanks and 'quotes\" \\ $x"                                       },
        {"ål\xe2\x82\xac", "p\xc3\xa4ssw\xc3\xb6rd"                                                },
        {"latin\xe5",       "\xe4\xf6\xfc"                                                          },
        {"x",               ":::"                                                                   },
        {"long",            "0123456789012345678901234567890123456789012345678901234567890123456789"},
    };
    folder_.write("digest", "");
    ASSERT_TRUE(run_htdigest({"-c", folder_.path("theirs"), "PRIVANE", "first"}, "first"));
    ASSERT_EQ(digest_file_set(path_.c_str(), "first", "first"), 0);

    for (const auto &row : cases) {
        ASSERT_TRUE(run_htdigest({folder_.path("theirs"), "PRIVANE", row.user}, row.password));
        EXPECT_EQ(digest_file_set(path_.c_str(), row.user, row.password), 0);
        EXPECT_EQ(folder_.read("digest"), folder_.read("theirs")) << row.user;
    }

    // Each changes what the other one wrote.
    ASSERT_TRUE(run_htdigest({path_, "PRIVANE", "alice"}, "other"));
    EXPECT_EQ(digest_file_set(folder_.path("theirs").c_str(), "alice", "other"), 0);
    EXPECT_EQ(folder_.read("digest"), folder_.read("theirs"));
}

// The exported functions, in a /etc that no other process sees.
static std::string in_private_etc(int (*work)()) {
    return text_from_child([&] {
        g_autofree char *text = nullptr;
        if (!enter_private_etc() || mkdir("/etc/apache2", 0755) != 0) {
            (void)std::fputs("no /etc of its own", stdout);
            return;
        }
        const int number = work();
        if (!g_file_get_contents("/etc/apache2/digest_auth_passwd", &text, nullptr, nullptr))
            (void)std::printf("%d, no file", number);
        else
            (void)std::printf("%d, %s", number, text);
    });
}

TEST(DigestEntryFunctions, WorkOnTheWebServersFile) {
    EXPECT_EQ(in_private_etc([] { return digest_entry_set("alice", "secret", 0); }), "0, " + ALICE);
    EXPECT_EQ(in_private_etc([] { return digest_entry_set_list(BOB.c_str(), 1); }), "0, " + BOB);
    EXPECT_EQ(in_private_etc([] {
                  return digest_entry_set_list((ALICE + BOB).c_str(), 1) +
                         digest_entry_delete("bob", 0);
              }),
              "0, " + ALICE);
    EXPECT_EQ(in_private_etc([] {
                  return digest_entry_set_list((ALICE + BOB).c_str(), 1) +
                         digest_entry_delete_list("alice", 1);
              }),
              "0, " + BOB);
}

TEST(DigestEntryFunctions, RefuseNullAndOtherFlags) {
    EXPECT_EQ(in_private_etc([] {
                  const bool all_refused =
                      digest_entry_set(nullptr, "x", 0) == DIGEST_ENTRY_ERROR_INVALID &&
                      digest_entry_set("x", nullptr, 0) == DIGEST_ENTRY_ERROR_INVALID &&
                      digest_entry_delete(nullptr, 0) == DIGEST_ENTRY_ERROR_INVALID &&
                      digest_entry_set_list(nullptr, 1) == DIGEST_ENTRY_ERROR_INVALID &&
                      digest_entry_delete_list(nullptr, 1) == DIGEST_ENTRY_ERROR_INVALID;
                  return all_refused ? 77 : 0;
              }),
              "77, no file");
    for (const int flags : {-1, 0, 1, 2, 3, 1 << 30}) {
        const bool single = flags == 0;
        const bool list = flags == 1;
        const std::string outcome = text_from_child([&] {
            if (!enter_private_etc() || mkdir("/etc/apache2", 0755) != 0)
                return;
            (void)std::printf(
                "%d %d %d %d", digest_entry_set("x", "x", flags), digest_entry_delete("x", flags),
                digest_entry_set_list(ALICE.c_str(), flags), digest_entry_delete_list("x", flags));
        });
        EXPECT_EQ(outcome, single ? "0 0 1 1" : list ? "1 1 0 0" : "1 1 1 1") << flags;
    }
}
