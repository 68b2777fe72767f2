// tests/fuzz/passwd_lines_fuzz.cpp: the passwd file's reader on any text.
#include <pwd.h>

#include "tests/fuzz/account_rows.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/memory_files.h"
#include "usermgmt/core_file_records.h"

static bool are_plain(const views &row) {
    return is_number(row[2]) && is_number(row[3]);
}

static void add_fields(const void *record, std::string *out_line) {
    const auto *line = static_cast<const struct passwd *>(record);
    add_field(line->pw_passwd, out_line);
    add_field(line->pw_uid, out_line);
    add_field(line->pw_gid, out_line);
    add_field(line->pw_gecos, out_line);
    add_field(line->pw_dir, out_line);
    add_field(line->pw_shell, out_line);
}

static const char *name_of(const void *record) {
    return static_cast<const struct passwd *>(record)->pw_name;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static constexpr row_rules rules = {7, are_plain, add_fields, name_of};
    static const core_file row = {CORE_FILE_ROW_PASSWD, "passwd",     "etc/passwd",
                                  fetch_passwd,         write_passwd, free_passwd};
    const std::string_view text(reinterpret_cast<const char *>(data), size);

    lay_memory_file(row.path, text);
    check_rows(row, rules, text);
    return 0;
}
