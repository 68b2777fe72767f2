// tests/unit/platform/coarse_times.h: times of files as other kernels and file systems keep them.
#pragma once

#include <ctime>
#include <functional>

// The times that fstat, fstatat and clock_gettime tell are multiples of this many nanoseconds; 1,
// as the kernel of this machine tells them, at the start. For programs whose calls are wrapped.
void set_time_step(long nanoseconds);

// What is done, once, when the clock is asked next, which then tells a time so much later.
void at_next_clock(std::function<void()> act, time_t seconds_later);
