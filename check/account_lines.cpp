// check/account_lines.cpp: reads the lines of the account files, and writes them in memory.
#include "check/account_lines.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <grp.h>
#include <pwd.h>
#include <shadow.h>

static std::size_t end_of_field(std::string_view text) {
    const std::size_t colon = text.find(':');
    return colon != std::string_view::npos ? colon : text.size();
}

std::string_view account_line::field(std::size_t index) const {
    std::string_view rest(text, length);

    for (; index > 0; index--) {
        const std::size_t end = end_of_field(rest);
        if (end == rest.size())
            return rest.substr(end);
        rest.remove_prefix(end + 1);
    }
    return rest.substr(0, end_of_field(rest));
}

std::size_t account_line::field_count() const {
    std::size_t count = 1;

    for (const char byte : std::string_view(text, length))
        count += byte == ':' ? 1 : 0;
    return count;
}

void account_line_clear(account_line *line) {
    g_clear_pointer(&line->text, g_free);
    g_clear_pointer(&line->name, g_free);
    g_clear_pointer(&line->members, g_ptr_array_unref);
}

static void account_line_free(void *data) {
    auto *line = static_cast<account_line *>(data);

    account_line_clear(line);
    g_free(line);
}

static int compare_names(const void *one, const void *other) {
    return std::strcmp(*static_cast<const char *const *>(one),
                       *static_cast<const char *const *>(other));
}

static void take_entry(const core_file &file, const void *record, account_line *line) {
    line->is_entry = true;
    if (file.id == CORE_FILE_ROW_PASSWD) {
        const auto *user = static_cast<const struct passwd *>(record);
        line->name = g_strdup(user->pw_name);
        line->id = user->pw_uid;
        line->primary_group = user->pw_gid;
    } else if (file.id == CORE_FILE_ROW_SHADOW) {
        line->name = g_strdup(static_cast<const struct spwd *>(record)->sp_namp);
    } else {
        const auto *group = static_cast<const struct group *>(record);
        line->name = g_strdup(group->gr_name);
        line->id = group->gr_gid;
        line->members = g_ptr_array_new_with_free_func(g_free);
        for (char **member = group->gr_mem; *member != nullptr; member++)
            g_ptr_array_add(line->members, g_strdup(*member));
        g_ptr_array_sort(line->members, compare_names);
    }
}

static char *copy_bytes(std::string_view text, const char *end) {
    const gsize end_length = std::strlen(end);
    auto *copy = static_cast<char *>(g_malloc(text.size() + end_length + 1));

    std::memcpy(copy, text.data(), text.size());
    std::memcpy(copy + text.size(), end, end_length + 1);
    return copy;
}

static account_line *parse(const core_file &file, unsigned number, std::string_view text) {
    auto *line = g_new0(account_line, 1);
    g_autofree char *whole = copy_bytes(text, "\n");

    line->number = number;
    line->text = copy_bytes(text, "");
    line->length = text.size();
    FILE *stream = fmemopen(whole, text.size() + 1, "r");
    if (stream == nullptr)
        return line;
    gpointer record = file.fetch(stream);
    if (record != nullptr)
        take_entry(file, record, line);
    file.free_record(record);
    (void)fclose(stream);  // It was only read from.
    return line;
}

void account_file_clear(account_file *file) {
    g_clear_pointer(&file->lines, g_ptr_array_unref);
}

bool read_account_file(const core_file &file, account_file *out_file, GError **error) {
    g_autofree char *contents = nullptr;
    gsize length = 0;

    if (!g_file_get_contents(file.path, &contents, &length, error))
        return false;
    std::string_view rest(contents, length);
    *out_file = {g_ptr_array_new_with_free_func(account_line_free),
                 !rest.empty() && rest.back() != '\n'};
    for (unsigned number = 1; !rest.empty(); number++) {
        const std::size_t end = rest.find('\n');
        g_ptr_array_add(out_file->lines, parse(file, number, rest.substr(0, end)));
        rest.remove_prefix(end != std::string_view::npos ? end + 1 : rest.size());
    }
    return true;
}

bool write_account_line(const core_file &file, const void *record, account_line *out_line) {
    char *text = nullptr;
    std::size_t length = 0;
    FILE *stream = open_memstream(&text, &length);

    if (stream == nullptr)
        return false;
    errno = 0;
    const bool written = file.write(record, stream) >= 0;
    const int cause = errno != 0 ? errno : EINVAL;
    const bool closed = fclose(stream) == 0;
    if (length > 0 && text[length - 1] == '\n')
        length--;
    out_line->text = copy_bytes({text, length}, "");
    out_line->length = length;
    std::free(text);
    if (!written)
        errno = cause;
    return written && closed;
}
