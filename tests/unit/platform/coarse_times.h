// tests/unit/platform/coarse_times.h: times of files as other kernels and file systems keep them,
// and clocks that are set. For programs whose calls are wrapped.
#pragma once

#include <ctime>
#include <functional>

#include <glib.h>

// The times that fstat and fstatat tell are multiples of this many nanoseconds, and so are those of
// clock_gettime, as far as a kernel's tick goes; 1, as the kernel of this machine tells them, at
// the start.
void set_time_step(gint64 nanoseconds);

// From now on the clock that can be set is so far ahead of that of the files.
void set_clock_error(time_t seconds);

// So much time has passed on all clocks.
void pass_time(time_t seconds);

// What is done, once, when the clocks are asked for the so-manieth time from now on, before so much
// time passes.
void at_clock(int calls, std::function<void()> act, time_t seconds_later);

// As at the start.
void reset_times();
