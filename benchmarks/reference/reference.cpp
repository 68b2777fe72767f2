// benchmarks/reference/reference.cpp: a daemon on the same binding that answers with constants.
//
//   reference BUS_NAME none|authz [NAMES_FILE]
//
// With "authz" every call is checked through libauthz first, as the service's are. NAMES_FILE has a
// line for each name of GetUserList, which a colon ends. The answers are the service's for the
// accounts that benchmarks/worlds.py writes; the runner compares the two.
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <gio/gio.h>

#include "platform/authz/authz.h"
#include "privane_system_binding.h"

static constexpr const char *OBJECT_PATH = "/com/zintor/PrivaneSystem";

static const char *const SECONDARY_GROUPS[] = {"viewer", "operator", nullptr};
static const char *const GROUP_MEMBERS[] = {"b00001", "b00002", "b00003",
                                            "b00004", "b00005", nullptr};
static constexpr int USER_ID = 1001;
static constexpr int GROUP_ID = 410;

struct reference_state {
    bool checks_callers;
    char **user_names;
};

static bool is_allowed(GDBusMethodInvocation *invocation, const reference_state *state,
                       const char *action_id) {
    g_autoptr(GError) error = nullptr;

    if (!state->checks_callers ||
        authz_check(g_dbus_method_invocation_get_sender(invocation), action_id, &error) != 0)
        return true;
    g_prefix_error(&error, "Authorization check failed: ");
    g_dbus_method_invocation_return_gerror(invocation, error);
    return false;
}

static gboolean on_get_user(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                            const char *, reference_state *state) {
    if (is_allowed(invocation, state, "com.zintor.privane-system.getuser"))
        privane_system__complete_get_user(skeleton, invocation, TRUE, "camera", SECONDARY_GROUPS,
                                          "Benchmark user", USER_ID);
    return TRUE;
}

static gboolean on_check_user(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                              const char *, reference_state *state) {
    if (is_allowed(invocation, state, "com.zintor.privane-system.checkuser"))
        privane_system__complete_check_user(skeleton, invocation, TRUE);
    return TRUE;
}

static gboolean on_get_group(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                             const char *, reference_state *state) {
    if (is_allowed(invocation, state, "com.zintor.privane-system.getgroup"))
        privane_system__complete_get_group(skeleton, invocation, GROUP_ID, GROUP_MEMBERS);
    return TRUE;
}

static gboolean on_get_user_list(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                                 reference_state *state) {
    if (is_allowed(invocation, state, "com.zintor.privane-system.getuserlist"))
        privane_system__complete_get_user_list(skeleton, invocation, state->user_names);
    return TRUE;
}

static gboolean on_add_user(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                            const char *, const char *, const char *, const char *, const char *,
                            reference_state *state) {
    if (is_allowed(invocation, state, "com.zintor.privane-system.adduser"))
        privane_system__complete_add_user(skeleton, invocation);
    return TRUE;
}

static gboolean on_auth_user_basic(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                                   const char *, const char *, reference_state *state) {
    if (is_allowed(invocation, state, "com.zintor.privane-system.authuserbasic"))
        privane_system__complete_auth_user_basic(skeleton, invocation);
    return TRUE;
}

static void connect_methods(PrivaneSystem *skeleton, reference_state *state) {
    const struct {
        const char *signal;
        GCallback handler;
    } rows[] = {
        {"handle-get-user",        G_CALLBACK(on_get_user)       },
        {"handle-check-user",      G_CALLBACK(on_check_user)     },
        {"handle-get-group",       G_CALLBACK(on_get_group)      },
        {"handle-get-user-list",   G_CALLBACK(on_get_user_list)  },
        {"handle-add-user",        G_CALLBACK(on_add_user)       },
        {"handle-auth-user-basic", G_CALLBACK(on_auth_user_basic)},
    };
    for (const auto &row : rows)
        (void)g_signal_connect(skeleton, row.signal, row.handler, state);
}

static void on_bus_acquired(GDBusConnection *connection, const char *, gpointer skeleton) {
    (void)g_dbus_interface_skeleton_export(G_DBUS_INTERFACE_SKELETON(skeleton), connection,
                                           OBJECT_PATH, nullptr);
}

// An empty list without a file.
static char **read_names(const char *names_file) {
    g_autofree char *text = nullptr;
    g_autoptr(GError) error = nullptr;
    if (names_file != nullptr && !g_file_get_contents(names_file, &text, nullptr, &error)) {
        (void)fprintf(stderr, "reference: %s\n", error->message);
        exit(EXIT_FAILURE);
    }

    g_autoptr(GPtrArray) names = g_ptr_array_new();
    g_auto(GStrv) lines = g_strsplit(text != nullptr ? text : "", "\n", -1);
    for (char **line = lines; *line != nullptr; line++) {
        const char *end = std::strchr(*line, ':');
        if (end != nullptr)
            g_ptr_array_add(names, g_strndup(*line, static_cast<gsize>(end - *line)));
    }
    g_ptr_array_add(names, nullptr);
    return reinterpret_cast<char **>(g_ptr_array_free(g_steal_pointer(&names), FALSE));
}

int main(int argc, char **argv) {
    if (argc < 3 || argc > 4) {
        (void)fprintf(stderr, "usage: reference BUS_NAME none|authz [NAMES_FILE]\n");
        return 2;
    }
    reference_state state = {std::strcmp(argv[2], "authz") == 0,
                             read_names(argc == 4 ? argv[3] : nullptr)};
    g_autoptr(GError) error = nullptr;
    if (state.checks_callers && authz_init(&error) == 0) {
        (void)fprintf(stderr, "reference: %s\n", error->message);
        return EXIT_FAILURE;
    }

    PrivaneSystem *skeleton = privane_system__skeleton_new();
    connect_methods(skeleton, &state);
    (void)g_bus_own_name(G_BUS_TYPE_SYSTEM, argv[1], G_BUS_NAME_OWNER_FLAGS_NONE, on_bus_acquired,
                         nullptr, nullptr, skeleton, nullptr);
    g_main_loop_run(g_main_loop_new(nullptr, FALSE));
}
