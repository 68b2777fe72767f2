// service/request.h: authorization of a request, the service's error codes, and the error reply.
#pragma once

#include <gio/gio.h>

// Stands in front of every warning that a method logs and of every fatal start-up text.
inline constexpr const char *PRIVANE_LOG_PREFIX = "";

// The domain "privaneSystemError". It is not registered with GDBus: callers see its name and the
// code in the name of the D-Bus error. The numbers reach bus callers and never change.
enum privane_error {
    PRIVANE_ERROR_SOCKET = 0,               // no socket could be made
    PRIVANE_ERROR_DEVICE_SETTINGS = 1,      // the link is not told, or has an unknown speed
    PRIVANE_ERROR_DUPLEX = 2,               // the link has neither duplex mode
    PRIVANE_ERROR_NO_USER = 5,              // a password check found no such account
    PRIVANE_ERROR_NO_HASH = 6,              // the account has no hash
    PRIVANE_ERROR_WRONG_PASSWORD = 7,       // the password is wrong
    PRIVANE_ERROR_ADJUST_CLOCK = 8,         // the kernel refused to slew the clock
    PRIVANE_ERROR_TIME_SYNC = 9,            // the time daemon's hook failed
    PRIVANE_ERROR_USER_ARGUMENT = 14,       // no name, or of no account
    PRIVANE_ERROR_CHIP = 15,                // there is no boot block
    PRIVANE_ERROR_READ_BOOTBLOCK = 16,      // the boot block could not be read
    PRIVANE_ERROR_WRITE_BOOTBLOCK = 17,     // the boot block could not be written
    PRIVANE_ERROR_START_NTP = 21,           // ntp.service could not be started
    PRIVANE_ERROR_RESTART_NTP = 22,         // ntp.service could not be restarted
    PRIVANE_ERROR_STOP_NTP = 23,            // ntp.service could not be stopped
    PRIVANE_ERROR_DIGEST = 24,              // the digest file did not follow, or wrong arguments
    PRIVANE_ERROR_UNKNOWN = 25,             // a failure without a reason
    PRIVANE_ERROR_START_LENSD = 26,         // lensd.service could not be started
    PRIVANE_ERROR_STOP_LENSD = 27,          // lensd.service could not be stopped
    PRIVANE_ERROR_NETWORK_INFO = 28,        // unknown mode, or netstat failed
    PRIVANE_ERROR_START_SERVICE = 29,       // unusable unit name, or systemd refused
    PRIVANE_ERROR_STOP_SERVICE = 30,        // unusable unit name, or systemd refused
    PRIVANE_ERROR_RESTART_SERVICE = 31,     // unusable unit name, or systemd refused
    PRIVANE_ERROR_RELOAD_SERVICE = 32,      // unusable unit name, or systemd refused
    PRIVANE_ERROR_SET_DEFAULT_TARGET = 33,  // unusable target name, or systemd refused
    PRIVANE_ERROR_EXECUTE_ETHTOOL = 35,     // flag or interface not on the list
    PRIVANE_ERROR_EXECUTE_SMARTCTL = 36,    // flag or device not on the list
    PRIVANE_ERROR_EXECUTE_LLDPCLI = 37,     // command not on the list
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
