// platform/authz/polkit/polkit_client.cpp: which questions a check asks on the process's
// connection, and how their answers are worded.
#include "platform/authz/polkit/polkit_client.h"

#include <cstring>

#include <gio/gio.h>

#include "platform/authz/authz_error.h"
#include "platform/authz/polkit/polkit_question.h"
#include "platform/authz/polkit/unit_action.h"

static constexpr const char *POLKIT_ERRORS = "org.freedesktop.PolicyKit1.Error.";

// For what the bus itself is asked besides, which it knows at once.
static constexpr int BUS_DEADLINE_MS = 1000;

static polkit_channel channel;

// The bus connection is the program's shared one: with one of its own, the checks would still go
// through while the program's is down.
static bool open_bus(GError **error) {
    if (channel.bus == nullptr)
        channel.bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error);
    if (channel.context == nullptr)
        channel.context = g_main_context_new();
    return channel.bus != nullptr;
}

// Whether the question went to a polkit that was just being replaced. One that has given up its
// name and not yet gone, the bus does not let anybody call.
static bool is_stale_owner(const GError *error) {
    return g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_NO_REPLY) ||
           g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_ACCESS_DENIED);
}

static bool ask(const polkit_question &asked, polkit_answer *out_answer, GError **error) {
    g_autoptr(GError) first_error = nullptr;

    if (polkit_question_ask(channel, asked, out_answer, &first_error))
        return true;
    if (!is_stale_owner(first_error)) {
        g_propagate_error(error, g_steal_pointer(&first_error));
        return false;
    }
    return polkit_question_ask(channel, asked, out_answer, error);
}

static bool is_of_polkit(const GError *error) {
    g_autofree char *name = g_dbus_error_get_remote_error(error);
    return name != nullptr && g_str_has_prefix(name, POLKIT_ERRORS);
}

// Polkit tells an action that no .policy file declares by its text alone.
static bool is_undeclared(const GError *error, const char *action_id) {
    g_autoptr(GError) told = g_error_copy(error);
    g_autofree char *text = g_strdup_printf("Action %s is not registered", action_id);

    (void)g_dbus_error_strip_remote_error(told);  // A local error has nothing to strip.
    return is_of_polkit(error) && std::strcmp(told->message, text) == 0;
}

// A unit's own action counts where it is declared. Where it is not, its parent decides, by rules
// that look at the details.
static bool ask_of_unit(const polkit_question &asked, polkit_answer *out_answer, GError **error) {
    g_auto(unit_action) action = {};
    g_autoptr(GError) cause = nullptr;

    if (ask(asked, out_answer, &cause))
        return true;
    if (!is_undeclared(cause, asked.action_id) || !unit_action_parse(asked.action_id, &action)) {
        g_propagate_error(error, g_steal_pointer(&cause));
        return false;
    }
    return ask({asked.sender, action.parent, action.unit, asked.action_id, asked.deadline},
               out_answer, error);
}

static bool find_uid(const char *sender, guint32 *out_uid) {
    g_autoptr(GVariant) reply = g_dbus_connection_call_sync(
        channel.bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
        "GetConnectionUnixUser", g_variant_new("(s)", sender), G_VARIANT_TYPE("(u)"),
        G_DBUS_CALL_FLAGS_NONE, BUS_DEADLINE_MS, nullptr, nullptr);

    if (reply == nullptr)
        return false;
    g_variant_get(reply, "(u)", out_uid);
    return true;
}

static void set_refusal(const char *sender, const char *action_id, polkit_answer answer,
                        GError **error) {
    const char *reason =
        answer == polkit_answer::NEEDS_PASSWORD ? " without a password, which cannot be given" : "";
    guint32 uid = 0;

    if (find_uid(sender, &uid))
        g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_REFUSED,
                    "action %s is refused to uid %" G_GUINT32_FORMAT "%s", action_id, uid, reason);
    else
        g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_REFUSED,
                    "action %s is refused to %s, whose uid is not known%s", action_id, sender,
                    reason);
}

// The errors of polkit and GDBus have domains that GDBus would map to its own names.
static void set_failure(const char *action_id, gint64 deadline, GError *cause, GError **error) {
    int code = AUTHZ_ERROR_UNREACHABLE;
    const char *reason = nullptr;

    if (is_of_polkit(cause)) {
        code = AUTHZ_ERROR_FAILED;
    } else if (g_error_matches(cause, G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT)) {
        code = AUTHZ_ERROR_FAILED;
        reason = "the answer has no valid form";
    } else if (g_error_matches(cause, G_IO_ERROR, G_IO_ERROR_TIMED_OUT) ||
               // So many earlier questions are still unanswered.
               g_error_matches(cause, G_DBUS_ERROR, G_DBUS_ERROR_LIMITS_EXCEEDED) ||
               polkit_question_remaining_ms(deadline) == 0) {
        code = AUTHZ_ERROR_TIMED_OUT;
        reason = "no answer in time";
    }
    // What the bus told polkit comes with the name of that error too.
    while (g_dbus_error_strip_remote_error(cause)) {
    }
    g_set_error(error, AUTHZ_ERROR_DOMAIN, code, "cannot check action %s: %s", action_id,
                reason != nullptr ? reason : cause->message);
}

bool polkit_client_check(const char *sender, const char *action_id, int deadline_ms,
                         GError **error) {
    const gint64 deadline = g_get_monotonic_time() + gint64{deadline_ms} * 1000;
    polkit_answer answer = polkit_answer::REFUSED;
    g_autoptr(GError) cause = nullptr;

    if (!open_bus(&cause) ||
        !ask_of_unit({sender, action_id, nullptr, nullptr, deadline}, &answer, &cause)) {
        set_failure(action_id, deadline, cause, error);
        return false;
    }
    if (answer != polkit_answer::ALLOWED)
        set_refusal(sender, action_id, answer, error);
    return answer == polkit_answer::ALLOWED;
}

void polkit_client_release() {
    g_clear_object(&channel.bus);
    g_clear_pointer(&channel.context, g_main_context_unref);
}
