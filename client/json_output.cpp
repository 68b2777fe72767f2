// client/json_output.cpp: answers as JSON.
#include "client/json_output.h"

#include <algorithm>

#include "output/display_text.h"

JsonNode *json_of_list(GVariant *results, const char *columns) {
    g_auto(GStrv) names = g_strsplit(columns, " ", -1);
    g_autoptr(JsonArray) rows = json_array_new();
    gsize length = G_MAXSIZE;

    // The service keeps the arrays in step; were they not, no element would be made up.
    for (gsize column = 0; names[column] != nullptr; column++) {
        g_autoptr(GVariant) array = g_variant_get_child_value(results, column);
        length = std::min(length, g_variant_n_children(array));
    }
    for (gsize row = 0; row < length; row++) {
        JsonObject *object = json_object_new();
        for (gsize column = 0; names[column] != nullptr; column++) {
            g_autoptr(GVariant) array = g_variant_get_child_value(results, column);
            g_autoptr(GVariant) cell = g_variant_get_child_value(array, row);
            json_object_set_member(object, names[column], json_gvariant_serialize(cell));
        }
        json_array_add_object_element(rows, object);
    }
    JsonNode *node = json_node_new(JSON_NODE_ARRAY);
    json_node_set_array(node, rows);
    return node;
}

JsonNode *json_of_results(GVariant *results, const GDBusMethodInfo *method, const char *name) {
    g_autoptr(JsonObject) object = json_object_new();

    if (name != nullptr)
        json_object_set_string_member(object, "name", name);
    for (gsize i = 0; i < g_variant_n_children(results); i++) {
        g_autoptr(GVariant) value = g_variant_get_child_value(results, i);
        json_object_set_member(object, method->out_args[i]->name, json_gvariant_serialize(value));
    }
    JsonNode *node = json_node_new(JSON_NODE_OBJECT);
    json_node_set_object(node, object);
    return node;
}

char *json_format(JsonNode *node, json_mode mode) {
    g_autofree char *text = json_to_string(node, mode == json_mode::PRETTY);
    g_autofree char *escaped = display_escape_json(text);
    return g_strconcat(escaped, "\n", nullptr);
}
