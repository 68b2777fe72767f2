// service/request.cpp: authorization of a request and the error reply.
#include "service/request.h"

#include "platform/authz/authz.h"
#include "service/reply.h"
#include "service/watchdog.h"

G_DEFINE_QUARK(privaneSystemError, privane_system_error)

gboolean privane_check_auth(GDBusMethodInvocation *invocation, const char *action_id,
                            GError **error) {
    watchdog_feed();
    const char *sender = g_dbus_method_invocation_get_sender(invocation);
    if (authz_check(sender, action_id, error) != 0)
        return TRUE;

    g_prefix_error(error, "Authorization check failed: ");
    if (error != nullptr && *error != nullptr)
        g_log(G_LOG_DOMAIN, G_LOG_LEVEL_WARNING, "%s%s", PRIVANE_LOG_PREFIX, (*error)->message);
    return FALSE;
}

void privane_return_error(GDBusMethodInvocation *invocation, GError *error) {
    if (error == nullptr) {
        g_dbus_method_invocation_return_error(invocation, PRIVANE_ERROR, PRIVANE_ERROR_UNKNOWN,
                                              "Unknown");
        return;
    }

    g_autoptr(GError) owned = error;
    g_autofree char *text = sendable_text(owned->message);
    g_autoptr(GError) too_large = nullptr;
    if (check_reply_size(wire_size(text), &too_large)) {
        g_dbus_method_invocation_return_error(invocation, owned->domain, owned->code, "%s", text);
        return;
    }
    g_log(G_LOG_DOMAIN, G_LOG_LEVEL_WARNING, "%s%s", PRIVANE_LOG_PREFIX, too_large->message);
    g_dbus_method_invocation_return_gerror(invocation, too_large);
}
