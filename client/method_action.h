// client/method_action.h: the polkit actions of the methods.
#pragma once

#include <gio/gio.h>

struct method_action {
    char *id;
    char *parent;  // of a unit's action: what is asked for where id is not declared; else null
    char *unit;    // and the detail "unit" of that question
};

// detail: the unit, target or mode of the methods whose actions depend on one, null for the others.
// False with a usage error.
bool method_action_find(const GDBusMethodInfo *method, const char *detail,
                        method_action *out_action, GError **error);

void method_action_clear(method_action *action);
G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(method_action, method_action_clear)

// Whether who may perform it can become root by that.
bool method_action_amounts_to_root(const method_action &action);

// A rule of polkit's that grants the action, for the administrator to adapt.
char *method_action_example_rule(const method_action &action, const char *user);

// A role of the policy file's that grants it, likewise.
char *method_action_example_role(const method_action &action, const char *user);
