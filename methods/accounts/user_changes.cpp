// methods/accounts/user_changes.cpp: the methods that change users.
//
// The clear text of a password also stands in the bus message, which is GDBus's and not ours to
// wipe.
#include "methods/accounts/user_changes.h"

#include "methods/accounts/notify.h"
#include "platform/digest_entry/digest_entry.h"
#include "service/method.h"
#include "usermgmt/usermgmt.h"

static constexpr gint32 ANY_UID = -1;
static constexpr int DIGEST_FLAGS = 0;

// Its members decide what a visitor without an account may do, so everybody learns of a change.
static constexpr const char *VISITOR = "anonymous";

// The bus has no absent values: an empty string or array stands for one. In a modification an
// absent field leaves its attribute as it is.
static user_entry make_user_entry(guint32 type, const char *name, const char *password,
                                  const char *group, const char *const *groups, const char *shell,
                                  const char *comment, gint32 uid) {
    const auto present = [](const char *text) -> const char * {
        return text != nullptr && *text != '\0' ? text : nullptr;
    };
    const bool has_groups = groups != nullptr && *groups != nullptr;

    user_entry entry = {};
    usermgmt_populate_user_entry(&entry, type, present(name), present(password), present(group),
                                 has_groups ? groups : nullptr, present(shell), present(comment),
                                 uid);
    return entry;
}

static bool has_no_type(guint32 type) {
    return type == USER_TYPE_NONE || type == USER_TYPE_INVALID;
}

// The account would exist without being able to log in over the web, so it goes again.
static bool undo_addition(method_call &call, const char *name, int digest_error) {
    (void)fail(call, PRIVANE_ERROR_DIGEST, "Failed to add digest info for '%s' (Err %d)", name,
               digest_error);  // the answer comes when the account is gone
    // Deliberate: why it could not go is dropped; the first error says more.
    if (!usermgmt_delete_user(call.state->usermgmt_context, name, nullptr))
        g_prefix_error(&call.error, "Could not cleanup user '%s' ", name);
    return false;
}

static bool add_ornet_user(method_call &call, const char *name, const char *password,
                           const char *group, const char *joined_groups, const char *comment,
                           gint32 uid) {
    g_auto(GStrv) groups = joined_groups != nullptr ? g_strsplit(joined_groups, ":", -1) : nullptr;
    g_auto(user_entry) entry =
        make_user_entry(USER_TYPE_ORNET, name, password, group, groups, nullptr, comment, uid);
    if (!usermgmt_add_user(call.state->usermgmt_context, name, &entry, &call.error))
        return pass_on(call, "");
    const int digest_error = digest_entry_set(name, password, DIGEST_FLAGS);
    if (digest_error != 0)
        return undo_addition(call, name, digest_error);
    notify_user_db_updated(call.skeleton, USER_TYPE_ORNET);

    // AddUidUser has the same, empty reply.
    privane_system__complete_add_user(call.skeleton, call.invocation);
    return true;
}

bool handle_add_user(method_call &call, const char *name, const char *password, const char *group,
                     const char *joined_groups, const char *comment) {
    return add_ornet_user(call, name, password, group, joined_groups, comment, ANY_UID);
}

bool handle_add_uid_user(method_call &call, const char *name, const char *password,
                         const char *group, const char *joined_groups, const char *comment,
                         gint uid) {
    return add_ornet_user(call, name, password, group, joined_groups, comment, uid);
}

bool handle_add_system_user(method_call &call, const char *name, const char *password,
                            const char *group, const char *const *groups, const char *shell,
                            const char *comment) {
    g_auto(user_entry) entry = make_user_entry(USER_TYPE_DYNAMIC_SYSTEM, name, password, group,
                                               groups, shell, comment, ANY_UID);
    if (!usermgmt_add_user(call.state->usermgmt_context, name, &entry, &call.error))
        return pass_on(call, "");
    signal_cfgstore();

    privane_system__complete_add_system_user(call.skeleton, call.invocation);
    return true;
}

// The web server's copy of a new password. The modification stays where this fails.
static bool update_digest(method_call &call, const char *name, const char *password,
                          guint32 user_type) {
    const int digest_error = digest_entry_set(name, password, DIGEST_FLAGS);
    if (digest_error != 0)
        return fail(call, PRIVANE_ERROR_DIGEST, "Failed to update digest info for '%s' (Err %d)",
                    name, digest_error);
    g_message("Updated digest info %s (usertype=%s)!", name, user_type_name(user_type));
    return true;
}

bool handle_modify_user(method_call &call, const char *name, const char *password,
                        const char *group, const char *const *groups, const char *shell,
                        const char *comment) {
    if (*name == '\0')
        return fail(call, PRIVANE_ERROR_USER_ARGUMENT, "Provided username cannot be NULL/empty");
    const bool is_visitor = g_str_equal(name, VISITOR);
    if (is_visitor)
        g_message("Updating anonymous user!");
    const guint32 type = usermgmt_get_user_type(call.state->usermgmt_context, name);
    if (has_no_type(type))
        return fail(call, PRIVANE_ERROR_USER_ARGUMENT,
                    "User modification failed, user type could not be determined");

    g_auto(user_entry) entry =
        make_user_entry(USER_TYPE_NONE, nullptr, password, group, groups, shell, comment, ANY_UID);
    if (!usermgmt_modify_user(call.state->usermgmt_context, name, &entry, &call.error))
        return pass_on(call, "");
    const bool logs_in_over_web = type == USER_TYPE_ORNET || type == USER_TYPE_ROOT;
    if (logs_in_over_web && entry.password != nullptr &&
        !update_digest(call, name, entry.password, type))
        return false;
    if (type == USER_TYPE_ROOT)
        set_root_password_flag();
    notify_user_db_updated(call.skeleton, is_visitor ? NOTIFY_EVERYBODY : type);

    privane_system__complete_modify_user(call.skeleton, call.invocation);
    return true;
}

// Unlike make_user_entry this keeps the empty list and the empty comment: they are what clears.
static bool clear_fields(method_call &call, const char *name, bool clear_groups,
                         bool clear_comment) {
    static const char *const no_groups[] = {nullptr};
    g_auto(user_entry) entry = {};
    usermgmt_populate_user_entry(&entry, USER_TYPE_NONE, name, nullptr, nullptr,
                                 clear_groups ? no_groups : nullptr, nullptr,
                                 clear_comment ? "" : nullptr, ANY_UID);
    return usermgmt_modify_user(call.state->usermgmt_context, name, &entry, &call.error) ||
           pass_on(call, "");
}

bool handle_clear_user_fields(method_call &call, const char *name, gboolean clear_password,
                              gboolean clear_groups, gboolean clear_comment) {
    if (*name == '\0')
        return fail(call, PRIVANE_ERROR_USER_ARGUMENT, "Provided username cannot be NULL/empty");

    if (clear_password &&
        !usermgmt_disable_password(call.state->usermgmt_context, name, &call.error))
        return pass_on(call, "");
    if ((clear_groups || clear_comment) && !clear_fields(call, name, clear_groups, clear_comment))
        return false;
    // Deliberate: a comment alone is announced to nobody.
    if (clear_password || clear_groups)
        notify_user_db_updated(call.skeleton, NOTIFY_EVERYBODY);

    privane_system__complete_clear_user_fields(call.skeleton, call.invocation);
    return true;
}

// Deliberate: neither the web server's copy of the password nor anybody else learns of the change.
bool handle_chpasswd_user(method_call &call, const char *name, const char *password) {
    g_auto(user_entry) entry = make_user_entry(USER_TYPE_NONE, nullptr, password, nullptr, nullptr,
                                               nullptr, nullptr, ANY_UID);
    if (!usermgmt_modify_user(call.state->usermgmt_context, name, &entry, &call.error))
        return pass_on(call, "");
    if (usermgmt_get_user_type(call.state->usermgmt_context, name) == USER_TYPE_ROOT)
        set_root_password_flag();

    privane_system__complete_chpasswd_user(call.skeleton, call.invocation);
    return true;
}

bool handle_remove_user(method_call &call, const char *name) {
    const guint32 type = usermgmt_get_user_type(call.state->usermgmt_context, name);
    if (has_no_type(type))
        return fail(call, PRIVANE_ERROR_USER_ARGUMENT,
                    "User deletion failed, user type could not be determined");

    if (!usermgmt_delete_user(call.state->usermgmt_context, name, &call.error))
        return pass_on(call, "");
    const int digest_error = type == USER_TYPE_ORNET ? digest_entry_delete(name, DIGEST_FLAGS) : 0;
    if (digest_error != 0)
        return fail(call, PRIVANE_ERROR_DIGEST, "Failed to delete digest info for '%s' (Err %d)",
                    name, digest_error);
    notify_user_db_updated(call.skeleton, type);

    privane_system__complete_remove_user(call.skeleton, call.invocation);
    return true;
}
