// client/verb_list.cpp: the help, and the table of commands as data.
#include "client/verb_list.h"

#include <algorithm>
#include <cstring>

#include "client/json_output.h"
#include "client/verbs.h"

// Where the help of a command begins, unless its usage is longer.
static constexpr int HELP_COLUMN = 34;

static void add_line(GString *text, const char *usage, const char *help) {
    const int length = static_cast<int>(std::strlen(usage));

    if (length + 4 <= HELP_COLUMN)
        g_string_append_printf(text, "  %-*s%s\n", HELP_COLUMN - 2, usage, help);
    else
        g_string_append_printf(text, "  %s\n%*s%s\n", usage, HELP_COLUMN, "", help);
}

static bool is_taken(option_id id, const char *noun) {
    return std::ranges::any_of(commands(), [id, noun](const command &row) {
        return row.help != nullptr && (noun == nullptr || std::strcmp(row.noun, noun) == 0) &&
               takes_option(row, id);
    });
}

static char *option_usage(const command_option &option) {
    return g_strconcat("--", option.name, option.value != nullptr ? "=" : nullptr, option.value,
                       nullptr);
}

char *help_format(const char *noun) {
    GString *text = g_string_new(
        "Usage: privanectl [OPTION...] COMMAND\n\n"
        "Calls the service com.zintor.PrivaneSystem.\n\nCommands:\n");

    for (const command &row : commands()) {
        if (row.help == nullptr || (noun != nullptr && std::strcmp(row.noun, noun) != 0))
            continue;
        g_autofree char *usage = command_usage(row);
        add_line(text, usage, row.help);
    }
    g_string_append(text, "\nOptions:\n");
    for (const command_option &option : command_options()) {
        if (!is_taken(option.id, noun))
            continue;
        g_autofree char *usage = option_usage(option);
        add_line(text, usage, option.help);
    }
    g_string_append(text, "\nExit status: 0 done, 1 refused or failed, 2 wrong usage.\n");
    return g_string_free(text, FALSE);
}

static JsonNode *json_of_commands() {
    g_autoptr(JsonArray) rows = json_array_new();

    for (const command &row : commands()) {
        if (row.help == nullptr)
            continue;
        g_autofree char *usage = command_usage(row);
        JsonObject *object = json_object_new();
        json_object_set_string_member(object, "noun", row.noun);
        json_object_set_string_member(object, "verb", row.verb);
        json_object_set_string_member(object, "method", row.method);
        json_object_set_string_member(object, "usage", usage);
        json_object_set_string_member(object, "help", row.help);
        json_array_add_object_element(rows, object);
    }
    JsonNode *node = json_node_new(JSON_NODE_ARRAY);
    json_node_set_array(node, rows);
    return node;
}

bool run_verbs(const session &run, GError **error) {
    g_autoptr(JsonNode) node = json_of_commands();
    g_autofree char *text = json_format(
        node, run.line->json == json_mode::SHORT ? json_mode::SHORT : json_mode::PRETTY);
    return session_print(text, error);
}
