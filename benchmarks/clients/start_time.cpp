// benchmarks/clients/start_time.cpp: how long a daemon takes from its fork to owning its name.
//
//   start_time BUS_NAME PROGRAM [ARGUMENT...]
//
// Prints the microseconds, and ends the daemon.
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gio/gio.h>

static constexpr guint LIMIT_SECONDS = 60;

struct waiting {
    GMainLoop *loop;
    gint64 end;  // 0 until the name is owned
};

static void on_owner_changed(GDBusConnection *, const char *, const char *, const char *,
                             const char *, GVariant *parameters, void *data) {
    auto *state = static_cast<waiting *>(data);
    const char *new_owner = nullptr;

    g_variant_get(parameters, "(&s&s&s)", nullptr, nullptr, &new_owner);
    if (*new_owner == '\0')
        return;
    state->end = g_get_monotonic_time();
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
    waiting state = {g_main_loop_new(nullptr, FALSE), 0};
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
    g_main_loop_run(state.loop);

    int status = 0;
    (void)kill(child, SIGTERM);
    if (waitpid(child, &status, 0) != child || state.end == 0) {
        (void)fprintf(stderr, "start_time: %s did not take %s\n", argv[2], argv[1]);
        return EXIT_FAILURE;
    }
    (void)printf("%.3f\n", static_cast<double>(state.end - start));
}
