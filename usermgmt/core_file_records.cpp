// usermgmt/core_file_records.cpp: the lines of the three account files.
#include "usermgmt/core_file_records.h"

#include <cstring>
#include <type_traits>

#include <grp.h>
#include <pwd.h>
#include <shadow.h>

#include "usermgmt/account_records.h"
#include "usermgmt/name_set.h"
#include "usermgmt/secret.h"

static constexpr gint64 SECONDS_PER_DAY = 86400;

// shadow(5): the ageing fields, in days. They are the same for every user, whatever the file held.
static constexpr long MIN_DAYS = 0;
static constexpr long MAX_DAYS = 99999;
static constexpr long WARN_DAYS = 7;
static constexpr long INACTIVE_DAYS = 0;
static constexpr long NO_EXPIRY = -1;
static constexpr unsigned long NO_FLAG = static_cast<unsigned long>(-1);

// The C library's records hold pointers to non-constant characters.
static char *written(const char *text) {
    return const_cast<char *>(text);
}

// The C library's own copy of a hash is wiped as soon as there is ours: it stays in static storage.
gpointer fetch_passwd(FILE *stream) {
    const struct passwd *line = fgetpwent(stream);
    if (line == nullptr)
        return nullptr;

    auto *copy = g_new0(struct passwd, 1);
    copy->pw_name = g_strdup(line->pw_name);
    copy->pw_passwd = g_strdup(line->pw_passwd);
    wipe_text(line->pw_passwd);
    copy->pw_uid = line->pw_uid;
    copy->pw_gid = line->pw_gid;
    copy->pw_gecos = g_strdup(line->pw_gecos);
    copy->pw_dir = g_strdup(line->pw_dir);
    copy->pw_shell = g_strdup(line->pw_shell);
    return copy;
}

void free_passwd(gpointer record) {
    auto *line = static_cast<struct passwd *>(record);
    if (line == nullptr)
        return;
    g_free(line->pw_name);
    wipe_free(line->pw_passwd);
    g_free(line->pw_gecos);
    g_free(line->pw_dir);
    g_free(line->pw_shell);
    g_free(line);
}

gpointer fetch_shadow(FILE *stream) {
    const struct spwd *line = fgetspent(stream);
    if (line == nullptr)
        return nullptr;

    auto *copy = g_new0(struct spwd, 1);
    *copy = *line;
    copy->sp_namp = g_strdup(line->sp_namp);
    copy->sp_pwdp = g_strdup(line->sp_pwdp);
    wipe_text(line->sp_pwdp);
    return copy;
}

void free_shadow(gpointer record) {
    auto *line = static_cast<struct spwd *>(record);
    if (line == nullptr)
        return;
    g_free(line->sp_namp);
    wipe_free(line->sp_pwdp);
    g_free(line);
}

gpointer fetch_group(FILE *stream) {
    const struct group *line = fgetgrent(stream);
    if (line == nullptr)
        return nullptr;

    auto *copy = g_new0(struct group, 1);
    copy->gr_name = g_strdup(line->gr_name);
    copy->gr_passwd = g_strdup(line->gr_passwd);
    wipe_text(line->gr_passwd);
    copy->gr_gid = line->gr_gid;
    copy->gr_mem = g_strdupv(line->gr_mem);
    return copy;
}

void free_group(gpointer record) {
    auto *line = static_cast<struct group *>(record);
    if (line == nullptr)
        return;
    g_free(line->gr_name);
    wipe_free(line->gr_passwd);
    g_strfreev(line->gr_mem);
    g_free(line);
}

const char *shadow_password(const internal_user *user) {
    return user->password != nullptr ? user->password : "*";
}

const char *passwd_password(const internal_user *user) {
    return user->shadowed ? "x" : shadow_password(user);
}

int write_passwd(const void *record, FILE *stream) {
    const auto *user = static_cast<const internal_user *>(record);

    struct passwd line = {};
    line.pw_name = user->name;
    line.pw_passwd = written(passwd_password(user));
    line.pw_uid = user->uid;
    line.pw_gid = user->gid;
    line.pw_gecos = written(user->gecos != nullptr ? user->gecos : "");
    line.pw_dir = user->home;
    line.pw_shell = user->shell;
    return putpwent(&line, stream);
}

int write_shadow(const void *record, FILE *stream) {
    const auto *user = static_cast<const internal_user *>(record);
    if (!user->shadowed)
        return 0;

    struct spwd line = {};
    line.sp_namp = user->name;
    line.sp_pwdp = written(shadow_password(user));
    line.sp_lstchg = user->last_change / SECONDS_PER_DAY;
    line.sp_min = MIN_DAYS;
    line.sp_max = MAX_DAYS;
    line.sp_warn = WARN_DAYS;
    line.sp_inact = INACTIVE_DAYS;
    line.sp_expire = NO_EXPIRY;
    line.sp_flag = NO_FLAG;
    return putspent(&line, stream);
}

int write_group(const void *record, FILE *stream) {
    const auto *group = static_cast<const internal_group *>(record);
    g_autoptr(GPtrArray) members = nullptr;
    if (g_hash_table_size(group->members) > 0)
        str_hash_to_ptr_array(group->members, &members, TRUE, FALSE);

    struct group line = {};
    line.gr_name = group->name;
    line.gr_passwd = group->password;
    line.gr_gid = group->gid;
    if (members != nullptr)
        line.gr_mem = reinterpret_cast<char **>(members->pdata);
    return putgrent(&line, stream);
}
