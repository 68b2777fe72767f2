// client/table_output.cpp: aligned tables and records.
#include "client/table_output.h"

#include <algorithm>

#include "output/display_text.h"

static constexpr const char *UNDERLINED = "\x1b[4m";
static constexpr const char *PLAIN = "\x1b[0m";

static void add_blanks(GString *text, int count) {
    for (int i = 0; i < count; i++)
        g_string_append_c(text, ' ');
}

static void add_cell(GString *text, const char *cell, const table_column &column, int width,
                     bool is_last) {
    const int missing = width - display_width(cell);

    if (column.is_number)
        add_blanks(text, missing);
    g_string_append(text, cell);
    if (!column.is_number && !is_last)
        add_blanks(text, missing);
}

static void add_row(GString *text, std::span<const table_column> columns, const int *widths,
                    const char *const *cells) {
    for (std::size_t i = 0; i < columns.size(); i++) {
        const bool is_last = i + 1 == columns.size();
        if (i > 0)
            g_string_append_c(text, ' ');
        add_cell(text, cells[i], columns[i], widths[i], is_last);
    }
}

// The cells as they are shown.
static GPtrArray *escape_rows(GPtrArray *rows, std::size_t columns) {
    auto *shown = g_ptr_array_new_with_free_func(reinterpret_cast<GDestroyNotify>(g_strfreev));

    for (guint row = 0; row < rows->len; row++) {
        const auto *cells = static_cast<const char *const *>(rows->pdata[row]);
        auto *escaped = g_new0(char *, columns + 1);
        for (std::size_t i = 0; i < columns; i++)
            escaped[i] = display_escape(cells[i], false);
        g_ptr_array_add(shown, escaped);
    }
    return shown;
}

char *table_format(std::span<const table_column> columns, GPtrArray *rows, table_style style) {
    g_autoptr(GPtrArray) shown = escape_rows(rows, columns.size());
    g_autofree int *widths = g_new0(int, columns.size());
    g_autofree const char **titles = g_new0(const char *, columns.size());
    GString *text = g_string_new(nullptr);

    for (std::size_t i = 0; i < columns.size(); i++) {
        titles[i] = columns[i].title;
        widths[i] = style.has_legend ? display_width(titles[i]) : 0;
        for (guint row = 0; row < shown->len; row++)
            widths[i] =
                std::max(widths[i], display_width(static_cast<char **>(shown->pdata[row])[i]));
    }
    if (style.has_legend) {
        g_string_append(text, style.in_color ? UNDERLINED : "");
        add_row(text, columns, widths, titles);
        g_string_append(text, style.in_color ? PLAIN : "");
        g_string_append_c(text, '\n');
    }
    for (guint row = 0; row < shown->len; row++) {
        const gsize start = text->len;
        add_row(text, columns, widths, static_cast<char **>(shown->pdata[row]));
        // Empty cells at the end leave nothing but blanks.
        while (text->len > start && text->str[text->len - 1] == ' ')
            g_string_truncate(text, text->len - 1);
        g_string_append_c(text, '\n');
    }
    return g_string_free(text, FALSE);
}

char *record_format(GStrv labels, GStrv values) {
    GString *text = g_string_new(nullptr);
    int width = 0;

    for (char **label = labels; *label != nullptr; label++)
        width = std::max(width, display_width(*label));
    for (guint i = 0; labels[i] != nullptr; i++) {
        g_autofree char *shown = display_escape(values[i], false);
        add_blanks(text, width - display_width(labels[i]));
        g_string_append_printf(text, "%s:%s%s\n", labels[i], *shown != '\0' ? " " : "", shown);
    }
    return g_string_free(text, FALSE);
}
