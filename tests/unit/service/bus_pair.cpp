// tests/unit/service/bus_pair.cpp: connects two ends of a D-Bus connection in this process.
#include "tests/unit/service/bus_pair.h"

#include <initializer_list>

#include <sys/socket.h>

GDBusConnection *connect_bus_end(int socket_fd) {
    g_autoptr(GSocket) socket = g_socket_new_from_fd(socket_fd, nullptr);
    g_autoptr(GSocketConnection) stream = g_socket_connection_factory_create_connection(socket);

    return g_dbus_connection_new_sync(G_IO_STREAM(stream), nullptr, G_DBUS_CONNECTION_FLAGS_NONE,
                                      nullptr, nullptr, nullptr);
}

bus_pair::bus_pair() {
    int ends[2] = {-1, -1};
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0)
        return;
    server_ = connect_bus_end(ends[0]);
    client_ = connect_bus_end(ends[1]);
}

bus_pair::~bus_pair() {
    close();
    g_clear_object(&client_);
    g_clear_object(&server_);
}

void bus_pair::close() {
    for (GDBusConnection *end : {client_, server_})
        if (end != nullptr)
            (void)g_dbus_connection_close_sync(end, nullptr, nullptr);
}
