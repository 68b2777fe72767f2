// usermgmt/queries.cpp: the read-only operations.
#include "usermgmt/context.h"
#include "usermgmt/name_set.h"
#include "usermgmt/user_entry.h"
#include "usermgmt/usermgmt.h"

gboolean usermgmt_get_user(const usermgmt_ctx *ctx, const char *username, user_entry *result,
                           GError **error) {
    static constexpr const char *action = "retrieve user";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (username == nullptr)
        return fail_missing_argument(action, "username", error);
    if (result == nullptr)
        return fail_missing_argument(action, "result", error);

    const internal_user *user = user_database_find(&ctx->user_db, username);
    bool filled = false;
    if (user == nullptr)
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER, "user does not exist");
    else
        filled = user_entry_from_internal(ctx, user, result, error);
    if (!filled)
        g_prefix_error(error, "Could not %s '%s', ", action, username);
    return filled;
}

gboolean usermgmt_user_exists(const usermgmt_ctx *ctx, const char *username) {
    return context_is_usable(ctx, "check user exists", nullptr) && username != nullptr &&
           user_database_find(&ctx->user_db, username) != nullptr;
}

gboolean usermgmt_group_exists(const usermgmt_ctx *ctx, const char *groupname) {
    return context_is_usable(ctx, "check group exists", nullptr) && groupname != nullptr &&
           group_database_find(&ctx->group_db, groupname) != nullptr;
}

gboolean usermgmt_groups_exist(const usermgmt_ctx *ctx, const char *const *groupnames,
                               guint *out_missing) {
    if (!context_is_usable(ctx, "check groups exists", nullptr) || groupnames == nullptr)
        return FALSE;
    for (guint i = 0; groupnames[i] != nullptr; i++) {
        if (usermgmt_group_exists(ctx, groupnames[i]))
            continue;
        if (out_missing != nullptr)
            *out_missing = i;
        return FALSE;
    }
    return TRUE;
}

gboolean usermgmt_get_group(const usermgmt_ctx *ctx, const char *groupname, guint32 *out_gid,
                            char ***out_members, GError **error) {
    static constexpr const char *action = "retrieve group";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (groupname == nullptr)
        return fail_missing_argument(action, "groupname", error);

    const internal_group *group = group_database_find(&ctx->group_db, groupname);
    if (group == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP, "Group '%s' does not exist",
                    groupname);
        return FALSE;
    }
    if (out_gid != nullptr)
        *out_gid = group->gid;
    if (out_members != nullptr) {
        g_autoptr(GPtrArray) members = nullptr;
        str_hash_to_ptr_array(group->members, &members, TRUE, TRUE);
        *out_members = reinterpret_cast<char **>(g_ptr_array_steal(members, nullptr));
    }
    return TRUE;
}

static void free_listed_entry(gpointer entry) {
    usermgmt_free_user_entry(static_cast<user_entry *>(entry));
    g_free(entry);
}

gboolean usermgmt_get_all_users(const usermgmt_ctx *ctx, char ***out_names, GList **out_entries,
                                GError **error) {
    if (!context_is_usable(ctx, "get all users", error))
        return FALSE;
    if (out_names == nullptr && out_entries == nullptr) {
        // Deliberate: the text begins with a blank.
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ARGUMENT,
                    " as at least one of user/entries is required");
        return FALSE;
    }

    const GPtrArray *users = ctx->user_db.entries;
    g_autoptr(GPtrArray) names = nullptr;
    if (out_names != nullptr)
        names = g_ptr_array_new_full(users->len + 1, g_free);
    GList *entries = nullptr;
    int position = 0;
    for (const internal_user *user : records<const internal_user>(users)) {
        if (names != nullptr)
            g_ptr_array_add(names, g_strdup(user->name));
        if (out_entries != nullptr) {
            auto *entry = g_new0(user_entry, 1);
            entries = g_list_prepend(entries, entry);
            if (!user_entry_from_internal(ctx, user, entry, error)) {
                // Deliberate: no blank after the colon.
                g_prefix_error(error,
                               "Failed to retrieve details for users, position #%d:", position);
                g_list_free_full(entries, free_listed_entry);
                return FALSE;
            }
        }
        position++;
    }

    if (out_names != nullptr) {
        g_ptr_array_add(names, nullptr);
        *out_names = reinterpret_cast<char **>(g_ptr_array_steal(names, nullptr));
    }
    if (out_entries != nullptr)
        *out_entries = g_list_reverse(entries);
    return TRUE;
}

gboolean usermgmt_get_all_groups(const usermgmt_ctx *ctx, char ***out_groupnames, GError **error) {
    static constexpr const char *action = "retrieve all groups";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (out_groupnames == nullptr)
        return fail_missing_argument(action, "groupnames", error);

    const GPtrArray *groups = ctx->group_db.entries;
    g_autoptr(GPtrArray) names = g_ptr_array_new_full(groups->len + 1, g_free);
    for (const internal_group *group : records<const internal_group>(groups))
        g_ptr_array_add(names, g_strdup(group->name));
    g_ptr_array_add(names, nullptr);
    *out_groupnames = reinterpret_cast<char **>(g_ptr_array_steal(names, nullptr));
    return TRUE;
}

guint32 usermgmt_get_user_type(const usermgmt_ctx *ctx, const char *username) {
    if (!context_is_usable(ctx, "get user type", nullptr) || username == nullptr)
        return USER_TYPE_INVALID;
    const internal_user *user = user_database_find(&ctx->user_db, username);
    return user != nullptr ? user->type : guint32{USER_TYPE_NONE};
}

guint32 usermgmt_get_group_type(const usermgmt_ctx *ctx, const char *groupname) {
    if (!context_is_usable(ctx, "get group type", nullptr) || groupname == nullptr)
        return GROUP_TYPE_INVALID;
    const internal_group *group = group_database_find(&ctx->group_db, groupname);
    return group != nullptr ? group->type : guint32{GROUP_TYPE_NONE};
}
