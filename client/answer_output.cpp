// client/answer_output.cpp: the answer of a method, as JSON or for people.
#include "client/answer_output.h"

#include <cstring>

#include "client/json_output.h"
#include "client/table_output.h"
#include "client/verbs.h"
#include "output/display_text.h"

// Of a record, what says more than its value.
struct special_label {
    const char *result;
    const char *label;
    const char *unit;
    bool is_answer;  // yes unless the number is 0
};

static constexpr special_label SPECIAL_LABELS[] = {
    {"gid",             "GID",             "",        false},
    {"uid",             "UID",             "",        false},
    {"pid",             "PID",             "",        false},
    {"speed",           "Speed",           " Mbit/s", false},
    {"autonegotiation", "Autonegotiation", "",        true },
};

static const special_label *find_special(const char *result) {
    for (const special_label &row : SPECIAL_LABELS)
        if (std::strcmp(row.result, result) == 0)
            return &row;
    return nullptr;
}

// "has_password" becomes "Has password".
static char *label_of(const char *result) {
    const special_label *special = find_special(result);
    char *label = g_strdup(special != nullptr ? special->label : result);

    (void)g_strdelimit(label, "_", ' ');
    label[0] = g_ascii_toupper(label[0]);
    return label;
}

static char *text_of(GVariant *value) {
    if (g_variant_is_of_type(value, G_VARIANT_TYPE_STRING))
        return g_variant_dup_string(value, nullptr);
    if (g_variant_is_of_type(value, G_VARIANT_TYPE_BOOLEAN))
        return g_strdup(g_variant_get_boolean(value) ? "yes" : "no");
    if (g_variant_is_of_type(value, G_VARIANT_TYPE_STRING_ARRAY)) {
        g_autofree const char **names = g_variant_get_strv(value, nullptr);
        return g_strjoinv(" ", const_cast<char **>(names));
    }
    return g_variant_print(value, FALSE);
}

static char *record_value(const char *result, GVariant *value) {
    const special_label *special = find_special(result);
    g_autofree char *text = text_of(value);

    if (special == nullptr)
        return g_steal_pointer(&text);
    if (special->is_answer)
        return g_strdup(std::strcmp(text, "0") == 0 ? "no" : "yes");
    return g_strconcat(text, special->unit, nullptr);
}

static char *format_record(const GDBusMethodInfo *method, GVariant *results, const char *name) {
    g_autoptr(GStrvBuilder) labels = g_strv_builder_new();
    g_autoptr(GStrvBuilder) values = g_strv_builder_new();

    if (name != nullptr) {
        g_strv_builder_add(labels, "Name");
        g_strv_builder_add(values, name);
    }
    for (gsize i = 0; i < g_variant_n_children(results); i++) {
        g_autoptr(GVariant) value = g_variant_get_child_value(results, i);
        g_autofree char *label = label_of(method->out_args[i]->name);
        g_autofree char *text = record_value(method->out_args[i]->name, value);
        g_strv_builder_add(labels, label);
        g_strv_builder_add(values, text);
    }
    g_auto(GStrv) all_labels = g_strv_builder_end(labels);
    g_auto(GStrv) all_values = g_strv_builder_end(values);
    return record_format(all_labels, all_values);
}

static GPtrArray *rows_of(GVariant *results) {
    auto *rows = g_ptr_array_new_with_free_func(reinterpret_cast<GDestroyNotify>(g_strfreev));
    const gsize columns = g_variant_n_children(results);
    g_autoptr(GVariant) first = g_variant_get_child_value(results, 0);

    for (gsize row = 0; row < g_variant_n_children(first); row++) {
        auto *cells = g_new0(char *, columns + 1);
        for (gsize column = 0; column < columns; column++) {
            g_autoptr(GVariant) array = g_variant_get_child_value(results, column);
            g_autoptr(GVariant) cell =
                row < g_variant_n_children(array) ? g_variant_get_child_value(array, row) : nullptr;
            cells[column] = cell != nullptr ? text_of(cell) : g_strdup("");
        }
        g_ptr_array_add(rows, cells);
    }
    return rows;
}

static char *format_list(const session &run, GVariant *results) {
    const bool has_legend = run.line->options[OPTION_NO_LEGEND] == nullptr;
    g_autoptr(GPtrArray) rows = rows_of(results);
    g_autofree char *upper = g_ascii_strup(run.asked->columns, -1);
    g_auto(GStrv) titles = g_strsplit(upper, " ", -1);
    const guint count = g_strv_length(titles);
    g_autofree table_column *columns = g_new0(table_column, count);

    for (guint i = 0; i < count; i++) {
        g_autoptr(GVariant) array = g_variant_get_child_value(results, i);
        columns[i] = {titles[i], g_variant_is_of_type(array, G_VARIANT_TYPE("ai")) == TRUE};
    }
    g_autofree char *table =
        table_format(std::span(columns, count), rows, {has_legend, run.in_color});
    if (!has_legend)
        return g_steal_pointer(&table);
    return g_strdup_printf("%s\n%u listed.\n", table, rows->len);
}

// A terminal obeys what is in a text; what is no terminal gets the text as it is.
static char *format_text(const session &run, GVariant *results, bool keeps_lines) {
    const char *text = nullptr;

    g_variant_get_child(results, 0, "&s", &text);
    g_autofree char *shown = run.on_terminal ? display_escape(text, keeps_lines) : g_strdup(text);
    if (keeps_lines && (*shown == '\0' || g_str_has_suffix(shown, "\n")))
        return g_steal_pointer(&shown);
    return g_strconcat(shown, "\n", nullptr);
}

static char *format_for_people(const session &run, const GDBusMethodInfo *method, GVariant *results,
                               const char *name) {
    gboolean answer = FALSE;

    switch (run.asked->answer) {
        case shape::NOTHING:
            return g_strdup("");
        case shape::TEXT:
            return format_text(run, results, true);
        case shape::LINE:
            return format_text(run, results, false);
        case shape::ANSWER:
            g_variant_get(results, "(b)", &answer);
            return g_strdup(answer ? "yes\n" : "no\n");
        case shape::LIST:
            return format_list(run, results);
        case shape::RECORD:
        case shape::SUBJECT:
            break;
    }
    return format_record(method, results, name);
}

char *answer_format(const session &run, const GDBusMethodInfo *method, GVariant *results) {
    const char *name =
        run.asked->answer == shape::SUBJECT ? word_at(*run.line, name_length(*run.asked)) : nullptr;

    if (run.line->json == json_mode::OFF)
        return format_for_people(run, method, results, name);
    g_autoptr(JsonNode) node = run.asked->answer == shape::LIST
                                   ? json_of_list(results, run.asked->columns)
                                   : json_of_results(results, method, name);
    return json_format(node, run.line->json);
}
