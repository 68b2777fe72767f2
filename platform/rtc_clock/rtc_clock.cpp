// platform/rtc_clock/rtc_clock.cpp: the hardware clock.
#include "platform/rtc_clock/rtc_clock.h"

#include <cerrno>
#include <ctime>

#include <fcntl.h>
#include <linux/rtc.h>
#include <sys/ioctl.h>
#include <unistd.h>

static constexpr const char *RTC_DEVICE = "/dev/rtc";
static constexpr suseconds_t MICROSECONDS_PER_SECOND = 1000000;

int rtc_write_time(const struct timeval *time) {
    struct tm utc = {};
    if (time == nullptr || time->tv_sec < 0 || time->tv_usec < 0 ||
        time->tv_usec >= MICROSECONDS_PER_SECOND || gmtime_r(&time->tv_sec, &utc) == nullptr) {
        errno = EINVAL;
        return -1;
    }
    struct rtc_time clock = {};
    clock.tm_sec = utc.tm_sec;
    clock.tm_min = utc.tm_min;
    clock.tm_hour = utc.tm_hour;
    clock.tm_mday = utc.tm_mday;
    clock.tm_mon = utc.tm_mon;
    clock.tm_year = utc.tm_year;

    const int fd = open(RTC_DEVICE, O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return -1;
    const int result = ioctl(fd, RTC_SET_TIME, &clock);
    const int saved_errno = errno;
    (void)close(fd);  // the clock was set or not by now
    errno = saved_errno;
    return result == 0 ? 0 : -1;
}
