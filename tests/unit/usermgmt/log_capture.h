// tests/unit/usermgmt/log_capture.h: what the code under test logs, through GLib and syslog(3).
#pragma once

#include <functional>
#include <string>
#include <vector>

using lines = std::vector<std::string>;

// Takes what was logged through syslog(3) since the last call, a line "<priority> <text>" for each
// record. Nothing reaches the machine's own log.
lines take_syslog();

// Runs the action and returns what it logs through GLib, a line "<domain>-<level>: <text>" for each
// record. Outside of it a warning or a critical record ends the test program.
lines glib_log_of(const std::function<void()> &action);
