// benchmarks/clients/call_times.cpp: how long a bus call takes.
//
//   call_times [OPTION...] INTERFACE.METHOD ARGUMENTS
//
// Prints the microseconds that a call takes: for one caller the median of its calls, which whatever
// else runs on the machine moves least, for several the time of all together by the number of all
// calls. ARGUMENTS is a tuple in GVariant's text format.
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

#include <sys/wait.h>
#include <unistd.h>

#include <gio/gio.h>

static char *destination;
static char *object_path;
static char *after_method;
static char *after_arguments;
static int warm_up_calls;
static int timed_calls = 1;
static int callers = 1;
static char *expected_error;
static gboolean answer_shown;

static const GOptionEntry options[] = {
    {"destination",     0, 0, G_OPTION_ARG_STRING, &destination,     "name on the bus",                "NAME"  },
    {"path",            0, 0, G_OPTION_ARG_STRING, &object_path,     "object",                         "PATH"  },
    {"warm-up",         0, 0, G_OPTION_ARG_INT,    &warm_up_calls,   "calls before that do not count", "N"     },
    {"calls",           0, 0, G_OPTION_ARG_INT,    &timed_calls,     "calls of each caller",           "N"     },
    {"callers",         0, 0, G_OPTION_ARG_INT,    &callers,         "processes that call at once",    "N"     },
    {"after",           0, 0, G_OPTION_ARG_STRING, &after_method,    "made after each, not timed",     "METHOD"},
    {"after-arguments", 0, 0, G_OPTION_ARG_STRING, &after_arguments, "its arguments",                  "TUPLE" },
    {"fails-with",      0, 0, G_OPTION_ARG_STRING, &expected_error,  "each must fail so",              "TEXT"  },
    {"show",            0, 0, G_OPTION_ARG_NONE,   &answer_shown,    "call once and print the answer", nullptr },
    {nullptr,           0, 0, G_OPTION_ARG_NONE,   nullptr,          nullptr,                          nullptr },
};

[[noreturn]] static void die(const char *what, const char *why) {
    (void)fprintf(stderr, "call_times: %s: %s\n", what, why);
    exit(EXIT_FAILURE);
}

struct bus_call {
    char *interface;
    const char *method;
    GVariant *arguments;
};

static bus_call parse_call(const char *full_method, const char *arguments) {
    const char *dot = std::strrchr(full_method, '.');
    g_autoptr(GError) error = nullptr;
    GVariant *parsed = g_variant_parse(nullptr, arguments, nullptr, nullptr, &error);

    if (dot == nullptr || parsed == nullptr)
        die(full_method, dot == nullptr ? "no interface" : error->message);
    return {g_strndup(full_method, static_cast<gsize>(dot - full_method)), dot + 1, parsed};
}

static GDBusConnection *connect_to_bus() {
    g_autoptr(GError) error = nullptr;
    GDBusConnection *bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, nullptr, &error);

    if (bus == nullptr)
        die("no system bus", error->message);
    return bus;
}

// The microseconds it took. An answer of the other kind ends the program: it would be no measure.
static gint64 make_call(GDBusConnection *bus, const bus_call &call, const char *must_fail_with) {
    g_autoptr(GError) error = nullptr;
    const gint64 start = g_get_monotonic_time();
    g_autoptr(GVariant) reply = g_dbus_connection_call_sync(
        bus, destination, object_path, call.interface, call.method, call.arguments, nullptr,
        G_DBUS_CALL_FLAGS_NONE, G_MAXINT, nullptr, &error);
    const gint64 elapsed = g_get_monotonic_time() - start;

    if (reply == nullptr &&
        (must_fail_with == nullptr || std::strstr(error->message, must_fail_with) == nullptr))
        die(call.method, error->message);
    if (reply != nullptr && must_fail_with != nullptr)
        die(call.method, "it did not fail");
    if (answer_shown) {
        g_autofree char *text = reply != nullptr ? g_variant_print(reply, FALSE) : nullptr;
        (void)puts(text != nullptr ? text : error->message);
    }
    return elapsed;
}

// The median of the calls' own times.
static gint64 make_calls(GDBusConnection *bus, const bus_call &call, const bus_call *after,
                         int count) {
    std::vector<gint64> times;
    for (int i = 0; i < count; i++) {
        times.push_back(make_call(bus, call, expected_error));
        if (after != nullptr)
            (void)make_call(bus, *after, nullptr);
    }
    const auto middle = times.begin() + count / 2;
    std::nth_element(times.begin(), middle, times.end());
    return count > 0 ? *middle : 0;
}

// Each says that it is ready by one byte, and starts when the other pipe is closed.
static double time_callers(const bus_call &call, const bus_call *after) {
    int ready[2];
    int go[2];
    char byte = 0;
    if (pipe(ready) != 0 || pipe(go) != 0)
        die("pipe", g_strerror(errno));

    for (int i = 0; i < callers; i++) {
        const pid_t child = fork();
        if (child < 0)
            die("fork", g_strerror(errno));
        if (child > 0)
            continue;
        (void)close(go[1]);
        GDBusConnection *bus = connect_to_bus();
        (void)make_calls(bus, call, after, warm_up_calls);
        if (write(ready[1], &byte, 1) != 1 || read(go[0], &byte, 1) != 0)
            die("pipe", "it does not work");
        (void)make_calls(bus, call, after, timed_calls);
        _exit(0);
    }
    (void)close(ready[1]);
    for (int i = 0; i < callers; i++)
        if (read(ready[0], &byte, 1) != 1)
            die("caller", "it ended too early");

    const gint64 start = g_get_monotonic_time();
    (void)close(go[1]);
    for (int i = 0; i < callers; i++) {
        int status = 0;
        if (wait(&status) < 0 || status != 0)
            die("caller", "it failed");
    }
    return static_cast<double>(g_get_monotonic_time() - start) / callers / timed_calls;
}

int main(int argc, char **argv) {
    g_autoptr(GOptionContext) context = g_option_context_new("INTERFACE.METHOD ARGUMENTS");
    g_autoptr(GError) error = nullptr;
    g_option_context_add_main_entries(context, options, nullptr);
    if (!g_option_context_parse(context, &argc, &argv, &error))
        die("options", error->message);
    if (argc != 3 || destination == nullptr || object_path == nullptr || timed_calls < 1 ||
        callers < 1)
        die("options", "see --help");

    const bus_call call = parse_call(argv[1], argv[2]);
    bus_call after = {};
    if (after_method != nullptr)
        after = parse_call(after_method, after_arguments);
    const bus_call *after_each = after_method != nullptr ? &after : nullptr;

    if (callers > 1) {
        (void)printf("%.3f\n", time_callers(call, after_each));
        return EXIT_SUCCESS;
    }
    GDBusConnection *bus = connect_to_bus();
    if (answer_shown) {
        (void)make_call(bus, call, expected_error);
        return EXIT_SUCCESS;
    }
    (void)make_calls(bus, call, after_each, warm_up_calls);
    const gint64 median = make_calls(bus, call, after_each, timed_calls);
    (void)printf("%" G_GINT64_FORMAT "\n", median);
}
