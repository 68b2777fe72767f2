// platform/authz/polkit/polkit_question.cpp: asks polkit one question, and once more where the
// answer was lost.
//
// Polkit is asked without its library: that one waits for ever where polkit hangs, and reads an
// answer of another form as if it were one.
#include "platform/authz/polkit/polkit_question.h"

#include <algorithm>

static constexpr const char *AUTHORITY_PATH = "/org/freedesktop/PolicyKit1/Authority";
static constexpr const char *AUTHORITY_INTERFACE = "org.freedesktop.PolicyKit1.Authority";

// Whether it is authorized, whether it could be after a password was given, and details.
static constexpr const char *ANSWER_TYPE = "((bba{ss}))";

static constexpr guint32 NO_INTERACTION = 0;

// The bus drops an answer when others fill what it keeps for this process. Asking again in any case
// would make a slow polkit work on questions whose answers nobody needs any more, and keep it from
// the next ones. So it is asked something cheap behind the question: polkit answers in the order in
// which it is asked, and when the second answer comes alone, the first is lost.
static constexpr guint FIRST_PROBE_MS = 250;
static constexpr guint LAST_PROBE_MS = 1000;
static constexpr const char *PROBED_PROPERTY = "BackendVersion";

// A question that was asked, perhaps more than once.
struct pending_check {
    const polkit_channel *channel;
    const polkit_question *asked;
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

int polkit_question_remaining_ms(gint64 deadline) {
    const gint64 left = (deadline - g_get_monotonic_time()) / 1000;
    return left > 0 ? static_cast<int>(left) : 0;
}

// Nobody cancels a question by its name, so that it has none: a check without interaction ends by
// itself.
static GVariant *arguments_of(const polkit_question &asked) {
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
    g_autoptr(GVariant) answer =
        g_dbus_connection_call_finish(pending->channel->bus, result, &error);

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
    g_dbus_connection_call(pending->channel->bus, POLKIT_NAME, AUTHORITY_PATH, AUTHORITY_INTERFACE,
                           "CheckAuthorization", arguments_of(*pending->asked),
                           G_VARIANT_TYPE(ANSWER_TYPE), G_DBUS_CALL_FLAGS_NONE,
                           polkit_question_remaining_ms(pending->asked->deadline),
                           pending->cancellable, on_answer, pending);
}

static void on_probe_answer(GObject *, GAsyncResult *result, void *data) {
    g_autofree auto *sent = static_cast<probe *>(data);
    pending_check *pending = sent->pending;
    // An error may be the bus's own, and tells nothing of what polkit has answered.
    g_autoptr(GVariant) version =
        g_dbus_connection_call_finish(pending->channel->bus, result, nullptr);

    pending->unanswered--;
    if (version != nullptr && sent->questions == pending->questions && !has_ended(*pending))
        send_question(pending);
}

static void send_probe(pending_check *pending) {
    auto *sent = g_new(probe, 1);
    *sent = {pending, pending->questions};
    pending->unanswered++;
    g_dbus_connection_call(
        pending->channel->bus, POLKIT_NAME, AUTHORITY_PATH, "org.freedesktop.DBus.Properties",
        "Get", g_variant_new("(ss)", AUTHORITY_INTERFACE, PROBED_PROPERTY), G_VARIANT_TYPE("(v)"),
        G_DBUS_CALL_FLAGS_NONE, polkit_question_remaining_ms(pending->asked->deadline),
        pending->cancellable, on_probe_answer, sent);
}

static gboolean on_silence(void *data);

static void await_silence(pending_check *pending, guint ms) {
    pending->silence = g_timeout_source_new(ms);
    pending->silence_ms = ms;
    g_source_set_callback(pending->silence, on_silence, pending, nullptr);
    // It is destroyed by its pointer.
    (void)g_source_attach(pending->silence, pending->channel->context);
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
    GMainContext *context = pending->channel->context;

    send_question(pending);
    await_silence(pending, FIRST_PROBE_MS);
    while (!has_ended(*pending))
        (void)g_main_context_iteration(context, TRUE);  // Whatever ran, the answer decides.
    end_silence(pending);

    if (pending->unanswered > 0)
        g_cancellable_cancel(pending->cancellable);
    while (pending->unanswered > 0)
        (void)g_main_context_iteration(context, TRUE);
}

bool polkit_question_ask(const polkit_channel &channel, const polkit_question &asked,
                         polkit_answer *out_answer, GError **error) {
    g_autoptr(GCancellable) cancellable = g_cancellable_new();
    pending_check pending = {&channel, &asked, cancellable, nullptr, 0, 0, 0, nullptr, nullptr};
    gboolean is_authorized = FALSE;
    gboolean needs_password = FALSE;

    g_main_context_push_thread_default(channel.context);
    await_answer(&pending);
    g_main_context_pop_thread_default(channel.context);

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
