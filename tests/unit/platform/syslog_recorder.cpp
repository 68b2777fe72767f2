// tests/unit/platform/syslog_recorder.cpp: stands in front of the C library's log functions.
//
// Each call becomes a write to standard output: "openlog IDENT OPTION FACILITY" or
// "syslog PRIORITY FORMAT TEXT". The header that declares them is left out, since with
// FORTIFY_SOURCE it defines syslog inline.
#include <cstdarg>
#include <string>

#include <unistd.h>

#include <glib.h>

extern "C" {
void openlog(const char *ident, int option, int facility);
void syslog(int priority, const char *format, ...) G_GNUC_PRINTF(2, 3);
void __syslog_chk(int priority, int flag, const char *format, ...) G_GNUC_PRINTF(3, 4);
}

static void record(const std::string &call) {
    // A test that misses a record fails by itself.
    const ssize_t written = write(STDOUT_FILENO, call.data(), call.size());
    (void)written;
}

static void G_GNUC_PRINTF(2, 0) record_syslog(int priority, const char *format, std::va_list args) {
    g_autofree char *text = g_strdup_vprintf(format, args);

    record("syslog " + std::to_string(priority) + " " + format + " " + text);
}

void openlog(const char *ident, int option, int facility) {
    record(std::string("openlog ") + ident + " " + std::to_string(option) + " " +
           std::to_string(facility));
}

void syslog(int priority, const char *format, ...) {
    std::va_list args;
    va_start(args, format);
    record_syslog(priority, format, args);
    va_end(args);
}

// The form that FORTIFY_SOURCE turns a call into.
void __syslog_chk(int priority, int, const char *format, ...) {
    std::va_list args;
    va_start(args, format);
    record_syslog(priority, format, args);
    va_end(args);
}
