// platform/authz/authz_form.cpp: the form of what a check is asked about.
#include "platform/authz/authz_form.h"

#include <gio/gio.h>

#include "platform/authz/authz_error.h"

// Only a unique name stays with one caller; a well-known one may pass to another between question
// and answer.
static bool is_unique_name(const char *sender) {
    return sender != nullptr && g_dbus_is_unique_name(sender);
}

bool authz_has_action_form(const char *action_id) {
    if (action_id == nullptr || *action_id == '\0')
        return false;
    for (const char *p = action_id; *p != '\0'; ++p) {
        if (!g_ascii_isalnum(*p) && *p != '.' && *p != '-')
            return false;
    }
    return true;
}

bool authz_check_form(const char *sender, const char *action_id, GError **error) {
    if (!authz_has_action_form(action_id)) {
        g_set_error_literal(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_INVALID,
                            "cannot check an action whose ID has no valid form");
        return false;
    }
    if (!is_unique_name(sender)) {
        g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_INVALID,
                    "cannot check action %s: the caller has no unique bus name", action_id);
        return false;
    }
    return true;
}
