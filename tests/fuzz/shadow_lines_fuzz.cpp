// tests/fuzz/shadow_lines_fuzz.cpp: the shadow file's reader on any text.
#include <shadow.h>

#include <algorithm>

#include "tests/fuzz/account_rows.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/memory_files.h"
#include "usermgmt/core_file_records.h"

static bool are_plain(const views &row) {
    return std::all_of(row.begin() + 2, row.end(), is_number_or_empty);
}

// An empty field of a number is read as -1.
static void add_number(long number, std::string *out_line) {
    *out_line += ':';
    if (number != -1)
        *out_line += std::to_string(number);
}

static void add_fields(const void *record, std::string *out_line) {
    const auto *line = static_cast<const struct spwd *>(record);
    add_field(line->sp_pwdp, out_line);
    for (const long number : {line->sp_lstchg, line->sp_min, line->sp_max, line->sp_warn,
                              line->sp_inact, line->sp_expire, static_cast<long>(line->sp_flag)})
        add_number(number, out_line);
}

static const char *name_of(const void *record) {
    return static_cast<const struct spwd *>(record)->sp_namp;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static constexpr row_rules rules = {9, are_plain, add_fields, name_of};
    static const core_file row = {CORE_FILE_ROW_SHADOW, "shadow",     "etc/shadow",
                                  fetch_shadow,         write_shadow, free_shadow};
    const std::string_view text(reinterpret_cast<const char *>(data), size);

    lay_memory_file(row.path, text);
    check_rows(row, rules, text);
    return 0;
}
