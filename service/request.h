// service/request.h: authorization of a request, the service's error codes, and the error reply.
#pragma once

#include <gio/gio.h>

// Stands in front of every warning that a method logs and of every fatal start-up text.
inline constexpr const char *PRIVANE_LOG_PREFIX = "";

// The domain "privaneSystemError". It is not registered with GDBus: callers see its name and the
// code in the name of the D-Bus error. The numbers reach bus callers and never change.
enum privane_error {
    PRIVANE_ERROR_SOCKET = 0,
    PRIVANE_ERROR_DEVICE_SETTINGS = 1,
    PRIVANE_ERROR_DUPLEX = 2,
    PRIVANE_ERROR_NO_USER = 5,
    PRIVANE_ERROR_NO_HASH = 6,
    PRIVANE_ERROR_WRONG_PASSWORD = 7,
    PRIVANE_ERROR_ADJUST_CLOCK = 8,
    PRIVANE_ERROR_TIME_SYNC = 9,
    PRIVANE_ERROR_USER_ARGUMENT = 14,
    PRIVANE_ERROR_CHIP = 15,
    PRIVANE_ERROR_READ_BOOTBLOCK = 16,
    PRIVANE_ERROR_WRITE_BOOTBLOCK = 17,
    PRIVANE_ERROR_START_NTP = 21,
    PRIVANE_ERROR_RESTART_NTP = 22,
    PRIVANE_ERROR_STOP_NTP = 23,
    PRIVANE_ERROR_DIGEST = 24,
    PRIVANE_ERROR_UNKNOWN = 25,
    PRIVANE_ERROR_START_LENSD = 26,
    PRIVANE_ERROR_STOP_LENSD = 27,
    PRIVANE_ERROR_NETWORK_INFO = 28,
    PRIVANE_ERROR_START_SERVICE = 29,
    PRIVANE_ERROR_STOP_SERVICE = 30,
    PRIVANE_ERROR_RESTART_SERVICE = 31,
    PRIVANE_ERROR_RELOAD_SERVICE = 32,
    PRIVANE_ERROR_SET_DEFAULT_TARGET = 33,
    PRIVANE_ERROR_EXECUTE_ETHTOOL = 35,
    PRIVANE_ERROR_EXECUTE_SMARTCTL = 36,
    PRIVANE_ERROR_EXECUTE_LLDPCLI = 37,
};

#define PRIVANE_ERROR privane_system_error_quark()
GQuark privane_system_error_quark();

// Whether the caller may perform the action. If not, a refusal that gave a reason is logged and the
// error begins with "Authorization check failed: "; *error stays null where none was given.
gboolean privane_check_auth(GDBusMethodInvocation *invocation, const char *action_id,
                            GError **error);

// Answers the call with the error's domain, code and text, or with PRIVANE_ERROR_UNKNOWN without
// one. Takes the error.
void privane_return_error(GDBusMethodInvocation *invocation, GError *error);
