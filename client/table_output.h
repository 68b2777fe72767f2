// client/table_output.h: aligned tables and records, as text.
#pragma once

#include <span>

#include <glib.h>

struct table_column {
    const char *title;
    bool is_number;  // set to the right
};

struct table_style {
    bool has_legend;
    bool in_color;
};

// A row is a GStrv with a cell for each column; control characters in it are escaped. The last
// column is not filled up with blanks.
char *table_format(std::span<const table_column> columns, GPtrArray *rows, table_style style);

// A line for each pair, "Label: value", the colons below each other. labels and values are as long.
char *record_format(GStrv labels, GStrv values);
