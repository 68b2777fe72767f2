// platform/authz/polkit/polkit_client.cpp: asks polkit on the process's connection, and words its
// answers.
//
// Polkit is asked without its library: that one waits for ever where polkit hangs, and reads an
// answer of another form as if it were one.
#include "platform/authz/polkit/polkit_client.h"

#include <algorithm>
#include <cstring>

#include <gio/gio.h>

#include "platform/authz/authz_error.h"
#include "platform/authz/polkit/unit_action.h"

static constexpr const char *AUTHORITY_PATH = "/org/freedesktop/PolicyKit1/Authority";
static constexpr const char *AUTHORITY_INTERFACE = "org.freedesktop.PolicyKit1.Authority";
static constexpr const char *POLKIT_ERRORS = "org.freedesktop.PolicyKit1.Error.";

// Whether it is authorized, whether it could be after a password was given, and details.
static constexpr const char *ANSWER_TYPE = "((bba{ss}))";

static constexpr guint32 NO_INTERACTION = 0;

// For what the bus itself is asked besides, which it knows at once.
static constexpr int BUS_DEADLINE_MS = 1000;

// The bus drops an answer when others fill what it keeps for this process. Asking again in any case
// would make a slow polkit work on questions whose answers nobody needs any more, and keep it from
// the next ones. So it is asked something cheap behind the question: polkit answers in the order in
// which it is asked, and when the second answer comes alone, the first is lost.
static constexpr guint FIRST_PROBE_MS = 250;
static constexpr guint LAST_PROBE_MS = 1000;
static constexpr const char *PROBED_PROPERTY = "BackendVersion";

enum class polkit_answer { ALLOWED, REFUSED, NEEDS_PASSWORD };

static GDBusConnection *client_bus;
// Of the questions alone: while one waits, nothing else of the program runs.
static GMainContext *client_context;

struct question {
    const char *sender;
    const char *action_id;
    const char *unit;         // null, or what the details tell of a unit
    const char *unit_action;  // and its own action
    gint64 deadline;
};

// A question that was asked, perhaps more than once.
struct pending_check {
    const question *asked;
    GCancellable *cancellable;
    GSource *silence;  // until the next probe; owned
    guint silence_ms;
    guint questions;   // how often it was asked
    guint unanswered;  // calls, the probes included
    GVariant *answer;  // the first, or
    GError *error;     // why there is none
};

struct probe {
    pending_check *pending;
    guint questions;  // that polkit had been asked when it was sent
};

static int remaining_ms(gint64 deadline) {
    const gint64 left = (deadline - g_get_monotonic_time()) / 1000;
    return left > 0 ? static_cast<int>(left) : 0;
}

// The bus connection is the program's shared one: with one of its own, the checks would still go
// through while the program's is down.
static bool open_bus(GError **error) {
    if (client_bus == nullptr)
        client_bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error);
    if (client_context == nullptr)
        client_context = g_main_context_new();
    return client_bus != nullptr;
}

// Nobody cancels a question by its name, so that it has none: a check without interaction ends by
// itself.
static GVariant *arguments_of(const question &asked) {
    GVariantBuilder identity;
    GVariantBuilder details;

    g_variant_builder_init(&identity, G_VARIANT_TYPE("a{sv}"));
    g_variant_builder_add(&identity, "{sv}", "name", g_variant_new_string(asked.sender));
    g_variant_builder_init(&details, G_VARIANT_TYPE("a{ss}"));
    if (asked.unit != nullptr) {
        g_variant_builder_add(&details, "{ss}", "action", asked.unit_action);
        g_variant_builder_add(&details, "{ss}", "unit", asked.unit);
    }
    return g_variant_new("((sa{sv})sa{ss}us)", "system-bus-name", &identity, asked.action_id,
                         &details, NO_INTERACTION, "");
}

static bool has_ended(const pending_check &pending) {
    return pending.answer != nullptr || pending.error != nullptr;
}

static void on_answer(GObject *, GAsyncResult *result, void *data) {
    auto *pending = static_cast<pending_check *>(data);
    g_autoptr(GError) error = nullptr;
    g_autoptr(GVariant) answer = g_dbus_connection_call_finish(client_bus, result, &error);

    pending->unanswered--;
    if (has_ended(*pending))
        return;
    pending->answer = g_steal_pointer(&answer);
    pending->error = g_steal_pointer(&error);
}

// A sound answer is one of the right form; GDBus makes any other an error.
static void send_question(pending_check *pending) {
    pending->questions++;
    pending->unanswered++;
    g_dbus_connection_call(
        client_bus, POLKIT_NAME, AUTHORITY_PATH, AUTHORITY_INTERFACE, "CheckAuthorization",
        arguments_of(*pending->asked), G_VARIANT_TYPE(ANSWER_TYPE), G_DBUS_CALL_FLAGS_NONE,
        remaining_ms(pending->asked->deadline), pending->cancellable, on_answer, pending);
}

static void on_probe_answer(GObject *, GAsyncResult *result, void *data) {
    g_autofree auto *sent = static_cast<probe *>(data);
    pending_check *pending = sent->pending;
    // An error may be the bus's own, and tells nothing of what polkit has answered.
    g_autoptr(GVariant) version = g_dbus_connection_call_finish(client_bus, result, nullptr);

    pending->unanswered--;
    if (version != nullptr && sent->questions == pending->questions && !has_ended(*pending))
        send_question(pending);
}

static void send_probe(pending_check *pending) {
    auto *sent = g_new(probe, 1);
    *sent = {pending, pending->questions};
    pending->unanswered++;
    g_dbus_connection_call(
        client_bus, POLKIT_NAME, AUTHORITY_PATH, "org.freedesktop.DBus.Properties", "Get",
        g_variant_new("(ss)", AUTHORITY_INTERFACE, PROBED_PROPERTY), G_VARIANT_TYPE("(v)"),
        G_DBUS_CALL_FLAGS_NONE, remaining_ms(pending->asked->deadline), pending->cancellable,
        on_probe_answer, sent);
}

static gboolean on_silence(void *data);

static void await_silence(pending_check *pending, guint ms) {
    pending->silence = g_timeout_source_new(ms);
    pending->silence_ms = ms;
    g_source_set_callback(pending->silence, on_silence, pending, nullptr);
    (void)g_source_attach(pending->silence, client_context);  // It is destroyed by its pointer.
}

static void end_silence(pending_check *pending) {
    g_source_destroy(pending->silence);
    g_clear_pointer(&pending->silence, g_source_unref);
}

static gboolean on_silence(void *data) {
    auto *pending = static_cast<pending_check *>(data);

    end_silence(pending);
    send_probe(pending);
    await_silence(pending, std::min(2 * pending->silence_ms, LAST_PROBE_MS));
    return G_SOURCE_REMOVE;
}

// Runs in the context of the questions. At the deadline the calls end by themselves.
static void await_answer(pending_check *pending) {
    send_question(pending);
    await_silence(pending, FIRST_PROBE_MS);
    while (!has_ended(*pending))
        (void)g_main_context_iteration(client_context, TRUE);  // Whatever ran, the answer decides.
    end_silence(pending);

    if (pending->unanswered > 0)
        g_cancellable_cancel(pending->cancellable);
    while (pending->unanswered > 0)
        (void)g_main_context_iteration(client_context, TRUE);
}

static bool ask_once(const question &asked, polkit_answer *out_answer, GError **error) {
    g_autoptr(GCancellable) cancellable = g_cancellable_new();
    pending_check pending = {&asked, cancellable, nullptr, 0, 0, 0, nullptr, nullptr};
    gboolean is_authorized = FALSE;
    gboolean needs_password = FALSE;

    g_main_context_push_thread_default(client_context);
    await_answer(&pending);
    g_main_context_pop_thread_default(client_context);

    g_autoptr(GVariant) answer = pending.answer;
    if (answer == nullptr) {
        g_propagate_error(error, pending.error);
        return false;
    }
    g_variant_get(answer, "((bb@a{ss}))", &is_authorized, &needs_password, nullptr);
    if (is_authorized)
        *out_answer = polkit_answer::ALLOWED;
    else
        *out_answer = needs_password ? polkit_answer::NEEDS_PASSWORD : polkit_answer::REFUSED;
    return true;
}

// Whether the question went to a polkit that was just being replaced. One that has given up its
// name and not yet gone, the bus does not let anybody call.
static bool is_stale_owner(const GError *error) {
    return g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_NO_REPLY) ||
           g_error_matches(error, G_DBUS_ERROR, G_DBUS_ERROR_ACCESS_DENIED);
}

static bool ask(const question &asked, polkit_answer *out_answer, GError **error) {
    g_autoptr(GError) first_error = nullptr;

    if (ask_once(asked, out_answer, &first_error))
        return true;
    if (!is_stale_owner(first_error)) {
        g_propagate_error(error, g_steal_pointer(&first_error));
        return false;
    }
    return ask_once(asked, out_answer, error);
}

static bool is_of_polkit(const GError *error) {
    g_autofree char *name = g_dbus_error_get_remote_error(error);
    return name != nullptr && g_str_has_prefix(name, POLKIT_ERRORS);
}

// Polkit tells an action that no .policy file declares by its text alone.
static bool is_undeclared(const GError *error, const char *action_id) {
    g_autoptr(GError) told = g_error_copy(error);
    g_autofree char *text = g_strdup_printf("Action %s is not registered", action_id);

    (void)g_dbus_error_strip_remote_error(told);  // A local error has nothing to strip.
    return is_of_polkit(error) && std::strcmp(told->message, text) == 0;
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
    return ask({asked.sender, action.parent, action.unit, asked.action_id, asked.deadline},
               out_answer, error);
}

static bool find_uid(const char *sender, guint32 *out_uid) {
    g_autoptr(GVariant) reply = g_dbus_connection_call_sync(
        client_bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
        "GetConnectionUnixUser", g_variant_new("(s)", sender), G_VARIANT_TYPE("(u)"),
        G_DBUS_CALL_FLAGS_NONE, BUS_DEADLINE_MS, nullptr, nullptr);

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

// The errors of polkit and GDBus have domains that GDBus would map to its own names.
static void set_failure(const char *action_id, gint64 deadline, GError *cause, GError **error) {
    int code = AUTHZ_ERROR_UNREACHABLE;
    const char *reason = nullptr;

    if (is_of_polkit(cause)) {
        code = AUTHZ_ERROR_FAILED;
    } else if (g_error_matches(cause, G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT)) {
        code = AUTHZ_ERROR_FAILED;
        reason = "the answer has no valid form";
    } else if (g_error_matches(cause, G_IO_ERROR, G_IO_ERROR_TIMED_OUT) ||
               // So many earlier questions are still unanswered.
               g_error_matches(cause, G_DBUS_ERROR, G_DBUS_ERROR_LIMITS_EXCEEDED) ||
               remaining_ms(deadline) == 0) {
        code = AUTHZ_ERROR_TIMED_OUT;
        reason = "no answer in time";
    }
    // What the bus told polkit comes with the name of that error too.
    while (g_dbus_error_strip_remote_error(cause)) {
    }
    g_set_error(error, AUTHZ_ERROR_DOMAIN, code, "cannot check action %s: %s", action_id,
                reason != nullptr ? reason : cause->message);
}

bool polkit_client_check(const char *sender, const char *action_id, int deadline_ms,
                         GError **error) {
    const gint64 deadline = g_get_monotonic_time() + gint64{deadline_ms} * 1000;
    polkit_answer answer = polkit_answer::REFUSED;
    g_autoptr(GError) cause = nullptr;

    if (!open_bus(&cause) ||
        !ask_of_unit({sender, action_id, nullptr, nullptr, deadline}, &answer, &cause)) {
        set_failure(action_id, deadline, cause, error);
        return false;
    }
    if (answer != polkit_answer::ALLOWED)
        set_refusal(sender, action_id, answer, error);
    return answer == polkit_answer::ALLOWED;
}

void polkit_client_release() {
    g_clear_object(&client_bus);
    g_clear_pointer(&client_context, g_main_context_unref);
}
