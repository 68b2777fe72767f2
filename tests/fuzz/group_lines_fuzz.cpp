// tests/fuzz/group_lines_fuzz.cpp: the group file's reader on any text.
#include <grp.h>

#include <algorithm>

#include "tests/fuzz/account_rows.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/memory_files.h"
#include "usermgmt/core_file_records.h"

static constexpr std::string_view MEMBER_LETTERS = "abcdefghijklmnopqrstuvwxyz0123456789_.-";

static bool are_plain(const views &row) {
    const views members = split(row[3], ',');
    return is_number(row[2]) &&
           (row[3].empty() ||
            std::all_of(members.begin(), members.end(), [](std::string_view member) {
                return !member.empty() && has_only(member, MEMBER_LETTERS);
            }));
}

static void add_fields(const void *record, std::string *out_line) {
    const auto *line = static_cast<const struct group *>(record);
    hold(line->gr_mem != nullptr, "every group has a list of members");
    add_field(line->gr_passwd, out_line);
    add_field(line->gr_gid, out_line);
    *out_line += ':';
    for (char **member = line->gr_mem; *member != nullptr; member++) {
        *out_line += member != line->gr_mem ? "," : "";
        *out_line += *member;
    }
}

static const char *name_of(const void *record) {
    return static_cast<const struct group *>(record)->gr_name;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static constexpr row_rules rules = {4, are_plain, add_fields, name_of};
    static const core_file row = {CORE_FILE_ROW_GROUP, "group",     "etc/group",
                                  fetch_group,         write_group, free_group};
    const std::string_view text(reinterpret_cast<const char *>(data), size);

    lay_memory_file(row.path, text);
    check_rows(row, rules, text);
    return 0;
}
