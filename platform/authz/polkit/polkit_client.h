// platform/authz/polkit/polkit_client.h: a check of an action by polkit; internal.
#pragma once

#include <glib.h>

// True when the owner of the unique bus name may do the action; otherwise *error says why not.
// Both strings have been checked for their form.
bool polkit_client_check(const char *sender, const char *action_id, int deadline_ms,
                         GError **error);

// Closes the client; the next check opens it anew.
void polkit_client_release();
