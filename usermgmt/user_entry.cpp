// usermgmt/user_entry.cpp: the public user record.
#include "usermgmt/user_entry.h"

#include <type_traits>

#include "usermgmt/context.h"
#include "usermgmt/precondition.h"
#include "usermgmt/secret.h"

static_assert(std::is_trivial_v<user_entry>);

void usermgmt_populate_user_entry(user_entry *entry, guint32 type, const char *name,
                                  const char *password, const char *group,
                                  const char *const *groups, const char *shell, const char *gecos,
                                  gint32 uid) {
    require(entry != NULL, );

    entry->type = type;
    entry->name = g_strdup(name);
    entry->password = g_strdup(password);
    entry->group = g_strdup(group);
    entry->groups = g_strdupv(const_cast<char **>(groups));
    entry->gecos = g_strdup(gecos);
    entry->shell = g_strdup(shell);
    entry->uid = uid;
}

void usermgmt_free_user_entry(user_entry *entry) {
    if (entry == nullptr)
        return;
    g_clear_pointer(&entry->name, g_free);
    g_clear_pointer(&entry->password, wipe_free);
    g_clear_pointer(&entry->group, g_free);
    g_clear_pointer(&entry->groups, g_strfreev);
    g_clear_pointer(&entry->gecos, g_free);
    g_clear_pointer(&entry->shell, g_free);
    entry->uid = -1;
}

bool build_secondary_group_list(const group_database *group_db, const char *username,
                                const char *primary_group, char ***results) {
    require(group_db->entries != NULL, false);
    require(*results == NULL, false);

    g_autoptr(GPtrArray) names = g_ptr_array_new_with_free_func(g_free);
    for (const internal_group *group : records<const internal_group>(group_db->entries))
        if (g_hash_table_contains(group->members, username) &&
            g_strcmp0(group->name, primary_group) != 0)
            g_ptr_array_add(names, g_strdup(group->name));
    g_ptr_array_add(names, nullptr);
    *results = reinterpret_cast<char **>(g_ptr_array_steal(names, nullptr));
    return true;
}

bool user_entry_from_internal(const usermgmt_ctx *ctx, const internal_user *intern,
                              user_entry *entry, GError **error) {
    require(intern != NULL, false);

    const internal_group *group = group_database_find_gid(&ctx->group_db, intern->gid);
    if (group == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                    "no corresponding group for GID '%d'", static_cast<int>(intern->gid));
        return false;
    }
    char **groups = nullptr;
    if (!build_secondary_group_list(&ctx->group_db, intern->name, group->name, &groups))
        return false;

    usermgmt_populate_user_entry(entry, intern->type, intern->name, intern->password, group->name,
                                 nullptr, intern->shell, intern->gecos,
                                 static_cast<gint32>(intern->uid));
    entry->groups = groups;
    return true;
}
