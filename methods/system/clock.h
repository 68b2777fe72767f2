// methods/system/clock.h: the methods that set and slew the clock.
#pragma once

#include <glib.h>

struct method_call;

bool handle_set_time_of_day(method_call &call, gint seconds, gint microseconds);
bool handle_adj_time(method_call &call, gint seconds, gint microseconds);
bool handle_notify_time_sync(method_call &call);
