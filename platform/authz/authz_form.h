// platform/authz/authz_form.h: the form of what a check is asked about; internal.
#pragma once

#include <glib.h>

// Whether the bytes, of which there is one at least, may stand in an action ID.
bool authz_has_action_form(const char *action_id);

// False with *error set unless the sender is a unique bus name and the action has the form of one.
// Either may be null.
bool authz_check_form(const char *sender, const char *action_id, GError **error);
