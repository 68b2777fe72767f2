// usermgmt/id_allocation.cpp: choosing the ID of a new account.
#include "usermgmt/id_allocation.h"

#include "usermgmt/context.h"
#include "usermgmt/precondition.h"
#include "usermgmt/usermgmt.h"

// Only of users whose UID is chosen here; a requested UID is not counted against it.
static constexpr guint MAX_ORNET_USERS = 100;

struct account_id {
    guint32 type;
    guint32 id;
};

static account_id id_of(const id_range *range, gconstpointer entry) {
    if (range->range_type == RANGE_TYPE_USER) {
        const auto *user = static_cast<const internal_user *>(entry);
        return {user->type, user->uid};
    }
    const auto *group = static_cast<const internal_group *>(entry);
    return {group->type, group->gid};
}

void find_min_max_uid_gid(const id_range *range, const GPtrArray *entries, guint32 *min_found,
                          guint32 *max_found, guint *count) {
    require(min_found != NULL && *min_found == 0, );
    require(max_found != NULL && *max_found == 0, );
    require(range->range_type == RANGE_TYPE_GROUP || range->range_type == RANGE_TYPE_USER, );

    for (const void *entry : records<const void>(entries)) {
        if (entry == nullptr)
            continue;
        const account_id account = id_of(range, entry);
        if (account.type != range->type || account.id < range->min || account.id > range->max)
            continue;
        if (count != nullptr)
            *count += 1;
        if (*min_found == 0 || account.id < *min_found)
            *min_found = account.id;
        if (*max_found == 0 || account.id > *max_found)
            *max_found = account.id;
    }
}

bool find_next_uid_gid_in_range(const id_range *range, guint32 min_found, guint32 max_found,
                                guint32 *out_next) {
    if (min_found == 0) {
        require(max_found == 0, false);
        *out_next = range->descending ? range->max : range->min;
        return true;
    }
    const guint32 next = range->descending ? min_found - 1 : max_found + 1;
    if (range->descending ? next < range->min : next > range->max)
        return false;
    *out_next = next;
    return true;
}

bool find_next_uid(const usermgmt_ctx *ctx, guint32 type, guint32 *out_uid, GError **error) {
    require(ctx->initialised != FALSE, false);
    require(ctx->user_db.entries != NULL, false);

    if (type < USER_TYPE_ROOT || type > USER_TYPE_NOBODY) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ALLOCATION_TYPE, "Invalid user type '%d'",
                    static_cast<int>(type));
        return false;
    }
    const id_range *range = &user_range_table[type];
    guint32 min_found = 0;
    guint32 max_found = 0;
    guint count = 0;
    find_min_max_uid_gid(range, ctx->user_db.entries, &min_found, &max_found, &count);
    if (type == USER_TYPE_ORNET && count >= MAX_ORNET_USERS) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_NO_UID,
                    "Max number of ORNET users exceeded (max=%d, current=%d)",
                    static_cast<int>(MAX_ORNET_USERS), static_cast<int>(count));
        return false;
    }
    if (!find_next_uid_gid_in_range(range, min_found, max_found, out_uid)) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_NO_UID,
                    "No more available UIDs in the %s range (%d - %d)", range->name,
                    static_cast<int>(range->min), static_cast<int>(range->max));
        return false;
    }
    return true;
}

bool find_next_gid(const usermgmt_ctx *ctx, guint32 *out_gid, GError **error) {
    require(ctx->initialised != FALSE, false);
    require(ctx->group_db.entries != NULL, false);

    const id_range *range = &group_range_table[GROUP_TYPE_DYNAMIC_SYSTEM];
    guint32 min_found = 0;
    guint32 max_found = 0;
    find_min_max_uid_gid(range, ctx->group_db.entries, &min_found, &max_found, nullptr);
    if (!find_next_uid_gid_in_range(range, min_found, max_found, out_gid)) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_NO_GID,
                    "No more available GIDs in the %s range (%d - %d)", range->name,
                    static_cast<int>(range->min), static_cast<int>(range->max));
        return false;
    }
    return true;
}

bool set_uid_if_free(const usermgmt_ctx *ctx, guint32 uid, GError **error) {
    // The blank behind the cast is part of the record.
    // clang-format off
    bool is_free = holds(uid > (uid_t) 0);
    // clang-format on
    for (const internal_user *user : records<const internal_user>(ctx->user_db.entries))
        is_free = is_free && user->uid != uid;
    if (!is_free)
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_ARGUMENT, "specified UID is unavailable");
    return is_free;
}
