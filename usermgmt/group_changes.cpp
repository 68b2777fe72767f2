// usermgmt/group_changes.cpp: adding and deleting groups, and the refusal to modify one.
#include <cstring>

#include <syslog.h>

#include "usermgmt/context.h"
#include "usermgmt/id_allocation.h"
#include "usermgmt/precondition.h"
#include "usermgmt/usermgmt.h"

static bool has_only_group_characters(const char *groupname) {
    for (const char *c = groupname; *c != '\0'; c++) {
        const bool is_final_dollar = *c == '$' && c[1] == '\0';
        if (!g_ascii_isalnum(*c) && std::strchr("_.@-", *c) == nullptr && !is_final_dollar)
            return false;
    }
    return true;
}

static bool check_group_name(const usermgmt_ctx *ctx, const char *groupname, GError **error) {
    if (group_database_find(&ctx->group_db, groupname) != nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP_EXISTS, "group already exists");
        return false;
    }
    const char *fault = nullptr;
    if (*groupname == '\0')
        fault = "group name must have at least one character";
    else if (*groupname == '-')
        fault = "group name cannot begin with '-'";
    else if (!has_only_group_characters(groupname))
        fault = "group name contains invalid characters";
    if (fault == nullptr)
        return true;
    g_set_error_literal(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP, fault);
    return false;
}

// The members as a set; null when one of them is no user.
static GHashTable *make_member_set(const usermgmt_ctx *ctx, const char *const *usernames,
                                   GError **error) {
    g_autoptr(GHashTable) members = member_set_new();
    for (guint k = 0; usernames != nullptr && usernames[k] != nullptr; k++) {
        if (!usermgmt_user_exists(ctx, usernames[k])) {
            g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER, "member #%d '%s' doesn't exist",
                        static_cast<int>(k), usernames[k]);
            return nullptr;
        }
        (void)g_hash_table_add(members, g_strdup(usernames[k]));
    }
    return g_steal_pointer(&members);
}

static internal_group *make_group(const usermgmt_ctx *ctx, const char *groupname,
                                  const char *const *usernames, GError **error) {
    guint32 gid = 0;
    if (!check_group_name(ctx, groupname, error) || !find_next_gid(ctx, &gid, error))
        return nullptr;
    GHashTable *members = make_member_set(ctx, usernames, error);
    if (members == nullptr)
        return nullptr;

    auto *group = g_new0(internal_group, 1);
    group->type = GROUP_TYPE_DYNAMIC_SYSTEM;
    group->name = g_strdup(groupname);
    group->gid = gid;
    group->members = members;
    return group;
}

gboolean usermgmt_add_group(usermgmt_ctx *ctx, const char *groupname, const char *const *usernames,
                            GError **error) {
    static constexpr const char *action = "add group";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (groupname == nullptr)
        return fail_missing_argument(action, "groupname", error);

    internal_group *group = make_group(ctx, groupname, usernames, error);
    if (group == nullptr)
        return fail_and_reload(ctx, action, groupname, 0, error);
    group_database_add(&ctx->group_db, group);
    if (!usermgmt_sync(ctx, error))
        return fail_and_reload(ctx, action, groupname, CORE_FILE_GROUP, error);
    return TRUE;
}

// Only listed members are examined. The mask says what a failure has to load again.
static bool check_members_can_do_without(const usermgmt_ctx *ctx, const internal_group *group,
                                         guint32 *out_reload_mask, GError **error) {
    GHashTableIter iter;
    gpointer member;
    g_hash_table_iter_init(&iter, group->members);
    while (g_hash_table_iter_next(&iter, &member, nullptr)) {
        const auto *username = static_cast<const char *>(member);
        const internal_user *user = user_database_find(&ctx->user_db, username);
        if (user == nullptr) {
            // Deliberate: the closing parenthesis is missing.
            syslog(LOG_ERR, "User/group DB mismatch (user '%s' not in grp '%s'!", username,
                   group->name);
            g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                        "user/group database out of sync");
            *out_reload_mask = CORE_FILE_ALL;
            return false;
        }
        if (user->gid == group->gid) {
            g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_PRIMARY_GROUP,
                        "primary group for user '%s'", username);
            return false;
        }
    }
    return true;
}

static bool group_database_remove(group_database *group_db, internal_group *group, GError **error) {
    bool removed = false;
    if (holds(group_db->entries != NULL)) {
        const guint32 gid = group->gid;
        const bool name_removed = g_hash_table_remove(group_db->name_hash, group->name);
        const bool gid_removed = g_hash_table_remove(group_db->gid_hash, &gid);
        const bool record_removed = g_ptr_array_remove(group_db->entries, group);
        removed = name_removed && gid_removed && record_removed;
        if (name_removed || gid_removed || record_removed)
            group_db->dirty = TRUE;
    }
    if (!removed)
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                    "could not remove group from internal structures");
    return removed;
}

static bool check_group_may_go(const usermgmt_ctx *ctx, const internal_group *group,
                               guint32 *out_reload_mask, GError **error) {
    if (group == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP_EXISTS, "group does not exist");
        return false;
    }
    if (group->type != GROUP_TYPE_DYNAMIC_SYSTEM &&
        group->type != GROUP_TYPE_PERMANENT_SYSTEM_NVR) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_DELETE_TYPE,
                    "group type '%s' with GID %d cannot be deleted", group_type_name(group->type),
                    static_cast<int>(group->gid));
        return false;
    }
    return check_members_can_do_without(ctx, group, out_reload_mask, error);
}

gboolean usermgmt_delete_group(usermgmt_ctx *ctx, const char *groupname, GError **error) {
    static constexpr const char *action = "delete group";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (groupname == nullptr)
        return fail_missing_argument(action, "groupname", error);

    guint32 reload_mask = 0;
    internal_group *group = group_database_find(&ctx->group_db, groupname);
    if (!check_group_may_go(ctx, group, &reload_mask, error) ||
        !group_database_remove(&ctx->group_db, group, error))
        return fail_and_reload(ctx, action, groupname, reload_mask, error);
    if (!usermgmt_sync(ctx, error))
        return fail_and_reload(ctx, action, groupname, CORE_FILE_GROUP, error);
    return TRUE;
}

gboolean usermgmt_modify_group(usermgmt_ctx *ctx, const char *groupname, const void *, const void *,
                               GError **error) {
    static constexpr const char *action = "modify group";
    if (!context_is_usable(ctx, action, error))
        return FALSE;
    if (groupname == nullptr)
        return fail_missing_argument(action, "groupname", error);
    g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP_MODIFICATION,
                "Group modification unsupported");
    return FALSE;
}
