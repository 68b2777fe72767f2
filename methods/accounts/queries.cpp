// methods/accounts/queries.cpp: the read-only account methods. They never write, notify or lock.
#include "methods/accounts/queries.h"

#include "service/method.h"
#include "service/reply.h"
#include "usermgmt/usermgmt.h"

// The only error of a query that does not come from the database.
static bool fits(method_call &call, gsize size) {
    return check_reply_size(size, &call.error) || pass_on(call, "");
}

bool handle_check_user(method_call &call, const char *user) {
    const gboolean exists = usermgmt_user_exists(call.state->usermgmt_context, user);

    privane_system__complete_check_user(call.skeleton, call.invocation, exists);
    return true;
}

bool handle_check_group(method_call &call, const char *group) {
    const gboolean exists = usermgmt_group_exists(call.state->usermgmt_context, group);

    privane_system__complete_check_group(call.skeleton, call.invocation, exists);
    return true;
}

bool handle_get_user(method_call &call, const char *user) {
    g_auto(user_entry) entry = {};
    if (!usermgmt_get_user(call.state->usermgmt_context, user, &entry, &call.error))
        return pass_on(call, "");

    g_autofree char *group = sendable_text(entry.group);
    make_sendable(entry.groups);
    g_autofree char *comment = sendable_text(entry.gecos);
    if (!fits(call, wire_size(group) + wire_size(entry.groups) + wire_size(comment)))
        return false;

    privane_system__complete_get_user(call.skeleton, call.invocation, entry.password != nullptr,
                                      group, entry.groups, comment, entry.uid);
    return true;
}

bool handle_get_user_list(method_call &call) {
    g_auto(GStrv) users = nullptr;
    if (!usermgmt_get_all_users(call.state->usermgmt_context, &users, nullptr, &call.error))
        return pass_on(call, "");

    make_sendable(users);
    if (!fits(call, wire_size(users)))
        return false;

    privane_system__complete_get_user_list(call.skeleton, call.invocation, users);
    return true;
}

bool handle_get_group(method_call &call, const char *group) {
    guint32 gid = 0;
    g_auto(GStrv) members = nullptr;
    if (!usermgmt_get_group(call.state->usermgmt_context, group, &gid, &members, &call.error))
        return pass_on(call, "");

    make_sendable(members);
    if (!fits(call, wire_size(members)))
        return false;

    privane_system__complete_get_group(call.skeleton, call.invocation, static_cast<int>(gid),
                                       members);
    return true;
}

bool handle_get_group_list(method_call &call) {
    g_auto(GStrv) groups = nullptr;
    if (!usermgmt_get_all_groups(call.state->usermgmt_context, &groups, &call.error))
        return pass_on(call, "");

    make_sendable(groups);
    if (!fits(call, wire_size(groups)))
        return false;

    privane_system__complete_get_group_list(call.skeleton, call.invocation, groups);
    return true;
}

// Adds one group to the two builders and to the size of the reply.
static bool add_group(method_call &call, const char *name, GVariantBuilder *gids,
                      GVariantBuilder *member_lists, gsize *size) {
    guint32 gid = static_cast<guint32>(-1);
    g_auto(GStrv) members = nullptr;
    if (!usermgmt_get_group(call.state->usermgmt_context, name, &gid, &members, &call.error))
        return false;

    make_sendable(members);
    g_variant_builder_add(gids, "i", static_cast<int>(gid));
    g_variant_builder_add(member_lists, "^as", members);
    *size += sizeof gid + wire_size(members);
    return true;
}

bool handle_get_group_list_full(method_call &call) {
    g_auto(GStrv) groups = nullptr;
    if (!usermgmt_get_all_groups(call.state->usermgmt_context, &groups, &call.error))
        return pass_on(call, "");

    g_auto(GVariantBuilder) gids = G_VARIANT_BUILDER_INIT(G_VARIANT_TYPE("ai"));
    g_auto(GVariantBuilder) member_lists = G_VARIANT_BUILDER_INIT(G_VARIANT_TYPE("aas"));
    gsize size = 0;
    for (int k = 0; groups[k] != nullptr; k++) {
        if (!add_group(call, groups[k], &gids, &member_lists, &size)) {
            g_autofree char *prefix = g_strdup_printf("Unable to get group entry #%d: ", k);
            return pass_on(call, prefix);
        }
    }
    make_sendable(groups);
    if (!fits(call, size + wire_size(groups)))
        return false;

    privane_system__complete_get_group_list_full(call.skeleton, call.invocation, groups,
                                                 g_variant_builder_end(&gids),
                                                 g_variant_builder_end(&member_lists));
    return true;
}
