// service/main.cpp: start-up, bus ownership, main loop and shutdown.
#include <bit>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>

#include <malloc.h>
#include <sys/prctl.h>
#include <unistd.h>

#include <gio/gio.h>

#include "platform/authz/authz.h"
#include "platform/log_backend/log_backend.h"
#include "service/intake.h"
#include "service/method_table.h"
#include "service/quit_signals.h"
#include "service/read_buffer.h"
#include "service/request.h"
#include "service/service_state.h"
#include "service/watchdog.h"
#include "usermgmt/usermgmt.h"

static constexpr const char *BUS_NAME = "com.zintor.PrivaneSystem";
static constexpr const char *OBJECT_PATH = "/com/zintor/PrivaneSystem";
static constexpr const char *RTC_DEVICE = "/dev/rtc";

// Only for failures at start-up and shutdown; the log back-end shows it as an error. No enumerator
// has this value, and it lies outside the range that a static_cast may produce.
static constexpr auto LOG_LEVEL_FATAL = std::bit_cast<GLogLevelFlags>(1 << G_LOG_LEVEL_USER_SHIFT);

// Freed memory that stays at the end of a heap, and the size from which on a block has pages of its
// own, which go back when it is freed. By itself glibc raises both with the largest block that was
// ever freed, to 64 and 32 MiB: a thread's heap would keep what one large message took, since
// malloc_trim(3) does not shorten it.
static constexpr int HEAP_END_KEPT = 4 * 1024 * 1024;
static constexpr int OWN_PAGES_FROM = 4 * 1024 * 1024;

static void on_bus_acquired(GDBusConnection *connection, const char *, gpointer user_data) {
    auto *state = static_cast<ServiceState *>(user_data);

    state->connection = connection;
    // Before there is anything to call.
    GDBusInterfaceInfo *interface = privane_system__interface_info();
    read_buffer_guard(connection, interface);
    intake_guard(connection, OBJECT_PATH, interface);
    (void)g_dbus_interface_skeleton_export(G_DBUS_INTERFACE_SKELETON(state->skeleton), connection,
                                           OBJECT_PATH, nullptr);
    g_message("Policy Server now registered with the name '%s' and object '%s'", BUS_NAME,
              OBJECT_PATH);
}

static bool can_open(const char *path) {
    FILE *stream = fopen(path, "re");
    if (stream == nullptr)
        return false;
    (void)fclose(stream);
    return true;
}

// What start-up acquires before the state block can own it.
struct process_resources {
    GMainLoop *loop;
    bool authz_open;
};

// Everything up to and including the opening of the database; what failed is logged. No thread may
// run before the detaching, since none would survive it.
static bool start(ServiceState *state, process_resources *resources, bool foreground) {
    g_autoptr(GError) error = nullptr;

    resources->loop = g_main_loop_new(nullptr, FALSE);
    if (!watch_quit_signals(resources->loop)) {
        g_log(G_LOG_DOMAIN, LOG_LEVEL_FATAL, "%sFailed to watch for signals: %s",
              PRIVANE_LOG_PREFIX, g_strerror(errno));
        return false;
    }
    resources->authz_open = authz_init(&error) != 0;
    if (!resources->authz_open) {
        g_log(G_LOG_DOMAIN, LOG_LEVEL_FATAL, "%sFailed to initialize libauthz: %s",
              PRIVANE_LOG_PREFIX, error->message);
        return false;
    }
    if (!foreground && daemon(0, 0) < 0) {
        g_log(G_LOG_DOMAIN, LOG_LEVEL_FATAL, "%sDaemon failed: %s", PRIVANE_LOG_PREFIX,
              g_strerror(errno));
        return false;
    }

    g_message("Initializing user management library");
    state->usermgmt_context = usermgmt_open(0, &error);
    if (state->usermgmt_context == nullptr) {
        g_log(G_LOG_DOMAIN, LOG_LEVEL_FATAL,
              "%sFailed to initialise the user management library: %s", PRIVANE_LOG_PREFIX,
              error != nullptr ? error->message : "Unknown error");
        return false;
    }
    return true;
}

// Until a quit signal.
static void serve(ServiceState *state, GMainLoop *loop) {
    watchdog_start();
    state->skeleton = privane_system__skeleton_new();
    connect_methods(state);
    state->owner_id = g_bus_own_name(G_BUS_TYPE_SYSTEM, BUS_NAME, G_BUS_NAME_OWNER_FLAGS_NONE,
                                     on_bus_acquired, nullptr, nullptr, state, nullptr);
    state->rtc_present = can_open(RTC_DEVICE) ? TRUE : FALSE;
    g_message("Starting privane_system");
    g_main_loop_run(loop);
}

static void close_database(ServiceState *state) {
    if (state->usermgmt_context != nullptr && !usermgmt_close(state->usermgmt_context))
        g_log(G_LOG_DOMAIN, LOG_LEVEL_FATAL,
              "%sFailed to release the user management library context", PRIVANE_LOG_PREFIX);
}

int main(int argc, char **argv) {
    // The memory holds passwords. A limit of 0 on core files does not hold for programs that take
    // them from the kernel through a pipe.
    (void)prctl(PR_SET_DUMPABLE, 0);  // fails for other values only
    // It accepts both, mallopt(3).
    (void)mallopt(M_TRIM_THRESHOLD, HEAP_END_KEPT);
    (void)mallopt(M_MMAP_THRESHOLD, OWN_PAGES_FROM);
    // Inherited as ignored, every tool that the service runs would seem to succeed.
    (void)signal(SIGCHLD, SIG_DFL);

    auto *state = g_new0(ServiceState, 1);
    const bool foreground = argc == 2 && g_strcmp0(argv[1], "-n") == 0;
    if (foreground)
        log_backend_stdout();
    else
        log_backend_syslog();

    process_resources resources = {};
    const bool started = start(state, &resources, foreground);
    if (started)
        serve(state, resources.loop);

    close_database(state);
    if (started) {
        g_bus_unown_name(state->owner_id);
        g_object_unref(state->skeleton);
    }
    g_free(state);
    g_main_loop_unref(resources.loop);
    if (resources.authz_open)
        authz_release();
    return started ? EXIT_SUCCESS : EXIT_FAILURE;
}
