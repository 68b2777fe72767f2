// client/explain.cpp: tells the action of a method, whether the caller may perform it, and what
// would grant it.
#include "client/explain.h"

#include "client/client_error.h"
#include "client/decision.h"
#include "client/json_output.h"
#include "client/method_action.h"
#include "client/table_output.h"
#include "client/verbs.h"

// Whether the bus lets the caller send to the service, whatever else is decided.
enum class door { OPEN, CLOSED, UNTOLD };

struct finding {
    verdict allowed;
    char *reason;
    char *grant;  // what has to be granted, and where; null where nothing has
    char *rule;   // its text, if it has one
};

static void finding_clear(finding *found) {
    g_clear_pointer(&found->reason, g_free);
    g_clear_pointer(&found->grant, g_free);
    g_clear_pointer(&found->rule, g_free);
}
G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(finding, finding_clear)

// Only a service that runs is asked: a question starts nothing. Of one that does not, the bus tells
// that before it looks at who asks.
static door find_door(const session &run, GDBusConnection *bus) {
    g_autoptr(GError) error = nullptr;
    g_autoptr(GVariant) answer = g_dbus_connection_call_sync(
        bus, SERVICE_NAME, SERVICE_PATH, "org.freedesktop.DBus.Peer", "Ping", nullptr, nullptr,
        G_DBUS_CALL_FLAGS_NO_AUTO_START, run.line->timeout_ms, nullptr, &error);

    if (answer != nullptr)
        return door::OPEN;
    return g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_ACCESS_DENIED) ? door::CLOSED
                                                                            : door::UNTOLD;
}

// What would change the decision; nothing where it is not known by what it is made.
static void find_rule(const method_action &action, const decision &made, finding *found) {
    if (made.by == decider::UNTOLD) {
        found->grant = g_strdup("what the device's own authorization library asks");
        return;
    }
    const bool is_role = made.by == decider::POLICY_FILE;
    found->grant = g_strdup_printf(
        "this %s in %s%s", is_role ? "role" : "rule",
        is_role ? made.policy_file : "/etc/polkit-1/rules.d",
        method_action_amounts_to_root(action) ? ", which amounts to making root" : "");
    if (is_role) {
        found->rule = method_action_example_role(action, g_get_user_name());
        return;
    }
    // An action that polkit knows is decided by its own ID.
    const bool is_declared = g_strcmp0(made.asked, action.id) == 0;
    const method_action asked = is_declared ? method_action{action.id, nullptr, nullptr} : action;
    found->rule = method_action_example_rule(asked, g_get_user_name());
}

static void judge(const method_action &action, const decision &made, door entrance,
                  finding *found) {
    found->allowed = made.allowed;
    if (made.allowed != verdict::YES)
        find_rule(action, made, found);
    if (entrance == door::CLOSED) {
        found->allowed = verdict::NO;
        found->reason = g_strdup("the bus lets only root and the group privane call the service");
        g_autofree char *more = found->grant;
        found->grant = more != nullptr
                           ? g_strconcat("membership in the group privane, and ", more, nullptr)
                           : g_strdup("membership in the group privane");
    } else if (entrance == door::UNTOLD && made.allowed == verdict::YES) {
        found->allowed = verdict::UNKNOWN;
        found->reason = g_strdup_printf(
            "%s; whether the bus does is told only while the service runs", made.reason);
    } else {
        found->reason = g_strdup(made.reason);
    }
}

static const char *word_of(verdict allowed) {
    switch (allowed) {
        case verdict::YES:
            return "yes";
        case verdict::NO:
            return "no";
        case verdict::UNKNOWN:
            break;
    }
    return "unknown";
}

static void set_text(JsonObject *object, const char *name, const char *text) {
    if (text != nullptr)
        json_object_set_string_member(object, name, text);
    else
        json_object_set_null_member(object, name);
}

static char *format_json(const session &run, const GDBusMethodInfo *method,
                         const method_action &action, const finding &found) {
    g_autoptr(JsonObject) object = json_object_new();

    json_object_set_string_member(object, "method", method->name);
    json_object_set_string_member(object, "action", action.id);
    json_object_set_string_member(object, "allowed", word_of(found.allowed));
    json_object_set_string_member(object, "reason", found.reason);
    json_object_set_boolean_member(object, "amounts_to_root",
                                   method_action_amounts_to_root(action));
    set_text(object, "grant", found.grant);
    set_text(object, "rule", found.rule);
    g_autoptr(JsonNode) node = json_node_new(JSON_NODE_OBJECT);
    json_node_set_object(node, object);
    return json_format(node, run.line->json);
}

static char *format_text(const GDBusMethodInfo *method, const method_action &action,
                         const finding &found) {
    g_autofree char *allowed = g_strdup_printf("%s (%s)", word_of(found.allowed), found.reason);
    const char *granted = found.grant != nullptr ? "Granted by" : nullptr;
    const char *labels[] = {"Method", "Action", "Allowed", granted, nullptr};
    const char *values[] = {method->name, action.id, allowed, found.grant, nullptr};
    g_autofree char *record =
        record_format(const_cast<char **>(labels), const_cast<char **>(values));

    return g_strconcat(record, found.rule != nullptr ? "\n" : "",
                       found.rule != nullptr ? found.rule : "", nullptr);
}

bool run_explain(const session &run, GError **error) {
    const char *name = word_at(*run.line, 1);
    const GDBusMethodInfo *method = method_find(name);
    g_auto(method_action) action = {};
    g_auto(decision) made = {};
    g_auto(finding) found = {};

    if (method == nullptr)
        return fail_usage(error, "no method is named '%s'", name);
    if (!method_action_find(method, word_at(*run.line, 2), &action, error))
        return false;
    authorization library;
    g_autoptr(GDBusConnection) bus = session_connect(error);
    if (bus == nullptr)
        return false;
    library.decide(bus, action.id, &made);
    judge(action, made, find_door(run, bus), &found);

    g_autofree char *text = run.line->json == json_mode::OFF
                                ? format_text(method, action, found)
                                : format_json(run, method, action, found);
    return session_print(text, error);
}
