// service/read_buffer.cpp: the message filter that sends zeros behind a password; GDBus's own
// thread runs it.
#include "service/read_buffer.h"

#include <algorithm>
#include <string_view>

// All whose arguments hold a password or its hash.
static constexpr std::string_view secret_members[] = {
    "AddSystemUser", "AddUidUser", "AddUser",    "AuthUserBasic",
    "ChpasswdUser",  "Digest",     "ModifyUser",
};

// More than the header of a call takes beyond that of the zeros: the longest names that the bus
// allows are 255 bytes, and there are four of them.
static constexpr gsize HEADER_ROOM = 2048;

static bool carries_secret(GDBusMessage *message) {
    const char *member = g_dbus_message_get_member(message);
    return g_dbus_message_get_message_type(message) == G_DBUS_MESSAGE_TYPE_METHOD_CALL &&
           member != nullptr &&
           std::find(std::begin(secret_members), std::end(secret_members), member) !=
               std::end(secret_members);
}

static void send_zeros(GDBusConnection *connection, gsize count) {
    g_autofree char *zeros = static_cast<char *>(g_malloc0(count));
    g_autoptr(GDBusMessage) message =
        g_dbus_message_new_signal("/", "com.zintor.PrivaneSystem", "Zeros");
    g_dbus_message_set_destination(message, g_dbus_connection_get_unique_name(connection));
    g_dbus_message_set_body(
        message, g_variant_new("(@ay)", g_variant_new_fixed_array(G_VARIANT_TYPE_BYTE, zeros, count,
                                                                  sizeof *zeros)));
    // It fails only when the connection is closed, and the service with it.
    (void)g_dbus_connection_send_message(connection, message, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                         nullptr, nullptr);
}

static GDBusMessage *on_message(GDBusConnection *connection, GDBusMessage *message,
                                gboolean incoming, void *) {
    if (incoming != FALSE && carries_secret(message)) {
        GVariant *body = g_dbus_message_get_body(message);
        const gsize size = body != nullptr ? g_variant_get_size(body) : 0;
        send_zeros(connection, std::min(size + HEADER_ROOM, READ_BUFFER_OVERWRITTEN));
    }
    return message;
}

void read_buffer_guard(GDBusConnection *connection) {
    (void)g_dbus_connection_add_filter(connection, on_message, nullptr, nullptr);
}
