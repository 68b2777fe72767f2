// platform/authz/polkit_client.cpp: asks polkit on the process's connection, and words its answers.
//
// Libpolkit's synchronous check waits for ever when polkit hangs. So the asynchronous one runs on a
// main context of the client's own, where a timer can cancel it and no source of the program's own
// loop is dispatched meanwhile.
#include "platform/authz/polkit_client.h"

#include <cstring>

#include <gio/gio.h>
#include <polkit/polkit.h>

#include "platform/authz/authz_error.h"
#include "platform/authz/unit_action.h"

static constexpr const char *AUTHORITY_PATH = "/org/freedesktop/PolicyKit1/Authority";
static constexpr const char *AUTHORITY_INTERFACE = "org.freedesktop.PolicyKit1.Authority";

// For what the bus itself is asked besides, which it knows at once.
static constexpr int BUS_DEADLINE_MS = 2000;

static constexpr gulong OWNER_POLL_US = 5000;

enum class polkit_answer { ALLOWED, REFUSED, NEEDS_PASSWORD };

struct polkit_client {
    GDBusConnection *bus;
    GMainContext *context;
    PolkitAuthority *authority;
    bool has_cancelled;
};

static polkit_client client;

struct question {
    const char *sender;
    const char *action_id;
    PolkitDetails *details;
    gint64 deadline;
};

struct pending_check {
    GCancellable *cancellable;
    GAsyncResult *result;
};

static int remaining_ms(gint64 deadline) {
    const gint64 left = (deadline - g_get_monotonic_time()) / 1000;
    return left > 0 ? static_cast<int>(left) : 0;
}

// The bus connection is the program's shared one: with one of its own, the checks would still go
// through while the program's is down.
static bool open_bus(GError **error) {
    if (client.bus == nullptr)
        client.bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error);
    return client.bus != nullptr;
}

// Asks the bus itself about a name; null where it has no answer.
static GVariant *call_bus(const char *method, const char *name, const char *reply_type) {
    return g_dbus_connection_call_sync(client.bus, "org.freedesktop.DBus", "/org/freedesktop/DBus",
                                       "org.freedesktop.DBus", method, g_variant_new("(s)", name),
                                       G_VARIANT_TYPE(reply_type), G_DBUS_CALL_FLAGS_NONE,
                                       BUS_DEADLINE_MS, nullptr, nullptr);
}

// Libpolkit sets itself up without a deadline. A first call that has one starts polkit where it
// is not running, and proves that it answers.
static bool wake_polkit(gint64 deadline, GError **error) {
    g_autoptr(GVariant) properties = g_dbus_connection_call_sync(
        client.bus, POLKIT_NAME, AUTHORITY_PATH, "org.freedesktop.DBus.Properties", "GetAll",
        g_variant_new("(s)", AUTHORITY_INTERFACE), nullptr, G_DBUS_CALL_FLAGS_NONE,
        remaining_ms(deadline), nullptr, error);
    return properties != nullptr;
}

static bool open_authority(gint64 deadline, GError **error) {
    if (client.authority == nullptr && wake_polkit(deadline, error))
        client.authority = polkit_authority_get_sync(nullptr, error);
    return client.authority != nullptr;
}

static void on_answer(GObject *, GAsyncResult *result, void *pending) {
    static_cast<pending_check *>(pending)->result = G_ASYNC_RESULT(g_object_ref(result));
}

static gboolean on_deadline(void *pending) {
    g_cancellable_cancel(static_cast<pending_check *>(pending)->cancellable);
    return G_SOURCE_REMOVE;
}

static polkit_answer answer_of(PolkitAuthorizationResult *result) {
    if (polkit_authorization_result_get_is_authorized(result))
        return polkit_answer::ALLOWED;
    return polkit_authorization_result_get_is_challenge(result) ? polkit_answer::NEEDS_PASSWORD
                                                                : polkit_answer::REFUSED;
}

static bool ask_once(const question &asked, polkit_answer *out_answer, GError **error) {
    if (!open_authority(asked.deadline, error))
        return false;

    g_autoptr(PolkitSubject) subject = polkit_system_bus_name_new(asked.sender);
    g_autoptr(GCancellable) cancellable = g_cancellable_new();
    pending_check pending = {cancellable, nullptr};
    g_autoptr(GSource) timer =
        g_timeout_source_new(static_cast<guint>(remaining_ms(asked.deadline)));
    g_source_set_callback(timer, on_deadline, &pending, nullptr);
    (void)g_source_attach(timer, client.context);  // Its number is not needed to destroy it.

    polkit_authority_check_authorization(client.authority, subject, asked.action_id, asked.details,
                                         POLKIT_CHECK_AUTHORIZATION_FLAGS_NONE, cancellable,
                                         on_answer, &pending);
    while (pending.result == nullptr)
        (void)g_main_context_iteration(client.context, TRUE);  // Whatever ran, the result decides.
    g_source_destroy(timer);

    g_autoptr(GAsyncResult) finished = pending.result;
    g_autoptr(PolkitAuthorizationResult) result =
        polkit_authority_check_authorization_finish(client.authority, finished, error);
    if (result == nullptr) {
        client.has_cancelled |= g_cancellable_is_cancelled(cancellable) != FALSE;
        return false;
    }
    *out_answer = answer_of(result);
    return true;
}

// Whether the question went to a polkit that was just being replaced. One that has given up its
// name and not yet gone, the bus does not let anybody call.
static bool is_stale_owner(const GError *error) {
    return g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_NO_REPLY) ||
           g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_ACCESS_DENIED) ||
           g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_NAME_HAS_NO_OWNER) ||
           g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_SERVICE_UNKNOWN);
}

// Null where nobody owns polkit's name.
static char *find_owner() {
    g_autoptr(GVariant) reply = call_bus("GetNameOwner", POLKIT_NAME, "(s)");
    char *owner = nullptr;

    if (reply != nullptr)
        g_variant_get(reply, "(s)", &owner);
    return owner;
}

// Libpolkit learns of a change from a signal, which waits on the context.
static bool is_owner_known() {
    while (g_main_context_iteration(client.context, FALSE)) {
    }

    g_autofree char *actual = find_owner();
    g_autofree char *known = polkit_authority_get_owner(client.authority);
    return g_strcmp0(actual, known) == 0;
}

// Libpolkit takes a new owner up only after a call to it, whose end nothing announces; until then
// its questions go to the old one.
static void await_owner(gint64 deadline) {
    while (!is_owner_known() && remaining_ms(deadline) > 0)
        g_usleep(OWNER_POLL_US);
}

static bool ask(const question &asked, polkit_answer *out_answer, GError **error) {
    g_autoptr(GError) first_error = nullptr;

    if (ask_once(asked, out_answer, &first_error))
        return true;
    if (client.authority == nullptr || !is_stale_owner(first_error)) {
        g_propagate_error(error, g_steal_pointer(&first_error));
        return false;
    }
    await_owner(asked.deadline);
    return ask_once(asked, out_answer, error);
}

// Polkit tells an action that no .policy file declares by its text alone.
static bool is_undeclared(GError *error, const char *action_id) {
    (void)g_dbus_error_strip_remote_error(error);  // A local error has nothing to strip.
    g_autofree char *text = g_strdup_printf("Action %s is not registered", action_id);
    return g_error_matches(error, POLKIT_ERROR, POLKIT_ERROR_FAILED) &&
           std::strcmp(error->message, text) == 0;
}

// A unit's own action counts where it is declared. Where it is not, its parent decides, by rules
// that look at the details.
static bool ask_of_unit(const question &asked, polkit_answer *out_answer, GError **error) {
    g_auto(unit_action) action = {};
    g_autoptr(GError) cause = nullptr;

    if (ask(asked, out_answer, &cause))
        return true;
    if (!is_undeclared(cause, asked.action_id) || !unit_action_parse(asked.action_id, &action)) {
        g_propagate_error(error, g_steal_pointer(&cause));
        return false;
    }

    g_autoptr(PolkitDetails) details = polkit_details_new();
    polkit_details_insert(details, "action", asked.action_id);
    polkit_details_insert(details, "unit", action.unit);
    return ask({asked.sender, action.parent, details, asked.deadline}, out_answer, error);
}

static bool ask_on_own_context(const question &asked, polkit_answer *out_answer, GError **error) {
    if (!open_bus(error))
        return false;
    if (client.context == nullptr)
        client.context = g_main_context_new();

    g_main_context_push_thread_default(client.context);
    const bool answered = ask_of_unit(asked, out_answer, error);
    g_main_context_pop_thread_default(client.context);
    return answered;
}

static bool find_uid(const char *sender, guint32 *out_uid) {
    g_autoptr(GVariant) reply = call_bus("GetConnectionUnixUser", sender, "(u)");

    if (reply == nullptr)
        return false;
    g_variant_get(reply, "(u)", out_uid);
    return true;
}

static void set_refusal(const char *sender, const char *action_id, polkit_answer answer,
                        GError **error) {
    const char *reason =
        answer == polkit_answer::NEEDS_PASSWORD ? " without a password, which cannot be given" : "";
    guint32 uid = 0;

    if (find_uid(sender, &uid))
        g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_REFUSED,
                    "action %s is refused to uid %" G_GUINT32_FORMAT "%s", action_id, uid, reason);
    else
        g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_REFUSED,
                    "action %s is refused to %s, whose uid is not known%s", action_id, sender,
                    reason);
}

// The errors of libpolkit and GDBus have domains that GDBus would map to its own names.
static void set_failure(const char *action_id, gint64 deadline, GError *cause, GError **error) {
    int code = AUTHZ_ERROR_UNREACHABLE;

    (void)g_dbus_error_strip_remote_error(cause);  // A local error has nothing to strip.
    if (cause->domain == POLKIT_ERROR)
        code = AUTHZ_ERROR_FAILED;
    else if (remaining_ms(deadline) == 0)
        code = AUTHZ_ERROR_TIMED_OUT;
    g_set_error(error, AUTHZ_ERROR_DOMAIN, code, "cannot check action %s: %s", action_id,
                code == AUTHZ_ERROR_TIMED_OUT ? "no answer in time" : cause->message);
}

bool polkit_client_check(const char *sender, const char *action_id, int deadline_ms,
                         GError **error) {
    const gint64 deadline = g_get_monotonic_time() + gint64{deadline_ms} * 1000;
    polkit_answer answer = polkit_answer::REFUSED;
    g_autoptr(GError) cause = nullptr;

    if (!ask_on_own_context({sender, action_id, nullptr, deadline}, &answer, &cause)) {
        set_failure(action_id, deadline, cause, error);
        return false;
    }
    if (answer != polkit_answer::ALLOWED)
        set_refusal(sender, action_id, answer, error);
    return answer == polkit_answer::ALLOWED;
}

// Libpolkit leaves its signal handlers connected to a bus proxy that a call under way keeps alive,
// and they would use an authority that is gone. Calls of its own it makes after a cancelled
// question and while it takes up a new owner.
static bool is_authority_idle() {
    return !client.has_cancelled && is_owner_known();
}

void polkit_client_release() {
    if (client.authority != nullptr) {
        const bool idle = is_authority_idle();
        g_clear_object(&client.authority);
        while (idle && g_main_context_iteration(client.context, FALSE)) {
            // The subscriptions that ended with it free their data.
        }
    }
    g_clear_pointer(&client.context, g_main_context_unref);
    g_clear_object(&client.bus);
    client.has_cancelled = false;
}
