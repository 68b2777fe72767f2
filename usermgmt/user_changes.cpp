// usermgmt/user_changes.cpp: adding, deleting and disabling users.
#include <glib.h>

#include "usermgmt/context.h"
#include "usermgmt/id_allocation.h"
#include "usermgmt/name_set.h"
#include "usermgmt/password.h"
#include "usermgmt/precondition.h"
#include "usermgmt/record_check.h"
#include "usermgmt/user_validation.h"
#include "usermgmt/usermgmt.h"

static constexpr const char *DEFAULT_SHELL = "/bin/false";

static bool choose_uid(const usermgmt_ctx *ctx, const user_entry *entry, internal_user *user,
                       GError **error) {
    if (entry->uid == -1)
        return find_next_uid(ctx, entry->type, &user->uid, error);
    const auto requested = static_cast<guint32>(entry->uid);
    if (!set_uid_if_free(ctx, requested, error))
        return false;
    user->uid = requested;
    return true;
}

// The record with everything but its groups; null on failure.
static internal_user *make_user(const usermgmt_ctx *ctx, const user_entry *entry, GError **error) {
    g_autoptr(internal_user) user = g_new0(internal_user, 1);
    user->type = entry->type;
    user->name = g_strdup(entry->name);
    user->gecos = g_strdup(entry->gecos);
    user->shell = g_strdup(entry->shell != nullptr ? entry->shell : DEFAULT_SHELL);
    if (!internal_user_set_password(user, entry->password, ctx->has_shadow, nullptr, error) ||
        !choose_uid(ctx, entry, user, error))
        return nullptr;
    return g_steal_pointer(&user);
}

// Position of the first group that would list the user.
static guint first_group_index(const usermgmt_ctx *ctx, const user_entry *entry) {
    guint index = 0;
    for (const internal_group *group : records<const internal_group>(ctx->group_db.entries)) {
        if (g_strcmp0(group->name, entry->group) == 0 || list_contains(group->name, entry->groups))
            break;
        index++;
    }
    return index;
}

static bool check_new_record(const usermgmt_ctx *ctx, const internal_user *user,
                             const user_entry *entry, GError **error) {
    return check_user_record(user, ctx->user_db.entries->len, error) &&
           check_member_name(user->name, first_group_index(ctx, entry), error);
}

static bool check_new_user(const usermgmt_ctx *ctx, const char *username, const user_entry *entry,
                           GError **error) {
    if (g_strcmp0(entry->name, username) != 0) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ARGUMENT, "usernames must match");
        return false;
    }
    if (user_database_find(&ctx->user_db, username) != nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER_EXISTS, "user already exists");
        return false;
    }
    return validate_user(ctx, username, entry->type, entry, USER_FIELD_ALL, error);
}

// Adds the user to its groups. The mask says what a failure has changed in memory.
static bool join_groups(usermgmt_ctx *ctx, internal_user *user, const user_entry *entry,
                        guint32 *out_reload_mask, GError **error) {
    group_database *group_db = &ctx->group_db;
    internal_group *primary = group_database_find(group_db, entry->group);
    if (primary == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP,
                    "primary group '%s' does not exist", entry->group);
        return false;
    }
    user->gid = primary->gid;
    if (!check_new_record(ctx, user, entry, error))
        return false;

    add_user_to_group(primary, user->name, &group_db->dirty);
    if (entry->groups == nullptr ||
        add_user_to_groups(group_db, user->name, entry->groups, primary->name, error))
        return true;
    *out_reload_mask = CORE_FILE_GROUP;
    return false;
}

gboolean usermgmt_add_user(usermgmt_ctx *ctx, const char *username, const user_entry *new_user,
                           GError **error) {
    static constexpr const char *action = "add user";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (username == nullptr)
        return fail_missing_argument(action, "username", error);
    if (new_user == nullptr)
        return fail_missing_argument(action, "new_user", error);

    guint32 reload_mask = 0;
    g_autoptr(internal_user) user = nullptr;
    if (check_new_user(ctx, username, new_user, error))
        user = make_user(ctx, new_user, error);
    if (user == nullptr || !join_groups(ctx, user, new_user, &reload_mask, error))
        return fail_and_reload(ctx, action, username, reload_mask, error);

    user_database_add(&ctx->user_db, g_steal_pointer(&user));
    if (!usermgmt_sync(ctx, error))
        return fail_and_reload(ctx, action, username, CORE_FILE_PASSWD, error);
    return TRUE;
}

static void remove_user_from_all_groups(group_database *group_db, const char *username) {
    require(group_db->entries != NULL, );
    require(username != NULL, );

    for (internal_group *group : records<internal_group>(group_db->entries))
        remove_user_from_group(group, username, &group_db->dirty);
}

// By the name under which the user was found, so that no key is left behind for a freed record.
static bool user_database_remove(user_database *user_db, const char *username, internal_user *user,
                                 GError **error) {
    bool removed = false;
    if (holds(user_db->entries != NULL)) {
        const bool name_removed = g_hash_table_remove(user_db->name_hash, username);
        const bool record_removed = g_ptr_array_remove(user_db->entries, user);
        removed = name_removed && record_removed;
        if (name_removed || record_removed)
            user_db->dirty = TRUE;
    }
    if (!removed)
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                    "could not remove user from internal structures");
    return removed;
}

gboolean usermgmt_delete_user(usermgmt_ctx *ctx, const char *username, GError **error) {
    static constexpr const char *action = "delete user";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (username == nullptr)
        return fail_missing_argument(action, "username", error);

    internal_user *user = user_database_find(&ctx->user_db, username);
    if (user == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER, "cannot delete non-existent user");
        return fail_and_reload(ctx, action, username, 0, error);
    }
    if (user->type != USER_TYPE_DYNAMIC_SYSTEM && user->type != USER_TYPE_ORNET) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_DELETE_TYPE,
                    "cannot delete '%s' with user type '%s'", username, user_type_name(user->type));
        return fail_and_reload(ctx, action, username, 0, error);
    }

    remove_user_from_all_groups(&ctx->group_db, user->name);
    // Deliberate: the user database stays as it is then; only the memberships come back.
    if (!user_database_remove(&ctx->user_db, username, user, error))
        return fail_and_reload(ctx, action, username, CORE_FILE_GROUP, error);
    if (!usermgmt_sync(ctx, error))
        return fail_and_reload(ctx, action, username, CORE_FILE_PASSWD | CORE_FILE_GROUP, error);
    return TRUE;
}

gboolean usermgmt_disable_password(usermgmt_ctx *ctx, const char *username, GError **error) {
    // Deliberate: the trailing blank, which shows in every message of this operation.
    static constexpr const char *action = "disable password for ";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (username == nullptr)
        return fail_missing_argument(action, "username", error);

    internal_user *user = user_database_find(&ctx->user_db, username);
    if (user == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER, "user does not exist");
        return fail_and_reload(ctx, action, username, 0, error);
    }
    if (user->type != USER_TYPE_PERMANENT && user->type != USER_TYPE_DYNAMIC_SYSTEM) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER_TYPE,
                    "password cannot be disabled for user type '%s'", user_type_name(user->type));
        return fail_and_reload(ctx, action, username, 0, error);
    }

    gboolean changed = FALSE;
    if (!internal_user_set_password(user, nullptr, ctx->has_shadow, &changed, error))
        return fail_and_reload(ctx, action, username, 0, error);
    if (!changed)
        return TRUE;
    ctx->user_db.dirty = TRUE;
    if (!usermgmt_sync(ctx, error))
        return fail_and_reload(ctx, action, username, CORE_FILE_PASSWD | CORE_FILE_SHADOW, error);
    return TRUE;
}
