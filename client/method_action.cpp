// client/method_action.cpp: the polkit actions of the methods.
#include "client/method_action.h"

#include <algorithm>
#include <cstring>

#include "client/client_error.h"
#include "client/unit_name.h"

static constexpr const char *PREFIX = "com.zintor.privane-system.";

// What an action depends on.
enum class detail_kind { SERVICE, TARGET, MODE };

struct special_method {
    const char *method;
    const char *action;
    bool has_detail;
    detail_kind detail;
};

static constexpr special_method SPECIAL_METHODS[] = {
    {"AddSystemUser",        "adduser",              false, detail_kind::MODE   },
    {"GetActiveNetworkInfo", "getactivenetworkinfo", true,  detail_kind::MODE   },
    {"StartService",         "startservice",         true,  detail_kind::SERVICE},
    {"StopService",          "stopservice",          true,  detail_kind::SERVICE},
    {"RestartService",       "restartservice",       true,  detail_kind::SERVICE},
    {"ReloadService",        "reloadservice",        true,  detail_kind::SERVICE},
    {"SetDefaultTarget",     "setdefaulttarget",     true,  detail_kind::TARGET },
};

static constexpr const char *ROOT_ACTIONS[] = {
    "adduser", "adduiduser",        "modifyuser",  "chpasswduser",
    "digest",  "addbootblockparam", "readlogfile", "pinsrv",
};

static const special_method *find_special(const char *method) {
    for (const special_method &row : SPECIAL_METHODS)
        if (std::strcmp(row.method, method) == 0)
            return &row;
    return nullptr;
}

// All instances of a template have one action.
static void set_unit_action(const char *action, const char *unit, method_action *out_action) {
    const char *at = std::strchr(unit, '@');
    g_autofree char *name =
        at != nullptr ? g_strndup(unit, static_cast<gsize>(at - unit)) : nullptr;

    out_action->parent = g_strconcat(PREFIX, action, nullptr);
    out_action->unit = name != nullptr ? g_strconcat(name, "@", nullptr) : g_strdup(unit);
    out_action->id = name != nullptr ? g_strconcat(PREFIX, action, ".", name, ".any", nullptr)
                                     : g_strconcat(PREFIX, action, ".", unit, nullptr);
}

static bool find_with_detail(const special_method &row, const char *detail,
                             method_action *out_action, GError **error) {
    const bool is_target = row.detail == detail_kind::TARGET;

    if (row.detail == detail_kind::MODE) {
        if (g_strcmp0(detail, "all") != 0 && g_strcmp0(detail, "tcp-udp") != 0)
            return fail_usage(error, "the action of %s depends on its mode: all or tcp-udp",
                              row.method);
        out_action->id = g_strconcat(PREFIX, row.action, ".", detail, nullptr);
        return true;
    }
    if (detail == nullptr)
        return fail_usage(error, "the action of %s depends on the %s", row.method,
                          is_target ? "target" : "unit");
    g_autofree char *unit = unit_without_suffix(detail, is_target ? ".target" : ".service");
    if (!is_unit_name(unit))
        return fail_usage(error, "the service acts on no unit of the name '%s'", unit);
    set_unit_action(row.action, unit, out_action);
    return true;
}

bool method_action_find(const GDBusMethodInfo *method, const char *detail,
                        method_action *out_action, GError **error) {
    const special_method *special = find_special(method->name);
    g_auto(method_action) action = {};

    if (special != nullptr && special->has_detail) {
        if (!find_with_detail(*special, detail, &action, error))
            return false;
    } else {
        if (detail != nullptr)
            return fail_usage(error, "the action of %s depends on nothing", method->name);
        g_autofree char *lower = g_ascii_strdown(method->name, -1);
        action.id = g_strconcat(PREFIX, special != nullptr ? special->action : lower, nullptr);
    }
    *out_action = action;
    action = {};
    return true;
}

void method_action_clear(method_action *action) {
    g_clear_pointer(&action->id, g_free);
    g_clear_pointer(&action->parent, g_free);
    g_clear_pointer(&action->unit, g_free);
}

bool method_action_amounts_to_root(const method_action &action) {
    const char *name = action.id + std::strlen(PREFIX);

    return std::ranges::any_of(ROOT_ACTIONS,
                               [name](const char *other) { return std::strcmp(name, other) == 0; });
}

// The role bears a name that no other has: a repeated one would make the file no policy.
char *method_action_example_role(const method_action &action, const char *user) {
    const char *name = action.id + std::strlen(PREFIX);

    return g_strdup_printf("[role %s-%s]\nusers=%s\nactions=%s\n", name, user, user, action.id);
}

char *method_action_example_rule(const method_action &action, const char *user) {
    GString *rule = g_string_new("polkit.addRule(function (action, subject) {\n");

    if (action.parent == nullptr)
        g_string_append_printf(rule, "    if (action.id === \"%s\" &&\n", action.id);
    else
        g_string_append_printf(
            rule,
            "    if (action.id === \"%s\" &&\n        action.lookup(\"unit\") === \"%s\" &&\n",
            action.parent, action.unit);
    g_string_append_printf(rule,
                           "        subject.user === \"%s\") {\n"
                           "        return polkit.Result.YES;\n"
                           "    }\n"
                           "    return polkit.Result.NOT_HANDLED;\n"
                           "});\n",
                           user);
    return g_string_free(rule, FALSE);
}
