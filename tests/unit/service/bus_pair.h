// tests/unit/service/bus_pair.h: D-Bus connections whose other end is in this process, without a
// bus between them.
#pragma once

#include <gio/gio.h>

// A connection over the socket, which becomes its own. Null on failure.
GDBusConnection *connect_bus_end(int socket_fd);

// Two connections to each other, closed at the end. Null where they could not be made.
class bus_pair {
  public:
    bus_pair();
    ~bus_pair();
    bus_pair(const bus_pair &) = delete;
    bus_pair &operator=(const bus_pair &) = delete;

    GDBusConnection *server() const { return server_; }
    GDBusConnection *client() const { return client_; }
    bool is_connected() const { return server_ != nullptr && client_ != nullptr; }

    // Neither sees anything of the other afterwards.
    void close();

  private:
    GDBusConnection *server_ = nullptr;
    GDBusConnection *client_ = nullptr;
};
