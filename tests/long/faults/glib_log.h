// tests/long/faults/glib_log.h: what is logged through GLib and syslog(3), taken.
#pragma once

#include <string>
#include <vector>

#include <glib.h>

// From its beginning to its end nothing is printed, and no warning ends the process.
class glib_log {
  public:
    glib_log();
    ~glib_log();
    glib_log(const glib_log &) = delete;
    glib_log &operator=(const glib_log &) = delete;

    // "warning <text>" or "message <text>" of GLib's, then syslog's "<priority> <text>".
    std::vector<std::string> taken() const;

  private:
    static void take(const char *domain, GLogLevelFlags level, const char *text, gpointer log);

    std::vector<std::string> lines_;
    GLogFunc old_;
    GLogLevelFlags old_fatal_;
};
