// platform/authz/policy/file_stamp.h: by what a file is known to be as it was read; internal.
#pragma once

#include <ctime>

#include <sys/stat.h>
#include <sys/types.h>

// The clocks at a moment, in seconds.
struct clock_reading {
    bool is_known;
    double wall;   // that files get their times from
    double ahead;  // of the time since the start of the system, which nobody sets
};

// The time of the last change of a file's attributes comes with each of its content, and nobody can
// set it but with the clock.
struct file_stamp {
    bool exists;
    dev_t device;
    ino_t inode;
    off_t size;
    struct timespec written;
    struct timespec changed;
    clock_reading read;
};

clock_reading read_clocks();

// Of a file that was looked at, and read, after the clocks were.
file_stamp file_stamp_of(const struct stat &seen, const clock_reading &before);

// Whether what stands at the path is beyond doubt what was read. The clocks were asked just before.
bool file_stamp_holds(const file_stamp &known, const char *path, int flags,
                      const clock_reading &now);
