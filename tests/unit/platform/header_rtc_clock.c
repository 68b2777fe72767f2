/* tests/unit/platform/header_rtc_clock.c: rtc_clock.h is C, and its function has the agreed type.
 */
#include "platform/rtc_clock/rtc_clock.h"

#include "platform/rtc_clock/rtc_clock.h"

int main(void) {
    int (*write_time)(const struct timeval *) = rtc_write_time;

    return write_time != 0 ? 0 : 1;
}
