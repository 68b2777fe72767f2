// client/decision.cpp: asks the device's own authorization library, and sees what that one asks.
//
// The library may be polkit's, the policy file's or the maker's own, and its functions do not tell.
// What it sends to polkit passes the connection that it shares with this program; the policy file's
// alone exports the path of its file. That the file is there tells nothing: its package leaves it
// behind.
#include "client/decision.h"

#include <cstring>

#include <dlfcn.h>
#include <unistd.h>

#include "platform/authz/authz.h"

static constexpr const char *LIBRARY = "libauthz.so.1";
static constexpr const char *POLKIT = "org.freedesktop.PolicyKit1";

// In platform/authz/policy/authz.cpp.
static constexpr const char *POLICY_PATH_SYMBOL = "authz_policy_path";

// What polkit was asked last. Messages pass on a thread of GDBus's.
static GMutex asked_mutex;
static char *asked_action;

static GDBusMessage *on_message(GDBusConnection *, GDBusMessage *message, gboolean is_incoming,
                                gpointer) {
    GVariant *body = g_dbus_message_get_body(message);
    const char *action = nullptr;

    if (is_incoming || g_strcmp0(g_dbus_message_get_destination(message), POLKIT) != 0 ||
        g_strcmp0(g_dbus_message_get_member(message), "CheckAuthorization") != 0 ||
        body == nullptr || !g_variant_is_of_type(body, G_VARIANT_TYPE("((sa{sv})sa{ss}us)")))
        return message;
    g_variant_get_child(body, 1, "&s", &action);
    g_mutex_lock(&asked_mutex);
    g_free(asked_action);
    asked_action = g_strdup(action);
    g_mutex_unlock(&asked_mutex);
    return message;
}

template <typename function>
static function *find(void *library, const char *name) {
    return reinterpret_cast<function *>(dlsym(library, name));
}

authorization::authorization() {
    library_ = dlopen(LIBRARY, RTLD_NOW | RTLD_LOCAL);
    if (library_ == nullptr) {
        g_set_error_literal(&error_, G_FILE_ERROR, G_FILE_ERROR_FAILED, dlerror());
        return;
    }
    auto *init = find<decltype(authz_init)>(library_, "authz_init");
    if (init != nullptr && init(&error_) != 0)
        return;
    if (error_ == nullptr)
        g_set_error(&error_, G_FILE_ERROR, G_FILE_ERROR_FAILED, "%s gives no reason", LIBRARY);
    (void)dlclose(library_);  // It is not used.
    library_ = nullptr;
}

authorization::~authorization() {
    g_clear_error(&error_);
    if (library_ == nullptr)
        return;
    auto *release = find<decltype(authz_release)>(library_, "authz_release");
    if (release != nullptr)
        release();
}

// Root sees what the service sees. To others a file may be closed, or an answer of polkit's.
static verdict verdict_of(const GError *error) {
    const GQuark domain = g_quark_from_string("authz");

    if (g_error_matches(error, domain, AUTHZ_ERROR_REFUSED))
        return verdict::NO;
    if (geteuid() != 0 || g_error_matches(error, domain, AUTHZ_ERROR_UNREACHABLE) ||
        g_error_matches(error, domain, AUTHZ_ERROR_TIMED_OUT))
        return verdict::UNKNOWN;
    return verdict::NO;
}

static void find_decider(void *library, decision *made) {
    made->policy_file = static_cast<const char *>(dlsym(library, POLICY_PATH_SYMBOL));
    if (made->asked != nullptr)
        made->by = decider::POLKIT;
    else if (made->policy_file != nullptr)
        made->by = decider::POLICY_FILE;
}

static const char *name_of(const decision &made) {
    switch (made.by) {
        case decider::POLKIT:
            return "polkit";
        case decider::POLICY_FILE:
            return made.policy_file;
        case decider::UNTOLD:
            break;
    }
    return "the authorization library";
}

static char *reason_of(const decision &made, const GError *error) {
    const char *who = name_of(made);

    if (made.allowed == verdict::YES)
        return g_strdup_printf("%s allows it", who);
    if (made.allowed == verdict::UNKNOWN)
        return g_strdup_printf("%s does not tell: %s", who, error->message);
    // A plain refusal has no more to say; another has met an error.
    if (g_error_matches(error, g_quark_from_string("authz"), AUTHZ_ERROR_REFUSED))
        return g_strdup_printf("%s refuses it", who);
    return g_strdup_printf("%s refuses it: %s", who, error->message);
}

void authorization::decide(GDBusConnection *bus, const char *action_id, decision *out_made) {
    auto *check =
        library_ != nullptr ? find<decltype(authz_check)>(library_, "authz_check") : nullptr;
    decision made = {verdict::UNKNOWN, nullptr, decider::UNTOLD, nullptr, nullptr};

    if (check != nullptr) {
        (void)g_dbus_connection_add_filter(bus, on_message, nullptr, nullptr);  // For good.
        made.allowed = check(g_dbus_connection_get_unique_name(bus), action_id, &error_) != 0
                           ? verdict::YES
                           : verdict::NO;
        g_mutex_lock(&asked_mutex);
        made.asked = g_steal_pointer(&asked_action);
        g_mutex_unlock(&asked_mutex);
        find_decider(library_, &made);
    }
    if (made.allowed != verdict::YES && error_ == nullptr)
        g_set_error(&error_, G_FILE_ERROR, G_FILE_ERROR_FAILED, "%s gives no reason", LIBRARY);
    if (made.allowed == verdict::NO)
        made.allowed = verdict_of(error_);
    made.reason = reason_of(made, error_);
    *out_made = made;
}

void decision_clear(decision *made) {
    g_clear_pointer(&made->reason, g_free);
    g_clear_pointer(&made->asked, g_free);
}
