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
    const GPtrArray *lines = files[CORE_FILE_ROW_PASSWD].lines;
    const guint32 type = user_type_of_uid(user.id);

    // An addition appends the user, who joins a group only with the last of the three files.
    return lines->pdata[lines->len - 1] == &user &&
           (type == USER_TYPE_DYNAMIC_SYSTEM || type == USER_TYPE_ORNET) &&
           !is_listed(files[CORE_FILE_ROW_GROUP], user.name) && has_temporary_file();
}
