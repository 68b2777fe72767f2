// tests/unit/platform/rtc_clock_test.cpp: what reaches the hardware clock, by a clock that records.
#include "platform/rtc_clock/rtc_clock.h"

#include <cerrno>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <limits>
#include <string>
#include <vector>

#include <fcntl.h>
#include <linux/rtc.h>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "tests/unit/platform/process_state.h"

// A clock in the place of /dev/rtc. A call fails where its error is set.
struct fake_clock {
    int open_error;
    int ioctl_error;
    int close_error;
    int fd;  // while it is open
    int flags;
    std::vector<struct rtc_time> times;
    std::vector<std::string> calls;
};
static fake_clock *installed;

static int open_clock(int flags) {
    installed->calls.emplace_back("open");
    installed->flags = flags;
    if (installed->open_error != 0) {
        errno = installed->open_error;
        return -1;
    }
    installed->fd = static_cast<int>(syscall(SYS_openat, AT_FDCWD, "/dev/null", flags, 0));
    return installed->fd;
}

// Stand in front of the C library's, for the library under test.
int open(const char *path, int flags, ...) {
    va_list rest;
    va_start(rest, flags);
    const mode_t mode = (flags & (O_CREAT | O_TMPFILE)) != 0 ? va_arg(rest, mode_t) : 0;
    va_end(rest);
    if (installed != nullptr && std::strcmp(path, "/dev/rtc") == 0)
        return open_clock(flags);
    return static_cast<int>(syscall(SYS_openat, AT_FDCWD, path, flags, mode));
}

int ioctl(int fd, unsigned long request, ...) noexcept {
    va_list rest;
    va_start(rest, request);
    void *argument = va_arg(rest, void *);
    va_end(rest);
    if (installed == nullptr || fd != installed->fd)
        return static_cast<int>(syscall(SYS_ioctl, fd, request, argument));
    installed->calls.push_back(request == RTC_SET_TIME ? "set" : "another ioctl");
    installed->times.push_back(*static_cast<struct rtc_time *>(argument));
    errno = installed->ioctl_error;
    return installed->ioctl_error == 0 ? 0 : -1;
}

int close(int fd) {
    const int result = static_cast<int>(syscall(SYS_close, fd));
    if (installed == nullptr || fd != installed->fd)
        return result;
    installed->calls.emplace_back("close");
    installed->fd = -1;
    errno = installed->close_error;
    return installed->close_error == 0 ? result : -1;
}

using words = std::vector<std::string>;

class RtcClock : public testing::Test {
  protected:
    void SetUp() override { installed = &clock_; }
    void TearDown() override { installed = nullptr; }

    // "RESULT", with the errno where it is -1.
    static std::string write_time(time_t seconds, suseconds_t microseconds = 0) {
        const struct timeval time = {seconds, microseconds};
        errno = 0;
        const int result = rtc_write_time(&time);
        const int number = errno;
        return std::to_string(result) + (result == -1 ? " " + std::to_string(number) : "");
    }

    static std::string failed(int number) { return "-1 " + std::to_string(number); }

    fake_clock clock_ = {0, 0, 0, -1, 0, {}, {}};
};

struct time_case {
    time_t seconds;
    int year, month, day, hour, minute, second;
};

// By date -u -d @SECONDS.
static constexpr time_case CASES[] = {
    {0,          70,  0,  1,  0,  0,  0 },
    {1,          70,  0,  1,  0,  0,  1 },
    {86399,      70,  0,  1,  23, 59, 59},
    {951782400,  100, 1,  29, 0,  0,  0 },
    {1700000000, 123, 10, 14, 22, 13, 20},
    {1709251199, 124, 1,  29, 23, 59, 59},
    {2147483647, 138, 0,  19, 3,  14, 7 },
    {4102444800, 200, 0,  1,  0,  0,  0 },
};

TEST_F(RtcClock, GetsTheTimeInUtc) {
    // Neither the zone nor its summer time counts.
    for (const char *zone : {"UTC0", "CET-1CEST,M3.5.0,M10.5.0/3", "<-12>12"}) {
        ASSERT_EQ(setenv("TZ", zone, 1), 0);
        tzset();
        for (const time_case &row : CASES) {
            clock_.times.clear();
            EXPECT_EQ(write_time(row.seconds), "0");
            ASSERT_EQ(clock_.times.size(), 1U);
            const struct rtc_time &set = clock_.times[0];
            EXPECT_EQ(set.tm_year, row.year) << row.seconds;
            EXPECT_EQ(set.tm_mon, row.month) << row.seconds;
            EXPECT_EQ(set.tm_mday, row.day) << row.seconds;
            EXPECT_EQ(set.tm_hour, row.hour) << row.seconds;
            EXPECT_EQ(set.tm_min, row.minute) << row.seconds;
            EXPECT_EQ(set.tm_sec, row.second) << row.seconds;
            EXPECT_EQ(set.tm_isdst, 0) << row.seconds;
        }
    }
    ASSERT_EQ(unsetenv("TZ"), 0);
    tzset();
}

TEST_F(RtcClock, IsOpenedForTheWriteAlone) {
    const std::vector<std::string> before = list_descriptors();

    EXPECT_EQ(write_time(1700000000), "0");
    EXPECT_EQ(clock_.calls, (words{"open", "set", "close"}));
    EXPECT_EQ(clock_.flags, O_RDONLY | O_CLOEXEC);
    EXPECT_EQ(list_descriptors(), before);
}

TEST_F(RtcClock, MicrosecondsAreDropped) {
    EXPECT_EQ(write_time(1700000000, 999999), "0");
    ASSERT_EQ(clock_.times.size(), 1U);
    EXPECT_EQ(clock_.times[0].tm_sec, 20);
}

TEST_F(RtcClock, TimeThatIsNoneIsRefusedUnopened) {
    EXPECT_EQ(write_time(-1), failed(EINVAL));
    EXPECT_EQ(write_time(-2147483648), failed(EINVAL));
    EXPECT_EQ(write_time(0, -1), failed(EINVAL));
    EXPECT_EQ(write_time(0, 1000000), failed(EINVAL));
    errno = 0;
    EXPECT_EQ(rtc_write_time(nullptr), -1);
    EXPECT_EQ(errno, EINVAL);
    EXPECT_EQ(clock_.calls, words{});
}

// The year does not fit an int.
TEST_F(RtcClock, TimeBeyondTheCalendarIsRefusedUnopened) {
    EXPECT_EQ(write_time(std::numeric_limits<time_t>::max()), failed(EINVAL));
    EXPECT_EQ(clock_.calls, words{});
}

TEST_F(RtcClock, FailingOpenSaysWhy) {
    for (const int error : {ENOENT, EACCES, EBUSY}) {
        clock_.open_error = error;
        EXPECT_EQ(write_time(1700000000), failed(error));
    }
    EXPECT_EQ(clock_.calls, (words{"open", "open", "open"}));
}

TEST_F(RtcClock, FailingSetSaysWhyAndCloses) {
    const std::vector<std::string> before = list_descriptors();

    // The close has an errno of its own.
    clock_.close_error = EINTR;
    for (const int error : {EINVAL, EACCES, ENOTTY}) {
        clock_.ioctl_error = error;
        EXPECT_EQ(write_time(1700000000), failed(error));
    }
    EXPECT_EQ(clock_.calls,
              (words{"open", "set", "close", "open", "set", "close", "open", "set", "close"}));
    EXPECT_EQ(list_descriptors(), before);
}

TEST_F(RtcClock, FailingCloseIsNoFailure) {
    clock_.close_error = EIO;
    EXPECT_EQ(write_time(1700000000), "0");
}
