// service/watchdog.cpp: one datagram to the service manager in each third of the watchdog's time.
//
// Written out here, since libsystemd would bring its own dependencies into a small image for it.
#include "service/watchdog.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <string_view>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <glib.h>

#include "service/request.h"

static constexpr const char *SOCKET_VARIABLE = "NOTIFY_SOCKET";
static constexpr const char *TIME_VARIABLE = "WATCHDOG_USEC";
static constexpr const char *PROCESS_VARIABLE = "WATCHDOG_PID";

static constexpr std::string_view SIGN_OF_LIFE = "WATCHDOG=1";

// Two may get lost, or come late, before the manager acts.
static constexpr guint64 SIGNS_PER_TIME = 3;

struct watchdog {
    int socket_fd;
    struct sockaddr_un address;
    socklen_t address_length;
    gint64 period;  // in microseconds; 0: nobody watches
    gint64 due;
};

static watchdog dog;

// In microseconds; 0 where nobody watches this process.
static guint64 watched_time() {
    const char *time = g_getenv(TIME_VARIABLE);
    const char *process = g_getenv(PROCESS_VARIABLE);
    guint64 pid = 0;
    guint64 microseconds = 0;

    if (process != nullptr &&
        (!g_ascii_string_to_unsigned(process, 10, 1, G_MAXINT, &pid, nullptr) ||
         pid != static_cast<guint64>(getpid())))
        return 0;
    if (time == nullptr ||
        !g_ascii_string_to_unsigned(time, 10, SIGNS_PER_TIME, G_MAXINT64, &microseconds, nullptr))
        return 0;
    return microseconds;
}

// The name begins with "/", or with "@" for one that is in no file system.
static bool read_address(const char *name) {
    if (name == nullptr || (name[0] != '/' && name[0] != '@'))
        return false;
    const std::size_t length = std::strlen(name);
    if (length < 2 || length >= sizeof dog.address.sun_path)
        return false;

    dog.address.sun_family = AF_UNIX;
    std::memcpy(dog.address.sun_path, name, length);
    if (name[0] == '@')
        dog.address.sun_path[0] = '\0';
    dog.address_length = static_cast<socklen_t>(offsetof(struct sockaddr_un, sun_path) + length);
    return true;
}

static void give_sign() {
    // By address and without waiting: the manager may make its socket anew, or be busy. What does
    // not get through now does at the next try.
    (void)!sendto(dog.socket_fd, SIGN_OF_LIFE.data(), SIGN_OF_LIFE.size(),
                  MSG_DONTWAIT | MSG_NOSIGNAL,
                  reinterpret_cast<const struct sockaddr *>(&dog.address), dog.address_length);
    dog.due = g_get_monotonic_time() + dog.period;
}

static gboolean on_timer(gpointer) {
    give_sign();
    return G_SOURCE_CONTINUE;
}

void watchdog_start() {
    const guint64 time = watched_time();
    const bool has_address = read_address(g_getenv(SOCKET_VARIABLE));
    for (const char *name : {SOCKET_VARIABLE, TIME_VARIABLE, PROCESS_VARIABLE})
        g_unsetenv(name);
    if (time == 0 || !has_address)
        return;

    dog.socket_fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    if (dog.socket_fd < 0) {
        g_warning("%sFailed to make the watchdog's socket: %s", PRIVANE_LOG_PREFIX,
                  g_strerror(errno));
        return;
    }
    dog.period = static_cast<gint64>(time / SIGNS_PER_TIME);
    const gint64 timer_ms = std::clamp<gint64>(dog.period / 1000, 1, G_MAXINT);
    (void)g_timeout_add(static_cast<guint>(timer_ms), on_timer, nullptr);  // until the end
    give_sign();
}

void watchdog_feed() {
    if (dog.period > 0 && g_get_monotonic_time() >= dog.due)
        give_sign();
}
