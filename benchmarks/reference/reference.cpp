// benchmarks/reference/reference.cpp: a daemon on the same binding that answers with constants.
//
//   reference BUS_NAME none|polkit [NAMES_FILE]
//
// With "polkit" every call is checked first, by polkit's own client library: nothing of the
// service's takes part, so that whatever its libauthz takes longer shows. NAMES_FILE has a line for
// each name of GetUserList, which a colon ends. The answers and the refusal are the service's for
// the accounts that benchmarks/worlds.py writes; the runner compares the two.
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <gio/gio.h>

#include <polkit/polkit.h>

#include "privane_system_binding.h"

static constexpr const char *OBJECT_PATH = "/com/zintor/PrivaneSystem";

static const char *const SECONDARY_GROUPS[] = {"viewer", "operator", nullptr};
static const char *const GROUP_MEMBERS[] = {"b00001", "b00002", "b00003",
                                            "b00004", "b00005", nullptr};
static constexpr int USER_ID = 1001;
static constexpr int GROUP_ID = 410;

struct reference_state {
    PolkitAuthority *authority;  // null where everything is allowed
    char **user_names;
};

static bool find_uid(GDBusMethodInvocation *invocation, guint32 *out_uid) {
    g_autoptr(GVariant) reply = g_dbus_connection_call_sync(
        g_dbus_method_invocation_get_connection(invocation), "org.freedesktop.DBus",
        "/org/freedesktop/DBus", "org.freedesktop.DBus", "GetConnectionUnixUser",
        g_variant_new("(s)", g_dbus_method_invocation_get_sender(invocation)),
        G_VARIANT_TYPE("(u)"), G_DBUS_CALL_FLAGS_NONE, -1, nullptr, nullptr);
    if (reply == nullptr)
        return false;
    g_variant_get(reply, "(u)", out_uid);
    return true;
}

// In the words of the service and of its libauthz, which tell the caller's uid as well. An error of
// the check itself is none that is measured: the runner finds that it differs.
static void refuse(GDBusMethodInvocation *invocation, const char *action_id, const GError *error) {
    guint32 uid = 0;

    if (error == nullptr && find_uid(invocation, &uid))
        g_dbus_method_invocation_return_error(
            invocation, g_quark_from_static_string("authz"), 1,
            "Authorization check failed: action %s is refused to uid %" G_GUINT32_FORMAT, action_id,
            uid);
    else
        g_dbus_method_invocation_return_error(invocation, G_IO_ERROR, G_IO_ERROR_FAILED,
                                              "cannot check action %s: %s", action_id,
                                              error != nullptr ? error->message : "no uid");
}

static bool is_allowed(GDBusMethodInvocation *invocation, const reference_state *state,
                       const char *action_id) {
    if (state->authority == nullptr)
        return true;
    g_autoptr(GError) error = nullptr;
    g_autoptr(PolkitSubject) caller =
        polkit_system_bus_name_new(g_dbus_method_invocation_get_sender(invocation));
    g_autoptr(PolkitAuthorizationResult) result = polkit_authority_check_authorization_sync(
        state->authority, caller, action_id, nullptr, POLKIT_CHECK_AUTHORIZATION_FLAGS_NONE,
        nullptr, &error);

    if (result != nullptr && polkit_authorization_result_get_is_authorized(result))
        return true;
    refuse(invocation, action_id, error);
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

static gboolean on_remove_user(PrivaneSystem *skeleton, GDBusMethodInvocation *invocation,
                               const char *, reference_state *state) {
    if (is_allowed(invocation, state, "com.zintor.privane-system.removeuser"))
        privane_system__complete_remove_user(skeleton, invocation);
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
        {"handle-remove-user",     G_CALLBACK(on_remove_user)    },
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
        (void)fprintf(stderr, "usage: reference BUS_NAME none|polkit [NAMES_FILE]\n");
        return 2;
    }
    reference_state state = {nullptr, read_names(argc == 4 ? argv[3] : nullptr)};
    g_autoptr(GError) error = nullptr;
    if (std::strcmp(argv[2], "polkit") == 0) {
        state.authority = polkit_authority_get_sync(nullptr, &error);
        if (state.authority == nullptr) {
            (void)fprintf(stderr, "reference: %s\n", error->message);
            return EXIT_FAILURE;
        }
    }

    PrivaneSystem *skeleton = privane_system__skeleton_new();
    connect_methods(skeleton, &state);
    (void)g_bus_own_name(G_BUS_TYPE_SYSTEM, argv[1], G_BUS_NAME_OWNER_FLAGS_NONE, on_bus_acquired,
                         nullptr, nullptr, skeleton, nullptr);
    g_main_loop_run(g_main_loop_new(nullptr, FALSE));
}
