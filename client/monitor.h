// client/monitor.h: the command that waits for announcements.
#pragma once

#include "client/session.h"

// As command::run; returns when a signal ends it, or with an error when the bus has gone.
bool run_monitor(const session &run, GError **error);
