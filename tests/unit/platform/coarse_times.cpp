// tests/unit/platform/coarse_times.cpp: stands in front of the calls that tell times.
#include "tests/unit/platform/coarse_times.h"

#include <ctime>
#include <utility>

#include <sys/stat.h>

static long step = 1;

void set_time_step(long nanoseconds) {
    step = nanoseconds;
}

static std::function<void()> next_act;
static time_t next_delay;

void at_next_clock(std::function<void()> act, time_t seconds_later) {
    next_act = std::move(act);
    next_delay = seconds_later;
}

static void cut(struct timespec *time) {
    time->tv_nsec -= time->tv_nsec % step;
}

static int cut_file(int result, struct stat64 *seen) {
    if (result == 0) {
        cut(&seen->st_mtim);
        cut(&seen->st_ctim);
    }
    return result;
}

extern "C" {

int __real_fstat64(int fd, struct stat64 *seen);
int __real_fstatat64(int folder, const char *path, struct stat64 *seen, int flags);
int __real_clock_gettime(clockid_t clock, struct timespec *time);
int __wrap_fstat64(int fd, struct stat64 *seen);
int __wrap_fstatat64(int folder, const char *path, struct stat64 *seen, int flags);
int __wrap_clock_gettime(clockid_t clock, struct timespec *time);

int __wrap_fstat64(int fd, struct stat64 *seen) {
    return cut_file(__real_fstat64(fd, seen), seen);
}

int __wrap_fstatat64(int folder, const char *path, struct stat64 *seen, int flags) {
    return cut_file(__real_fstatat64(folder, path, seen, flags), seen);
}

int __wrap_clock_gettime(clockid_t clock, struct timespec *time) {
    const std::function<void()> act = std::exchange(next_act, nullptr);
    const time_t delay = std::exchange(next_delay, 0);

    if (act)
        act();
    const int result = __real_clock_gettime(clock, time);
    time->tv_sec += delay;
    if (result == 0)
        cut(time);
    return result;
}
}
