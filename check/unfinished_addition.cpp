// check/unfinished_addition.cpp: tells additions that were cut off from accounts that are lost.
#include "check/unfinished_addition.h"

#include <sys/stat.h>

#include "usermgmt/account_types.h"
#include "usermgmt/usermgmt.h"

// Any of the three will do: the next changes may be cut off, too, while they make them anew, and a
// change of groups alone replaces no other file.
static bool has_temporary_file() {
    for (const core_file &file : core_file_table) {
        g_autofree char *path = g_strconcat(file.path, ".tmp", nullptr);
        struct stat status = {};
        if (lstat(path, &status) == 0 && S_ISREG(status.st_mode))
            return true;
    }
    return false;
}

// An addition appends the user, whose name and UID nobody had.
static bool is_last_and_new(const account_file &passwd, const account_line &user) {
    for (const account_line *line : lines_of(passwd)) {
        if (line == &user)
            return line == passwd.lines->pdata[passwd.lines->len - 1];
        if (line->is_entry && (g_str_equal(line->name, user.name) || line->id == user.id))
            return false;
    }
    return false;
}

static bool is_given_by_a_method(guint32 uid) {
    const guint32 type = user_type_of_uid(uid);
    return type == USER_TYPE_DYNAMIC_SYSTEM || type == USER_TYPE_ORNET;
}

// Also one that is no entry, of which somebody may make one again.
static const account_line *find_line(const account_file &shadow, std::string_view name) {
    for (const account_line *line : lines_of(shadow)) {
        const std::string_view field = line->field(0);
        const std::size_t start = field.find_first_not_of(" \t");
        if (start != std::string_view::npos && field.substr(start) == name)
            return line;
    }
    return nullptr;
}

static bool is_listed(const account_file &groups, const char *user) {
    for (const account_line *line : lines_of(groups)) {
        if (!line->is_entry)
            continue;
        for (const char *member : records<const char>(line->members))
            if (g_str_equal(member, user))
                return true;
    }
    return false;
}

bool is_unfinished_addition(const account_file (&files)[CORE_FILE_COUNT],
                            const account_line &user) {
    const account_file &shadow = files[CORE_FILE_ROW_SHADOW];

    // The lines in shadow and group come with the files that were not replaced any more.
    return is_last_and_new(files[CORE_FILE_ROW_PASSWD], user) && is_given_by_a_method(user.id) &&
           shadow.lines != nullptr && find_line(shadow, user.name) == nullptr &&
           !is_listed(files[CORE_FILE_ROW_GROUP], user.name) && has_temporary_file();
}
