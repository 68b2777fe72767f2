// usermgmt/account_records.cpp: users and groups as the databases hold them.
#include "usermgmt/account_records.h"

#include <type_traits>

#include "usermgmt/secret.h"

static_assert(std::is_trivial_v<internal_user> && std::is_trivial_v<internal_group>);

void internal_user_free(internal_user *user) {
    if (user == nullptr)
        return;
    g_free(user->name);
    wipe_free(user->password);
    g_free(user->gecos);
    g_free(user->home);
    g_free(user->shell);
    g_free(user);
}

void internal_group_free(internal_group *group) {
    if (group == nullptr)
        return;
    g_free(group->name);
    wipe_free(group->password);
    g_clear_pointer(&group->members, g_hash_table_unref);
    g_free(group);
}

GHashTable *member_set_new() {
    return g_hash_table_new_full(g_str_hash, g_str_equal, g_free, nullptr);
}
