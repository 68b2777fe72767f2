// check/repeated_lines.cpp: accounts whose name or ID an earlier one has.
#include "check/repeated_lines.h"

// The line that has the key first, or null where this one has.
static const account_line *find_first(GHashTable *lines, const void *key,
                                      const account_line *line) {
    auto *mutable_key = const_cast<void *>(key);
    const auto *first = static_cast<const account_line *>(g_hash_table_lookup(lines, key));

    if (first == nullptr)
        (void)g_hash_table_insert(lines, mutable_key, const_cast<account_line *>(line));
    return first;
}

// Names and IDs that stand twice are kept, but an operation finds only one of them.
static void review_file(const account_file (&files)[CORE_FILE_COUNT], int row, const char *what,
                        findings *out) {
    const char *path = core_file_table[row].path;
    g_autoptr(GHashTable) by_name = g_hash_table_new(g_str_hash, g_str_equal);
    g_autoptr(GHashTable) by_id = g_hash_table_new(g_direct_hash, g_direct_equal);

    for (const account_line *line : lines_of(files[row])) {
        if (!line->is_entry)
            continue;
        const account_line *named = find_first(by_name, line->name, line);
        if (named != nullptr && row == CORE_FILE_ROW_PASSWD)
            out->add(gravity::NOTICE, "repeated-name", path, line->number, line->name,
                     g_strdup_printf("has the name of line %u; a change reaches the last of them, "
                                     "a check of a password the first",
                                     named->number));
        const account_line *numbered = find_first(by_id, GUINT_TO_POINTER(line->id), line);
        if (numbered != nullptr)
            out->add(gravity::NOTICE, "repeated-id", path, line->number, line->name,
                     g_strdup_printf("has the %s of line %u", what, numbered->number));
    }
}

void review_repeated_lines(const account_file (&files)[CORE_FILE_COUNT], findings *out) {
    review_file(files, CORE_FILE_ROW_PASSWD, "UID", out);
    review_file(files, CORE_FILE_ROW_GROUP, "GID", out);
}
