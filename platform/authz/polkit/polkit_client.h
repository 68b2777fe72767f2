// platform/authz/polkit/polkit_client.h: questions to polkit, each with a deadline; internal.
#pragma once

#include <glib.h>

// Polkit's name on the bus, the service that decides.
inline constexpr const char *POLKIT_NAME = "org.freedesktop.PolicyKit1";

// True when the owner of the unique bus name may do the action; otherwise *error says why not.
// Both strings have been checked for their form.
bool polkit_client_check(const char *sender, const char *action_id, int deadline_ms,
                         GError **error);

// Closes the client; the next check opens it anew.
void polkit_client_release();
