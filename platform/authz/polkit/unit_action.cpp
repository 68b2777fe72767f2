// platform/authz/polkit/unit_action.cpp: the actions whose ID ends in the name of a systemd unit.
#include "platform/authz/polkit/unit_action.h"

#include <cstddef>
#include <cstring>

static constexpr const char *PARENTS[] = {
    "com.zintor.privane-system.startservice",     "com.zintor.privane-system.stopservice",
    "com.zintor.privane-system.restartservice",   "com.zintor.privane-system.reloadservice",
    "com.zintor.privane-system.setdefaulttarget",
};

// What stands behind a template's name, where one action covers all of its instances.
static constexpr const char *ANY_INSTANCE = ".any";

// Null for an action that is no unit's.
static const char *find_parent(const char *action_id) {
    for (const char *parent : PARENTS) {
        const std::size_t length = std::strlen(parent);
        if (std::strncmp(action_id, parent, length) == 0 && action_id[length] == '.')
            return parent;
    }
    return nullptr;
}

// Null where the part of an ID cannot come from a unit's name, which has no dot of its own.
static char *name_unit(const char *part) {
    const char *dot = std::strchr(part, '.');

    if (dot == nullptr)
        return g_strdup(part);
    if (std::strcmp(dot, ANY_INSTANCE) != 0)
        return nullptr;
    return g_strdup_printf("%.*s@", static_cast<int>(dot - part), part);
}

bool unit_action_parse(const char *action_id, unit_action *out_action) {
    const char *parent = find_parent(action_id);
    char *unit = parent != nullptr ? name_unit(action_id + std::strlen(parent) + 1) : nullptr;

    if (unit == nullptr)
        return false;
    *out_action = {g_strdup(parent), unit};
    return true;
}

void unit_action_clear(unit_action *action) {
    g_clear_pointer(&action->parent, g_free);
    g_clear_pointer(&action->unit, g_free);
}
