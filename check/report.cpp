// check/report.cpp: prints the findings.
#include "check/report.h"

#include <algorithm>
#include <cstdio>

#include <json-glib/json-glib.h>

#include "output/display_text.h"

void print_text(const findings &found) {
    for (const finding &one : found.all()) {
        std::string line = one.file;
        if (one.line != 0)
            line += ":" + std::to_string(one.line);
        line += std::string(": ") + gravity_name(one.weight) + ": " + one.kind + ": ";
        if (!one.account.empty())
            line += "'" + one.account + "': ";
        g_autofree char *shown = display_escape((line + one.text).c_str(), false);
        (void)std::puts(shown);
    }
}

static void add_text(JsonBuilder *builder, const char *name, const std::string &text) {
    g_autofree char *valid = g_utf8_make_valid(text.c_str(), static_cast<gssize>(text.size()));
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
    if (!one.account.empty())
        add_text(builder, "account", one.account);
    add_text(builder, "text", one.text);
    (void)json_builder_end_object(builder);
}

void print_json(const findings &found, bool is_pretty) {
    g_autoptr(JsonBuilder) builder = json_builder_new();
    (void)json_builder_begin_object(builder);
    (void)json_builder_set_member_name(builder, "findings");
    (void)json_builder_begin_array(builder);
    for (const finding &one : found.all())
        add_finding(builder, one);
    (void)json_builder_end_array(builder);
    const auto worst = std::max_element(
        found.all().begin(), found.all().end(),
        [](const finding &one, const finding &other) { return one.weight < other.weight; });
    if (worst != found.all().end()) {
        add_text(builder, "worst", gravity_name(worst->weight));
    } else {
        (void)json_builder_set_member_name(builder, "worst");
        (void)json_builder_add_null_value(builder);
    }
    (void)json_builder_end_object(builder);

    g_autoptr(JsonNode) root = json_builder_get_root(builder);
    g_autofree char *text = json_to_string(root, is_pretty ? TRUE : FALSE);
    g_autofree char *shown = display_escape_json(text);
    (void)std::puts(shown);
}
