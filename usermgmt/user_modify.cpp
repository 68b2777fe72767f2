// usermgmt/user_modify.cpp: changing a user in place.
#include <syslog.h>

#include "usermgmt/context.h"
#include "usermgmt/name_set.h"
#include "usermgmt/password.h"
#include "usermgmt/precondition.h"
#include "usermgmt/record_check.h"
#include "usermgmt/user_entry.h"
#include "usermgmt/user_validation.h"
#include "usermgmt/usermgmt.h"

static constexpr const char *ACTION = "modify user";

static constexpr guint32 RELOAD_AFTER_NEW_GROUP = CORE_FILE_PASSWD | CORE_FILE_GROUP;

// Deliberate: these are not bits of a file mask. 1 selects no file and 2 the passwd file, so that a
// failure that changed only users leaves them changed in memory.
static constexpr guint32 RELOAD_CHANGED_USERS = 1;
static constexpr guint32 RELOAD_CHANGED_GROUPS = 2;

// One modification on its way.
struct modification {
    usermgmt_ctx *ctx;
    const user_entry *wanted;
    guint32 fields;
    internal_user *user;
    internal_group *primary;  // once it was looked up
    guint32 pending_mask;     // what a failure has to load again, beside what is marked as changed
};

static guint32 fields_of(const user_entry *entry) {
    guint32 fields = 0;
    fields |= entry->password != nullptr ? USER_FIELD_PASSWORD : 0U;
    fields |= entry->group != nullptr ? USER_FIELD_GROUP : 0U;
    fields |= entry->groups != nullptr ? USER_FIELD_GROUPS : 0U;
    fields |= entry->gecos != nullptr ? USER_FIELD_GECOS : 0U;
    fields |= entry->shell != nullptr ? USER_FIELD_SHELL : 0U;
    return fields;
}

static bool is_wanted(const modification &change, user_field field) {
    return (change.fields & field) != 0;
}

// The group that will be the primary one; null when the current GID has none.
static const internal_group *next_primary_group(const modification &change) {
    const group_database *group_db = &change.ctx->group_db;
    return is_wanted(change, USER_FIELD_GROUP)
               ? group_database_find(group_db, change.wanted->group)
               : group_database_find_gid(group_db, change.user->gid);
}

// Position of the first group that the user would newly be in; false when it joins none.
static bool find_first_new_group(const modification &change, const internal_group *primary,
                                 guint *out_index) {
    guint index = 0;
    for (const internal_group *group :
         records<const internal_group>(change.ctx->group_db.entries)) {
        const bool joins = group == primary ? group->gid != change.user->gid
                                            : list_contains(group->name, change.wanted->groups);
        if (joins && !g_hash_table_contains(group->members, change.user->name)) {
            *out_index = index;
            return true;
        }
        index++;
    }
    return false;
}

// The record as it would become, owning nothing; the hash as it stands.
static bool check_new_record(const modification &change, GError **error) {
    internal_user intended = *change.user;
    const internal_group *primary = next_primary_group(change);
    if (primary != nullptr)
        intended.gid = primary->gid;
    if (is_wanted(change, USER_FIELD_SHELL))
        intended.shell = change.wanted->shell;

    guint index = 0;
    // Whom the index has, the array has.
    (void)g_ptr_array_find(change.ctx->user_db.entries, change.user, &index);
    if (!check_user_record(&intended, index, error))
        return false;
    return !find_first_new_group(change, primary, &index) ||
           check_member_name(change.user->name, index, error);
}

static void replace_user_group(modification &change, internal_group *next) {
    gboolean changed = FALSE;
    remove_user_from_group(change.primary, change.user->name, &changed);
    add_user_to_group(next, change.user->name, &changed);
    change.user->gid = next->gid;
    // Deliberate: a new GID alone marks nothing as changed.
    if (changed) {
        change.ctx->user_db.dirty = TRUE;
        change.ctx->group_db.dirty = TRUE;
    }
    change.primary = next;
    change.pending_mask = RELOAD_AFTER_NEW_GROUP;
}

static bool modify_primary_group(modification &change, GError **error) {
    const internal_user *user = change.user;
    change.primary = group_database_find_gid(&change.ctx->group_db, user->gid);
    if (change.primary == nullptr) {
        const int gid = static_cast<int>(user->gid);
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_INTERNAL,
                    "primary group (%d) for user does not exist!!", gid);
        syslog(LOG_ERR, "Mis-match in user/group DB! (Pri grp '%d' missing for '%s')", gid,
               user->name);
        change.pending_mask = CORE_FILE_ALL;
        return false;
    }
    internal_group *next = group_database_find(&change.ctx->group_db, change.wanted->group);
    if (next->gid != change.primary->gid)
        replace_user_group(change, next);
    return true;
}

static void remove_users_from_groups(group_database *group_db, const char *username,
                                     const char *const *groups, const char *primary) {
    for (; *groups != nullptr; groups++) {
        if (g_strcmp0(*groups, primary) == 0)
            continue;
        internal_group *group = group_database_find(group_db, *groups);
        if (group == nullptr)
            syslog(LOG_WARNING, "Attempted to remove '%s' from non-existing group '%s'", username,
                   *groups);
        else
            remove_user_from_group(group, username, &group_db->dirty);
    }
}

// The groups to join and those to leave, each as its own list.
struct membership_lists {
    GList *join = nullptr;
    GList *keep = nullptr;
    GList *leave = nullptr;

    membership_lists(const char *const *current, const char *const *wanted) {
        list_diff(current, wanted, &leave, &keep, &join);
    }
    ~membership_lists() {
        for (GList *list : {join, keep, leave})
            g_list_free_full(list, g_free);
    }
    membership_lists(const membership_lists &) = delete;
    membership_lists &operator=(const membership_lists &) = delete;
};

using membership_change = void (*)(internal_group *group, const char *username, gboolean *changed);

// Applies the change to each group of the list but the primary one.
static bool change_memberships(group_database *group_db, const char *username, const GList *names,
                               const char *primary, bool joining, gboolean *changed,
                               GError **error) {
    const membership_change change = joining ? add_user_to_group : remove_user_from_group;
    for (const GList *link = names; link != nullptr; link = link->next) {
        const auto *name = static_cast<const char *>(link->data);
        if (g_strcmp0(name, primary) == 0)
            continue;
        internal_group *group = group_database_find(group_db, name);
        if (group == nullptr) {
            g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP,
                        joining ? "could not add user to non-existent group '%s'"
                                : "could not remove user from non-existent group '%s'",
                        name);
            return false;
        }
        change(group, username, changed);
    }
    return true;
}

static bool exchange_groups(group_database *group_db, const char *username,
                            const char *const *current, const char *const *wanted,
                            const char *primary, GError **error) {
    const membership_lists lists(current, wanted);
    gboolean changed = FALSE;
    if (!change_memberships(group_db, username, lists.join, primary, true, &changed, error) ||
        !change_memberships(group_db, username, lists.leave, primary, false, &changed, error))
        return false;
    // Deliberate: only after both, so that a failure in between leaves nothing marked as changed.
    if (changed)
        group_db->dirty = TRUE;
    return true;
}

static bool update_groups(group_database *group_db, const char *username,
                          const internal_group *primary, const char *const *wanted,
                          GError **error) {
    g_auto(GStrv) current = nullptr;
    if (!build_secondary_group_list(group_db, username, primary->name, &current))
        return false;
    if (*wanted != nullptr)
        return exchange_groups(group_db, username, current, wanted, primary->name, error);
    remove_users_from_groups(group_db, username, current, primary->name);
    return true;
}

static bool modify_user_groups(group_database *group_db, const char *username,
                               const internal_group *primary, const char *const *wanted,
                               GError **error) {
    require(username != NULL, false);

    if (update_groups(group_db, username, primary, wanted, error))
        return true;
    g_prefix_error(error, "could not update groups: ");
    return false;
}

static bool modify_secondary_groups(modification &change, GError **error) {
    group_database *group_db = &change.ctx->group_db;
    const internal_group *primary = change.primary != nullptr
                                        ? change.primary
                                        : group_database_find_gid(group_db, change.user->gid);
    if (primary == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP, "could not get primary group!");
        return false;
    }
    if (modify_user_groups(group_db, change.user->name, primary, change.wanted->groups, error))
        return true;
    g_prefix_error(error, "sec. groups: ");
    return false;
}

// An empty text is a value like any other.
static void replace_text(internal_user *user, char *internal_user::*text, const char *wanted,
                         gboolean *changed) {
    if (g_strcmp0(user->*text, wanted) == 0)
        return;
    internal_user_replace_text(user, text, wanted);
    *changed = TRUE;
}

static bool change_fields(modification &change, GError **error) {
    gboolean *dirty = &change.ctx->user_db.dirty;
    internal_user *user = change.user;

    if (is_wanted(change, USER_FIELD_GROUP) && !modify_primary_group(change, error))
        return false;
    if (is_wanted(change, USER_FIELD_GROUPS) && !modify_secondary_groups(change, error))
        return false;
    if (is_wanted(change, USER_FIELD_PASSWORD) &&
        !internal_user_set_password(user, change.wanted->password, user->shadowed != FALSE, dirty,
                                    error))
        return false;
    if (is_wanted(change, USER_FIELD_GECOS))
        replace_text(user, &internal_user::gecos, change.wanted->gecos, dirty);
    if (is_wanted(change, USER_FIELD_SHELL))
        replace_text(user, &internal_user::shell, change.wanted->shell, dirty);
    return usermgmt_sync(change.ctx, error);
}

// Finds the user and checks what is asked for.
static bool check_modification(modification &change, const char *username, GError **error) {
    const user_entry *wanted = change.wanted;
    if (wanted->name != nullptr && !g_str_equal(wanted->name, username)) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ARGUMENT,
                    "changing username is not permitted");
        return false;
    }
    change.user = user_database_find(&change.ctx->user_db, username);
    if (change.user == nullptr) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER, "user does not exist");
        return false;
    }
    if (wanted->type != USER_TYPE_NONE && wanted->type != change.user->type) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ARGUMENT,
                    "changing user type is not permitted");
        return false;
    }
    change.fields = fields_of(wanted);
    return change.fields == 0 ||
           (validate_user(change.ctx, username, change.user->type, wanted, change.fields, error) &&
            check_new_record(change, error));
}

gboolean usermgmt_modify_user(usermgmt_ctx *ctx, const char *username, const user_entry *mod_user,
                              GError **error) {
    if (!context_is_usable(ctx, ACTION, error))
        return FALSE;
    if (username == nullptr)
        return fail_missing_argument(ACTION, "username", error);
    if (mod_user == nullptr)
        return fail_missing_argument(ACTION, "mod_user", error);

    const user_database *user_db = &ctx->user_db;
    const group_database *group_db = &ctx->group_db;
    warn_unless(user_db->dirty == FALSE);
    warn_unless(group_db->dirty == FALSE);

    modification change = {ctx, mod_user, 0, nullptr, nullptr, 0};
    if (check_modification(change, username, error) &&
        (change.fields == 0 || change_fields(change, error)))
        return TRUE;

    guint32 reload_mask = change.pending_mask;
    reload_mask |= user_db->dirty ? RELOAD_CHANGED_USERS : 0U;
    reload_mask |= group_db->dirty ? RELOAD_CHANGED_GROUPS : 0U;
    return fail_and_reload(ctx, ACTION, username, reload_mask, error);
}
