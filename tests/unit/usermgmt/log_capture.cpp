// tests/unit/usermgmt/log_capture.cpp: what the code under test logs, through GLib and syslog(3).
#include "tests/unit/usermgmt/log_capture.h"

#include <cstdarg>
#include <utility>

#include <glib.h>

// The linker sends syslog(3), also under its fortified name, here (--wrap).
void wrap_syslog(int priority, const char *format, ...) asm("__wrap_syslog") G_GNUC_PRINTF(2, 3);
void wrap_syslog_chk(int priority, int flag, const char *format, ...) asm("__wrap___syslog_chk")
    G_GNUC_PRINTF(3, 4);

static lines syslog_lines;

static void record_syslog(int priority, const char *format, va_list arguments) G_GNUC_PRINTF(2, 0);
static void record_syslog(int priority, const char *format, va_list arguments) {
    g_autofree char *text = g_strdup_vprintf(format, arguments);
    syslog_lines.push_back(std::to_string(priority) + " " + text);
}

void wrap_syslog(int priority, const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    record_syslog(priority, format, arguments);
    va_end(arguments);
}

void wrap_syslog_chk(int priority, int /*flag*/, const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    record_syslog(priority, format, arguments);
    va_end(arguments);
}

lines take_syslog() {
    return std::exchange(syslog_lines, {});
}

static constexpr auto SERIOUS =
    static_cast<GLogLevelFlags>(G_LOG_FATAL_MASK | G_LOG_LEVEL_CRITICAL | G_LOG_LEVEL_WARNING);
static const GLogLevelFlags default_fatal_levels = g_log_set_always_fatal(SERIOUS);

static void record_glib(const char *domain, GLogLevelFlags level, const char *text,
                        gpointer records) {
    const char *name = (level & G_LOG_LEVEL_CRITICAL) != 0  ? "CRITICAL"
                       : (level & G_LOG_LEVEL_WARNING) != 0 ? "WARNING"
                                                            : "other";
    static_cast<lines *>(records)->push_back(std::string(domain != nullptr ? domain : "") + "-" +
                                             name + ": " + text);
}

lines glib_log_of(const std::function<void()> &action) {
    lines records;
    const GLogFunc handler = g_log_set_default_handler(record_glib, &records);
    (void)g_log_set_always_fatal(default_fatal_levels);
    action();
    (void)g_log_set_always_fatal(SERIOUS);
    (void)g_log_set_default_handler(handler, nullptr);
    return records;
}
