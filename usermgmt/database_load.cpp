// usermgmt/database_load.cpp: building the databases from the account files.
#include <grp.h>
#include <pwd.h>
#include <shadow.h>
#include <syslog.h>

#include "usermgmt/account_types.h"
#include "usermgmt/context.h"
#include "usermgmt/database.h"
#include "usermgmt/usermgmt.h"

static constexpr gint64 SECONDS_PER_DAY = 86400;

// What the passwd file holds when the password lives in the shadow file.
static constexpr const char *password_elsewhere = "x";

static guint count_of(const core_file_data &cached) {
    return cached.data != nullptr ? cached.data->len : 0;
}

static const char *text_of(const GError *error) {
    return error != nullptr ? error->message : "Unknown error";
}

static internal_group *internal_group_from_linux_group(const struct group *line, GError **error) {
    const guint32 type = group_type_of_gid(line->gr_gid);
    if (type == GROUP_TYPE_NONE) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP, "unable to determine group type");
        return nullptr;
    }

    auto *group = g_new0(internal_group, 1);
    group->type = type;
    group->name = g_strdup(line->gr_name);
    if (line->gr_passwd != nullptr && *line->gr_passwd != '\0')
        group->password = g_strdup(line->gr_passwd);
    group->gid = line->gr_gid;
    group->members = member_set_new();
    for (char **member = line->gr_mem; member != nullptr && *member != nullptr; member++)
        (void)g_hash_table_add(group->members, g_strdup(*member));
    return group;
}

// Adds one parsed group or skips it. False where that is fatal.
static bool load_group(const usermgmt_ctx *ctx, group_database *group_db, const struct group *line,
                       GError **error) {
    const bool strict = (ctx->open_flags & USERMGMT_OPEN_STRICT) != 0;

    if (group_database_find(group_db, line->gr_name) != nullptr) {
        if (strict) {
            g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_DUPLICATE_GROUP,
                        "group data contains duplicate entry '%s'", line->gr_name);
            return false;
        }
        syslog(LOG_WARNING, "Skipping duplicate group entry '%s'", line->gr_name);
        return true;
    }

    g_autoptr(GError) cause = nullptr;
    internal_group *group = internal_group_from_linux_group(line, &cause);
    if (group != nullptr) {
        group_database_add(group_db, group);
        return true;
    }
    if (strict) {
        g_propagate_prefixed_error(error, g_steal_pointer(&cause),
                                   "could not parse group data for '%s': ", line->gr_name);
        return false;
    }
    syslog(LOG_ERR, "Failed to parse group '%s': %s", line->gr_name, text_of(cause));
    return true;
}

gboolean init_populate_group_database(const usermgmt_ctx *ctx, group_database *group_db,
                                      GError **error) {
    if (group_db->entries->len != 0 || g_hash_table_size(group_db->name_hash) != 0 ||
        g_hash_table_size(group_db->gid_hash) != 0) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                    "failed to init internal structures");
        return FALSE;
    }

    const core_file_data &cached = ctx->cached[CORE_FILE_ROW_GROUP];
    if (cached.data == nullptr)
        return TRUE;
    for (const struct group *line : records<const struct group>(cached.data)) {
        if (!load_group(ctx, group_db, line, error)) {
            g_prefix_error(error, "Could not init group database, ");
            return FALSE;
        }
    }
    return TRUE;
}

gboolean group_database_init(usermgmt_ctx *ctx, gboolean reread, GError **error) {
    const core_file_data &cached = ctx->cached[CORE_FILE_ROW_GROUP];
    const bool read_again = reread || cached.data == nullptr;
    const guint32 mask = read_again ? guint32{CORE_FILE_GROUP} : 0;
    core_file_free_data(ctx, mask);
    if (!core_file_parse(ctx, mask, error)) {
        g_prefix_error(error, "Could not init group database, ");
        return FALSE;
    }

    group_database group_db = group_database_new(count_of(cached));
    if (!init_populate_group_database(ctx, &group_db, error)) {
        group_database_clear(&group_db);
        return FALSE;
    }
    group_database_clear(&ctx->group_db);
    ctx->group_db = group_db;
    ctx->group_db.dirty = FALSE;
    return TRUE;
}

// The GIDs that exist: the group database's own index, or without one the parsed groups.
static GHashTable *gid_index(const usermgmt_ctx *ctx) {
    if (ctx->group_db.gid_hash != nullptr)
        return g_hash_table_ref(ctx->group_db.gid_hash);

    GHashTable *index = g_hash_table_new(g_int_hash, g_int_equal);
    const core_file_data &cached = ctx->cached[CORE_FILE_ROW_GROUP];
    if (cached.data != nullptr)
        for (struct group *line : records<struct group>(cached.data))
            (void)g_hash_table_add(index, &line->gr_gid);
    return index;
}

// Finds the shadow lines of users who are asked for in the order of the passwd file. As long as the
// shadow file keeps to it, as our own writing does, the next line is the wanted one and no index is
// made. The first line of a name counts.
class shadow_lines {
  public:
    // The lines are borrowed; null without a shadow file.
    explicit shadow_lines(const GPtrArray *lines) : lines_(lines) {}
    ~shadow_lines() { g_clear_pointer(&index_, g_hash_table_unref); }
    shadow_lines(const shadow_lines &) = delete;
    shadow_lines &operator=(const shadow_lines &) = delete;

    // Null where there is none. New is a name that was not asked for before: the lines that were
    // passed are then other users'.
    const struct spwd *find(const char *name, bool is_new) {
        if (lines_ == nullptr)
            return nullptr;
        if (index_ == nullptr && is_new && next_ < lines_->len) {
            const struct spwd *line = line_at(next_);
            if (g_str_equal(line->sp_namp, name)) {
                next_++;
                return line;
            }
        }
        if (index_ == nullptr)
            make_index();
        return static_cast<const struct spwd *>(g_hash_table_lookup(index_, name));
    }

  private:
    struct spwd *line_at(guint i) const {
        return static_cast<struct spwd *>(g_ptr_array_index(lines_, i));
    }

    // Name -> line, both borrowed; from the last line on, so that the first of a name stays.
    void make_index() {
        index_ = g_hash_table_new(g_str_hash, g_str_equal);
        for (guint i = lines_->len; i > 0; i--)
            (void)g_hash_table_insert(index_, line_at(i - 1)->sp_namp, line_at(i - 1));
    }

    const GPtrArray *lines_;
    guint next_ = 0;
    GHashTable *index_ = nullptr;
};

static internal_user *internal_user_from_linux_passwd(const struct passwd *line, bool is_new,
                                                      shadow_lines *shadow, GHashTable *gids,
                                                      GError **error) {
    const bool shadowed = g_strcmp0(line->pw_passwd, password_elsewhere) == 0;
    const struct spwd *shadow_line = shadowed ? shadow->find(line->pw_name, is_new) : nullptr;
    if (shadowed && shadow_line == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER,
                    "no corresponding shadow entry was found for '%s'", line->pw_name);
        return nullptr;
    }
    if (!g_hash_table_contains(gids, &line->pw_gid)) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP,
                    "no group was found on the system for GID '%d'",
                    static_cast<int>(line->pw_gid));
        return nullptr;
    }
    const guint32 type = user_type_of_uid(line->pw_uid);
    if (type == USER_TYPE_NONE) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER_TYPE,
                    "user type for %s could not be determined!", line->pw_name);
        return nullptr;
    }

    const internal_user borrowed = {
        .type = type,
        .shadowed = shadowed ? TRUE : FALSE,
        .name = line->pw_name,
        .password = shadowed ? shadow_line->sp_pwdp : line->pw_passwd,
        .gecos = line->pw_gecos,
        .home = line->pw_dir,
        .shell = line->pw_shell,
        .uid = line->pw_uid,
        .gid = line->pw_gid,
        .last_change = shadowed ? gint64{shadow_line->sp_lstchg} * SECONDS_PER_DAY : 0,
        .room = 0,
    };
    return internal_user_copy(&borrowed);
}

gboolean init_populate_user_database(const usermgmt_ctx *ctx, user_database *user_db,
                                     GError **error) {
    if (user_db->entries->len != 0 || g_hash_table_size(user_db->name_hash) != 0) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                    "could not allocate internal structures");
        return FALSE;
    }

    const core_file_data &cached = ctx->cached[CORE_FILE_ROW_PASSWD];
    if (cached.data == nullptr)
        return TRUE;
    g_autoptr(GHashTable) gids = gid_index(ctx);
    shadow_lines shadow(ctx->cached[CORE_FILE_ROW_SHADOW].data);
    // A user who is left out is not in the database to be found: the name may have been asked for.
    bool all_loaded = true;
    for (const struct passwd *line : records<const struct passwd>(cached.data)) {
        g_autoptr(GError) cause = nullptr;
        const bool is_new = all_loaded && user_database_find(user_db, line->pw_name) == nullptr;
        internal_user *user = internal_user_from_linux_passwd(line, is_new, &shadow, gids, &cause);
        if (user != nullptr) {
            user_database_add(user_db, user);
            continue;
        }
        all_loaded = false;
        syslog(LOG_WARNING, "Failed to parse user '%s': %s", line->pw_name, text_of(cause));
        if ((ctx->open_flags & USERMGMT_OPEN_STRICT) != 0) {
            g_propagate_prefixed_error(error, g_steal_pointer(&cause),
                                       "could not parse user %s as ", line->pw_name);
            return FALSE;
        }
    }
    return TRUE;
}

gboolean user_database_init(usermgmt_ctx *ctx, GError **error) {
    guint32 mask = 0;
    if (ctx->cached[CORE_FILE_ROW_PASSWD].data == nullptr)
        mask |= CORE_FILE_PASSWD;
    if (ctx->has_shadow && ctx->cached[CORE_FILE_ROW_SHADOW].data == nullptr)
        mask |= CORE_FILE_SHADOW;
    if (ctx->cached[CORE_FILE_ROW_GROUP].data == nullptr)
        mask |= CORE_FILE_GROUP;
    core_file_free_data(ctx, mask);
    if (!core_file_parse(ctx, mask, error)) {
        g_prefix_error(error, "Could not init user database, ");
        return FALSE;
    }

    user_database user_db = user_database_new(count_of(ctx->cached[CORE_FILE_ROW_PASSWD]));
    if (!init_populate_user_database(ctx, &user_db, error)) {
        user_database_clear(&user_db);
        return FALSE;
    }
    user_database_clear(&ctx->user_db);
    ctx->user_db = user_db;
    ctx->user_db.dirty = FALSE;
    return TRUE;
}

// The names that have a line in the passwd file, borrowed.
static GHashTable *passwd_names(const usermgmt_ctx *ctx) {
    GHashTable *names = g_hash_table_new(g_str_hash, g_str_equal);
    for (const struct passwd *line :
         records<const struct passwd>(ctx->cached[CORE_FILE_ROW_PASSWD].data))
        (void)g_hash_table_add(names, line->pw_name);
    return names;
}

void warn_of_unknown_members(const usermgmt_ctx *ctx) {
    // Also of those that were skipped at load; where every member was loaded it is not needed.
    g_autoptr(GHashTable) names = nullptr;
    for (const internal_group *group : records<const internal_group>(ctx->group_db.entries)) {
        const char *first = nullptr;
        guint count = 0;
        GHashTableIter iter;
        gpointer member;
        g_hash_table_iter_init(&iter, group->members);
        while (g_hash_table_iter_next(&iter, &member, nullptr)) {
            if (g_hash_table_contains(ctx->user_db.name_hash, member))
                continue;
            if (names == nullptr)
                names = passwd_names(ctx);
            if (g_hash_table_contains(names, member))
                continue;
            first = static_cast<const char *>(member);
            count++;
        }
        if (count == 1)
            syslog(LOG_WARNING, "Group '%s' lists member '%s', which has no passwd line",
                   group->name, first);
        else if (count > 1)
            syslog(LOG_WARNING,
                   "Group '%s' lists %u members without a passwd line, '%s' among them",
                   group->name, count, first);
    }
}
