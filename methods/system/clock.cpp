// methods/system/clock.cpp: the methods that set and slew the clock.
#include "methods/system/clock.h"

#include <sys/time.h>

#include "methods/tool_runner.h"
#include "platform/rtc_clock/rtc_clock.h"
#include "service/method.h"

static constexpr const char *TIME_SYNC_HOOK = "/usr/lib/ntpd/ntpd_hook";

bool handle_set_time_of_day(method_call &call, gint seconds, gint microseconds) {
    const struct timeval time = {seconds, microseconds};
    const int result = settimeofday(&time, nullptr);
    // Deliberate: also when the kernel refused the time for its own clock.
    if (call.state->rtc_present)
        (void)rtc_write_time(&time);  // the answer is about the system clock

    privane_system__complete_set_time_of_day(call.skeleton, call.invocation, result);
    return true;
}

bool handle_adj_time(method_call &call, gint seconds, gint microseconds) {
    const struct timeval delta = {seconds, microseconds};
    if (adjtime(&delta, nullptr) < 0)
        return fail(call, PRIVANE_ERROR_ADJUST_CLOCK, "Failed to adjust the system clock.");

    privane_system__complete_adj_time(call.skeleton, call.invocation);
    return true;
}

bool handle_notify_time_sync(method_call &call) {
    const char *const argv[] = {TIME_SYNC_HOOK, "settime", nullptr};
    g_auto(tool_result) result = {};
    // One text answers every failure, so what the spawning says is not kept.
    if (!run_tool(argv, tool_capture::NOTHING, &result, nullptr) || !tool_succeeded(result))
        return fail(call, PRIVANE_ERROR_TIME_SYNC, "Failed to notify time sync.");

    privane_system__complete_notify_time_sync(call.skeleton, call.invocation);
    return true;
}
