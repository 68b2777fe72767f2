// tests/fuzz/shadow_lines_fuzz.cpp: the shadow file's reader on any text.
#include <shadow.h>

#include <algorithm>

#include "tests/fuzz/account_rows.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/memory_file.h"
#include "usermgmt/core_file_records.h"

static bool are_plain(const fields &row) {
    return std::all_of(row.begin() + 2, row.end(), is_number_or_empty);
}

// An empty field of a number is read as -1.
static std::string number_or_empty(long number) {
    return number != -1 ? std::to_string(number) : "";
}

static fields fields_of(const void *record) {
    const auto *line = static_cast<const struct spwd *>(record);
    return {text_or_empty(line->sp_namp),
            text_or_empty(line->sp_pwdp),
            number_or_empty(line->sp_lstchg),
            number_or_empty(line->sp_min),
            number_or_empty(line->sp_max),
            number_or_empty(line->sp_warn),
            number_or_empty(line->sp_inact),
            number_or_empty(line->sp_expire),
            number_or_empty(static_cast<long>(line->sp_flag))};
}

static const char *name_of(const void *record) {
    return static_cast<const struct spwd *>(record)->sp_namp;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static constexpr row_rules rules = {9, are_plain, fields_of, name_of};
    static const memory_file file;
    static const core_file row = {CORE_FILE_ROW_SHADOW, "shadow",     file.path(),
                                  fetch_shadow,         write_shadow, free_shadow};
    const std::string_view text(reinterpret_cast<const char *>(data), size);

    file.fill(text);
    check_rows(row, rules, text);
    return 0;
}
