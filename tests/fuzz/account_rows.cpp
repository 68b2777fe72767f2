// tests/fuzz/account_rows.cpp: the lines of an account file that leave no doubt, and the records
// that must have come of them.
#include "tests/fuzz/account_rows.h"

#include "tests/fuzz/fuzz.h"

static constexpr std::string_view LETTERS =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789_.-";
static constexpr std::string_view DIGITS = "0123456789";
static constexpr std::size_t MAX_DIGITS = 9;

bool is_number(std::string_view text) {
    return !text.empty() && text.size() <= MAX_DIGITS && has_only(text, DIGITS) &&
           (text.front() != '0' || text.size() == 1);
}

bool is_number_or_empty(std::string_view text) {
    return text.empty() || is_number(text);
}

void add_field(const char *text, std::string *out_line) {
    *out_line += ':';
    if (text != nullptr)
        *out_line += text;
}

void add_field(unsigned long number, std::string *out_line) {
    *out_line += ':';
    *out_line += std::to_string(number);
}

static bool is_plain_name(std::string_view name) {
    return !name.empty() && name.front() != '-' && has_only(name, LETTERS);
}

static bool is_plain(std::string_view line, const row_rules &rules) {
    static views row;
    split_into(line, ':', &row);
    return line.find('\0') == std::string_view::npos && row.size() == rules.columns &&
           is_plain_name(row.front()) && rules.are_plain(row);
}

// The colons of the line are as many as belong between a record's fields, so that none of them
// stands in a field.
static bool is_of_line(const void *record, const row_rules &rules, std::string_view line) {
    static std::string own;
    const char *name = rules.name_of(record);
    own = name != nullptr ? name : "";
    rules.add_fields(record, &own);
    return own == line;
}

static void check_records(const GPtrArray *records, const row_rules &rules, std::string_view text) {
    const views lines = lines_of(text);
    hold(records->len <= lines.size(), "a line is one record at most", text);

    guint next = 0;
    for (const std::string_view line : lines) {
        if (!is_plain(line, rules))
            continue;
        while (next < records->len && !is_of_line(g_ptr_array_index(records, next), rules, line))
            next++;
        hold(next < records->len, "every plain line is a record, in its place", line);
        next++;
    }
    // Where blanks are cut off in front of a line without an end, the C library's own reader has
    // its last byte twice.
    const bool has_ends = text.ends_with('\n') && text.find('\0') == std::string_view::npos;
    for (guint i = 0; i < records->len; i++) {
        const char *name = rules.name_of(g_ptr_array_index(records, i));
        hold(name != nullptr, "every record has a name", text);
        hold(!has_ends || text.find(name) != std::string_view::npos,
             "a record's name stands in the file", name);
        hold(std::string_view(name).find_first_of(":\n") == std::string_view::npos,
             "a name has no separator in it", name);
    }
}

void check_rows(const core_file &row, const row_rules &rules, std::string_view text) {
    core_file_data read = {};
    g_autoptr(GError) error = nullptr;
    const gboolean done = core_file_read_data(&row, &read, &error);

    hold(done && error == nullptr, "every text can be read",
         error != nullptr ? error->message : "without an error");
    hold(!read.dirty && read.data != nullptr, "what was read is there and unchanged", text);
    check_records(read.data, rules, text);
    g_ptr_array_unref(read.data);
}
