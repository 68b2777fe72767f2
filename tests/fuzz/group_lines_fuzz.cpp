// tests/fuzz/group_lines_fuzz.cpp: the group file's reader on any text.
#include <grp.h>

#include <algorithm>

#include "tests/fuzz/account_rows.h"
#include "tests/fuzz/fuzz.h"
#include "tests/fuzz/memory_file.h"
#include "usermgmt/core_file_records.h"

static constexpr std::string_view MEMBER_LETTERS = "abcdefghijklmnopqrstuvwxyz0123456789_.-";

static bool are_plain(const fields &row) {
    const std::vector<std::string> members = split(row[3], ',');
    return is_number(row[2]) &&
           (row[3].empty() ||
            std::all_of(members.begin(), members.end(), [](const std::string &member) {
                return !member.empty() && has_only(member, MEMBER_LETTERS);
            }));
}

static fields fields_of(const void *record) {
    const auto *line = static_cast<const struct group *>(record);
    std::string members;
    hold(line->gr_mem != nullptr, "every group has a list of members");
    for (char **member = line->gr_mem; *member != nullptr; member++)
        members += (members.empty() ? "" : ",") + std::string(*member);
    return {text_or_empty(line->gr_name), text_or_empty(line->gr_passwd),
            std::to_string(line->gr_gid), members};
}

static const char *name_of(const void *record) {
    return static_cast<const struct group *>(record)->gr_name;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
    static constexpr row_rules rules = {4, are_plain, fields_of, name_of};
    static const memory_file file;
    static const core_file row = {CORE_FILE_ROW_GROUP, "group",     file.path(),
                                  fetch_group,         write_group, free_group};
    const std::string_view text(reinterpret_cast<const char *>(data), size);

    file.fill(text);
    check_rows(row, rules, text);
    return 0;
}
