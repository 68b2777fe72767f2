// tests/long/faults/call_trap_test.cpp: the calls that the trap knows, and those that it does not.
#include "tests/long/faults/call_trap.h"

#include <cerrno>
#include <cstdlib>
#include <functional>

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/ioctl.h>
#include <sys/sendfile.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

// What a trapped child made of a call.
struct told {
    int error;            // of the call, 0 where it succeeded
    std::string unknown;  // as the trap tells it
    std::string last;     // call that was recorded
};

class CallTrap : public testing::Test {
  protected:
    void SetUp() override {
        ASSERT_NE(mkdtemp(folder_), nullptr);
        ASSERT_EQ(chdir(folder_), 0);
        for (const char *name : {"file", "other"}) {
            const int fd = open(name, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
            ASSERT_EQ(write(fd, "text", 4), 4);
            ASSERT_EQ(close(fd), 0);
        }
        ASSERT_EQ(mkdir("empty", 0700), 0);
    }

    void TearDown() override {
        for (const char *name : {"file", "other", "new"})
            (void)unlink(name);
        (void)rmdir("empty");
        (void)rmdir(folder_);
    }

    // In a child, since the trap is for good.
    static told trapped(const std::function<long()> &call) {
        int ends[2];
        told result = {-1, "no answer", ""};
        if (pipe2(ends, O_CLOEXEC) != 0)
            return result;
        const pid_t child = fork();
        if (child == 0)
            tell(ends[1], call);
        (void)close(ends[1]);
        char text[512] = {};
        const ssize_t length = read(ends[0], text, sizeof text - 1);
        (void)close(ends[0]);
        int status = 0;
        if (child < 0 || waitpid(child, &status, 0) != child || status != 0 || length <= 0)
            return result;
        const std::string answer = text;
        const std::size_t first = answer.find('\n');
        const std::size_t second = answer.find('\n', first + 1);
        return {std::atoi(text), answer.substr(first + 1, second - first - 1),
                answer.substr(second + 1)};
    }

    static struct stat status_of(const char *path) {
        struct stat status = {};
        EXPECT_EQ(stat(path, &status), 0) << path;
        return status;
    }

  private:
    [[noreturn]] static void tell(int fd, const std::function<long()> &call) {
        call_trace *trace = make_shared_trace();
        if (trace == nullptr || !install_call_trap())
            _exit(1);
        begin_trap(trace, {});
        const int error = call() < 0 ? errno : 0;
        end_trap();
        const std::string text = std::to_string(error) + "\n" + unknown_call() + "\n" +
                                 (trace->count > 0 ? line_of(trace->calls[trace->count - 1]) : "");
        _exit(write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()) ? 0 : 1);
    }

    char folder_[32] = "/tmp/call-trap-XXXXXX";
};

struct unknown_row {
    const char *name;
    long number;
    long (*make)();
};

static int open_file(const char *name) {
    return open(name, O_RDWR | O_CLOEXEC);
}

static const unknown_row unknown_rows[] = {
    {"linkat",          SYS_linkat,
     [] { return syscall(SYS_linkat, AT_FDCWD, "file", AT_FDCWD, "new", 0); }                                   },
    {"symlinkat",       SYS_symlinkat,       [] { return syscall(SYS_symlinkat, "file", AT_FDCWD, "new"); }     },
    {"mknodat",         SYS_mknodat,
     [] { return syscall(SYS_mknodat, AT_FDCWD, "new", S_IFREG | 0600, 0); }                                    },
    {"openat2",         SYS_openat2,
     [] {
         open_how how = {};
         how.flags = O_WRONLY | O_CREAT;
         how.mode = 0600;
         return syscall(SYS_openat2, AT_FDCWD, "new", &how, sizeof how);
     }                                                                                                          },
    {"utimensat",       SYS_utimensat,
     [] { return syscall(SYS_utimensat, AT_FDCWD, "file", nullptr, 0); }                                        },
    {"copy_file_range", SYS_copy_file_range,
     [] { return copy_file_range(open_file("file"), nullptr, open_file("other"), nullptr, 4, 0); }              },
    {"sendfile",        SYS_sendfile,
     [] { return sendfile(open_file("other"), open_file("file"), nullptr, 4); }                                 },
    {"fallocate",       SYS_fallocate,
     [] { return syscall(SYS_fallocate, open_file("file"), 0, 0L, 100L); }                                      },
    {"pwritev",         SYS_pwritev,
     [] {
         char byte = 'x';
         const iovec piece = {&byte, 1};
         return pwritev(open_file("file"), &piece, 1, 0);
     }                                                                                                          },
    {"pwritev2",        SYS_pwritev2,
     [] {
         char byte = 'x';
         const iovec piece = {&byte, 1};
         return syscall(SYS_pwritev2, open_file("file"), &piece, 1UL, 0L, 0L, RWF_SYNC);
     }                                                                                                          },
    {"preadv",          SYS_preadv,
     [] {
         char byte = 'x';
         const iovec piece = {&byte, 1};
         return preadv(open_file("file"), &piece, 1, 0);
     }                                                                                                          },
    {"sync_file_range", SYS_sync_file_range,
     [] { return syscall(SYS_sync_file_range, open_file("file"), 0L, 0L, 0); }                                  },
    {"syncfs",          SYS_syncfs,          [] { return syscall(SYS_syncfs, open_file("file")); }              },
    {"setxattr",        SYS_setxattr,        [] { return syscall(SYS_setxattr, "file", "user.a", "b", 1UL, 0); }},
    {"dup",             SYS_dup,             [] { return syscall(SYS_dup, open_file("file")); }                 },
    {"fcntl",           SYS_fcntl,
     [] { return static_cast<long>(fcntl(open_file("file"), F_DUPFD_CLOEXEC, 0)); }                             },
    {"io_uring_setup",  SYS_io_uring_setup,  [] { return syscall(SYS_io_uring_setup, 1U, nullptr); }            },
    {"of the future",   999,                 [] { return syscall(999); }                                        },
};

TEST_F(CallTrap, WhatItDoesNotKnowIsToldAndNotDone) {
    const struct stat before = status_of("file");
    for (const unknown_row &row : unknown_rows) {
        const told result = trapped(row.make);
        EXPECT_EQ(result.error, ENOSYS) << row.name;
        EXPECT_TRUE(
            result.unknown.starts_with("system call " + std::to_string(row.number) + " behind '"))
            << row.name << ": " << result.unknown;
        EXPECT_NE(access("new", F_OK), 0) << row.name;
        const struct stat now = status_of("file");
        EXPECT_TRUE(now.st_size == before.st_size && now.st_nlink == before.st_nlink &&
                    now.st_mtim.tv_nsec == before.st_mtim.tv_nsec)
            << row.name;
    }
}

TEST_F(CallTrap, UnknownCallIsToldWithTheOneBeforeIt) {
    const told result =
        trapped([] { return syscall(SYS_fallocate, open_file("file"), 0, 0L, 100L); });
    EXPECT_EQ(result.unknown,
              "system call " + std::to_string(SYS_fallocate) + " behind 'open file'");
}

// It could neither be told which file changes nor be made to fail.
TEST_F(CallTrap, WriteThroughADescriptorFromBeforeIsUnknown) {
    const int fd = open_file("file");
    for (const std::function<long()> &call : std::initializer_list<std::function<long()>>{
             [fd] { return write(fd, "x", 1); }, [fd] { return ftruncate(fd, 0); },
             [fd] { return fsync(fd); }, [fd] { return fchmod(fd, 0644); }}) {
        const told result = trapped(call);
        EXPECT_EQ(result.error, ENOSYS);
        EXPECT_NE(result.unknown, "");
    }
    EXPECT_EQ(close(fd), 0);
    EXPECT_EQ(status_of("file").st_size, 4);
}

TEST_F(CallTrap, KnownCallsAreMadeAndRecorded) {
    struct row {
        const char *line;
        long (*make)();
    };
    static constexpr row rows[] = {
        {"open file",     [] { return static_cast<long>(open_file("file")); }                  },
        {"write file",    [] { return write(open_file("file"), "y", 1); }                      },
        {"fsync file",    [] { return static_cast<long>(fsync(open_file("file"))); }           },
        {"truncate file", [] { return static_cast<long>(ftruncate(open_file("file"), 4)); }    },
        {"rename file",   [] { return static_cast<long>(rename("file", "new")); }              },
        {"unlink new",    [] { return static_cast<long>(unlink("new")); }                      },
        {"rmdir empty",   [] { return static_cast<long>(rmdir("empty")); }                     },
        {"mkdir empty",   [] { return static_cast<long>(mkdirat(AT_FDCWD, "empty", 0700)); }   },
        {"chown other",
         [] { return static_cast<long>(fchownat(AT_FDCWD, "other", geteuid(), getegid(), 0)); }},
    };
    for (const row &one : rows) {
        const told result = trapped(one.make);
        EXPECT_EQ(result.error, 0) << one.line;
        EXPECT_EQ(result.unknown, "") << one.line;
        EXPECT_EQ(result.last, one.line);
    }
    EXPECT_NE(access("file", F_OK), 0);
}

TEST_F(CallTrap, WhatTouchesNoFilePasses) {
    const told result = trapped([] { return static_cast<long>(getpid()); });
    EXPECT_EQ(result.error, 0);
    EXPECT_EQ(result.unknown, "");
    EXPECT_EQ(result.last, "");
}
