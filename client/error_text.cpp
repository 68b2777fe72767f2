// client/error_text.cpp: an error as one line.
#include "client/error_text.h"

#include <cstring>

#include <gio/gio.h>

#include "client/client_error.h"
#include "client/command_line.h"
#include "output/display_text.h"

static constexpr const char *PREFIX = "org.gtk.GDBus.UnmappedGError.Quark._";
static constexpr const char *CODE_MARK = ".Code";

// Undoes "_2d" for "-". False where the text is nothing that GDBus writes.
static bool decode(const char *text, gsize length, GString *out_decoded) {
    for (gsize i = 0; i < length; i++) {
        if (g_ascii_isalnum(text[i])) {
            g_string_append_c(out_decoded, text[i]);
            continue;
        }
        if (text[i] != '_' || length - i < 3 || g_ascii_xdigit_value(text[i + 1]) < 0 ||
            g_ascii_xdigit_value(text[i + 2]) < 0)
            return false;
        const int byte = g_ascii_xdigit_value(text[i + 1]) * 16 + g_ascii_xdigit_value(text[i + 2]);
        if (byte == 0)
            return false;
        g_string_append_c(out_decoded, static_cast<char>(byte));
        i += 2;
    }
    return length > 0;
}

bool error_name_split(const char *bus_name, char **out_domain, int *out_code) {
    gint64 code = 0;

    if (!g_str_has_prefix(bus_name, PREFIX))
        return false;
    const char *domain = bus_name + std::strlen(PREFIX);
    const char *mark = g_strrstr(domain, CODE_MARK);
    if (mark == nullptr || !parse_number(mark + std::strlen(CODE_MARK), G_MININT, G_MAXINT, &code))
        return false;
    g_autoptr(GString) decoded = g_string_new(nullptr);
    if (!decode(domain, static_cast<gsize>(mark - domain), decoded))
        return false;
    *out_domain = g_strdup(decoded->str);
    *out_code = static_cast<int>(code);
    return true;
}

// What stands in the brackets; null for nothing.
static char *tell_origin(const GError *error) {
    g_autofree char *bus_name = g_dbus_error_get_remote_error(error);
    g_autofree char *domain = nullptr;
    int code = 0;

    if (error->domain == CLIENT_ERROR)
        return nullptr;
    if (bus_name == nullptr)
        return g_strdup_printf("%s %d", g_quark_to_string(error->domain), error->code);
    if (error_name_split(bus_name, &domain, &code))
        return g_strdup_printf("%s %d", domain, code);
    return g_steal_pointer(&bus_name);
}

char *error_text_line(const GError *error) {
    g_autoptr(GError) told = g_error_copy(error);
    g_autofree char *origin = tell_origin(error);

    (void)g_dbus_error_strip_remote_error(told);  // A local error has nothing to strip.
    g_autofree char *text = display_escape(g_strchomp(told->message), false);
    if (origin == nullptr)
        return g_steal_pointer(&text);
    g_autofree char *shown_origin = display_escape(origin, false);
    return g_strdup_printf("%s (%s)", text, shown_origin);
}
