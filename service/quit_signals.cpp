// service/quit_signals.cpp: SIGHUP, SIGINT and SIGTERM as events of the main loop.
#include "service/quit_signals.h"

#include <array>
#include <cerrno>
#include <csignal>

#include <fcntl.h>
#include <unistd.h>

#include <glib-unix.h>

static constexpr std::array quit_signals = {SIGHUP, SIGINT, SIGTERM};

// From the signal handler to the loop; both ends close-on-exec and non-blocking.
static int signal_pipe[2] = {-1, -1};

static void write_to_pipe(int) {
    const int saved_errno = errno;
    // A full pipe already holds the wake-up.
    (void)!write(signal_pipe[1], "", 1);
    errno = saved_errno;
}

gboolean on_quit_signal(gpointer loop) {
    g_main_loop_quit(static_cast<GMainLoop *>(loop));
    return TRUE;
}

static gboolean on_pipe_readable(int fd, GIOCondition, gpointer loop) {
    char drained[16];
    while (read(fd, drained, sizeof drained) > 0) {
    }
    return on_quit_signal(loop);
}

bool watch_quit_signals(GMainLoop *loop) {
    if (pipe2(signal_pipe, O_CLOEXEC | O_NONBLOCK) != 0)
        return false;

    struct sigaction action = {};
    action.sa_handler = write_to_pipe;
    action.sa_flags = SA_RESTART;
    for (const int number : quit_signals)
        (void)sigaction(number, &action, nullptr);  // fails only for signals that do not exist
    (void)g_unix_fd_add(signal_pipe[0], G_IO_IN, on_pipe_readable, loop);
    return true;
}
