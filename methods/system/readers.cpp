// methods/system/readers.cpp: small methods that read, start or relay something.
#include "methods/system/readers.h"

#include <algorithm>
#include <array>
#include <cerrno>

#include <linux/ethtool.h>
#include <linux/sockios.h>
#include <net/if.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <syslog.h>
#include <unistd.h>

#include "methods/system/text_answer.h"
#include "methods/text_file.h"
#include "service/method.h"

static constexpr const char *SLABINFO = "/proc/slabinfo";
static constexpr const char *NETWORK_INTERFACE = "eth0";
static constexpr const char *PINSRV = "/usr/bin/pinsrv";

// In Mbit/s; a link that reports another speed, as one that is down does, is an error.
static constexpr std::array<guint32, 5> known_speeds = {10, 100, 1000, 2500, 10000};

static bool answer_with_file(method_call &call, const char *path, text_completion complete) {
    g_autofree char *contents = nullptr;
    if (!read_text_file(path, &contents, &call.error))
        return pass_on(call, "");

    return answer_with_text(call, contents, complete);
}

bool handle_get_slabinfo(method_call &call) {
    return answer_with_file(call, SLABINFO, privane_system__complete_get_slabinfo);
}

// Deliberate: any path. The method's action is the only guard.
bool handle_read_log_file(method_call &call, const char *path) {
    return answer_with_file(call, path, privane_system__complete_read_log_file);
}

// Asks the kernel (ethtool.h: ETHTOOL_GSET). The ioctl's result, with errno set.
static int query_link(int socket_fd, struct ethtool_cmd *link) {
    struct ifreq request = {};
    link->cmd = ETHTOOL_GSET;
    (void)g_strlcpy(request.ifr_name, NETWORK_INTERFACE, sizeof request.ifr_name);
    request.ifr_data = reinterpret_cast<char *>(link);
    return ioctl(socket_fd, SIOCETHTOOL, &request);
}

bool handle_get_network_speed_duplex(method_call &call) {
    const int socket_fd = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    if (socket_fd < 0)
        return fail(call, PRIVANE_ERROR_SOCKET, "Failed to create socket");
    struct ethtool_cmd link = {};
    errno = 0;
    const int result = query_link(socket_fd, &link);
    const int saved_errno = errno;
    (void)close(socket_fd);  // nothing was sent

    const guint32 speed = ethtool_cmd_speed(&link);
    const bool is_known =
        std::find(known_speeds.begin(), known_speeds.end(), speed) != known_speeds.end();
    errno = saved_errno;
    if (result != 0 || !is_known)
        return fail(call, PRIVANE_ERROR_DEVICE_SETTINGS, "Cannot get device settings %d %m",
                    result);
    if (link.duplex != DUPLEX_HALF && link.duplex != DUPLEX_FULL)
        // Deliberate: the text ends with a line feed.
        return fail(call, PRIVANE_ERROR_DUPLEX, "Unknown! (%i)\n", link.duplex);

    // Deliberate: true is half duplex, and the mask is not made a 0 or 1.
    privane_system__complete_get_network_speed_duplex(call.skeleton, call.invocation, speed,
                                                      link.duplex == DUPLEX_HALF,
                                                      link.advertising & ADVERTISED_Autoneg);
    return true;
}

// The process ID, or -1.
static int start_pinsrv(const char *const *arguments) {
    if (!g_file_test(PINSRV, G_FILE_TEST_IS_EXECUTABLE)) {
        syslog(LOG_WARNING, "pinserver not found or not executable");
        return -1;
    }
    g_autoptr(GPtrArray) argv = g_ptr_array_new();
    g_ptr_array_add(argv, const_cast<char *>(PINSRV));
    // The caller's first element is its name for the program.
    if (arguments[0] != nullptr)
        for (const char *const *argument = arguments + 1; *argument != nullptr; argument++)
            g_ptr_array_add(argv, const_cast<char *>(*argument));
    g_ptr_array_add(argv, nullptr);

    GPid pid = -1;
    g_autoptr(GError) error = nullptr;
    if (!g_spawn_async(nullptr, reinterpret_cast<char **>(argv->pdata), nullptr, G_SPAWN_DEFAULT,
                       nullptr, nullptr, &pid, &error)) {
        g_warning("%sFailed to start pinsrv: %s", PRIVANE_LOG_PREFIX, error->message);
        return -1;
    }
    g_spawn_close_pid(pid);
    return pid;
}

bool handle_pinsrv(method_call &call, const char *const *arguments) {
    const int pid = start_pinsrv(arguments);

    privane_system__complete_pinsrv(call.skeleton, call.invocation, pid);
    return true;
}

bool handle_rtspread_config(method_call &call) {
    privane_system__emit_user_database_updated(call.skeleton);
    g_message("Emitted DBus signal to inform the user DB was updated.");

    privane_system__complete_rtspread_config(call.skeleton, call.invocation);
    return true;
}
