// usermgmt/database.cpp: the two databases with their indexes.
#include "usermgmt/database.h"

#include "usermgmt/precondition.h"
#include "usermgmt/usermgmt.h"

template <typename record, void (*free_record)(record *)>
static void free_entry(gpointer entry) {
    free_record(static_cast<record *>(entry));
}

user_database user_database_new(guint reserved) {
    return {
        .name_hash = g_hash_table_new_full(g_str_hash, g_str_equal, g_free, nullptr),
        .entries = g_ptr_array_new_full(reserved, free_entry<internal_user, internal_user_free>),
        .dirty = FALSE,
    };
}

group_database group_database_new(guint reserved) {
    return {
        .name_hash = g_hash_table_new_full(g_str_hash, g_str_equal, g_free, nullptr),
        .gid_hash = g_hash_table_new_full(g_int_hash, g_int_equal, g_free, nullptr),
        .entries = g_ptr_array_new_full(reserved, free_entry<internal_group, internal_group_free>),
        .dirty = FALSE,
    };
}

void user_database_clear(user_database *user_db) {
    g_clear_pointer(&user_db->name_hash, g_hash_table_unref);
    g_clear_pointer(&user_db->entries, g_ptr_array_unref);
    user_db->dirty = FALSE;
}

void group_database_clear(group_database *group_db) {
    g_clear_pointer(&group_db->name_hash, g_hash_table_unref);
    g_clear_pointer(&group_db->gid_hash, g_hash_table_unref);
    g_clear_pointer(&group_db->entries, g_ptr_array_unref);
    group_db->dirty = FALSE;
}

internal_user *user_database_find(const user_database *user_db, const char *name) {
    return static_cast<internal_user *>(g_hash_table_lookup(user_db->name_hash, name));
}

internal_group *group_database_find(const group_database *group_db, const char *name) {
    return static_cast<internal_group *>(g_hash_table_lookup(group_db->name_hash, name));
}

internal_group *group_database_find_gid(const group_database *group_db, guint32 gid) {
    return static_cast<internal_group *>(g_hash_table_lookup(group_db->gid_hash, &gid));
}

void user_database_add(user_database *user_db, internal_user *user) {
    g_ptr_array_add(user_db->entries, user);
    (void)g_hash_table_insert(user_db->name_hash, g_strdup(user->name), user);
    user_db->dirty = TRUE;
}

void group_database_add(group_database *group_db, internal_group *group) {
    require(group_db->entries != NULL, );
    require(group_db->gid_hash != NULL, );
    require(group_db->name_hash != NULL, );

    auto *gid = g_new(guint32, 1);
    *gid = group->gid;
    g_ptr_array_add(group_db->entries, group);
    (void)g_hash_table_insert(group_db->name_hash, g_strdup(group->name), group);
    (void)g_hash_table_insert(group_db->gid_hash, gid, group);
    group_db->dirty = TRUE;
}

void add_user_to_group(internal_group *group, const char *username, gboolean *changed) {
    if (g_hash_table_contains(group->members, username))
        return;
    (void)g_hash_table_add(group->members, g_strdup(username));
    if (changed != nullptr)
        *changed = TRUE;
}

void remove_user_from_group(internal_group *group, const char *username, gboolean *changed) {
    if (g_hash_table_remove(group->members, username) && changed != nullptr)
        *changed = TRUE;
}

gboolean add_user_to_groups(group_database *group_db, const char *username,
                            const char *const *groupnames, const char *skip, GError **error) {
    for (; *groupnames != nullptr; groupnames++) {
        if (g_strcmp0(*groupnames, skip) == 0)
            continue;
        internal_group *group = group_database_find(group_db, *groupnames);
        if (group == nullptr) {
            g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP,
                        "could not add user '%s' to non-existing group '%s'!", username,
                        *groupnames);
            return FALSE;
        }
        add_user_to_group(group, username, &group_db->dirty);
    }
    return TRUE;
}
