// service/intake.cpp: the message filter that bounds what waits for the main loop and for the bus.
//
// The filter runs in GDBus's thread, and a message may go in any thread: all that is counted is
// under one lock, and nothing of GDBus is called while it is held.
#include "service/intake.h"

#include <string>

#include <malloc.h>

static constexpr const char *BUS_SENDER = "org.freedesktop.DBus";
static constexpr const char *LIMITS_EXCEEDED = "org.freedesktop.DBus.Error.LimitsExceeded";
static constexpr const char *INVALID_ARGUMENTS = "org.freedesktop.DBus.Error.InvalidArgs";
static constexpr const char *TICKET = "privane-intake-ticket";

struct sender_share {
    guint calls;
    gsize cost;
    guint refusals;
};

// Shared by the filter and all tickets; freed with the last of them.
struct intake {
    GMutex lock;
    char *path;                     // owned
    GDBusInterfaceInfo *interface;  // a reference
    GHashTable *shares;             // by the sender's name; only of those who hold something
    GHashTable *unanswered;         // the places whose answer has not gone out
    guint calls;
    guint large_calls;
    gsize cost;
    guint refusals;
};

// A call's place. It is given back when the answer goes out, before the caller can have it and call
// again; without an answer, when the message is freed.
struct place {
    char *sender;  // owned
    guint32 serial;
    gsize cost;
};

// Hangs on a message, and tells when the message is freed.
struct ticket {
    intake *keeper;  // a reference
    place *held;     // of a call without an answer; null for a refusal
    char *sender;    // of the refused call, owned
};

static void place_free(void *data) {
    auto *held = static_cast<place *>(data);
    g_free(held->sender);
    g_free(held);
}

static guint place_hash(const void *data) {
    const auto *held = static_cast<const place *>(data);
    return g_str_hash(held->sender) ^ held->serial;
}

static gboolean place_equal(const void *left, const void *right) {
    const auto *one = static_cast<const place *>(left);
    const auto *other = static_cast<const place *>(right);
    return one->serial == other->serial && g_str_equal(one->sender, other->sender);
}

// To look a place up with, as long as the name is there.
static place place_key(const char *sender, guint32 serial) {
    return {const_cast<char *>(sender), serial, 0};
}

static void intake_clear(void *data) {
    auto *self = static_cast<intake *>(data);
    GHashTableIter iterator;
    void *left = nullptr;

    // Of calls that can no longer be answered.
    g_hash_table_iter_init(&iterator, self->unanswered);
    while (g_hash_table_iter_next(&iterator, &left, nullptr) != FALSE)
        place_free(left);
    g_hash_table_unref(self->unanswered);
    g_hash_table_unref(self->shares);
    g_dbus_interface_info_unref(self->interface);
    g_free(self->path);
    g_mutex_clear(&self->lock);
}

static void intake_unref(void *self) {
    g_atomic_rc_box_release_full(self, intake_clear);
}

// Only a bus names the senders; what comes straight from a peer has one name for all.
static const char *name_of(const char *sender) {
    return sender != nullptr ? sender : "";
}

static sender_share *share_of(intake *self, const char *sender) {
    auto *share = static_cast<sender_share *>(g_hash_table_lookup(self->shares, sender));
    if (share == nullptr) {
        share = g_new0(sender_share, 1);
        (void)g_hash_table_insert(self->shares, g_strdup(sender), share);
    }
    return share;
}

static void forget_empty_share(intake *self, const char *sender, const sender_share *share) {
    if (share->calls == 0 && share->refusals == 0)
        (void)g_hash_table_remove(self->shares, sender);
}

static gboolean trim(void *) {
    (void)malloc_trim(0);  // Where there was nothing to give back, all is well.
    return G_SOURCE_REMOVE;
}

// Of the main loop, whose turn comes however many large calls end meanwhile, and comes once for all
// of them.
static gint trim_waits;

static gboolean trim_in_turn(void *) {
    g_atomic_int_set(&trim_waits, 0);
    return trim(nullptr);
}

static void trim_when_freed() {
    if (g_atomic_int_compare_and_exchange(&trim_waits, 0, 1) != FALSE)
        (void)g_idle_add_full(G_PRIORITY_DEFAULT, trim_in_turn, nullptr, nullptr);
}

static bool is_large(gsize cost) {
    return cost > INTAKE_SMALL_COST;
}

static void let_go(intake *self, place *held) {
    sender_share *share = share_of(self, held->sender);
    share->calls--;
    share->cost -= held->cost;
    self->calls--;
    self->cost -= held->cost;
    if (is_large(held->cost) && --self->large_calls == 0)
        trim_when_freed();
    forget_empty_share(self, held->sender, share);
    place_free(held);
}

static void give_back(void *data) {
    auto *given = static_cast<ticket *>(data);
    intake *self = given->keeper;

    g_mutex_lock(&self->lock);
    if (given->held != nullptr) {
        let_go(self, given->held);
    } else {
        sender_share *share = share_of(self, given->sender);
        share->refusals--;
        self->refusals--;
        forget_empty_share(self, given->sender, share);
    }
    g_mutex_unlock(&self->lock);

    g_free(given->sender);
    g_free(given);
    intake_unref(self);
}

static void put_ticket(intake *self, GDBusMessage *message, place *held, const char *sender) {
    auto *given = g_new0(ticket, 1);
    given->keeper = g_atomic_rc_box_acquire(self);
    given->held = held;
    given->sender = g_strdup(sender);
    g_object_set_data_full(G_OBJECT(message), TICKET, given, give_back);
}

static bool wants_answer(GDBusMessage *call) {
    return (g_dbus_message_get_flags(call) & G_DBUS_MESSAGE_FLAGS_NO_REPLY_EXPECTED) == 0;
}

static gsize cost_of(GVariant *body) {
    if (body == nullptr)
        return 0;
    gsize cost = g_variant_get_size(body);
    for (gsize i = 0; i < g_variant_n_children(body); i++) {
        g_autoptr(GVariant) argument = g_variant_get_child_value(body, i);
        if (g_variant_is_of_type(argument, G_VARIANT_TYPE_ARRAY))
            cost += g_variant_n_children(argument) * INTAKE_ELEMENT_COST;
    }
    return cost;
}

static bool has_room(const intake *self, const sender_share *share, gsize cost) {
    if (self->calls >= INTAKE_CALLS)
        return false;
    if (share->calls == 0 && cost <= INTAKE_SMALL_COST)
        return true;
    return self->calls < INTAKE_SHARED_CALLS && share->calls < INTAKE_SENDER_CALLS &&
           self->cost + cost <= INTAKE_SHARED_COST && share->cost + cost <= INTAKE_SENDER_COST;
}

// Null where there is no room.
static place *take_place(intake *self, GDBusMessage *call, const char *sender, gsize cost) {
    sender_share *share = share_of(self, sender);
    if (!has_room(self, share, cost)) {
        forget_empty_share(self, sender, share);
        return nullptr;
    }
    share->calls++;
    share->cost += cost;
    self->calls++;
    self->cost += cost;
    if (is_large(cost))
        self->large_calls++;

    auto *held = g_new0(place, 1);
    held->sender = g_strdup(sender);
    held->serial = g_dbus_message_get_serial(call);
    held->cost = cost;
    if (wants_answer(call))
        (void)g_hash_table_add(self->unanswered, held);
    return held;
}

// Whether the main loop serves it. GDBus answers any other call itself, also one without an answer.
static bool is_served(const intake *self, GDBusMessage *call) {
    if (g_strcmp0(g_dbus_message_get_path(call), self->path) != 0 ||
        g_strcmp0(g_dbus_message_get_interface(call), self->interface->name) != 0)
        return false;
    const GDBusMethodInfo *method =
        g_dbus_interface_info_lookup_method(self->interface, g_dbus_message_get_member(call));
    if (method == nullptr)
        return false;
    std::string wanted;
    // A method without arguments has no list of them.
    for (GDBusArgInfo **argument = method->in_args; argument != nullptr && *argument != nullptr;
         argument++)
        wanted += (*argument)->signature;
    return wanted == g_dbus_message_get_signature(call);
}

enum class verdict { TAKEN, NO_ROOM, UNANSWERABLE };

static verdict take(intake *self, GDBusMessage *call, const char *sender, gsize cost) {
    const place key = place_key(sender, g_dbus_message_get_serial(call));

    g_mutex_lock(&self->lock);
    // With the number of a call that is not answered yet, the two answers could not be told apart.
    const bool is_repeated = wants_answer(call) && g_hash_table_contains(self->unanswered, &key);
    place *held = is_repeated ? nullptr : take_place(self, call, sender, cost);
    g_mutex_unlock(&self->lock);

    if (held != nullptr && !wants_answer(call))
        put_ticket(self, call, held, nullptr);
    if (is_repeated)
        return verdict::UNANSWERABLE;
    return held != nullptr ? verdict::TAKEN : verdict::NO_ROOM;
}

static bool may_refuse(intake *self, const char *sender) {
    g_mutex_lock(&self->lock);
    sender_share *share = share_of(self, sender);
    const bool has_room =
        share->refusals < INTAKE_SENDER_REFUSALS && self->refusals < INTAKE_REFUSALS;
    if (has_room) {
        share->refusals++;
        self->refusals++;
    }
    forget_empty_share(self, sender, share);
    g_mutex_unlock(&self->lock);
    return has_room;
}

static void refuse(intake *self, GDBusConnection *connection, GDBusMessage *call,
                   const char *error_name, const char *text) {
    const char *sender = name_of(g_dbus_message_get_sender(call));
    if (!wants_answer(call) || !may_refuse(self, sender))
        return;
    g_autoptr(GDBusMessage) answer =
        g_dbus_message_new_method_error_literal(call, error_name, text);
    put_ticket(self, answer, nullptr, sender);
    // It fails only when the connection is closed, and the service with it.
    (void)g_dbus_connection_send_message(connection, answer, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                         nullptr, nullptr);
}

// Freed in small pieces, a large message would stay with the allocator. This thread is done with
// the one at hand when it comes to its next source.
static void trim_after_this_message() {
    g_autoptr(GSource) source = g_idle_source_new();
    g_source_set_priority(source, G_PRIORITY_DEFAULT);
    g_source_set_callback(source, trim, nullptr, nullptr);
    (void)g_source_attach(source, g_main_context_get_thread_default());  // It removes itself.
}

static bool accept_call(intake *self, GDBusConnection *connection, GDBusMessage *call) {
    if (g_dbus_message_get_num_unix_fds(call) != 0) {
        refuse(self, connection, call, INVALID_ARGUMENTS, "No method takes file descriptors");
        return false;
    }
    const gsize cost = cost_of(g_dbus_message_get_body(call));
    if (cost > INTAKE_CALL_COST) {
        refuse(self, connection, call, LIMITS_EXCEEDED, "The arguments of the call are too large");
        return false;
    }
    if (!wants_answer(call) && !is_served(self, call))
        return false;

    switch (take(self, call, name_of(g_dbus_message_get_sender(call)), cost)) {
        case verdict::TAKEN:
            return true;
        case verdict::NO_ROOM:
            refuse(self, connection, call, LIMITS_EXCEEDED, "Too many calls are waiting");
            return false;
        case verdict::UNANSWERABLE:
            return false;
    }
    return false;
}

static bool accept(intake *self, GDBusConnection *connection, GDBusMessage *message) {
    switch (g_dbus_message_get_message_type(message)) {
        case G_DBUS_MESSAGE_TYPE_METHOD_CALL:
            return accept_call(self, connection, message);
        case G_DBUS_MESSAGE_TYPE_SIGNAL:
            // Those that others broadcast come by subscription only.
            return g_dbus_message_get_destination(message) == nullptr ||
                   g_strcmp0(g_dbus_message_get_sender(message), BUS_SENDER) == 0;
        case G_DBUS_MESSAGE_TYPE_METHOD_RETURN:
        case G_DBUS_MESSAGE_TYPE_ERROR:
            // GDBus keeps none that it does not wait for.
            return true;
        case G_DBUS_MESSAGE_TYPE_INVALID:
            return false;
    }
    return false;
}

// The bus is about to take a message.
static void note_answer(intake *self, GDBusMessage *message) {
    const GDBusMessageType type = g_dbus_message_get_message_type(message);
    if (type != G_DBUS_MESSAGE_TYPE_METHOD_RETURN && type != G_DBUS_MESSAGE_TYPE_ERROR)
        return;
    const place key = place_key(name_of(g_dbus_message_get_destination(message)),
                                g_dbus_message_get_reply_serial(message));

    g_mutex_lock(&self->lock);
    void *held = nullptr;
    if (g_hash_table_steal_extended(self->unanswered, &key, &held, nullptr) != FALSE)
        let_go(self, static_cast<place *>(held));
    g_mutex_unlock(&self->lock);
}

static GDBusMessage *on_message(GDBusConnection *connection, GDBusMessage *message,
                                gboolean incoming, void *data) {
    auto *self = static_cast<intake *>(data);

    if (incoming == FALSE) {
        // A refusal never had a place.
        if (g_object_get_data(G_OBJECT(message), TICKET) == nullptr)
            note_answer(self, message);
        return message;
    }
    if (accept(self, connection, message))
        return message;
    if (cost_of(g_dbus_message_get_body(message)) > INTAKE_SMALL_COST)
        trim_after_this_message();
    g_object_unref(message);
    return nullptr;
}

void intake_guard(GDBusConnection *connection, const char *path, GDBusInterfaceInfo *interface) {
    intake *self = g_atomic_rc_box_new0(intake);
    g_mutex_init(&self->lock);
    self->path = g_strdup(path);
    self->interface = g_dbus_interface_info_ref(interface);
    self->shares = g_hash_table_new_full(g_str_hash, g_str_equal, g_free, g_free);
    self->unanswered = g_hash_table_new(place_hash, place_equal);
    (void)g_dbus_connection_add_filter(connection, on_message, self, intake_unref);
}
