// client/account_verbs.cpp: the arguments of the digest commands.
#include "client/account_verbs.h"

#include <cerrno>
#include <cstring>

#include <unistd.h>

#include "client/arguments.h"
#include "client/client_error.h"
#include "client/password_prompt.h"

static constexpr const char *REALM = "PRIVANE";

// Far more than a device has accounts.
static constexpr gsize LONGEST_LIST = 1UL << 20;

static GVariant *digest_arguments(const char *action, const char *list) {
    const char *const arguments[] = {action, list, nullptr};
    return g_variant_new("(^as)", arguments);
}

// A line is a login, and the first ":" in it ends the name.
static bool check_login_name(const char *name, GError **error) {
    if (*name != '\0' && std::strpbrk(name, ":\n") == nullptr)
        return true;
    return fail_usage(error, "no web login can be named '%s'", name);
}

GVariant *build_digest_set(const command_line &line, GError **error) {
    const char *name = word_at(line, 2);

    if (!check_login_name(name, error))
        return nullptr;
    g_auto(wiped_string) password = arguments_password(line, true, error);
    if (password == nullptr)
        return nullptr;
    g_auto(wiped_string) clear = g_strconcat(name, ":", REALM, ":", password, nullptr);
    g_auto(wiped_string) hash = g_compute_checksum_for_string(G_CHECKSUM_MD5, clear, -1);
    g_auto(wiped_string) entry = g_strconcat(name, ":", REALM, ":", hash, "\n", nullptr);
    return digest_arguments("set", entry);
}

// One byte more than a list may have shows that there is more, or ends it.
using list_bytes = wiped_bytes<LONGEST_LIST + 1>;

// False with an error. Where it is true, the list is a string.
static bool read_list(list_bytes *list, GError **error) {
    gsize length = 0;

    for (;;) {
        const ssize_t count = read(STDIN_FILENO, list->bytes + length, sizeof list->bytes - length);
        if (count < 0 && errno == EINTR)
            continue;
        if (count < 0)
            return fail_failed(error, "Cannot read the list: %s", g_strerror(errno));
        if (count == 0)
            break;
        length += static_cast<gsize>(count);
        if (length > LONGEST_LIST)
            return fail_failed(error, "The list is longer than %" G_GSIZE_FORMAT " bytes",
                               LONGEST_LIST);
    }
    if (length == 0)
        return fail_failed(error, "The list is empty");
    return g_utf8_validate(list->bytes, static_cast<gssize>(length), nullptr) != FALSE ||
           fail_failed(error, "The list is no UTF-8 text");
}

GVariant *build_digest_import(const command_line &, GError **error) {
    // Hashes log in as passwords do, so the list is wiped, too.
    list_bytes list;

    if (!read_list(&list, error))
        return nullptr;
    return digest_arguments("set", list.bytes);
}

GVariant *build_digest_delete(const command_line &line, GError **error) {
    g_autoptr(GString) list = g_string_new(nullptr);

    for (guint i = 2; i < line.words->len; i++) {
        if (!check_login_name(word_at(line, i), error))
            return nullptr;
        g_string_append_printf(list, "%s\n", word_at(line, i));
    }
    return digest_arguments("delete", list->str);
}
