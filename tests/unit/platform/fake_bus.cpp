// tests/unit/platform/fake_bus.cpp: answers as a bus, in GDBus's own thread.
#include "tests/unit/platform/fake_bus.h"

#include <cstdlib>

static constexpr const char *BUS = "org.freedesktop.DBus";

// A main loop of the bus's own, as that of the test waits for what the bus answers.
void *fake_bus::serve(void *data) {
    auto *bus = static_cast<fake_bus *>(data);

    g_main_context_push_thread_default(bus->context_);
    while (bus->is_serving_)
        g_main_context_iteration(bus->context_, TRUE);
    g_main_context_pop_thread_default(bus->context_);
    return nullptr;
}

fake_bus::fake_bus() {
    g_autofree char *guid = g_dbus_generate_guid();

    g_main_context_push_thread_default(context_);
    server_ = g_dbus_server_new_sync("unix:tmpdir=/tmp", G_DBUS_SERVER_FLAGS_NONE, guid, nullptr,
                                     nullptr, nullptr);
    if (server_ != nullptr) {
        (void)g_signal_connect(server_, "new-connection", G_CALLBACK(on_connection), this);
        g_dbus_server_start(server_);
        g_setenv("DBUS_SYSTEM_BUS_ADDRESS", g_dbus_server_get_client_address(server_), TRUE);
    }
    g_main_context_pop_thread_default(context_);
    thread_ = g_thread_new("fake bus", serve, this);
}

// The connection is closed for whoever uses it.
fake_bus::~fake_bus() {
    g_unsetenv("DBUS_SYSTEM_BUS_ADDRESS");
    is_serving_ = false;
    g_main_context_wakeup(context_);
    (void)g_thread_join(thread_);  // It returns nothing.
    if (connection_ != nullptr)
        (void)g_dbus_connection_close_sync(connection_, nullptr, nullptr);
    g_clear_object(&connection_);
    if (server_ != nullptr)
        g_dbus_server_stop(server_);
    g_clear_object(&server_);
    g_main_context_unref(context_);
}

gboolean fake_bus::on_connection(GDBusServer *, GDBusConnection *connection, void *data) {
    auto *bus = static_cast<fake_bus *>(data);

    g_set_object(&bus->connection_, connection);
    (void)g_dbus_connection_add_filter(connection, on_message, bus, nullptr);
    return TRUE;
}

GVariant *fake_bus::tell(const std::string &name) const {
    static const guint32 gids[] = {7, 750};
    const auto uid = static_cast<guint32>(std::atoi(name.c_str() + name.find('.') + 1));
    GVariantBuilder told_builder;

    g_variant_builder_init(&told_builder, G_VARIANT_TYPE("a{sv}"));
    g_variant_builder_add(&told_builder, "{sv}", "ProcessID", g_variant_new_uint32(1));
    if (told == credentials::UID_OF_ANOTHER_TYPE)
        g_variant_builder_add(&told_builder, "{sv}", "UnixUserID", g_variant_new_string("0"));
    else if (told != credentials::WITHOUT_UID)
        g_variant_builder_add(&told_builder, "{sv}", "UnixUserID", g_variant_new_uint32(uid));
    if (told != credentials::WITHOUT_GROUPS)
        g_variant_builder_add(
            &told_builder, "{sv}", "UnixGroupIDs",
            g_variant_new_fixed_array(G_VARIANT_TYPE_UINT32, gids, 2, sizeof gids[0]));
    return g_variant_new("(a{sv})", &told_builder);
}

void fake_bus::answer(GDBusConnection *connection, GDBusMessage *call, const std::string &member) {
    GVariant *arguments = g_dbus_message_get_body(call);
    g_autoptr(GDBusMessage) reply = g_dbus_message_new_method_reply(call);
    const char *text = "";

    if (arguments != nullptr && g_variant_is_of_type(arguments, G_VARIANT_TYPE("(s)")))
        g_variant_get(arguments, "(&s)", &text);
    if (member == "Hello") {
        g_dbus_message_set_body(reply, g_variant_new("(s)", ":1.1"));
    } else if (member == "AddMatch" || member == "RemoveMatch") {
        if (std::string(text).find("arg0=':") != std::string::npos)
            watches += member == "AddMatch" ? 1 : -1;
    } else if (member == "GetConnectionCredentials") {
        questions++;
        if (lost > 0) {
            lost--;
            return;
        }
        if (told == credentials::REFUSED) {
            g_clear_object(&reply);
            reply = g_dbus_message_new_method_error_literal(
                call, "org.freedesktop.DBus.Error.LimitsExceeded", "too much of it");
        } else if (told == credentials::OF_ANOTHER_TYPE) {
            g_dbus_message_set_body(reply, g_variant_new("(u)", 0U));
        } else {
            g_dbus_message_set_body(reply, tell(text));
        }
    }
    if ((g_dbus_message_get_flags(call) & G_DBUS_MESSAGE_FLAGS_NO_REPLY_EXPECTED) == 0)
        (void)g_dbus_connection_send_message(connection, reply, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                             nullptr, nullptr);
}

GDBusMessage *fake_bus::on_message(GDBusConnection *connection, GDBusMessage *message,
                                   gboolean incoming, void *data) {
    if (!incoming)
        return message;
    const char *member = g_dbus_message_get_member(message);
    if (member != nullptr)
        static_cast<fake_bus *>(data)->answer(connection, message, member);
    g_object_unref(message);
    return nullptr;
}

void fake_bus::end(const std::string &name) const {
    g_autoptr(GDBusMessage) message =
        g_dbus_message_new_signal("/org/freedesktop/DBus", BUS, "NameOwnerChanged");

    g_dbus_message_set_sender(message, BUS);
    g_dbus_message_set_body(message, g_variant_new("(sss)", name.c_str(), name.c_str(), ""));
    (void)g_dbus_connection_send_message(connection_, message, G_DBUS_SEND_MESSAGE_FLAGS_NONE,
                                         nullptr, nullptr);
}
