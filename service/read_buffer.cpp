// service/read_buffer.cpp: the message filter that sends zeros behind a password. GDBus's own
// thread runs it.
#include "service/read_buffer.h"

#include <algorithm>
#include <cstring>
#include <string_view>

static constexpr const char *ZEROS_INTERFACE = "com.zintor.PrivaneSystem";
static constexpr const char *ZEROS_MEMBER = "Zeros";

// All whose arguments hold a password or its hash.
static constexpr std::string_view secret_members[] = {
    "AddSystemUser", "AddUidUser", "AddUser",    "AuthUserBasic",
    "ChpasswdUser",  "Digest",     "ModifyUser",
};

// Those that GDBus answers for every object; no password goes with them.
static constexpr const char *STANDARD_INTERFACES = "org.freedesktop.DBus.";

// More than the header of a call takes beyond its path and beyond that of the zeros: the longest
// names that the bus allows are 255 bytes, and there are four of them.
static constexpr gsize HEADER_ROOM = 2048;

// The bus drops zeros for which its queue for this process has no room.
static constexpr guint LOST_AFTER_MS = 1000;

// What a text takes in a message beyond its bytes: its length, and padding to that.
static constexpr gsize TEXT_OVERHEAD = 8;

// Of any other type than the methods take, a message may hold up to that many times the bytes that
// the value has.
static constexpr gsize WIRE_FACTOR = 4;

// Of one thread, GDBus's. A reference counted box: the filter and the timer each hold it.
struct read_buffer {
    GWeakRef connection;
    GDBusInterfaceInfo *interface;  // a reference
    guint32 number;                 // of the zeros that were sent last
    gsize under_way;                // how many these are; 0 when they have come back
    GSource *lost;                  // when they are given up; owned, null when they have come back
    gsize wanted;                   // by calls that came meanwhile
};

static bool may_carry_secret(const read_buffer *self, GDBusMessage *message) {
    const char *member = g_dbus_message_get_member(message);
    if (g_dbus_message_get_message_type(message) != G_DBUS_MESSAGE_TYPE_METHOD_CALL ||
        member == nullptr)
        return false;
    if (std::find(std::begin(secret_members), std::end(secret_members), member) !=
        std::end(secret_members))
        return true;
    const char *interface = g_dbus_message_get_interface(message);
    const bool is_standard =
        interface != nullptr && g_str_has_prefix(interface, STANDARD_INTERFACES);
    return !is_standard && g_dbus_interface_info_lookup_method(self->interface, member) == nullptr;
}

// Bytes in a message, at most.
static gsize argument_length(GVariant *argument) {
    const gsize size = g_variant_get_size(argument);
    if (g_variant_is_of_type(argument, G_VARIANT_TYPE_STRING))
        return size + TEXT_OVERHEAD;
    if (g_variant_is_of_type(argument, G_VARIANT_TYPE_STRING_ARRAY))
        return size + TEXT_OVERHEAD * (1 + g_variant_n_children(argument));
    return size * WIRE_FACTOR + TEXT_OVERHEAD;
}

static gsize length_of(GDBusMessage *message) {
    GVariant *body = g_dbus_message_get_body(message);
    gsize arguments = 0;
    for (gsize i = 0; body != nullptr && i < g_variant_n_children(body); i++) {
        g_autoptr(GVariant) argument = g_variant_get_child_value(body, i);
        arguments += argument_length(argument);
    }
    const char *path = g_dbus_message_get_path(message);
    const gsize header = HEADER_ROOM + (path != nullptr ? std::strlen(path) : 0);
    // The bus throws out who sends a longer message than it carries.
    return std::min(std::min(arguments, READ_BUFFER_OVERWRITTEN) + header,
                    BUS_MESSAGE_LIMIT - HEADER_ROOM);
}

static void read_buffer_clear(void *data) {
    auto *self = static_cast<read_buffer *>(data);
    g_weak_ref_clear(&self->connection);
    g_dbus_interface_info_unref(self->interface);
}

static void read_buffer_unref(void *data) {
    g_atomic_rc_box_release_full(data, read_buffer_clear);
}

static gboolean on_lost(void *data);

static void await_return(read_buffer *self) {
    self->lost = g_timeout_source_new(LOST_AFTER_MS);
    g_source_set_callback(self->lost, on_lost, g_atomic_rc_box_acquire(self), read_buffer_unref);
    (void)g_source_attach(self->lost, g_main_context_get_thread_default());  // Its pointer is kept.
}

static void end_waiting(read_buffer *self) {
    self->under_way = 0;
    g_source_destroy(self->lost);
    g_clear_pointer(&self->lost, g_source_unref);
}

static void send_zeros(read_buffer *self, GDBusConnection *connection) {
    const gsize count = self->wanted;
    g_autofree char *zeros = static_cast<char *>(g_malloc0(count));
    g_autoptr(GDBusMessage) message = g_dbus_message_new_signal("/", ZEROS_INTERFACE, ZEROS_MEMBER);
    g_dbus_message_set_destination(message, g_dbus_connection_get_unique_name(connection));
    self->number++;
    g_dbus_message_set_body(
        message,
        g_variant_new("(u@ay)", self->number,
                      g_variant_new_fixed_array(G_VARIANT_TYPE_BYTE, zeros, count, sizeof *zeros)));
    self->under_way = count;
    self->wanted = 0;
    await_return(self);
    // It fails only when the connection is closed, and the service with it.
    (void)g_dbus_connection_send_message(connection, message, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                         nullptr, nullptr);
}

static gboolean on_lost(void *data) {
    auto *self = static_cast<read_buffer *>(data);
    g_autoptr(GDBusConnection) connection =
        static_cast<GDBusConnection *>(g_weak_ref_get(&self->connection));

    self->wanted = std::max(self->wanted, self->under_way);
    end_waiting(self);
    if (connection != nullptr)
        send_zeros(self, connection);
    return G_SOURCE_REMOVE;
}

// Only the bus says who sent a message.
static bool are_own_zeros(GDBusConnection *connection, GDBusMessage *message) {
    return g_dbus_message_get_message_type(message) == G_DBUS_MESSAGE_TYPE_SIGNAL &&
           g_strcmp0(g_dbus_message_get_member(message), ZEROS_MEMBER) == 0 &&
           g_strcmp0(g_dbus_message_get_sender(message),
                     g_dbus_connection_get_unique_name(connection)) == 0;
}

// Those that were given up and come after all may be fewer than those that are under way.
static void note_return(read_buffer *self, GDBusMessage *zeros) {
    guint32 number = 0;
    g_variant_get_child(g_dbus_message_get_body(zeros), 0, "u", &number);
    if (number == self->number && self->under_way > 0)
        end_waiting(self);
}

static GDBusMessage *on_message(GDBusConnection *connection, GDBusMessage *message,
                                gboolean incoming, void *data) {
    auto *self = static_cast<read_buffer *>(data);

    // Outgoing messages come from other threads, and are nobody's here.
    if (incoming == FALSE)
        return message;
    if (may_carry_secret(self, message))
        self->wanted = std::max(self->wanted, length_of(message));
    const bool has_returned = are_own_zeros(connection, message);
    if (has_returned)
        note_return(self, message);
    if (self->wanted > 0 && self->under_way == 0)
        send_zeros(self, connection);
    if (!has_returned)
        return message;
    g_object_unref(message);
    return nullptr;
}

void read_buffer_guard(GDBusConnection *connection, GDBusInterfaceInfo *interface) {
    read_buffer *self = g_atomic_rc_box_new0(read_buffer);
    g_weak_ref_init(&self->connection, connection);
    self->interface = g_dbus_interface_info_ref(interface);
    (void)g_dbus_connection_add_filter(connection, on_message, self, read_buffer_unref);
}
