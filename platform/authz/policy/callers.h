// platform/authz/policy/callers.h: who owns a unique bus name, asked of the bus once; internal.
#pragma once

#include <glib.h>

#include "platform/authz/policy/policy_file.h"

// How many are remembered; above that the bus is asked about the one that was asked first again.
inline constexpr guint CALLERS_REMEMBERED = 256;

// False with *error set, which names the action, where the bus does not tell in time, or does not
// know the name. What was found is valid until the next call or the next turn of the main loop.
bool callers_find(const char *sender, const char *action_id, int deadline_ms,
                  policy_caller *out_caller, GError **error);

// Forgets all of them and lets go of the bus; the next search opens it anew.
void callers_release();
