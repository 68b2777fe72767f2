// usermgmt/user_validation.h: what a user of each type may have, internal to usermgmt.
#pragma once

#include <glib.h>

#include "usermgmt/usermgmt.h"

// One bit for each field of a user_entry, in the record's order.
enum user_field : guint32 {
    USER_FIELD_TYPE = 1,
    USER_FIELD_NAME = 2,
    USER_FIELD_PASSWORD = 4,
    USER_FIELD_GROUP = 8,
    USER_FIELD_GROUPS = 16,
    USER_FIELD_GECOS = 32,
    USER_FIELD_SHELL = 64,
    USER_FIELD_UID = 128,
    USER_FIELD_ALL = 255,
};

// Whether a user of that type may be given the fields of the entry that the flags name. The error
// is that of the first rule that is broken, without a prefix; none is set when an argument is null.
bool validate_user(const usermgmt_ctx *ctx, const char *username, guint32 type,
                   const user_entry *new_user, guint32 fields, GError **error);
