// client/monitor.cpp: prints UserDatabaseUpdated as it comes.
#include "client/monitor.h"

#include <cstdio>

#include <glib-unix.h>

#include "client/client_error.h"
#include "client/json_output.h"
#include "privane_system_binding.h"

static constexpr const char *SIGNAL = "UserDatabaseUpdated";

struct waiting {
    const session *run;
    GMainLoop *loop;
    GError *error;  // what ended it
};

static char *format_signal(const session &run) {
    g_autoptr(GDateTime) now = g_date_time_new_now_local();

    if (run.line->json == json_mode::OFF) {
        g_autofree char *time = g_date_time_format(now, "%F %T");
        return g_strdup_printf("%s %s\n", time, SIGNAL);
    }
    g_autofree char *time = g_date_time_format_iso8601(now);
    g_autoptr(JsonObject) object = json_object_new();
    json_object_set_string_member(object, "signal", SIGNAL);
    json_object_set_string_member(object, "time", time);
    g_autoptr(JsonNode) node = json_node_new(JSON_NODE_OBJECT);
    json_node_set_object(node, object);
    return json_format(node, run.line->json);
}

static void on_signal(PrivaneSystem *, gpointer data) {
    auto *wait = static_cast<waiting *>(data);
    g_autofree char *text = format_signal(*wait->run);

    if (wait->error == nullptr && !session_print(text, &wait->error))
        g_main_loop_quit(wait->loop);
}

static void on_closed(GDBusConnection *, gboolean, GError *, gpointer data) {
    auto *wait = static_cast<waiting *>(data);

    if (wait->error == nullptr)
        (void)fail_failed(&wait->error, "The bus has gone");
    g_main_loop_quit(wait->loop);
}

static gboolean on_end(gpointer data) {
    g_main_loop_quit(static_cast<waiting *>(data)->loop);
    return G_SOURCE_CONTINUE;
}

// The bus has taken the subscription when it answers to what was sent behind it.
static bool await_subscription(GDBusConnection *bus, GError **error) {
    g_autoptr(GVariant) answer = g_dbus_connection_call_sync(
        bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus", "GetId",
        nullptr, G_VARIANT_TYPE("(s)"), G_DBUS_CALL_FLAGS_NONE, -1, nullptr, error);
    return answer != nullptr;
}

bool run_monitor(const session &run, GError **error) {
    g_autoptr(GDBusConnection) bus = session_connect(error);
    const int flags =
        G_DBUS_PROXY_FLAGS_DO_NOT_LOAD_PROPERTIES | G_DBUS_PROXY_FLAGS_DO_NOT_AUTO_START;

    if (bus == nullptr)
        return false;
    g_autoptr(PrivaneSystem) proxy = privane_system__proxy_new_sync(
        bus, static_cast<GDBusProxyFlags>(flags), SERVICE_NAME, SERVICE_PATH, nullptr, error);
    if (proxy == nullptr || !await_subscription(bus, error))
        return false;

    g_autoptr(GMainLoop) loop = g_main_loop_new(nullptr, FALSE);
    waiting wait = {&run, loop, nullptr};
    (void)g_signal_connect(proxy, "user-database-updated", G_CALLBACK(on_signal), &wait);
    (void)g_signal_connect(bus, "closed", G_CALLBACK(on_closed), &wait);
    (void)g_unix_signal_add(SIGINT, on_end, &wait);
    (void)g_unix_signal_add(SIGTERM, on_end, &wait);
    if (run.line->options[OPTION_NO_LEGEND] == nullptr)
        (void)std::fprintf(stderr, "Waiting for announcements of %s; Ctrl-C ends this.\n",
                           SERVICE_NAME);
    g_main_loop_run(loop);
    g_signal_handlers_disconnect_by_data(proxy, &wait);
    g_signal_handlers_disconnect_by_data(bus, &wait);
    if (wait.error == nullptr)
        return true;
    g_propagate_error(error, wait.error);
    return false;
}
