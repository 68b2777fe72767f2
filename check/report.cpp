// check/report.cpp: the findings as text and as JSON.
#include "check/report.h"

#include <json-glib/json-glib.h>

#include "output/display_text.h"

static void append_finding(GString *text, const finding &one) {
    g_autoptr(GString) line = g_string_new(one.file);

    if (one.line != 0)
        g_string_append_printf(line, ":%u", one.line);
    g_string_append_printf(line, ": %s: %s: ", gravity_name(one.weight), one.kind);
    if (one.account != nullptr)
        g_string_append_printf(line, "'%s': ", one.account);
    g_string_append(line, one.text);
    g_autofree char *shown = display_escape(line->str, false);
    g_string_append_printf(text, "%s\n", shown);
}

static char *format_text(const findings &found) {
    GString *text = g_string_new(nullptr);

    for (const finding *one : found.all())
        append_finding(text, *one);
    return g_string_free(text, FALSE);
}

static void add_text(JsonBuilder *builder, const char *name, const char *text) {
    g_autofree char *valid = g_utf8_make_valid(text, -1);

    (void)json_builder_set_member_name(builder, name);
    (void)json_builder_add_string_value(builder, valid);
}

static void add_finding(JsonBuilder *builder, const finding &one) {
    (void)json_builder_begin_object(builder);
    add_text(builder, "weight", gravity_name(one.weight));
    add_text(builder, "kind", one.kind);
    add_text(builder, "file", one.file);
    if (one.line != 0) {
        (void)json_builder_set_member_name(builder, "line");
        (void)json_builder_add_int_value(builder, one.line);
    }
    if (one.account != nullptr)
        add_text(builder, "account", one.account);
    add_text(builder, "text", one.text);
    (void)json_builder_end_object(builder);
}

static void add_worst(JsonBuilder *builder, const findings &found) {
    const finding *worst = nullptr;

    for (const finding *one : found.all())
        if (worst == nullptr || one->weight > worst->weight)
            worst = one;
    if (worst != nullptr) {
        add_text(builder, "worst", gravity_name(worst->weight));
        return;
    }
    (void)json_builder_set_member_name(builder, "worst");
    (void)json_builder_add_null_value(builder);
}

char *report_format(const findings &found, json_mode mode) {
    if (mode == json_mode::OFF)
        return format_text(found);
    g_autoptr(JsonBuilder) builder = json_builder_new();
    (void)json_builder_begin_object(builder);
    (void)json_builder_set_member_name(builder, "findings");
    (void)json_builder_begin_array(builder);
    for (const finding *one : found.all())
        add_finding(builder, *one);
    (void)json_builder_end_array(builder);
    add_worst(builder, found);
    (void)json_builder_end_object(builder);

    g_autoptr(JsonNode) root = json_builder_get_root(builder);
    g_autofree char *text = json_to_string(root, mode == json_mode::PRETTY ? TRUE : FALSE);
    g_autofree char *shown = display_escape_json(text);
    return g_strconcat(shown, "\n", nullptr);
}
