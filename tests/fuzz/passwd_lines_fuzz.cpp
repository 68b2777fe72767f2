// tests/fuzz/passwd_lines_fuzz.cpp: the passwd file's reader on any text.
#include <pwd.h>

#include "tests/fuzz/account_rows.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/memory_file.h"
#include "usermgmt/core_file_records.h"

static bool are_plain(const fields &row) {
    return is_number(row[2]) && is_number(row[3]);
}

static fields fields_of(const void *record) {
    const auto *line = static_cast<const struct passwd *>(record);
    return {text_or_empty(line->pw_name),  text_or_empty(line->pw_passwd),
            std::to_string(line->pw_uid),  std::to_string(line->pw_gid),
            text_or_empty(line->pw_gecos), text_or_empty(line->pw_dir),
            text_or_empty(line->pw_shell)};
}

static const char *name_of(const void *record) {
    return static_cast<const struct passwd *>(record)->pw_name;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static constexpr row_rules rules = {7, are_plain, fields_of, name_of};
    static const memory_file file;
    static const core_file row = {CORE_FILE_ROW_PASSWD, "passwd",     file.path(),
                                  fetch_passwd,         write_passwd, free_passwd};
    const std::string_view text(reinterpret_cast<const char *>(data), size);

    file.fill(text);
    check_rows(row, rules, text);
    return 0;
}
