// tests/unit/platform/bootparam_fault_test.cpp: a boot block whose writing fails or stops half-way.
#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <string>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <malloc.h>
#include <sys/file.h>
#include <sys/mount.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>
#include <zlib.h>

#include "tests/unit/platform/boot_block.h"

// What becomes of the writing of a copy, which no other write is as long as.
struct write_fault {
    std::size_t taken;  // so many bytes get through
    int error;          // then this, or the end of the process
    bool at_sync;       // that comes with the fsync behind it
};
static const write_fault *planned;
static bool unlock_fails;
// What another process does before libubootenv has the lock, for which it waits.
static void (*before_lock)();
// How often a copy was checked, and whether somebody held the lock each time.
static int checks;
static bool was_unlocked;

[[noreturn]] static void end_process() {
    (void)kill(getpid(), SIGKILL);
    std::abort();
}

// Stand in front of the C library's, for libubootenv.
ssize_t write(int fd, const void *bytes, size_t count) {
    if (planned == nullptr || planned->at_sync || count < 0x1000)
        return syscall(SYS_write, fd, bytes, count);
    const std::size_t taken = std::min(planned->taken, count);
    if (taken > 0 && syscall(SYS_write, fd, bytes, taken) != static_cast<ssize_t>(taken))
        return -1;
    if (planned->error == 0)
        end_process();
    errno = planned->error;
    return -1;
}

int fsync(int fd) {
    if (planned == nullptr || !planned->at_sync)
        return static_cast<int>(syscall(SYS_fsync, fd));
    if (planned->error == 0)
        end_process();
    errno = planned->error;
    return -1;
}

int flock(int fd, int operation) {
    if (operation == LOCK_EX && before_lock != nullptr)
        before_lock();
    const int result = static_cast<int>(syscall(SYS_flock, fd, operation));
    if (!unlock_fails || operation != LOCK_UN)
        return result;
    errno = EIO;
    return -1;
}

static bool is_locked() {
    const int fd = open("/run/lock/fw_printenv.lock", O_RDWR | O_CLOEXEC);
    const bool locked = syscall(SYS_flock, fd, LOCK_EX | LOCK_NB) != 0 && errno == EWOULDBLOCK;
    (void)close(fd);
    return locked;
}

uLong crc32(uLong crc, const Bytef *bytes, uInt length) {
    checks++;
    was_unlocked = was_unlocked || !is_locked();
    return crc32_z(crc, bytes, length);
}

class BootParamFault : public BootParam {
  protected:
    void SetUp() override {
        BootParam::SetUp();
        if (HasFatalFailure())
            return;
        ASSERT_EQ(BootParam::write("a", OLD), "ok");
        ASSERT_EQ(BootParam::write("b", "kept"), "ok");
        before_[0] = read_file(copy(0));
        before_[1] = read_file(copy(1));
    }

    void restore() {
        write_file(copy(0), before_[0]);
        write_file(copy(1), before_[1]);
    }

    // Long, so that most of what is cut off a copy is missed.
    static const std::string OLD;
    static const std::string NEW;
    std::string before_[2];

    // Writes in a process that ends over it.
    static void write_and_die(const write_fault &fault) {
        const pid_t child = fork();
        if (child == 0) {
            planned = &fault;
            (void)BootParam::write("a", NEW);
            _exit(0);  // The fault did not come.
        }
        int status = 0;
        ASSERT_EQ(waitpid(child, &status, 0), child);
        ASSERT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) << status;
    }
};

const std::string BootParamFault::OLD(12000, 'o');
const std::string BootParamFault::NEW(12000, 'n');

TEST_F(BootParamFault, CutAnywhereInTheWriteLeavesTheOldOrTheNewValue) {
    std::vector<std::size_t> cuts;
    for (std::size_t cut = 0; cut < 32; cut++)
        cuts.push_back(cut);
    for (std::size_t cut = 512; cut < COPY_SIZE; cut += 512)
        cuts.push_back(cut);

    for (const std::size_t cut : cuts) {
        restore();
        write_and_die({cut, 0, false});
        const std::string value = read("a");
        EXPECT_EQ(value, "=" + (cut < NEW.size() ? OLD : NEW)) << cut;
        EXPECT_EQ(read("b"), "=kept") << cut;
        EXPECT_EQ(BootParam::write("c", "next"), "ok") << cut;
        EXPECT_EQ(read("a"), value) << cut;
        EXPECT_EQ(read("b"), "=kept") << cut;
        EXPECT_EQ(read("c"), "=next") << cut;
    }
}

TEST_F(BootParamFault, WholeWriteIsTheNewValue) {
    write_and_die({COPY_SIZE, 0, false});
    EXPECT_EQ(read("a"), "=" + NEW);
    EXPECT_EQ(read("b"), "=kept");
}

TEST_F(BootParamFault, CutAtTheSyncIsTheNewValue) {
    write_and_die({0, 0, true});
    EXPECT_EQ(read("a"), "=" + NEW);
    EXPECT_EQ(read("b"), "=kept");
}

TEST_F(BootParamFault, FailingWriteSaysWhyAndKeepsTheOldValue) {
    for (const int error : {EIO, ENOSPC, EBADF, EPERM}) {
        for (const std::size_t taken : {std::size_t{0}, std::size_t{100}, COPY_SIZE / 2}) {
            const write_fault fault = {taken, error, false};
            planned = &fault;
            const std::string outcome = BootParam::write("a", NEW);
            planned = nullptr;
            EXPECT_EQ(outcome, failed(error));
            EXPECT_EQ(read("a"), "=" + OLD);
            EXPECT_EQ(read("b"), "=kept");
        }
    }
    EXPECT_EQ(BootParam::write("a", NEW), "ok");
    EXPECT_EQ(read("a"), "=" + NEW);
}

// Nobody may take for stored what the disk has not taken.
TEST_F(BootParamFault, FailingSyncIsAFailure) {
    for (const int error : {EIO, ENOSPC}) {
        const write_fault fault = {0, error, true};
        planned = &fault;
        const std::string outcome = BootParam::write("a", NEW);
        planned = nullptr;
        EXPECT_EQ(outcome, failed(error));
        EXPECT_EQ(read("b"), "=kept");
    }
    EXPECT_EQ(BootParam::write("a", OLD), "ok");
    EXPECT_EQ(read("a"), "=" + OLD);
}

// Some files that are written through answer a sync with EINVAL.
TEST_F(BootParamFault, FileWithoutSyncIsWritten) {
    const write_fault fault = {0, EINVAL, true};
    planned = &fault;
    const std::string outcome = BootParam::write("a", NEW);
    planned = nullptr;
    EXPECT_EQ(outcome, "ok");
    EXPECT_EQ(read("a"), "=" + NEW);
}

// errno tells of the failure, and not of what came after it.
TEST_F(BootParamFault, FailingUnlockChangesNothing) {
    unlock_fails = true;
    const std::string outcome = read("nothing");
    unlock_fails = false;
    EXPECT_EQ(outcome, ABSENT);
}

// Where there seems to be no end it is the CRC that counts.
TEST_F(BootParamFault, CopiesAreOnlyReadUnderTheLock) {
    write_file(copy(0), image(std::string(COPY_SIZE - 5, 'x'), "\x01"));
    ASSERT_FALSE(is_locked());
    checks = 0;
    was_unlocked = false;
    EXPECT_EQ(read("a"), failed(EBADMSG));
    EXPECT_EQ(BootParam::write("a", NEW), failed(EBADMSG));
    EXPECT_EQ(checks, 2);
    EXPECT_FALSE(was_unlocked);
}

// Of the older copy, whose parameters libubootenv does not look at.
TEST_F(BootParamFault, CopiesAreCheckedAgainOnceLibubootenvHasTheLock) {
    before_lock = [] {
        const int older = read_file(copy(0))[4] < read_file(copy(1))[4] ? 0 : 1;
        write_file(copy(older),
                   image(std::string(COPY_SIZE - 5, 'x'), read_file(copy(older)).substr(4, 1)));
    };
    const std::string outcome = read("a");
    restore();
    const std::string of_write = BootParam::write("a", NEW);
    before_lock = nullptr;
    EXPECT_EQ(outcome, failed(EBADMSG));
    EXPECT_EQ(of_write, failed(EBADMSG));
    restore();
    EXPECT_EQ(read("a"), "=" + OLD);
}

// So that what another writes before is no reason to refuse, as long as it is whole.
TEST_F(BootParamFault, WhatAnotherWritesBeforeLibubootenvHasTheLockIsRead) {
    before_lock = [] {
        const std::string parameters("a=another's\0\0", 13);
        write_file(copy(0), image(parameters + std::string(COPY_SIZE - 5 - 13, '\0'), "\x7f"));
    };
    const std::string value = read("a");
    before_lock = nullptr;
    EXPECT_EQ(value, "=another's");
}

TEST_F(BootParamFault, ReadOnlyBlockIsReadAndSaysWhyItIsNotWritten) {
    EXPECT_EQ(from_child([] {
                  if (mount(nullptr, "/etc", nullptr, MS_REMOUNT | MS_RDONLY | MS_NOSUID | MS_NODEV,
                            nullptr) != 0)
                      return std::string("no read-only /etc");
                  std::string outcome = BootParam::write("a", NEW);
                  outcome += read("a") == "=" + OLD ? "; old" : "; another value";
                  return mount(nullptr, "/etc", nullptr, MS_REMOUNT | MS_NOSUID | MS_NODEV,
                               nullptr) == 0
                             ? outcome
                             : "not writable again";
              }),
              failed(EROFS) + "; old");
}

// libubootenv writes a buffer that it does not clear.
TEST_F(BootParamFault, FreedMemoryDoesNotReachTheBlock) {
    const std::string secret = "secret-of-a-caller";
    // A small piece behind each block keeps the heap from shrinking when the blocks are freed.
    std::vector<std::pair<std::string *, std::string *>> blocks;
    for (int i = 0; i < 8; i++) {
        auto *block = new std::string;
        block->reserve(3 * COPY_SIZE);
        while (block->size() + secret.size() <= block->capacity())
            *block += secret;
        blocks.emplace_back(block, new std::string(64, 'x'));
    }
    for (const auto &[block, behind] : blocks)
        delete block;

    EXPECT_EQ(BootParam::write("a", "1"), "ok");
    EXPECT_EQ(BootParam::write("a", "2"), "ok");
    for (int number = 0; number < 2; number++) {
        const std::string bytes = read_file(copy(number));
        ASSERT_EQ(bytes.size(), COPY_SIZE);
        EXPECT_EQ(bytes.find(secret.substr(0, 8)), std::string::npos);
    }
    for (const auto &[block, behind] : blocks)
        delete behind;
}

// What is in use, where the C library's own allocator tells.
static std::size_t bytes_in_use() {
    const struct mallinfo2 info = mallinfo2();
    return info.uordblks + info.hblkhd;
}

TEST_F(BootParamFault, CallsKeepNoMemory) {
    const auto round = [] {
        (void)set_chip();
        (void)read("a");
        (void)read("nothing");
        (void)BootParam::write("a", "1");
        (void)BootParam::write("a", std::string(2 * COPY_SIZE, 'x'));
        write_file(copy(0), "short");
        (void)read("a");
        make_blank();
        (void)read("a");
    };
    round();
    const std::size_t before = bytes_in_use();
    for (int i = 0; i < 50; i++)
        round();
    EXPECT_LT(bytes_in_use(), before + 1000);
}
