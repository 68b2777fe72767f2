// check/account_lines.cpp: reads the lines of the account files, and writes them in memory.
#include "check/account_lines.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include <grp.h>
#include <pwd.h>
#include <shadow.h>

static std::size_t end_of_field(std::string_view text) {
    const std::size_t colon = text.find(':');
    return colon != std::string_view::npos ? colon : text.size();
}

std::string_view account_line::field(std::size_t index) const {
    std::string_view rest = text;
    for (; index > 0; index--) {
        const std::size_t end = end_of_field(rest);
        if (end == rest.size())
            return {};
        rest.remove_prefix(end + 1);
    }
    return rest.substr(0, end_of_field(rest));
}

std::size_t account_line::field_count() const {
    std::size_t count = 1;
    for (const char byte : text)
        count += byte == ':' ? 1 : 0;
    return count;
}

static void take_entry(const core_file &file, const void *record, account_line *line) {
    line->is_entry = true;
    if (file.id == CORE_FILE_ROW_PASSWD) {
        const auto *user = static_cast<const struct passwd *>(record);
        line->name = user->pw_name;
        line->id = user->pw_uid;
        line->primary_group = user->pw_gid;
    } else if (file.id == CORE_FILE_ROW_SHADOW) {
        line->name = static_cast<const struct spwd *>(record)->sp_namp;
    } else {
        const auto *group = static_cast<const struct group *>(record);
        line->name = group->gr_name;
        line->id = group->gr_gid;
        for (char **member = group->gr_mem; *member != nullptr; member++)
            line->members.emplace_back(*member);
        std::sort(line->members.begin(), line->members.end());
    }
}

static account_line parse(const core_file &file, unsigned number, std::string_view text) {
    account_line line = {number, std::string(text)};
    std::string whole = line.text + '\n';
    FILE *stream = fmemopen(whole.data(), whole.size(), "r");
    if (stream == nullptr)
        return line;
    gpointer record = file.fetch(stream);
    if (record != nullptr)
        take_entry(file, record, &line);
    file.free_record(record);
    (void)fclose(stream);  // it was only read from
    return line;
}

bool read_account_lines(const core_file &file, std::vector<account_line> *out_lines,
                        bool *out_has_last_end, GError **error) {
    g_autofree char *contents = nullptr;
    gsize length = 0;
    if (!g_file_get_contents(file.path, &contents, &length, error))
        return false;

    std::string_view rest(contents, length);
    *out_has_last_end = rest.empty() || rest.back() == '\n';
    for (unsigned number = 1; !rest.empty(); number++) {
        const std::size_t end = rest.find('\n');
        out_lines->push_back(parse(file, number, rest.substr(0, end)));
        rest.remove_prefix(end != std::string_view::npos ? end + 1 : rest.size());
    }
    return true;
}

bool write_account_line(const core_file &file, const void *record, std::string *out_text) {
    char *text = nullptr;
    std::size_t length = 0;
    FILE *stream = open_memstream(&text, &length);
    if (stream == nullptr)
        return false;
    errno = 0;
    const bool written = file.write(record, stream) >= 0;
    const int cause = errno != 0 ? errno : EINVAL;
    const bool closed = fclose(stream) == 0;
    out_text->assign(text, length);
    std::free(text);
    if (!out_text->empty() && out_text->back() == '\n')
        out_text->pop_back();
    if (!written)
        errno = cause;
    return written && closed;
}
