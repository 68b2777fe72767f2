// platform/authz/polkit/unit_action.h: the actions whose ID ends in the name of a systemd unit;
// internal.
#pragma once

#include <glib.h>

struct unit_action {
    char *parent;  // the ID without the unit, a declared action
    char *unit;    // the unit's name without its suffix; of a template, with "@" behind it
};

// False, with nothing to clear, for an ID that is no unit's.
bool unit_action_parse(const char *action_id, unit_action *out_action);

void unit_action_clear(unit_action *action);

G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(unit_action, unit_action_clear)
