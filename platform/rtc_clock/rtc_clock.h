/* platform/rtc_clock/rtc_clock.h: the hardware clock, which keeps UTC. */
#pragma once

#include <sys/time.h>

#ifdef __cplusplus
extern "C" {
#endif

#pragma GCC visibility push(default)

/*
 * Writes the time, in seconds and microseconds since the epoch, to /dev/rtc (rtc(4): RTC_SET_TIME).
 * The clock counts whole seconds, so the microseconds are dropped. 0, or -1 with errno set: EINVAL
 * for a time before the epoch or microseconds outside 0 to 999999.
 */
int rtc_write_time(const struct timeval *time);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif
