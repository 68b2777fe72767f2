// tests/unit/platform/atomic_file_test.cpp: the lock, the reading and the replacement of a small
// file.
#include "platform/atomic_file.h"

#include <cstdio>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <glib.h>
#include <gtest/gtest.h>

#include "tests/unit/platform/child.h"
#include "tests/unit/platform/file_calls.h"
#include "tests/unit/platform/scratch_folder.h"

using texts = std::vector<std::string>;

static constexpr const char *NEW_TEXT = "new text\n";

static file_access own_access(mode_t mode) {
    return {geteuid(), getegid(), mode};
}

class AtomicFile : public testing::Test {
  protected:
    std::string path() const { return folder_.path("file"); }

    // Everything a writer does.
    file_result rewrite(const std::string &text = NEW_TEXT) {
        const std::string its_path = path();
        atomic_file file(its_path.c_str());
        wiped_text old_text;

        file_result result = file.lock(0);
        if (result == file_result::DONE)
            result = file.read(&old_text);
        if (result == file_result::DONE)
            result = file.replace(text, own_access(0640));
        return result;
    }

    file_result read(std::string *out_text) {
        const std::string its_path = path();
        atomic_file file(its_path.c_str());
        wiped_text text;

        EXPECT_EQ(file.lock(0), file_result::DONE);
        const file_result result = file.read(&text);
        *out_text = text.view();
        return result;
    }

    scratch_folder folder_;
};

TEST_F(AtomicFile, ReplacesWhatIsThere) {
    folder_.write("file", "old text, which is longer\n");

    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(folder_.read("file"), NEW_TEXT);
    EXPECT_EQ(folder_.names(), (texts{"file", "file.lock"}));
}

TEST_F(AtomicFile, MakesWhatIsMissingWithTheAccessGiven) {
    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(folder_.read("file"), NEW_TEXT);
    EXPECT_EQ(folder_.status("file").st_mode, S_IFREG | 0640U);
    EXPECT_EQ(folder_.names(), (texts{"file", "file.lock"}));
}

TEST_F(AtomicFile, MissingFileReadsAsNothing) {
    std::string text;
    const std::string its_path = path();
    atomic_file file(its_path.c_str());
    wiped_text read;

    EXPECT_EQ(file.lock(0), file_result::DONE);
    EXPECT_EQ(file.read(&read), file_result::DONE);
    EXPECT_TRUE(read.view().empty());
    EXPECT_FALSE(file.exists());
}

TEST_F(AtomicFile, ReadsEveryByte) {
    std::string all_bytes;
    for (int i = 0; i < 100 * 1000; i++)
        all_bytes += static_cast<char>(i * 7 + i / 256);
    folder_.write("file", all_bytes);

    std::string text;
    EXPECT_EQ(read(&text), file_result::DONE);
    EXPECT_EQ(text, all_bytes);
}

TEST_F(AtomicFile, ModeIsKept) {
    for (const mode_t mode : {0600U, 0640U, 0644U, 0400U, 0777U, 04711U, 02640U, 01640U}) {
        folder_.write("file", "old\n");
        ASSERT_EQ(chmod(path().c_str(), mode), 0);

        EXPECT_EQ(rewrite(), file_result::DONE);
        EXPECT_EQ(folder_.status("file").st_mode, S_IFREG | mode);
        ASSERT_EQ(unlink(path().c_str()), 0);
    }
}

// Whoever can open the lock can hold it.
TEST_F(AtomicFile, LockOfOthersIsMadePrivateOrRefused) {
    folder_.write("file.lock", "");
    ASSERT_EQ(chmod(folder_.path("file.lock").c_str(), 0666), 0);
    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(folder_.status("file.lock").st_mode, S_IFREG | 0600U);

    if (geteuid() == 0) {
        ASSERT_EQ(chown(folder_.path("file.lock").c_str(), 12345, 0), 0);
        EXPECT_EQ(rewrite(), file_result::NO_LOCK);
        EXPECT_EQ(folder_.status("file.lock").st_uid, 12345U);
    }
}

// An ordinary user can keep none but its own.
TEST_F(AtomicFile, OwnerIsKept) {
    const bool privileged = geteuid() == 0;
    const uid_t owner = privileged ? 12345 : geteuid();
    const gid_t group = privileged ? 23456 : getegid();
    folder_.write("file", "old\n");
    ASSERT_EQ(chown(path().c_str(), owner, group), 0);
    ASSERT_EQ(chmod(path().c_str(), 0640), 0);

    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(folder_.status("file").st_uid, owner);
    EXPECT_EQ(folder_.status("file").st_gid, group);
    EXPECT_EQ(folder_.status("file").st_mode, S_IFREG | 0640U);
}

TEST_F(AtomicFile, StepsComeInOrder) {
    folder_.write("file", "old\n");
    ASSERT_EQ(chmod(path().c_str(), 0604), 0);
    const std::string name = folder_.path().substr(folder_.path().rfind('/') + 1);
    const std::string owner = std::to_string(geteuid()) + " " + std::to_string(getegid());

    file_calls calls;
    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(calls.lines(), (texts{
                                 "open " + name + " DIRECTORY CLOEXEC",
                                 "openat file.lock CREAT NOFOLLOW NONBLOCK CLOEXEC 0600",
                                 "fstat file.lock",
                                 "flock file.lock",
                                 "openat file NOFOLLOW NONBLOCK CLOEXEC",
                                 "fstat file",
                                 "read file",
                                 "read file",
                                 "close file",
                                 "unlinkat file.tmp",
                                 "openat file.tmp CREAT EXCL NOFOLLOW CLOEXEC 0600",
                                 "write file.tmp",
                                 "fchown file.tmp " + owner,
                                 "fchmod file.tmp 0604",
                                 "fsync file.tmp",
                                 "close file.tmp",
                                 "renameat file.tmp file",
                                 "fsync " + name,
                                 "close file.lock",
                                 "close " + name,
                             }));
}

// From its first moment to the end of the writing.
TEST_F(AtomicFile, TemporaryFileIsPrivate) {
    folder_.write("file", "old\n");
    folder_.write("file.tmp", "of an earlier try\n");
    ASSERT_EQ(chmod(folder_.path("file.tmp").c_str(), 0666), 0);

    int looks = 0;
    file_calls calls;
    calls.before = [&](const std::string &line) {
        if (line != "write file.tmp" && line.rfind("fchown file.tmp", 0) != 0)
            return;
        looks++;
        EXPECT_EQ(folder_.status("file.tmp").st_mode, S_IFREG | 0600U);
    };
    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(looks, 2);
}

TEST_F(AtomicFile, PlantedLinksAreNotFollowed) {
    const scratch_folder elsewhere;
    elsewhere.write("victim", "untouched\n");
    folder_.write("file", "old\n");
    ASSERT_EQ(symlink(elsewhere.path("victim").c_str(), folder_.path("file.tmp").c_str()), 0);

    EXPECT_EQ(rewrite(), file_result::DONE);
    EXPECT_EQ(elsewhere.read("victim"), "untouched\n");
    EXPECT_EQ(folder_.names(), (texts{"file", "file.lock"}));

    ASSERT_EQ(unlink(folder_.path("file.lock").c_str()), 0);
    ASSERT_EQ(symlink(elsewhere.path("made").c_str(), folder_.path("file.lock").c_str()), 0);
    EXPECT_EQ(rewrite("third\n"), file_result::NO_LOCK);
    EXPECT_FALSE(elsewhere.exists("made"));
    EXPECT_EQ(folder_.read("file"), NEW_TEXT);
}

TEST_F(AtomicFile, OnlyRegularFilesAreTaken) {
    const scratch_folder elsewhere;
    elsewhere.write("target", "target\n");
    const std::string name = path();
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    (void)g_strlcpy(address.sun_path, name.c_str(), sizeof address.sun_path);
    const int server = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);

    ASSERT_EQ(symlink(elsewhere.path("target").c_str(), name.c_str()), 0);
    EXPECT_EQ(rewrite(), file_result::NOT_REGULAR) << "a link";
    EXPECT_EQ(elsewhere.read("target"), "target\n");
    ASSERT_EQ(unlink(name.c_str()), 0);

    ASSERT_EQ(symlink("/nonexistent/target", name.c_str()), 0);
    EXPECT_EQ(rewrite(), file_result::NOT_REGULAR) << "a link to nowhere";
    ASSERT_EQ(unlink(name.c_str()), 0);

    ASSERT_EQ(mkfifo(name.c_str(), 0600), 0);
    EXPECT_EQ(rewrite(), file_result::NOT_REGULAR) << "a FIFO";
    ASSERT_EQ(unlink(name.c_str()), 0);

    ASSERT_EQ(bind(server, reinterpret_cast<struct sockaddr *>(&address), sizeof address), 0);
    EXPECT_EQ(rewrite(), file_result::NOT_REGULAR) << "a socket";
    ASSERT_EQ(unlink(name.c_str()), 0);
    (void)close(server);

    ASSERT_EQ(mkdir(name.c_str(), 0700), 0);
    EXPECT_EQ(rewrite(), file_result::NOT_REGULAR) << "a folder";
    EXPECT_EQ(folder_.names(), (texts{"file", "file.lock"}));
}

TEST_F(AtomicFile, SizeIsLimited) {
    const std::string largest(atomic_file::MAX_SIZE, 'x');
    std::string text;

    folder_.write("file", largest);
    EXPECT_EQ(read(&text), file_result::DONE);
    EXPECT_TRUE(text == largest);
    EXPECT_EQ(rewrite(largest), file_result::DONE);
    EXPECT_EQ(rewrite(largest + "x"), file_result::TOO_BIG);
    EXPECT_TRUE(folder_.read("file") == largest);

    folder_.write("file", largest + "x");
    EXPECT_EQ(rewrite(), file_result::TOO_BIG);
    EXPECT_EQ(folder_.names(), (texts{"file", "file.lock"}));

    // Of a file that never ends only so much is read.
    ASSERT_EQ(truncate(path().c_str(), off_t{1} << 40), 0);
    EXPECT_EQ(read(&text), file_result::TOO_BIG);
    EXPECT_LT(text.size(), 2 * atomic_file::MAX_SIZE);
}

TEST_F(AtomicFile, FolderMustExist) {
    const std::string inside = folder_.path("missing/file");
    EXPECT_EQ(atomic_file(inside.c_str()).lock(0), file_result::NO_FOLDER);

    folder_.write("file", "old\n");
    const std::string below = folder_.path("file/below");
    EXPECT_EQ(atomic_file(below.c_str()).lock(0), file_result::NO_FOLDER);
}

TEST_F(AtomicFile, LockFileIsPrivate) {
    const mode_t old_mask = umask(0);
    EXPECT_EQ(rewrite(), file_result::DONE);
    (void)umask(old_mask);

    EXPECT_EQ(folder_.status("file.lock").st_mode, S_IFREG | 0600U);
}

TEST_F(AtomicFile, LockFileMustBeARegularFile) {
    ASSERT_EQ(mkfifo(folder_.path("file.lock").c_str(), 0600), 0);
    EXPECT_EQ(rewrite(), file_result::NO_LOCK);
    EXPECT_FALSE(folder_.exists("file"));
}

TEST_F(AtomicFile, LockIsWaitedForUntilTheDeadline) {
    const std::string its_path = path();
    atomic_file holder(its_path.c_str());
    ASSERT_EQ(holder.lock(0), file_result::DONE);

    atomic_file other(its_path.c_str());
    const gint64 start = g_get_monotonic_time();
    EXPECT_EQ(other.lock(200), file_result::BUSY);
    const gint64 taken_ms = (g_get_monotonic_time() - start) / 1000;
    EXPECT_GE(taken_ms, 200);
    EXPECT_LT(taken_ms, 2000);
}

TEST_F(AtomicFile, LockIsTakenWhenItIsGivenBack) {
    const std::string its_path = path();
    const std::string outcome = text_from_child([&] {
        g_autofree char *lock = g_strconcat(its_path.c_str(), ".lock", nullptr);
        const int fd = open(lock, O_RDWR | O_CREAT | O_CLOEXEC, 0600);
        if (fd < 0 || flock(fd, LOCK_EX) != 0)
            return;
        const pid_t child = fork();
        if (child == 0) {
            g_usleep(100 * 1000);
            _exit(0);  // The lock ends with the last descriptor.
        }
        (void)close(fd);
        atomic_file file(its_path.c_str());
        const gint64 start = g_get_monotonic_time();
        const bool done = file.lock(20 * 1000) == file_result::DONE;
        const bool waited = g_get_monotonic_time() - start > 50 * 1000;
        (void)std::fputs(done && waited ? "taken" : "failed", stdout);
    });
    EXPECT_EQ(outcome, "taken");
}

TEST_F(AtomicFile, LockEndsWithTheObject) {
    for (int i = 0; i < 3; i++)
        EXPECT_EQ(rewrite(), file_result::DONE);
}
