// methods/system/unit_control.h: the methods that control systemd units.
#pragma once

#include <gio/gio.h>

#include "privane_system_binding.h"
#include "service/method.h"

// Calls a method of systemd's manager and drops its reply. Floating arguments are consumed. The
// error is GDBus's behind "%s failed, " and the method.
bool privane_call_systemd(GDBusConnection *conn, const char *method, GVariant *args,
                          GError **error);

// The manager calls, each with a unit's full name.
using manager_call = bool (*)(GDBusConnection *conn, const char *unit, GError **error);
bool start_unit(GDBusConnection *conn, const char *unit, GError **error);
bool stop_unit(GDBusConnection *conn, const char *unit, GError **error);
bool restart_unit(GDBusConnection *conn, const char *unit, GError **error);
bool reload_unit(GDBusConnection *conn, const char *unit, GError **error);
bool set_default_target(GDBusConnection *conn, const char *unit, GError **error);

using unit_completion = void (*)(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation);

// A method that acts on a unit of the caller's choice.
struct unit_job {
    const char *action;
    const char *suffix;
    manager_call call;
    unit_completion complete;
    int code;
};

inline constexpr unit_job start_service = {"startservice", ".service", start_unit,
                                           privane_system__complete_start_service,
                                           PRIVANE_ERROR_START_SERVICE};
inline constexpr unit_job stop_service = {"stopservice", ".service", stop_unit,
                                          privane_system__complete_stop_service,
                                          PRIVANE_ERROR_STOP_SERVICE};
inline constexpr unit_job restart_service = {"restartservice", ".service", restart_unit,
                                             privane_system__complete_restart_service,
                                             PRIVANE_ERROR_RESTART_SERVICE};
inline constexpr unit_job reload_service = {"reloadservice", ".service", reload_unit,
                                            privane_system__complete_reload_service,
                                            PRIVANE_ERROR_RELOAD_SERVICE};
inline constexpr unit_job default_target = {"setdefaulttarget", ".target", set_default_target,
                                            privane_system__complete_set_default_target,
                                            PRIVANE_ERROR_SET_DEFAULT_TARGET};

// The whole of such a method: checks the name, authorizes for the unit, or for the template of an
// instance, acts and answers. FALSE without an answer for an absent unit only.
gboolean privane_handle_unit_action(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                                    const char *action, const char *unit, const char *suffix,
                                    manager_call call, unit_completion complete, int code,
                                    ServiceState *state);

template <const unit_job &row>
struct served_unit_job {
    static gboolean serve(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                          const char *unit, ServiceState *state) {
        return privane_handle_unit_action(skeleton, invocation, row.action, unit, row.suffix,
                                          row.call, row.complete, row.code, state);
    }

    static void connect(const char *signal, ServiceState *state) {
        connect_method(signal, G_CALLBACK(serve), state);
    }
};

// The row of a method that acts on a unit of the caller's choice.
template <const unit_job &row>
consteval method_row unit_method(const char *signal) {
    return {signal, served_unit_job<row>::connect};
}

// A method that acts on one unit of the device.
struct fixed_unit {
    const char *unit;
    manager_call call;
    unit_completion complete;
    int code;
    const char *failure;
};

inline constexpr fixed_unit start_ntp = {"ntp.service", start_unit,
                                         privane_system__complete_start_ntp,
                                         PRIVANE_ERROR_START_NTP, "Failed to start ntp service"};
inline constexpr fixed_unit restart_ntp = {
    "ntp.service", restart_unit, privane_system__complete_restart_ntp, PRIVANE_ERROR_RESTART_NTP,
    "Failed to restart ntp service"};
inline constexpr fixed_unit stop_ntp = {"ntp.service", stop_unit, privane_system__complete_stop_ntp,
                                        PRIVANE_ERROR_STOP_NTP, "Failed to stop ntp service"};
inline constexpr fixed_unit start_lensd = {
    "lensd.service", start_unit, privane_system__complete_start_lensd, PRIVANE_ERROR_START_LENSD,
    "Failed to start lensd service"};
inline constexpr fixed_unit stop_lensd = {"lensd.service", stop_unit,
                                          privane_system__complete_stop_lensd,
                                          PRIVANE_ERROR_STOP_LENSD, "Failed to stop lensd service"};

bool act_on_fixed_unit(method_call &call, const fixed_unit &row);

template <const fixed_unit &row>
bool handle_fixed_unit(method_call &call) {
    return act_on_fixed_unit(call, row);
}
