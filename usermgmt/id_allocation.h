// usermgmt/id_allocation.h: choosing the ID of a new account, internal to usermgmt.
//
// An ID above the highest in use (below the lowest, where a range descends) is given out, so that
// the ID of a deleted account is not handed out again while a later one exists.
#pragma once

#include <glib.h>

#include "usermgmt/account_types.h"

struct usermgmt_ctx;

// The lowest and highest ID of the row's type inside the row's range, and how many there are. The
// entries are internal_user or internal_group records, as the row's range type says. Both found
// values must be 0 on entry and stay 0 when nothing is found; the count, whose slot may be null, is
// added to. A row or a value that is not as it must be leaves all three alone.
void find_min_max_uid_gid(const id_range *range, const GPtrArray *entries, guint32 *min_found,
                          guint32 *max_found, guint *count);

// False, without an error, when the range is used up.
bool find_next_uid_gid_in_range(const id_range *range, guint32 min_found, guint32 max_found,
                                guint32 *out_next);

// USERMGMT_ERROR_ALLOCATION_TYPE or USERMGMT_ERROR_NO_UID; no error for a context that is not open.
bool find_next_uid(const usermgmt_ctx *ctx, guint32 type, guint32 *out_uid, GError **error);

// Always of the "dynamic system" range. USERMGMT_ERROR_NO_GID; no error for a context that is not
// open.
bool find_next_gid(const usermgmt_ctx *ctx, guint32 *out_gid, GError **error);

// Whether no user has that UID; 0 is never free. USERMGMT_ERROR_ARGUMENT.
bool set_uid_if_free(const usermgmt_ctx *ctx, guint32 uid, GError **error);
