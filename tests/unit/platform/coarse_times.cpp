// tests/unit/platform/coarse_times.cpp: stands in front of the calls that tell times.
#include "tests/unit/platform/coarse_times.h"

#include <algorithm>
#include <ctime>
#include <utility>

#include <sys/stat.h>

// The longest tick of a kernel; a clock is never as coarse as the times of files may be.
static constexpr gint64 MAX_TICK = 10'000'000;

static gint64 step = 1;
static time_t clock_error;
static time_t time_passed;
static std::function<void()> next_act;
static time_t next_delay;
static int calls_before;

void set_time_step(gint64 nanoseconds) {
    step = nanoseconds;
}

void set_clock_error(time_t seconds) {
    clock_error = seconds;
}

void pass_time(time_t seconds) {
    time_passed += seconds;
}

void at_clock(int calls, std::function<void()> act, time_t seconds_later) {
    calls_before = calls - 1;
    next_act = std::move(act);
    next_delay = seconds_later;
}

void reset_times() {
    step = 1;
    clock_error = 0;
    time_passed = 0;
    at_clock(1, nullptr, 0);
}

static void cut(struct timespec *time, gint64 by) {
    static constexpr gint64 SECOND = 1'000'000'000;
    const gint64 all = time->tv_sec * SECOND + time->tv_nsec;
    const gint64 kept = all - all % by;
    time->tv_sec = kept / SECOND;
    time->tv_nsec = kept % SECOND;
}

static int cut_file(int result, struct stat64 *seen) {
    if (result == 0) {
        cut(&seen->st_mtim, step);
        cut(&seen->st_ctim, step);
    }
    return result;
}

static bool is_wall_clock(clockid_t clock) {
    return clock == CLOCK_REALTIME || clock == CLOCK_REALTIME_COARSE;
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
    if (next_act && calls_before-- == 0) {
        std::exchange(next_act, nullptr)();
        time_passed += next_delay;
    }
    const int result = __real_clock_gettime(clock, time);
    time->tv_sec += time_passed + (is_wall_clock(clock) ? clock_error : 0);
    if (result == 0)
        cut(time, std::min(step, MAX_TICK));
    return result;
}
}
