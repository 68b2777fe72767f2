// platform/authz/policy/file_stamp.cpp: by what a file is known to be as it was read.
#include "platform/authz/policy/file_stamp.h"

#include <cerrno>
#include <cmath>

#include <fcntl.h>

// Two changes may get one time when they are no further apart than this; on a file system that
// keeps no fractions of a second, than the other.
static constexpr double MOMENT = 0.1;
static constexpr double WHOLE_MOMENT = 2;

// A tick and a little; above that somebody has set the clock. Less than a moment, so that a clock
// that was set by less brings no moment back.
static constexpr double MAX_WAVER = 0.05;

static bool is_same_time(const struct timespec &left, const struct timespec &right) {
    return left.tv_sec == right.tv_sec && left.tv_nsec == right.tv_nsec;
}

static double in_seconds(const struct timespec &time) {
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

clock_reading read_clocks() {
    struct timespec wall = {};
    struct timespec since_start = {};

    if (clock_gettime(CLOCK_REALTIME_COARSE, &wall) != 0 ||
        clock_gettime(CLOCK_BOOTTIME, &since_start) != 0)
        return {};
    return {true, in_seconds(wall), in_seconds(wall) - in_seconds(since_start)};
}

file_stamp file_stamp_of(const struct stat &seen, const clock_reading &before) {
    return {true, seen.st_dev, seen.st_ino, seen.st_size, seen.st_mtim, seen.st_ctim, before};
}

// Whether no change since the reading can have got the time that the file had then: that moment was
// over, or, for a file from a clock that was set back since, it is yet to come.
static bool would_show_a_change(const file_stamp &known, const clock_reading &now) {
    const double changed = in_seconds(known.changed);
    const double moment = known.changed.tv_nsec != 0 ? MOMENT : WHOLE_MOMENT;

    if (!known.read.is_known || !now.is_known ||
        std::fabs(now.ahead - known.read.ahead) > MAX_WAVER)
        return false;
    return changed + moment < known.read.wall || now.wall + moment < changed;
}

bool file_stamp_holds(const file_stamp &known, const char *path, int flags,
                      const clock_reading &now) {
    struct stat seen = {};

    if (fstatat(AT_FDCWD, path, &seen, flags) != 0)
        return !known.exists && errno == ENOENT;
    return known.exists && would_show_a_change(known, now) && known.device == seen.st_dev &&
           known.inode == seen.st_ino && known.size == seen.st_size &&
           is_same_time(known.written, seen.st_mtim) && is_same_time(known.changed, seen.st_ctim);
}
