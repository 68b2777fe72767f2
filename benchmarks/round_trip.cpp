// benchmarks/round_trip.cpp: how long a call to the service takes next to a Ping of its process.
//
//   round_trip ROUNDS CALLS
//
// Each round makes CALLS of every kind, the kinds in turn, so that a machine whose speed drifts
// treats them alike. Prints a line a kind: its name, then the round's microseconds a call, ROUNDS
// times.
#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <vector>

#include <gio/gio.h>

static constexpr const char *BUS_NAME = "com.zintor.PrivaneSystem";
static constexpr const char *OBJECT_PATH = "/com/zintor/PrivaneSystem";

struct call_kind {
    const char *name;
    const char *interface;
    const char *method;
    const char *argument;  // the one string argument; null for none
};

static constexpr call_kind call_kinds[] = {
    {"Ping",      "org.freedesktop.DBus.Peer", "Ping",      nullptr},
    {"CheckUser", BUS_NAME,                    "CheckUser", "root" },
};

static void call_once(GDBusConnection *bus, const call_kind &kind) {
    g_autoptr(GError) error = nullptr;
    GVariant *arguments = kind.argument != nullptr ? g_variant_new("(s)", kind.argument) : nullptr;
    g_autoptr(GVariant) reply = g_dbus_connection_call_sync(
        bus, BUS_NAME, OBJECT_PATH, kind.interface, kind.method, arguments, nullptr,
        G_DBUS_CALL_FLAGS_NONE, -1, nullptr, &error);
    if (reply == nullptr) {
        (void)fprintf(stderr, "%s: %s\n", kind.name, error->message);
        exit(EXIT_FAILURE);
    }
}

static double microseconds_a_call(GDBusConnection *bus, const call_kind &kind, int calls) {
    const gint64 start = g_get_monotonic_time();
    for (int i = 0; i < calls; i++)
        call_once(bus, kind);
    return static_cast<double>(g_get_monotonic_time() - start) / calls;
}

int main(int argc, char **argv) {
    const int rounds = argc == 3 ? atoi(argv[1]) : 0;
    const int calls = argc == 3 ? atoi(argv[2]) : 0;
    if (rounds < 1 || calls < 1) {
        (void)fprintf(stderr, "usage: round_trip ROUNDS CALLS\n");
        return 2;
    }
    g_autoptr(GError) error = nullptr;
    g_autoptr(GDBusConnection) bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, &error);
    if (bus == nullptr) {
        (void)fprintf(stderr, "no system bus: %s\n", error->message);
        return EXIT_FAILURE;
    }

    for (const call_kind &kind : call_kinds)
        (void)microseconds_a_call(bus, kind, calls);  // a warm-up that does not count
    std::vector<double> measured[std::size(call_kinds)];
    for (int round = 0; round < rounds; round++)
        for (std::size_t k = 0; k < std::size(call_kinds); k++)
            measured[k].push_back(microseconds_a_call(bus, call_kinds[k], calls));
    for (std::size_t k = 0; k < std::size(call_kinds); k++) {
        (void)printf("%s", call_kinds[k].name);
        for (const double microseconds : measured[k])
            (void)printf(" %.2f", microseconds);
        (void)puts("");
    }
    return EXIT_SUCCESS;
}
