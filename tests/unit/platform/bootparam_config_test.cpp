// tests/unit/platform/bootparam_config_test.cpp: where the boot block is, and the lock on it.
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <glib.h>

#include "platform/bootparam/boot_copies.h"
#include "tests/unit/platform/boot_block.h"
#include "tests/unit/platform/outcome.h"

// Of a chip, a read and a write, which do not know each other's findings.
static std::string three_times(const std::string &outcome) {
    return outcome + "; " + outcome + "; " + outcome;
}

class BootParamConfig : public BootParam {
  protected:
    // libubootenv loses the first word of a line that it passes over: the child ends without the
    // leak check of an instrumented build.
    static std::string unchecked(const std::function<std::string()> &work) {
        return from_child([&]() -> std::string {
            say(work());
            (void)std::fflush(stdout);
            _exit(0);
        });
    }

    static std::string all_calls() {
        return unchecked([] {
            std::string outcomes = set_chip();
            outcomes += "; " + read("a");
            outcomes += "; " + write("a", "1");
            return outcomes;
        });
    }
};

TEST_F(BootParamConfig, DescriptionThatIsNoneIsRefused) {
    const std::string descriptions[] = {
        "",
        "\n\n",
        "# comment\n",
        "garbage\n",
        std::string("\0\xff\xfe", 3),
        "/etc/copy0\n",
        "/etc/copy0 0x0\n",
        "/etc/copy0 zero 0x4000\n",
        "/etc/copy0 0x0 0x0\n",
        "/etc/copy0 0x0 0x1\n",
        "/etc/copy0 0x0 0x5\n",
        "/etc/nothing 0x0 0x4000\n",
        "/etc/copy0 0x0 0x4000\n/etc/copy1 0x0 0x2000\n",
        "/etc/copy0 0x0 0x4000\n/etc/nothing 0x0 0x4000\n",
        std::string(5000, 'x'),
    };
    for (const std::string &description : descriptions) {
        write_file(CONFIG, description);
        EXPECT_EQ(all_calls(), three_times(failed(EINVAL))) << description.substr(0, 80);
    }
}

// Whatever libubootenv lets pass.
TEST_F(BootParamConfig, EveryCopyHasRoomForAParameter) {
    for (const char *sizes : {"0x5 0x4000", "0x4000 0x5", "0x4000 0x0", "0x0 0x0", "0x5 0x5"}) {
        const std::string both = sizes;
        const std::size_t blank = both.find(' ');
        write_file(CONFIG, copy(0) + " 0x0 " + both.substr(0, blank) + "\n" + copy(1) + " 0x0" +
                               both.substr(blank) + "\n");
        boot_copies copies;
        EXPECT_EQ(copies.read_config(CONFIG), -EINVAL) << sizes;
    }
    for (const char *size : {"0x6", "0x4000"}) {
        write_file(CONFIG, copy(0) + " 0x0 0x4000\n" + copy(1) + " 0x0 " + size + "\n");
        boot_copies copies;
        EXPECT_EQ(copies.read_config(CONFIG), 0) << size;
        EXPECT_EQ(copies.capacity(), std::stoul(size, nullptr, 16) - 5) << "the smaller one's";
    }
}

TEST_F(BootParamConfig, DescriptionThatCannotBeReadIsAnError) {
    ASSERT_EQ(unlink(CONFIG), 0);
    EXPECT_EQ(all_calls(), three_times(failed(ENOENT)));

    ASSERT_EQ(symlink(CONFIG, CONFIG), 0);
    EXPECT_EQ(all_calls(), three_times(failed(ELOOP)));
    ASSERT_EQ(unlink(CONFIG), 0);

    ASSERT_EQ(mkdir(CONFIG, 0755), 0);
    EXPECT_EQ(all_calls(), three_times(failed(EINVAL)));
    ASSERT_EQ(rmdir(CONFIG), 0);
}

TEST_F(BootParamConfig, CommentsBlankLinesAndFurtherFieldsArePassedOver) {
    const std::string descriptions[] = {
        "# Device  Offset  Size\n" + config_of_two(),
        "#/etc/nothing 0x0 0x8\n" + config_of_two(),
        config_of_two() + "# the end\n",
        "/etc/copy0\t0\t4000\n/etc/copy1\t0\t4000\n",
        "/etc/copy0 0x0 0x4000 0x4000 1\n/etc/copy1 0x0 0x4000 0x4000 1\n",
        "not a device\n" + config_of_two(),
    };
    for (const std::string &description : descriptions) {
        make_blank();
        write_file(CONFIG, description);
        EXPECT_EQ(all_calls(), "ok; " + BLANK + "; ok") << description;
        EXPECT_EQ(unchecked([] { return read("a"); }), "=1") << description;
        EXPECT_EQ(unchecked([] { return write("a", std::string(COPY_SIZE - 8, 'x')); }), FULL)
            << description;
    }
}

TEST_F(BootParamConfig, OffsetsAreKept) {
    write_file(copy(0), std::string(3 * COPY_SIZE, '\x55'));
    write_file(CONFIG, "/etc/copy0 0x1000 0x4000\n/etc/copy0 0x6000 0x4000\n");

    EXPECT_EQ(write("a", "1"), "ok");
    EXPECT_EQ(write("a", "2"), "ok");
    EXPECT_EQ(read("a"), "=2");
    EXPECT_EQ(printed("a"), "2\n");
    const std::string bytes = read_file(copy(0));
    ASSERT_EQ(bytes.size(), 3 * COPY_SIZE);
    EXPECT_EQ(bytes.substr(0, 0x1000), std::string(0x1000, '\x55'));
    EXPECT_EQ(bytes.substr(0x5000, 0x1000), std::string(0x1000, '\x55'));
    EXPECT_EQ(bytes.substr(0xa000), std::string(0x2000, '\x55'));
}

TEST_F(BootParamConfig, ShortDeviceIsAnError) {
    write_file(copy(1), "short");

    EXPECT_EQ(all_calls(), "ok; " + failed(EIO) + "; " + failed(EIO));
    EXPECT_EQ(read_file(copy(0)), std::string(COPY_SIZE, '\xff'));
    EXPECT_EQ(read_file(copy(1)), "short");

    write_file(CONFIG, "/etc 0x0 0x4000\n");
    EXPECT_EQ(all_calls(), "ok; " + failed(EIO) + "; " + failed(EIO));
}

TEST_F(BootParamConfig, DeviceThatGoesMissingIsAnError) {
    EXPECT_EQ(write("a", "1"), "ok");
    ASSERT_EQ(unlink(copy(0).c_str()), 0);

    EXPECT_EQ(all_calls(), three_times(failed(EINVAL)));
}

// Whether a child that does the work ends within a moment; it is ended then.
class waiting_child {
  public:
    explicit waiting_child(const std::function<std::string()> &work) {
        pid_ = fork();
        if (pid_ == 0)
            _exit(work() == "ok" ? 0 : 1);
    }
    bool ends_within_ms(int limit) {
        for (int i = 0; i < limit && !ended_; i++) {
            ended_ = waitpid(pid_, &status_, WNOHANG) == pid_;
            g_usleep(1000);
        }
        return ended_;
    }
    int status() const { return status_; }
    ~waiting_child() {
        if (ended_)
            return;
        (void)kill(pid_, SIGKILL);  // It may end by itself at this moment.
        (void)waitpid(pid_, nullptr, 0);
    }

  private:
    pid_t pid_ = -1;
    int status_ = -1;
    bool ended_ = false;
};

TEST_F(BootParamConfig, CallsWaitForTheLockOfTheTools) {
    EXPECT_EQ(write("a", "1"), "ok");
    const std::string before = read_file(copy(0)) + read_file(copy(1));
    const int lock = open(LOCK, O_RDWR | O_CLOEXEC);
    ASSERT_GE(lock, 0);
    ASSERT_EQ(flock(lock, LOCK_EX), 0);

    waiting_child writer([] { return write("a", "2"); });
    waiting_child reader([] { return read("a").substr(0, 1) == "=" ? "ok" : "failed"; });
    EXPECT_FALSE(writer.ends_within_ms(300));
    EXPECT_FALSE(reader.ends_within_ms(10));
    EXPECT_EQ(read_file(copy(0)) + read_file(copy(1)), before);

    ASSERT_EQ(flock(lock, LOCK_UN), 0);
    EXPECT_TRUE(writer.ends_within_ms(10000));
    EXPECT_TRUE(reader.ends_within_ms(10000));
    EXPECT_EQ(writer.status(), 0);
    EXPECT_EQ(reader.status(), 0);
    (void)close(lock);
    EXPECT_EQ(read("a"), "=2");
}

TEST_F(BootParamConfig, LockThatIsNeverGivenBackIsNotWaitedForForever) {
    EXPECT_EQ(write("a", "1"), "ok");
    const int lock = open(LOCK, O_RDWR | O_CLOEXEC);
    ASSERT_EQ(flock(lock, LOCK_EX), 0);

    EXPECT_EQ(write("a", "2"), failed(EBUSY));
    (void)close(lock);
    EXPECT_EQ(read("a"), "=1");
}

// libubootenv itself would go on without it.
TEST_F(BootParamConfig, WithoutALockNothingIsReadOrWritten) {
    EXPECT_EQ(write("a", "1"), "ok");
    const std::string before = read_file(copy(0)) + read_file(copy(1));
    ASSERT_EQ(unlink(LOCK), 0);
    ASSERT_EQ(mkdir(LOCK, 0700), 0);

    EXPECT_EQ(write("a", "2"), failed(EISDIR));
    EXPECT_EQ(read("a"), failed(EISDIR));
    EXPECT_EQ(read_file(copy(0)) + read_file(copy(1)), before);

    ASSERT_EQ(rmdir(LOCK), 0);
    ASSERT_EQ(symlink("/etc/copy0", LOCK), 0);
    EXPECT_EQ(write("a", "2"), failed(ELOOP));
    ASSERT_EQ(unlink(LOCK), 0);
    EXPECT_EQ(read("a"), "=1");
}

TEST_F(BootParamConfig, WritersLoseNothing) {
    EXPECT_EQ(write("z", "0"), "ok");
    {
        std::vector<std::unique_ptr<waiting_child>> writers;
        for (const char *name : {"a", "b", "c", "d"})
            writers.push_back(std::make_unique<waiting_child>([name] {
                for (int i = 1; i < 25; i++)
                    if (const std::string outcome = write(name, std::to_string(i)); outcome != "ok")
                        return outcome;
                return write(name, "done");
            }));
        for (const auto &writer : writers) {
            EXPECT_TRUE(writer->ends_within_ms(20000));
            EXPECT_EQ(writer->status(), 0);
        }
    }
    EXPECT_EQ(read("a") + read("b") + read("c") + read("d") + read("z"), "=done=done=done=done=0");
}

// A caller who could open the lock could keep every other from the boot block.
TEST_F(BootParamConfig, PackagedLockIsTheOneThatIsTaken) {
    EXPECT_NE(read_file(TMPFILES_RULES).find(std::string("\nf ") + LOCK + " 0600 root root -\n"),
              std::string::npos);
    struct stat lock = {};
    ASSERT_NE(stat(LOCK, &lock), 0);

    EXPECT_EQ(write("a", "1"), "ok");
    ASSERT_EQ(stat(LOCK, &lock), 0);
    const ino_t inode = lock.st_ino;
    ASSERT_EQ(chmod(LOCK, 0600), 0);
    EXPECT_EQ(write("a", "2"), "ok");
    ASSERT_EQ(stat(LOCK, &lock), 0);
    EXPECT_EQ(lock.st_mode, S_IFREG | mode_t{0600});
    EXPECT_EQ(lock.st_ino, inode);
}
