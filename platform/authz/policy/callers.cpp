// platform/authz/policy/callers.cpp: asks the bus for the credentials of a name, and remembers them
// until the name is gone.
//
// A bus gives a unique name to one connection and never to another, and credentials are those with
// which it connected, so that they hold for as long as the name is there. The name of one bus may
// be somebody else's on the next: what a lost connection told is forgotten with it.
#include "platform/authz/policy/callers.h"

#include <gio/gio.h>

#include "platform/authz/authz_error.h"

static constexpr const char *BUS_NAME = "org.freedesktop.DBus";
static constexpr const char *BUS_PATH = "/org/freedesktop/DBus";

// The bus drops an answer when others fill what it keeps for this process.
static constexpr guint REPEAT_MS = 1000;

struct known_caller {
    guint32 uid;
    GVariant *gids;  // "au", or null where the bus tells none
    guint64 number;  // in the order in which they were asked
    guint watch;     // of the name's end
};

static GDBusConnection *callers_bus;
// Of the questions alone: while one waits, nothing else of the program runs.
static GMainContext *callers_context;
static GHashTable *known_callers;  // by unique name
static guint64 callers_asked;

// A question that was asked, perhaps more than once.
struct question {
    const char *sender;
    gint64 deadline;
    GCancellable *cancellable;
    guint unanswered;
    GVariant *answer;  // the first, or
    GError *error;     // why there is none
};

static int remaining_ms(gint64 deadline) {
    const gint64 left = (deadline - g_get_monotonic_time()) / 1000;
    return left > 0 ? static_cast<int>(left) : 0;
}

static void known_caller_free(void *data) {
    auto *known = static_cast<known_caller *>(data);

    g_dbus_connection_signal_unsubscribe(callers_bus, known->watch);
    g_clear_pointer(&known->gids, g_variant_unref);
    g_free(known);
}

static bool open_bus(GError **error) {
    if (callers_bus != nullptr && g_dbus_connection_is_closed(callers_bus))
        callers_release();
    // The program's shared one: with one of its own, the checks would still go through while the
    // program's is down.
    if (callers_bus == nullptr)
        callers_bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error);
    if (callers_context == nullptr)
        callers_context = g_main_context_new();
    if (known_callers == nullptr)
        known_callers = g_hash_table_new_full(g_str_hash, g_str_equal, g_free, known_caller_free);
    if (callers_bus == nullptr || !g_dbus_connection_is_closed(callers_bus))
        return callers_bus != nullptr;
    // Somebody else still holds it; nothing can be watched there.
    g_set_error_literal(error, G_IO_ERROR, G_IO_ERROR_CLOSED, "the connection is closed");
    return false;
}

// Runs in the program's main loop.
static void on_owner_changed(GDBusConnection *, const char *, const char *, const char *,
                             const char *, GVariant *arguments, void *) {
    const char *name = nullptr;
    const char *new_owner = nullptr;

    if (known_callers == nullptr || !g_variant_is_of_type(arguments, G_VARIANT_TYPE("(sss)")))
        return;
    g_variant_get(arguments, "(&ss&s)", &name, nullptr, &new_owner);
    if (*new_owner == '\0')
        (void)g_hash_table_remove(known_callers, name);  // It may have made room already.
}

static guint watch_name(const char *name) {
    return g_dbus_connection_signal_subscribe(callers_bus, BUS_NAME, BUS_NAME, "NameOwnerChanged",
                                              BUS_PATH, name, G_DBUS_SIGNAL_FLAGS_NONE,
                                              on_owner_changed, nullptr, nullptr);
}

static bool has_ended(const question &asked) {
    return asked.answer != nullptr || asked.error != nullptr;
}

static void on_answer(GObject *, GAsyncResult *result, void *data) {
    auto *asked = static_cast<question *>(data);
    g_autoptr(GError) error = nullptr;
    g_autoptr(GVariant) answer = g_dbus_connection_call_finish(callers_bus, result, &error);

    asked->unanswered--;
    if (has_ended(*asked))
        return;
    asked->answer = g_steal_pointer(&answer);
    asked->error = g_steal_pointer(&error);
}

// At the deadline the calls end by themselves.
static void send_question(question *asked) {
    asked->unanswered++;
    g_dbus_connection_call(callers_bus, BUS_NAME, BUS_PATH, BUS_NAME, "GetConnectionCredentials",
                           g_variant_new("(s)", asked->sender), G_VARIANT_TYPE("(a{sv})"),
                           G_DBUS_CALL_FLAGS_NONE, remaining_ms(asked->deadline),
                           asked->cancellable, on_answer, asked);
}

static gboolean on_silence(void *data) {
    send_question(static_cast<question *>(data));
    return G_SOURCE_CONTINUE;
}

static void await_answer(question *asked) {
    GSource *silence = g_timeout_source_new(REPEAT_MS);

    g_source_set_callback(silence, on_silence, asked, nullptr);
    (void)g_source_attach(silence, callers_context);  // It is destroyed by its pointer.
    send_question(asked);
    while (!has_ended(*asked))
        (void)g_main_context_iteration(callers_context, TRUE);  // Whatever ran, the answer decides.
    g_source_destroy(silence);
    g_source_unref(silence);

    if (asked->unanswered > 0)
        g_cancellable_cancel(asked->cancellable);
    while (asked->unanswered > 0)
        (void)g_main_context_iteration(callers_context, TRUE);
}

// The credentials, "a{sv}".
static GVariant *ask(const char *sender, gint64 deadline, GError **error) {
    g_autoptr(GCancellable) cancellable = g_cancellable_new();
    question asked = {sender, deadline, cancellable, 0, nullptr, nullptr};

    g_main_context_push_thread_default(callers_context);
    await_answer(&asked);
    g_main_context_pop_thread_default(callers_context);

    g_autoptr(GVariant) answer = asked.answer;
    if (answer == nullptr) {
        g_propagate_error(error, asked.error);
        return nullptr;
    }
    return g_variant_get_child_value(answer, 0);
}

static void make_room() {
    GHashTableIter iter;
    void *name = nullptr;
    void *value = nullptr;
    const void *oldest = nullptr;
    guint64 number = G_MAXUINT64;

    if (g_hash_table_size(known_callers) < CALLERS_REMEMBERED)
        return;
    g_hash_table_iter_init(&iter, known_callers);
    while (g_hash_table_iter_next(&iter, &name, &value)) {
        const auto *known = static_cast<const known_caller *>(value);
        if (known->number < number) {
            number = known->number;
            oldest = name;
        }
    }
    // The table's own key goes with the entry.
    g_autofree char *copy = g_strdup(static_cast<const char *>(oldest));
    (void)g_hash_table_remove(known_callers, copy);  // It is there.
}

// The errors of GDBus have domains that it would map to names of its own.
static void set_failure(const char *sender, const char *action_id, gint64 deadline, GError *cause,
                        GError **error) {
    if (g_error_matches(cause, G_DBUS_ERROR, G_DBUS_ERROR_NAME_HAS_NO_OWNER)) {
        g_set_error(error, AUTHZ_ERROR_DOMAIN, AUTHZ_ERROR_REFUSED,
                    "action %s is refused to %s, whose uid is not known", action_id, sender);
        return;
    }
    int code = AUTHZ_ERROR_UNREACHABLE;
    const char *reason = nullptr;
    if (g_error_matches(cause, G_IO_ERROR, G_IO_ERROR_INVALID_ARGUMENT)) {
        code = AUTHZ_ERROR_FAILED;
        reason = "the answer has no valid form";
    } else if (g_error_matches(cause, G_IO_ERROR, G_IO_ERROR_TIMED_OUT) ||
               remaining_ms(deadline) == 0) {
        code = AUTHZ_ERROR_TIMED_OUT;
        reason = "no answer in time";
    }
    (void)g_dbus_error_strip_remote_error(cause);  // A local error has nothing to strip.
    g_set_error(error, AUTHZ_ERROR_DOMAIN, code, "cannot check action %s: %s", action_id,
                reason != nullptr ? reason : cause->message);
}

static known_caller *remember(const char *sender, GVariant *credentials, guint watch,
                              GError **error) {
    guint32 uid = 0;

    if (!g_variant_lookup(credentials, "UnixUserID", "u", &uid)) {
        // Said as of a name that is gone.
        g_set_error_literal(error, G_DBUS_ERROR, G_DBUS_ERROR_NAME_HAS_NO_OWNER, "no uid");
        return nullptr;
    }
    auto *known = g_new0(known_caller, 1);
    known->uid = uid;
    known->gids = g_variant_lookup_value(credentials, "UnixGroupIDs", G_VARIANT_TYPE("au"));
    known->number = callers_asked++;
    known->watch = watch;
    make_room();
    (void)g_hash_table_insert(known_callers, g_strdup(sender), known);  // It was not there.
    return known;
}

// The watch comes first, so that the end of the name cannot be missed.
static known_caller *ask_and_remember(const char *sender, gint64 deadline, GError **error) {
    const guint watch = watch_name(sender);
    g_autoptr(GVariant) credentials = ask(sender, deadline, error);
    known_caller *known =
        credentials != nullptr ? remember(sender, credentials, watch, error) : nullptr;

    if (known == nullptr)
        g_dbus_connection_signal_unsubscribe(callers_bus, watch);
    return known;
}

bool callers_find(const char *sender, const char *action_id, int deadline_ms,
                  policy_caller *out_caller, GError **error) {
    const gint64 deadline = g_get_monotonic_time() + gint64{deadline_ms} * 1000;
    g_autoptr(GError) cause = nullptr;
    const known_caller *known = nullptr;

    if (open_bus(&cause)) {
        known = static_cast<const known_caller *>(g_hash_table_lookup(known_callers, sender));
        if (known == nullptr)
            known = ask_and_remember(sender, deadline, &cause);
    }
    if (known == nullptr) {
        set_failure(sender, action_id, deadline, cause, error);
        return false;
    }
    *out_caller = {known->uid, nullptr, 0};
    if (known->gids != nullptr)
        out_caller->gids = static_cast<const guint32 *>(g_variant_get_fixed_array(
            known->gids, &out_caller->gid_count, sizeof *out_caller->gids));
    return true;
}

void callers_release() {
    // The watches go with the bus that they are on.
    g_clear_pointer(&known_callers, g_hash_table_unref);
    g_clear_object(&callers_bus);
    g_clear_pointer(&callers_context, g_main_context_unref);
}
