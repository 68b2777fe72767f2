// benchmarks/reference/minimal.cpp: the least that a GDBus daemon with polkit does before it
// serves: the client of polkit's own library, the skeleton, the name. For start-up and memory.
//
//   minimal BUS_NAME
#include <cstdio>
#include <cstdlib>

#include <gio/gio.h>

#include <polkit/polkit.h>

#include "privane_system_binding.h"

static void on_bus_acquired(GDBusConnection *connection, const char *, gpointer skeleton) {
    (void)g_dbus_interface_skeleton_export(G_DBUS_INTERFACE_SKELETON(skeleton), connection,
                                           "/com/zintor/PrivaneSystem", nullptr);
}

int main(int argc, char **argv) {
    if (argc != 2) {
        (void)fprintf(stderr, "usage: minimal BUS_NAME\n");
        return 2;
    }
    g_autoptr(GError) error = nullptr;
    g_autoptr(PolkitAuthority) authority = polkit_authority_get_sync(nullptr, &error);
    if (authority == nullptr) {
        (void)fprintf(stderr, "minimal: %s\n", error->message);
        return EXIT_FAILURE;
    }
    (void)g_bus_own_name(G_BUS_TYPE_SYSTEM, argv[1], G_BUS_NAME_OWNER_FLAGS_NONE, on_bus_acquired,
                         nullptr, nullptr, privane_system__skeleton_new(), nullptr);
    g_main_loop_run(g_main_loop_new(nullptr, FALSE));
}
