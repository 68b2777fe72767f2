// usermgmt/user_validation.cpp: what a user of each type may have.
#include "usermgmt/user_validation.h"

#include <cstring>

#include "usermgmt/password.h"
#include "usermgmt/precondition.h"

static constexpr int MAX_ORNET_NAME_LENGTH = 14;
static constexpr int MAX_ORNET_PASSWORD_LENGTH = 64;
static constexpr int NO_MAX_LENGTH = -1;

static constexpr guint32 MIN_REQUESTED_UID = 1000;
static constexpr guint32 MAX_REQUESTED_UID = 60000;

// The one permanent user that may be changed: its group memberships say what a visitor without an
// account may do.
static constexpr const char *VISITOR = "anonymous";

static bool refuse(GError **error, int code, const char *text) {
    g_set_error_literal(error, USERMGMT_ERROR, code, text);
    return false;
}

static bool check_root(const user_entry *new_user, guint32 fields, GError **error) {
    if (fields != USER_FIELD_PASSWORD)
        return refuse(error, USERMGMT_ERROR_USER_TYPE,
                      "only the password can be modified for root user");
    return check_password_rules(new_user->password, NO_MAX_LENGTH, error);
}

static bool check_permanent(const char *username, guint32 fields, GError **error) {
    if ((fields & USER_FIELD_GROUPS) == 0 || !g_str_equal(username, VISITOR))
        return refuse(error, USERMGMT_ERROR_USER_TYPE, "permanent system users cannot be modified");
    return true;
}

static bool check_ornet_name(const char *name, GError **error) {
    if (name == nullptr)
        return refuse(error, USERMGMT_ERROR_USER, "missing username");
    if (*name == '\0')
        return refuse(error, USERMGMT_ERROR_USER, "username must have at least one character");
    if (std::strlen(name) > MAX_ORNET_NAME_LENGTH) {
        g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER,
                    "username too long, max allowed length is %d characters",
                    MAX_ORNET_NAME_LENGTH);
        return false;
    }
    for (const char *c = name; *c != '\0'; c++)
        if (!g_ascii_isalnum(*c))
            return refuse(error, USERMGMT_ERROR_USER, "username contains invalid characters");
    return true;
}

static bool check_ornet(const user_entry *new_user, guint32 fields, GError **error) {
    if ((fields & USER_FIELD_NAME) != 0 && !check_ornet_name(new_user->name, error))
        return false;
    if ((fields & USER_FIELD_PASSWORD) != 0 &&
        !check_password_rules(new_user->password, MAX_ORNET_PASSWORD_LENGTH, error))
        return false;
    if ((fields & USER_FIELD_SHELL) != 0 && new_user->shell != nullptr)
        return refuse(error, USERMGMT_ERROR_SHELL, "no shell login allowed for ORNET users");
    return true;
}

static bool check_groups(const usermgmt_ctx *ctx, const user_entry *new_user, guint32 fields,
                         GError **error) {
    const char *missing = nullptr;
    const char *kind = nullptr;
    guint index = 0;

    if ((fields & USER_FIELD_GROUP) != 0 && !usermgmt_group_exists(ctx, new_user->group)) {
        kind = "primary";
        missing = new_user->group;
    } else if ((fields & USER_FIELD_GROUPS) != 0 && new_user->groups != nullptr &&
               !usermgmt_groups_exist(ctx, new_user->groups, &index)) {
        kind = "secondary";
        missing = new_user->groups[index];
    }
    if (missing == nullptr)
        return true;
    g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_GROUP, "%s group '%s' does not exist", kind,
                missing);
    return false;
}

// Deliberate: the entry's own type is tested, so that one of type "none" cannot ask for a UID.
static bool check_uid(const user_entry *new_user, guint32 fields, GError **error) {
    if ((fields & USER_FIELD_UID) == 0 || new_user->uid == -1)
        return true;
    const auto uid = static_cast<guint32>(new_user->uid);
    if (new_user->type == USER_TYPE_ORNET && uid >= MIN_REQUESTED_UID && uid <= MAX_REQUESTED_UID)
        return true;
    return refuse(error, USERMGMT_ERROR_ARGUMENT, "invalid UID");
}

bool validate_user(const usermgmt_ctx *ctx, const char *username, guint32 type,
                   const user_entry *new_user, guint32 fields, GError **error) {
    require(ctx != NULL, false);
    require(username != NULL, false);
    require(new_user != NULL, false);

    if (new_user->name != nullptr && !g_str_equal(new_user->name, username))
        return refuse(error, USERMGMT_ERROR_ARGUMENT, "mismatch of supplied username/type");
    if (new_user->type != USER_TYPE_NONE && new_user->type != type)
        return refuse(error, USERMGMT_ERROR_ARGUMENT, "mismatch of supplied username/type");
    if ((fields & USER_FIELD_GROUP) != 0 && new_user->group == nullptr)
        return refuse(error, USERMGMT_ERROR_GROUP, "no primary group specified");

    switch (type) {
        case USER_TYPE_ROOT:
            return check_root(new_user, fields, error);
        case USER_TYPE_PERMANENT:
            if (!check_permanent(username, fields, error))
                return false;
            break;
        case USER_TYPE_DYNAMIC_SYSTEM:
            break;
        case USER_TYPE_ORNET:
            if (!check_ornet(new_user, fields, error))
                return false;
            break;
        default:
            g_set_error(error, USERMGMT_ERROR, USERMGMT_ERROR_USER_TYPE, "invalid user type '%s'",
                        user_type_name(type));
            return false;
    }
    return check_groups(ctx, new_user, fields, error) && check_uid(new_user, fields, error);
}
