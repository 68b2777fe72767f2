// platform/authz/polkit/service_probe.cpp: looks for polkit on the system bus from a short-lived
// child.
//
// GDBus does its work in threads, and a thread does not survive the fork of a process that
// detaches. So GDBus runs in a child, which reports through a pipe: one byte for the verdict, then
// the text of the error.
#include "platform/authz/polkit/service_probe.h"

#include <cerrno>
#include <csignal>
#include <cstddef>
#include <cstring>

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gio/gio.h>

#include "platform/authz/authz_error.h"
#include "platform/authz/polkit/polkit_question.h"

static constexpr char VERDICT_FOUND = '+';
static constexpr char VERDICT_FAILED = '-';

// The verdict and the text, cut if need be, which a pipe takes in one write without blocking.
static constexpr std::size_t MAX_REPORT = 1024;

struct probe_report {
    char bytes[MAX_REPORT];
    std::size_t length;
};

static bool bus_call(GDBusConnection *bus, const char *method, GVariant *arguments,
                     const char *reply_type, GVariant **out_reply, GError **error) {
    *out_reply = g_dbus_connection_call_sync(
        bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus", method,
        arguments, G_VARIANT_TYPE(reply_type), G_DBUS_CALL_FLAGS_NONE, -1, nullptr, error);
    return *out_reply != nullptr;
}

// Being startable is enough: how long a start takes is the business of the first check.
static bool is_polkit_available(GDBusConnection *bus, GError **error) {
    g_autoptr(GVariant) owned_reply = nullptr;
    g_autoptr(GVariant) names_reply = nullptr;
    gboolean owned = FALSE;

    if (!bus_call(bus, "NameHasOwner", g_variant_new("(s)", POLKIT_NAME), "(b)", &owned_reply,
                  error))
        return false;
    g_variant_get(owned_reply, "(b)", &owned);
    if (owned)
        return true;

    if (!bus_call(bus, "ListActivatableNames", nullptr, "(as)", &names_reply, error))
        return false;
    g_autofree const char **names = nullptr;
    g_variant_get(names_reply, "(^a&s)", &names);
    if (g_strv_contains(names, POLKIT_NAME))
        return true;

    g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_UNREACHABLE,
                "%s is neither running on the system bus nor can be started", POLKIT_NAME);
    return false;
}

static bool look_for_polkit(GError **error) {
    g_autofree char *address = g_dbus_address_get_for_bus_sync(G_BUS_TYPE_SYSTEM, nullptr, error);
    if (address == nullptr)
        return false;

    const auto flags =
        static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                          G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION);
    g_autoptr(GDBusConnection) bus =
        g_dbus_connection_new_for_address_sync(address, flags, nullptr, nullptr, error);
    return bus != nullptr && is_polkit_available(bus, error);
}

[[noreturn]] static void run_child(int report_fd) {
    // A starting daemon that is killed must not leave a child behind that nobody ends.
    (void)prctl(PR_SET_PDEATHSIG, SIGKILL);

    g_autoptr(GError) error = nullptr;
    char report[MAX_REPORT] = {VERDICT_FOUND};
    std::size_t length = 1;

    if (!look_for_polkit(&error)) {
        (void)g_dbus_error_strip_remote_error(error);
        report[0] = VERDICT_FAILED;
        (void)g_strlcpy(report + 1, error->message, sizeof report - 1);
        length += std::strlen(report + 1);
    }

    const ssize_t written = write(report_fd, report, length);
    _exit(written == static_cast<ssize_t>(length) ? 0 : 1);
}

static bool fail_with_errno(const char *what, GError **error) {
    const int saved_errno = errno;

    g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_UNREACHABLE, "%s: %s", what,
                g_strerror(saved_errno));
    return false;
}

// Waits until there is something to read, or the end of the report.
static bool wait_readable(int report_fd, gint64 deadline, GError **error) {
    while (true) {
        const gint64 left = deadline - g_get_monotonic_time();
        struct pollfd readable = {report_fd, POLLIN, 0};
        const int ready = poll(&readable, 1, left > 0 ? static_cast<int>(left / 1000) + 1 : 0);

        if (ready > 0)
            return true;
        if (ready == 0) {
            g_set_error_literal(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_TIMED_OUT,
                                "the system bus gave no answer in time");
            return false;
        }
        if (errno != EINTR)
            return fail_with_errno("cannot wait for the look at the system bus", error);
    }
}

// The report is whole when its writer has closed the pipe, or when there is no room for more.
static bool read_report(int report_fd, gint64 deadline, probe_report *out_report, GError **error) {
    while (out_report->length < sizeof out_report->bytes) {
        if (!wait_readable(report_fd, deadline, error))
            return false;

        const ssize_t count = read(report_fd, out_report->bytes + out_report->length,
                                   sizeof out_report->bytes - out_report->length);
        if (count == 0)
            return true;
        if (count > 0)
            out_report->length += static_cast<std::size_t>(count);
        else if (errno != EINTR)
            return fail_with_errno("cannot read the look at the system bus", error);
    }
    return true;
}

static bool judge(const probe_report &report, GError **error) {
    if (report.length == 1 && report.bytes[0] == VERDICT_FOUND)
        return true;

    if (report.length > 1 && report.bytes[0] == VERDICT_FAILED) {
        g_autofree char *text =
            g_utf8_make_valid(report.bytes + 1, static_cast<gssize>(report.length - 1));
        g_set_error_literal(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_UNREACHABLE, text);
        return false;
    }
    g_set_error_literal(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_UNREACHABLE,
                        "the look at the system bus ended without a result");
    return false;
}

// The report alone decides: where the process ignores SIGCHLD there is no status to wait for.
static void reap(pid_t child) {
    while (waitpid(child, nullptr, 0) < 0 && errno == EINTR) {
    }
}

bool service_probe_run(int deadline_ms, GError **error) {
    const gint64 deadline = g_get_monotonic_time() + gint64{deadline_ms} * 1000;
    int ends[2] = {-1, -1};

    if (pipe2(ends, O_CLOEXEC) != 0)
        return fail_with_errno("cannot make a pipe", error);

    const pid_t child = fork();
    if (child == 0)
        run_child(ends[1]);
    if (child < 0) {
        (void)fail_with_errno("cannot fork", error);  // Before the closes change errno.
        (void)close(ends[0]);
        (void)close(ends[1]);
        return false;
    }

    (void)close(ends[1]);
    probe_report report = {};
    const bool whole = read_report(ends[0], deadline, &report, error);
    (void)close(ends[0]);
    if (!whole)
        (void)kill(child, SIGKILL);
    reap(child);

    return whole && judge(report, error);
}
