// output/display_text.cpp: texts of others made fit for a terminal.
#include "output/display_text.h"

#include <glib.h>

static bool must_be_escaped(gunichar c) {
    switch (g_unichar_type(c)) {
        case G_UNICODE_CONTROL:
        case G_UNICODE_FORMAT:
        case G_UNICODE_LINE_SEPARATOR:
        case G_UNICODE_PARAGRAPH_SEPARATOR:
        case G_UNICODE_SURROGATE:
            return true;
        default:
            return false;
    }
}

char *display_escape(const char *text, bool keeps_lines) {
    g_autofree char *valid = g_utf8_make_valid(text, -1);
    GString *escaped = g_string_new(nullptr);

    for (const char *at = valid; *at != '\0'; at = g_utf8_find_next_char(at, nullptr)) {
        const gunichar c = g_utf8_get_char(at);
        if ((keeps_lines && (c == '\n' || c == '\t')) || !must_be_escaped(c))
            g_string_append_unichar(escaped, c);
        else if (c <= 0xff)
            g_string_append_printf(escaped, "\\x%02x", c);
        else
            g_string_append_printf(escaped, c <= 0xffff ? "\\u%04x" : "\\U%08x", c);
    }
    return g_string_free(escaped, FALSE);
}

static void append_json_escape(GString *document, gunichar c) {
    static constexpr gunichar FIRST_OF_PAIRS = 0x10000;

    if (c < FIRST_OF_PAIRS) {
        g_string_append_printf(document, "\\u%04x", c);
        return;
    }
    const gunichar rest = c - FIRST_OF_PAIRS;
    g_string_append_printf(document, "\\u%04x\\u%04x", 0xd800 + (rest >> 10),
                           0xdc00 + (rest & 0x3ff));
}

char *display_escape_json(const char *document) {
    g_autofree char *valid = g_utf8_make_valid(document, -1);
    GString *escaped = g_string_new(nullptr);

    for (const char *at = valid; *at != '\0'; at = g_utf8_find_next_char(at, nullptr)) {
        const gunichar c = g_utf8_get_char(at);
        if (c == '\n' || !must_be_escaped(c))
            g_string_append_unichar(escaped, c);
        else
            append_json_escape(escaped, c);
    }
    return g_string_free(escaped, FALSE);
}

int display_width(const char *text) {
    int width = 0;

    for (const char *at = text; *at != '\0'; at = g_utf8_find_next_char(at, nullptr)) {
        const gunichar c = g_utf8_get_char(at);
        if (g_unichar_iswide(c))
            width += 2;
        else if (!g_unichar_iszerowidth(c))
            width++;
    }
    return width;
}
