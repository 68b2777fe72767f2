// platform/authz/authz.cpp: the authorization library's three functions, answered by polkit.
#include "platform/authz/authz.h"

#include <gio/gio.h>

#include "platform/authz/authz_error.h"
#include "platform/authz/polkit_client.h"
#include "platform/authz/service_probe.h"

// That of a check, AUTHZ_DEADLINE_MS, is the build's to choose.
static constexpr int INIT_DEADLINE_MS = 10 * 1000;

// Only a unique name stays with one caller; a well-known one may pass to another between question
// and answer.
static bool is_unique_name(const char *sender) {
    return sender != nullptr && g_dbus_is_unique_name(sender);
}

static bool is_action_id(const char *action_id) {
    if (action_id == nullptr || *action_id == '\0')
        return false;
    for (const char *p = action_id; *p != '\0'; ++p) {
        if (!g_ascii_isalnum(*p) && *p != '.' && *p != '-')
            return false;
    }
    return true;
}

int authz_init(GError **error) {
    return service_probe_run(INIT_DEADLINE_MS, error) ? 1 : 0;
}

int authz_check(const char *sender, const char *action_id, GError **error) {
    if (!is_action_id(action_id)) {
        g_set_error_literal(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_INVALID,
                            "cannot check an action whose ID has no valid form");
        return 0;
    }
    if (!is_unique_name(sender)) {
        g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_INVALID,
                    "cannot check action %s: the caller has no unique bus name", action_id);
        return 0;
    }
    return polkit_client_check(sender, action_id, AUTHZ_DEADLINE_MS, error) ? 1 : 0;
}

void authz_release(void) {
    polkit_client_release();
}
