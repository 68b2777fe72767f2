// methods/system/unit_control.cpp: the methods that control systemd units.
#include "methods/system/unit_control.h"

#include <cstring>

static constexpr std::size_t MAX_UNIT_LENGTH = 64;
static constexpr const char *UNIT_CHARACTERS = "-abcdefghijklmnopqrstuvwxyz0123456789@";
static constexpr char SUBSTITUTE = '!';

// Systemd's job mode: replaces a conflicting job that is queued.
static constexpr const char *JOB_MODE = "replace";

// A critical record in the manner of GLib's own preconditions, under the bare function name.
static bool is_given(const void *argument, const char *function, const char *expression) {
    if (argument == nullptr)
        g_return_if_fail_warning(G_LOG_DOMAIN, function, expression);
    return argument != nullptr;
}

bool privane_call_systemd(GDBusConnection *conn, const char *method, GVariant *args,
                          GError **error) {
    if (!is_given(conn, __func__, "conn != NULL") || !is_given(args, __func__, "args != NULL"))
        return false;

    g_autoptr(GVariant) reply =
        g_dbus_connection_call_sync(conn, "org.freedesktop.systemd1", "/org/freedesktop/systemd1",
                                    "org.freedesktop.systemd1.Manager", method, args, nullptr,
                                    G_DBUS_CALL_FLAGS_NONE, -1, nullptr, error);
    if (reply == nullptr)
        g_prefix_error(error, "%s failed, ", method);
    return reply != nullptr;
}

bool start_unit(GDBusConnection *conn, const char *unit, GError **error) {
    return privane_call_systemd(conn, "StartUnit", g_variant_new("(ss)", unit, JOB_MODE), error);
}

bool stop_unit(GDBusConnection *conn, const char *unit, GError **error) {
    return privane_call_systemd(conn, "StopUnit", g_variant_new("(ss)", unit, JOB_MODE), error);
}

bool restart_unit(GDBusConnection *conn, const char *unit, GError **error) {
    return privane_call_systemd(conn, "RestartUnit", g_variant_new("(ss)", unit, JOB_MODE), error);
}

bool reload_unit(GDBusConnection *conn, const char *unit, GError **error) {
    return privane_call_systemd(conn, "ReloadUnit", g_variant_new("(ss)", unit, JOB_MODE), error);
}

bool set_default_target(GDBusConnection *conn, const char *unit, GError **error) {
    const gboolean force = TRUE;
    return privane_call_systemd(conn, "SetDefaultTarget", g_variant_new("(sb)", unit, force),
                                error);
}

static const char *text_of(const GError *error) {
    return error != nullptr ? error->message : "unknown error";
}

static bool check_unit_name(method_call &call, const char *unit, int code) {
    if (std::strlen(unit) > MAX_UNIT_LENGTH)
        return fail(call, code, "Invalid unit '%s': %s", unit, "Name too long");
    g_autofree char *checked = g_strcanon(g_strdup(unit), UNIT_CHARACTERS, SUBSTITUTE);
    if (std::strchr(checked, SUBSTITUTE) != nullptr)
        return fail(call, code, "Invalid unit '%s': %s", unit, "Name contained invalid characters");
    return true;
}

// An instance is authorized for its whole template.
static bool is_authorized(method_call &call, const char *action, const char *unit) {
    g_autofree char *name = g_strdup(unit);
    char *instance = std::strchr(name, '@');
    if (instance != nullptr)
        *instance = '\0';
    g_autofree char *action_id = g_strdup_printf("%s%s.%s%s", ACTION_PREFIX.text, action, name,
                                                 instance != nullptr ? ".any" : "");
    return privane_check_auth(call.invocation, action_id, &call.error);
}

static bool act_on_unit(method_call &call, const char *action, const char *unit, const char *suffix,
                        manager_call act, int code) {
    g_autofree char *full_name = g_strconcat(unit, suffix, nullptr);
    g_autoptr(GError) cause = nullptr;
    if (act(call.state->connection, full_name, &cause))
        return true;
    return fail(call, code, "Action %s on %s failed: %s", action, unit, text_of(cause));
}

gboolean privane_handle_unit_action(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                                    const char *action, const char *unit, const char *suffix,
                                    manager_call call, unit_completion complete, int code,
                                    ServiceState *state) {
    if (!is_given(unit, __func__, "unit != NULL"))
        return FALSE;

    method_call request = {skeleton, invocation, state, nullptr};
    if (check_unit_name(request, unit, code) && is_authorized(request, action, unit) &&
        act_on_unit(request, action, unit, suffix, call, code))
        complete(skeleton, invocation);
    else
        privane_return_error(invocation, g_steal_pointer(&request.error));
    return TRUE;
}

bool act_on_fixed_unit(method_call &call, const fixed_unit &row) {
    g_autoptr(GError) cause = nullptr;
    if (!row.call(call.state->connection, row.unit, &cause))
        return fail(call, row.code, "%s: %s", row.failure, text_of(cause));

    row.complete(call.skeleton, call.invocation);
    return true;
}
