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
static constexpr gint64 LOST_AFTER_US = G_USEC_PER_SEC;

// A short text of a list takes up to four times as much in a message as in its value.
static constexpr gsize WIRE_FACTOR = 4;

struct read_buffer {
    GDBusInterfaceInfo *interface;  // a reference
    gsize under_way;                // zeros that were sent and have not come back
    gint64 sent_at;                 // when they were, on the monotonic clock
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

static gsize length_of(GDBusMessage *message) {
    GVariant *body = g_dbus_message_get_body(message);
    const gsize size = body != nullptr ? g_variant_get_size(body) : 0;
    const char *path = g_dbus_message_get_path(message);
    const gsize header = HEADER_ROOM + (path != nullptr ? std::strlen(path) : 0);
    return std::min(size * WIRE_FACTOR + header, READ_BUFFER_OVERWRITTEN);
}

static void send_zeros(read_buffer *self, GDBusConnection *connection) {
    const gsize count = self->wanted;
    g_autofree char *zeros = static_cast<char *>(g_malloc0(count));
    g_autoptr(GDBusMessage) message = g_dbus_message_new_signal("/", ZEROS_INTERFACE, ZEROS_MEMBER);
    g_dbus_message_set_destination(message, g_dbus_connection_get_unique_name(connection));
    g_dbus_message_set_body(
        message, g_variant_new("(@ay)", g_variant_new_fixed_array(G_VARIANT_TYPE_BYTE, zeros, count,
                                                                  sizeof *zeros)));
    self->under_way = count;
    self->sent_at = g_get_monotonic_time();
    self->wanted = 0;
    // It fails only when the connection is closed, and the service with it.
    (void)g_dbus_connection_send_message(connection, message, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                         nullptr, nullptr);
}

// They are sent again with the next message of anybody.
static void want_lost_zeros(read_buffer *self) {
    if (self->under_way == 0 || g_get_monotonic_time() - self->sent_at < LOST_AFTER_US)
        return;
    self->wanted = std::max(self->wanted, self->under_way);
    self->under_way = 0;
}

// Only the bus says who sent a message.
static bool are_own_zeros(GDBusConnection *connection, GDBusMessage *message) {
    return g_dbus_message_get_message_type(message) == G_DBUS_MESSAGE_TYPE_SIGNAL &&
           g_strcmp0(g_dbus_message_get_member(message), ZEROS_MEMBER) == 0 &&
           g_strcmp0(g_dbus_message_get_sender(message),
                     g_dbus_connection_get_unique_name(connection)) == 0;
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
        self->under_way = 0;
    else
        want_lost_zeros(self);
    if (self->wanted > 0 && self->under_way == 0)
        send_zeros(self, connection);
    if (!has_returned)
        return message;
    g_object_unref(message);
    return nullptr;
}

static void read_buffer_free(void *data) {
    auto *self = static_cast<read_buffer *>(data);
    g_dbus_interface_info_unref(self->interface);
    g_free(self);
}

void read_buffer_guard(GDBusConnection *connection, GDBusInterfaceInfo *interface) {
    auto *self = g_new0(read_buffer, 1);
    self->interface = g_dbus_interface_info_ref(interface);
    (void)g_dbus_connection_add_filter(connection, on_message, self, read_buffer_free);
}
