// client/completion_values.cpp: what this machine has of users, groups, units and the like.
#include "client/completion_values.h"

#include <grp.h>
#include <pwd.h>

#include "client/session.h"
#include "client/unit_name.h"
#include "privane_system_binding.h"

// Nobody waits longer for a completion.
static constexpr int PATIENCE_MS = 1000;

// The account files are read, not the service asked: a completion is no call that one must be
// allowed, or that should stand in a log.
static void add_users(GStrvBuilder *values) {
    setpwent();
    for (const passwd *user = getpwent(); user != nullptr; user = getpwent())
        g_strv_builder_add(values, user->pw_name);
    endpwent();
}

static void add_groups(GStrvBuilder *values) {
    setgrent();
    for (const group *entry = getgrent(); entry != nullptr; entry = getgrent())
        g_strv_builder_add(values, entry->gr_name);
    endgrent();
}

static void add_methods(GStrvBuilder *values) {
    const GDBusInterfaceInfo *interface = privane_system__interface_info();

    for (GDBusMethodInfo **method = interface->methods; *method != nullptr; method++)
        g_strv_builder_add(values, (*method)->name);
}

static void add_units(const char *suffix, GStrvBuilder *values) {
    g_autoptr(GDBusConnection) bus = session_connect(nullptr);
    g_autofree char *pattern = g_strconcat("*", suffix, nullptr);
    const char *const patterns[] = {pattern, nullptr};
    const char *const states[] = {nullptr};
    const char *path = nullptr;

    if (bus == nullptr)
        return;
    g_autoptr(GVariant) files = g_dbus_connection_call_sync(
        bus, "org.freedesktop.systemd1", "/org/freedesktop/systemd1",
        "org.freedesktop.systemd1.Manager", "ListUnitFilesByPatterns",
        g_variant_new("(^as^as)", states, patterns), G_VARIANT_TYPE("(a(ss))"),
        G_DBUS_CALL_FLAGS_NO_AUTO_START, PATIENCE_MS, nullptr, nullptr);
    if (files == nullptr)
        return;
    g_autoptr(GVariantIter) rows = nullptr;
    g_variant_get(files, "(a(ss))", &rows);
    while (g_variant_iter_next(rows, "(&s&s)", &path, nullptr)) {
        g_autofree char *file = g_path_get_basename(path);
        g_autofree char *unit = unit_without_suffix(file, suffix);
        if (is_unit_name(unit))
            g_strv_builder_add(values, unit);
    }
}

// The names in a folder that begin with one of the prefixes.
static void add_entries(const char *folder, const char *const *prefixes, const char *before,
                        GStrvBuilder *values) {
    g_autoptr(GDir) entries = g_dir_open(folder, 0, nullptr);

    for (const char *name = entries != nullptr ? g_dir_read_name(entries) : nullptr;
         name != nullptr; name = g_dir_read_name(entries))
        for (const char *const *prefix = prefixes; *prefix != nullptr; prefix++)
            if (g_str_has_prefix(name, *prefix)) {
                g_autofree char *value = g_strconcat(before, name, nullptr);
                g_strv_builder_add(values, value);
            }
}

static void add_choices(const char *choices, GStrvBuilder *values) {
    g_auto(GStrv) words = g_strsplit(choices, " ", -1);
    g_strv_builder_addv(values, const_cast<const char **>(words));
}

char **completion_values(value_kind kind, const char *choices) {
    static constexpr const char *DISKS[] = {"sd", nullptr};
    static constexpr const char *INTERFACES[] = {"eth", "br", "wlan", nullptr};
    g_autoptr(GStrvBuilder) values = g_strv_builder_new();

    switch (kind) {
        case value_kind::USER:
            add_users(values);
            break;
        case value_kind::GROUP:
        case value_kind::GROUPS:
            add_groups(values);
            break;
        case value_kind::UNIT:
            add_units(".service", values);
            break;
        case value_kind::TARGET:
            add_units(".target", values);
            break;
        case value_kind::METHOD:
            add_methods(values);
            break;
        case value_kind::DISK:
            add_entries("/sys/block", DISKS, "/dev/", values);
            break;
        case value_kind::INTERFACE:
            add_entries("/sys/class/net", INTERFACES, "", values);
            break;
        case value_kind::CHOICE:
            add_choices(choices, values);
            break;
        case value_kind::FILE_PATH:
        case value_kind::TEXT:
        case value_kind::NUMBER:
            break;
    }
    return g_strv_builder_end(values);
}
