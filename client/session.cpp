// client/session.cpp: the bus, the call, and standard output.
#include "client/session.h"

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "client/client_error.h"
#include "privane_system_binding.h"

void session_choose_bus(const session &run) {
    const char *address = run.line->options[OPTION_ADDRESS];

    // The authorization library has to meet the same bus.
    if (address != nullptr)
        (void)g_setenv("DBUS_SYSTEM_BUS_ADDRESS", address, TRUE);  // No thread reads it meanwhile.
}

GDBusConnection *session_connect(GError **error) {
    GDBusConnection *bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, error);

    if (bus == nullptr) {
        g_prefix_error(error, "Cannot reach the bus: ");
        return nullptr;
    }
    // A bus that goes is told as an error.
    g_dbus_connection_set_exit_on_close(bus, FALSE);
    return bus;
}

GVariant *session_call(const session &run, const GDBusMethodInfo *method, GVariant *arguments,
                       GError **error) {
    g_autoptr(GVariant) owned = g_variant_ref_sink(arguments);
    g_autoptr(GDBusConnection) bus = session_connect(error);
    const int flags = G_DBUS_PROXY_FLAGS_DO_NOT_LOAD_PROPERTIES |
                      G_DBUS_PROXY_FLAGS_DO_NOT_CONNECT_SIGNALS |
                      G_DBUS_PROXY_FLAGS_DO_NOT_AUTO_START_AT_CONSTRUCTION;

    if (bus == nullptr)
        return nullptr;
    g_autoptr(PrivaneSystem) proxy = privane_system__proxy_new_sync(
        bus, static_cast<GDBusProxyFlags>(flags), SERVICE_NAME, SERVICE_PATH, nullptr, error);
    if (proxy == nullptr)
        return nullptr;
    return g_dbus_proxy_call_sync(G_DBUS_PROXY(proxy), method->name, owned, G_DBUS_CALL_FLAGS_NONE,
                                  run.line->timeout_ms, nullptr, error);
}

bool session_print(const char *text, GError **error) {
    if (std::fputs(text, stdout) != EOF && std::fflush(stdout) == 0)
        return true;
    const int saved = errno;
    return fail_failed(error, "Cannot write to standard output: %s", g_strerror(saved));
}
