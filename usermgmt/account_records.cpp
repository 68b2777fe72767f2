// usermgmt/account_records.cpp: users and groups as the databases hold them.
#include "usermgmt/account_records.h"

#include <cstdint>
#include <type_traits>

#include "usermgmt/record_block.h"
#include "usermgmt/secret.h"

static_assert(std::is_trivial_v<internal_user> && std::is_trivial_v<internal_group>);

// The password is left out: it is wiped and replaced by itself.
static constexpr char *internal_user::*texts[] = {&internal_user::name, &internal_user::gecos,
                                                  &internal_user::home, &internal_user::shell};

internal_user *internal_user_copy(const internal_user *user) {
    internal_user *copy = copy_with_texts(user, texts);
    copy->password = g_strdup(user->password);
    copy->room = room_for_texts(user, texts);
    return copy;
}

// Frees one of the record's strings unless it goes with the record.
static void free_text(const internal_user *user, char *text) {
    const auto room = reinterpret_cast<std::uintptr_t>(user + 1);
    const auto position = reinterpret_cast<std::uintptr_t>(text);
    if (position < room || position >= room + user->room)
        g_free(text);
}

void internal_user_replace_text(internal_user *user, char *internal_user::*text,
                                const char *wanted) {
    char *old = user->*text;
    user->*text = g_strdup(wanted);
    free_text(user, old);
}

void internal_user_free(internal_user *user) {
    if (user == nullptr)
        return;
    wipe_free(user->password);
    for (char *internal_user::*text : texts)
        free_text(user, user->*text);
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
