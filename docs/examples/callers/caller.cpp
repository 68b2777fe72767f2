// docs/examples/callers/caller.cpp: a caller in C++, with the binding that gdbus-codegen generates.
#include <cstring>
#include <iostream>
#include <string>
#include <string_view>

#include <gio/gio.h>

#include "privane_system_binding.h"
#include "service_error.hpp"

constexpr const char *NAME = "com.zintor.PrivaneSystem";
constexpr const char *PATH = "/com/zintor/PrivaneSystem";

// Longer than the service itself waits for whoever decides about the call.
constexpr int TIMEOUT_MS = 60000;

static std::optional<service_error> decode(const GError *error) {
    g_autofree char *name = g_dbus_error_get_remote_error(error);
    return name != nullptr ? decode_error(name) : std::nullopt;
}

static bool is_error(const GError *error, std::string_view domain, int code) {
    const auto decoded = decode(error);
    return decoded && decoded->domain == domain && decoded->code == code;
}

// Tells an error on a line: those a caller can act on first.
static void tell(GError *error) {
    const auto decoded = decode(error);
    const bool exists = is_error(error, "usermgmt", 6);
    const bool refused = is_error(error, "authz", 1);
    g_dbus_error_strip_remote_error(error);
    if (exists)
        std::cerr << "there is such an account already\n";
    else if (refused)
        std::cerr << "not allowed: " << error->message << "\n";
    else if (decoded)
        std::cerr << error->message << " (" << decoded->domain << " " << decoded->code << ")\n";
    else
        std::cerr << error->message << "\n";
}

static bool list_users(PrivaneSystem *service, GError **error) {
    g_auto(GStrv) users = nullptr;
    if (!privane_system__call_get_user_list_sync(service, G_DBUS_CALL_FLAGS_NONE, TIMEOUT_MS,
                                                 &users, nullptr, error))
        return false;
    for (char **user = users; *user != nullptr; user++)
        std::cout << *user << std::endl;
    return true;
}

// A password whose text is wiped. What was read with it stays in the stream's buffer.
struct password_line {
    std::string text;

    // The first line of standard input, which no other user can see, as an argument could be.
    password_line() {
        text.reserve(1024);  // A text that has to grow leaves its beginning behind.
        std::getline(std::cin, text);
    }
    ~password_line() { explicit_bzero(text.data(), text.size()); }
    password_line(const password_line &) = delete;
    password_line &operator=(const password_line &) = delete;
};

static bool check_password(PrivaneSystem *service, const char *user, GError **error) {
    const password_line password;
    g_autoptr(GError) failure = nullptr;
    const bool right = privane_system__call_auth_user_basic_sync(
        service, user, password.text.c_str(), G_DBUS_CALL_FLAGS_NONE, TIMEOUT_MS, nullptr,
        &failure);
    if (!right && !is_error(failure, "privaneSystemError", 7)) {
        g_propagate_error(error, g_steal_pointer(&failure));
        return false;
    }
    std::cout << (right ? "right" : "wrong") << std::endl;
    return true;
}

static bool add_user(PrivaneSystem *service, const char *user, const char *group, GError **error) {
    const password_line password;
    const char *no_groups = "", *no_comment = "";
    if (!privane_system__call_add_user_sync(service, user, password.text.c_str(), group, no_groups,
                                            no_comment, G_DBUS_CALL_FLAGS_NONE, TIMEOUT_MS, nullptr,
                                            error))
        return false;
    std::cout << "added " << user << std::endl;
    return true;
}

static void on_update(PrivaneSystem *, gpointer) {
    std::cout << "UserDatabaseUpdated" << std::endl;
}

// Until the program is ended. The proxy has subscribed when it was made, so the list is read after.
static bool watch(PrivaneSystem *service, GError **error) {
    g_autoptr(GMainLoop) loop = g_main_loop_new(nullptr, FALSE);
    g_signal_connect(service, "user-database-updated", G_CALLBACK(on_update), nullptr);
    if (!list_users(service, error))
        return false;
    g_main_loop_run(loop);
    return true;
}

static int usage() {
    std::cerr << "usage: caller list | check USER | add USER GROUP | watch\n";
    return 2;
}

int main(int argc, char **argv) {
    const std::string_view command = argc > 1 ? argv[1] : "";
    g_autoptr(GError) error = nullptr;
    g_autoptr(PrivaneSystem) service = privane_system__proxy_new_for_bus_sync(
        G_BUS_TYPE_SYSTEM, G_DBUS_PROXY_FLAGS_NONE, NAME, PATH, nullptr, &error);
    if (service == nullptr) {
        tell(error);
        return 1;
    }

    bool done = false;
    if (command == "list" && argc == 2)
        done = list_users(service, &error);
    else if (command == "check" && argc == 3)
        done = check_password(service, argv[2], &error);
    else if (command == "add" && argc == 4)
        done = add_user(service, argv[2], argv[3], &error);
    else if (command == "watch" && argc == 2)
        done = watch(service, &error);
    else
        return usage();
    if (!done)
        tell(error);
    return done ? 0 : 1;
}
