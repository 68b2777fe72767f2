/* docs/examples/callers/caller.c: a caller in C, with nothing but GIO. */
#include <stdio.h>
#include <string.h>

#include <gio/gio.h>

static const char NAME[] = "com.zintor.PrivaneSystem";
static const char PATH[] = "/com/zintor/PrivaneSystem";

/* Longer than the service itself waits for whoever decides about the call. */
enum { TIMEOUT_MS = 60000 };

/* Calls a method. The answer, of that type, is the caller's; NULL with the error set. */
static GVariant *call(GDBusConnection *bus, const char *method, GVariant *arguments,
                      const char *answer, GError **error) {
    return g_dbus_connection_call_sync(bus, NAME, PATH, NAME, method, arguments,
                                       G_VARIANT_TYPE(answer), G_DBUS_CALL_FLAGS_NONE, TIMEOUT_MS,
                                       NULL, error);
}

static gboolean is_error(const GError *error, const char *domain, int code) {
    return g_error_matches(error, g_quark_from_string(domain), code);
}

/* Tells an error on a line: those a caller can act on first. */
static void tell(GError *error) {
    g_dbus_error_strip_remote_error(error);
    if (is_error(error, "usermgmt", 6))
        fprintf(stderr, "there is such an account already\n");
    else if (is_error(error, "authz", 1))
        fprintf(stderr, "not allowed: %s\n", error->message);
    else
        fprintf(stderr, "%s (%s %d)\n", error->message, g_quark_to_string(error->domain),
                error->code);
}

static gboolean list_users(GDBusConnection *bus, GError **error) {
    g_autoptr(GVariant) reply = call(bus, "GetUserList", NULL, "(as)", error);
    if (reply == NULL)
        return FALSE;
    g_autofree const char **users = NULL;
    g_variant_get(reply, "(^a&s)", &users);
    for (int k = 0; users[k] != NULL; k++)
        puts(users[k]);
    return TRUE;
}

/* The first line of standard input, which no other user can see, as an argument could be. */
static gboolean read_password(char *buffer, int size) {
    if (fgets(buffer, size, stdin) == NULL)
        return FALSE;
    buffer[strcspn(buffer, "\n")] = '\0';
    return TRUE;
}

static gboolean check_password(GDBusConnection *bus, const char *user, const char *password,
                               GError **error) {
    g_autoptr(GError) failure = NULL;
    g_autoptr(GVariant) reply =
        call(bus, "AuthUserBasic", g_variant_new("(ss)", user, password), "()", &failure);
    if (reply == NULL && !is_error(failure, "privaneSystemError", 7)) {
        g_propagate_error(error, g_steal_pointer(&failure));
        return FALSE;
    }
    puts(reply != NULL ? "right" : "wrong");
    return TRUE;
}

static gboolean add_user(GDBusConnection *bus, const char *user, const char *password,
                         const char *group, GError **error) {
    const char *no_groups = "", *no_comment = "";
    g_autoptr(GVariant) reply =
        call(bus, "AddUser", g_variant_new("(sssss)", user, password, group, no_groups, no_comment),
             "()", error);
    if (reply == NULL)
        return FALSE;
    printf("added %s\n", user);
    return TRUE;
}

static void on_signal(GDBusConnection *bus, const char *sender, const char *path,
                      const char *interface, const char *signal, GVariant *arguments,
                      gpointer data) {
    (void)bus, (void)sender, (void)path, (void)interface, (void)arguments, (void)data;
    puts(signal);
}

/* Until the program is ended. Who keeps accounts reads them after the subscription, else a change
 * in between is missed, and again at each signal. */
static gboolean watch(GDBusConnection *bus, GError **error) {
    g_autoptr(GMainLoop) loop = g_main_loop_new(NULL, FALSE);
    g_dbus_connection_signal_subscribe(bus, NAME, NAME, "UserDatabaseUpdated", PATH, NULL,
                                       G_DBUS_SIGNAL_FLAGS_NONE, on_signal, NULL, NULL);
    if (!list_users(bus, error))
        return FALSE;
    g_main_loop_run(loop);
    return TRUE;
}

int main(int argc, char **argv) {
    char password[512] = "";
    gboolean done = FALSE;
    g_autoptr(GError) error = NULL;

    setvbuf(stdout, NULL, _IOLBF, 0);
    g_autoptr(GDBusConnection) bus = g_bus_get_sync(G_BUS_TYPE_SYSTEM, NULL, &error);
    if (bus == NULL) {
        tell(error);
        return 1;
    }
    if (argc == 2 && strcmp(argv[1], "list") == 0) {
        done = list_users(bus, &error);
    } else if (argc == 2 && strcmp(argv[1], "watch") == 0) {
        done = watch(bus, &error);
    } else if (argc == 3 && strcmp(argv[1], "check") == 0 &&
               read_password(password, sizeof password)) {
        done = check_password(bus, argv[2], password, &error);
    } else if (argc == 4 && strcmp(argv[1], "add") == 0 &&
               read_password(password, sizeof password)) {
        done = add_user(bus, argv[2], password, argv[3], &error);
    } else {
        fprintf(stderr, "usage: caller list | check USER | add USER GROUP | watch\n");
        return 2;
    }
    explicit_bzero(password, sizeof password);
    if (!done)
        tell(error);
    return done ? 0 : 1;
}
