// tests/unit/platform/coarse_times.h: times of files as other kernels and file systems keep them.
#pragma once

// The times that fstat, fstatat and clock_gettime tell are multiples of this many nanoseconds; 1,
// as the kernel of this machine tells them, at the start. For programs whose calls are wrapped.
void set_time_step(long nanoseconds);
