// usermgmt/user_entry.h: from the database's user to the public one, internal to usermgmt.
#pragma once

#include <glib.h>

#include "usermgmt/account_records.h"
#include "usermgmt/usermgmt.h"

struct group_database;

// Stores in *results, which must be null, the names of all groups that list the user, but the
// primary one, in database order.
bool build_secondary_group_list(const group_database *group_db, const char *username,
                                const char *primary_group, char ***results);

// Fills a zeroed entry with copies. USERMGMT_ERROR_INTERNAL when the primary GID has no group.
bool user_entry_from_internal(const usermgmt_ctx *ctx, const internal_user *intern,
                              user_entry *entry, GError **error);
