// benchmarks/clients/start_time.cpp: how long a daemon takes from its fork to owning its name.
//
//   start_time BUS_NAME PROGRAM [ARGUMENT...]
//
// Prints the microseconds, and how many of them the daemon was at work for; ends the daemon.
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gio/gio.h>

static constexpr guint LIMIT_SECONDS = 60;

struct waiting {
    GMainLoop *loop;
    pid_t child;
    gint64 end;     // 0 until the name is owned
    gint64 worked;  // by the daemon's own clock
};

// Of all threads of a process.
static gint64 processor_microseconds(pid_t process) {
    clockid_t clock = 0;
    struct timespec time = {};
    if (clock_getcpuclockid(process, &clock) != 0 || clock_gettime(clock, &time) != 0)
        return 0;
    return gint64{time.tv_sec} * G_USEC_PER_SEC + time.tv_nsec / 1000;
}

static void on_owner_changed(GDBusConnection *, const char *, const char *, const char *,
                             const char *, GVariant *parameters, void *data) {
    auto *state = static_cast<waiting *>(data);
    const char *new_owner = nullptr;

    g_variant_get(parameters, "(&s&s&s)", nullptr, nullptr, &new_owner);
    if (*new_owner == '\0')
        return;
    state->end = g_get_monotonic_time();
    state->worked = processor_microseconds(state->child);
    g_main_loop_quit(state->loop);
}

static gboolean on_limit(void *loop) {
    g_main_loop_quit(static_cast<GMainLoop *>(loop));
    return G_SOURCE_REMOVE;
}

[[noreturn]] static void run_daemon(char **argv) {
    const int null_fd = open("/dev/null", O_RDWR | O_CLOEXEC);
    (void)dup2(null_fd, STDIN_FILENO);
    (void)dup2(null_fd, STDOUT_FILENO);
    (void)execv(argv[0], argv);
    _exit(127);
}

int main(int argc, char **argv) {
    if (argc < 3) {
        (void)fprintf(stderr, "usage: start_time BUS_NAME PROGRAM [ARGUMENT...]\n");
        return 2;
    }
    g_autoptr(GError) error = nullptr;
    g_autoptr(GDBusConnection) bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, &error);
    if (bus == nullptr) {
        (void)fprintf(stderr, "start_time: %s\n", error->message);
        return EXIT_FAILURE;
    }
    waiting state = {g_main_loop_new(nullptr, FALSE), 0, 0, 0};
    (void)g_dbus_connection_signal_subscribe(bus, "org.freedesktop.DBus", "org.freedesktop.DBus",
                                             "NameOwnerChanged", "/org/freedesktop/DBus", argv[1],
                                             G_DBUS_SIGNAL_FLAGS_NONE, on_owner_changed, &state,
                                             nullptr);
    // The subscription has reached the bus when a later call is answered.
    g_autoptr(GVariant) reply = g_dbus_connection_call_sync(
        bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus.Peer", "Ping",
        nullptr, nullptr, G_DBUS_CALL_FLAGS_NONE, -1, nullptr, nullptr);
    (void)g_timeout_add_seconds(LIMIT_SECONDS, on_limit, state.loop);

    const gint64 start = g_get_monotonic_time();
    const pid_t child = fork();
    if (child == 0)
        run_daemon(argv + 2);
    if (child < 0)
        return EXIT_FAILURE;
    state.child = child;
    g_main_loop_run(state.loop);

    int status = 0;
    (void)kill(child, SIGTERM);
    if (waitpid(child, &status, 0) != child || state.end == 0 || state.worked == 0) {
        (void)fprintf(stderr, "start_time: %s did not take %s\n", argv[2], argv[1]);
        return EXIT_FAILURE;
    }
    (void)printf("%" G_GINT64_FORMAT " %" G_GINT64_FORMAT "\n", state.end - start, state.worked);
}
