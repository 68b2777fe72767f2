// client/explain.cpp: tells the action of a method, whether the caller may perform it, and what
// would grant it.
#include "client/explain.h"

#include <cstring>

#include <unistd.h>

#include "client/client_error.h"
#include "client/json_output.h"
#include "client/method_action.h"
#include "client/table_output.h"
#include "client/verbs.h"
#include "output/display_text.h"

enum class verdict { YES, NO, UNKNOWN };

struct finding {
    verdict allowed;
    char *reason;
    bool is_declared;  // a unit's action: a rule has to look at it alone
};

static void finding_clear(finding *found) {
    g_clear_pointer(&found->reason, g_free);
}
G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(finding, finding_clear)

static constexpr const char *POLKIT = "org.freedesktop.PolicyKit1";

static void find(finding *found, verdict allowed, const char *reason) {
    g_free(found->reason);
    found->allowed = allowed;
    found->reason = g_strdup(reason);
}

static void find_error(finding *found, const char *who, GError *error) {
    (void)g_dbus_error_strip_remote_error(error);  // A local error has nothing to strip.
    g_autofree char *reason = g_strdup_printf("%s: %s", who, error->message);
    find(found, verdict::UNKNOWN, reason);
}

// The bus lets only some send to the service, whatever polkit says.
static bool is_shut_out(const session &run, GDBusConnection *bus) {
    g_autoptr(GError) error = nullptr;
    g_autoptr(GVariant) answer = g_dbus_connection_call_sync(
        bus, SERVICE_NAME, SERVICE_PATH, "org.freedesktop.DBus.Peer", "Ping", nullptr, nullptr,
        G_DBUS_CALL_FLAGS_NO_AUTO_START, run.line->timeout_ms, nullptr, &error);

    return answer == nullptr && g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_ACCESS_DENIED);
}

static GVariant *question_of(GDBusConnection *bus, const char *action, const char *unit,
                             const char *unit_action) {
    GVariantBuilder identity;
    GVariantBuilder details;

    g_variant_builder_init(&identity, G_VARIANT_TYPE("a{sv}"));
    g_variant_builder_add(&identity, "{sv}", "name",
                          g_variant_new_string(g_dbus_connection_get_unique_name(bus)));
    g_variant_builder_init(&details, G_VARIANT_TYPE("a{ss}"));
    if (unit != nullptr) {
        g_variant_builder_add(&details, "{ss}", "action", unit_action);
        g_variant_builder_add(&details, "{ss}", "unit", unit);
    }
    return g_variant_new("((sa{sv})sa{ss}us)", "system-bus-name", &identity, action, &details,
                         guint32{0}, "");
}

static GVariant *ask(const session &run, GDBusConnection *bus, GVariant *question, GError **error) {
    return g_dbus_connection_call_sync(bus, POLKIT, "/org/freedesktop/PolicyKit1/Authority",
                                       "org.freedesktop.PolicyKit1.Authority", "CheckAuthorization",
                                       question, G_VARIANT_TYPE("((bba{ss}))"),
                                       G_DBUS_CALL_FLAGS_NONE, run.line->timeout_ms, nullptr,
                                       error);
}

static bool is_undeclared(const GError *error, const char *action) {
    g_autofree char *text = g_strdup_printf("Action %s is not registered", action);
    return g_str_has_suffix(error->message, text) == TRUE;
}

// As the service asks it.
static void ask_polkit(const session &run, GDBusConnection *bus, const method_action &action,
                       finding *found) {
    g_autoptr(GError) error = nullptr;
    gboolean is_allowed = FALSE;
    g_autoptr(GVariant) answer =
        ask(run, bus, question_of(bus, action.id, nullptr, nullptr), &error);

    found->is_declared = answer != nullptr;
    if (answer == nullptr && action.parent != nullptr && is_undeclared(error, action.id)) {
        g_clear_error(&error);
        answer = ask(run, bus, question_of(bus, action.parent, action.unit, action.id), &error);
    }
    if (answer == nullptr) {
        find_error(found, "polkit does not tell", error);
        return;
    }
    g_variant_get(answer, "((bb@a{ss}))", &is_allowed, nullptr, nullptr);
    find(found, is_allowed ? verdict::YES : verdict::NO,
         is_allowed ? "polkit allows it" : "polkit refuses it");
}

static void judge(const session &run, GDBusConnection *bus, const method_action &action,
                  finding *found) {
    ask_polkit(run, bus, action, found);
    if (is_shut_out(run, bus))
        find(found, verdict::NO, "the bus lets only root and the group privane call the service");
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

static char *format_json(const session &run, const GDBusMethodInfo *method,
                         const method_action &action, const finding &found, const char *rule) {
    g_autoptr(JsonObject) object = json_object_new();

    json_object_set_string_member(object, "method", method->name);
    json_object_set_string_member(object, "action", action.id);
    json_object_set_string_member(object, "allowed", word_of(found.allowed));
    json_object_set_string_member(object, "reason", found.reason);
    json_object_set_boolean_member(object, "amounts_to_root",
                                   method_action_amounts_to_root(action));
    json_object_set_string_member(object, "rule", rule);
    g_autoptr(JsonNode) node = json_node_new(JSON_NODE_OBJECT);
    json_node_set_object(node, object);
    return json_format(node, run.line->json);
}

static char *format_text(const GDBusMethodInfo *method, const method_action &action,
                         const finding &found, const char *rule) {
    g_autofree char *allowed = g_strdup_printf("%s (%s)", word_of(found.allowed), found.reason);
    const char *grant = method_action_amounts_to_root(action)
                            ? "this rule in /etc/polkit-1/rules.d, which amounts to making root"
                            : "this rule in /etc/polkit-1/rules.d";
    const char *labels[] = {"Method", "Action", "Allowed", "Granted by", nullptr};
    const char *values[] = {method->name, action.id, allowed, grant, nullptr};
    g_autofree char *record =
        record_format(const_cast<char **>(labels), const_cast<char **>(values));

    return g_strdup_printf("%s\n%s", record, rule);
}

bool run_explain(const session &run, GError **error) {
    const char *name = word_at(*run.line, 1);
    const GDBusMethodInfo *method = method_find(name);
    g_auto(method_action) action = {};
    g_auto(finding) found = {};

    if (method == nullptr)
        return fail_usage(error, "no method is named '%s'", name);
    if (!method_action_find(method, word_at(*run.line, 2), &action, error))
        return false;
    g_autoptr(GDBusConnection) bus = session_connect(run, error);
    if (bus == nullptr)
        return false;
    judge(run, bus, action, &found);

    // A declared action of a unit is decided by its own ID.
    const method_action ruled =
        found.is_declared ? method_action{action.id, nullptr, nullptr} : action;
    g_autofree char *rule = method_action_example_rule(ruled, g_get_user_name());
    g_autofree char *text = run.line->json == json_mode::OFF
                                ? format_text(method, action, found, rule)
                                : format_json(run, method, action, found, rule);
    return session_print(text, error);
}
