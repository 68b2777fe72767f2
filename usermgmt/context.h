// usermgmt/context.h: the open user and group database, internal to usermgmt.
#pragma once

#include <glib.h>

#include "usermgmt/core_file.h"
#include "usermgmt/core_file_cache.h"
#include "usermgmt/database.h"

struct usermgmt_ctx {
    GMutex mutex;
    gboolean initialised;  // set as the last step of opening
    gboolean has_shadow;   // the shadow file existed at open
    guint32 open_flags;
    core_file_data cached[CORE_FILE_COUNT];
    user_database user_db;
    group_database group_db;
    core_file_stamp stamps[CORE_FILE_COUNT];
};

// Whether the context can be worked with. If not: USERMGMT_ERROR_ARGUMENT, "Failed to %s: Invalid
// or uninitialised context" with the action words.
bool context_is_usable(const usermgmt_ctx *ctx, const char *action, GError **error);

// USERMGMT_ERROR_ARGUMENT, "Failed to %s: Invalid or missing '%s' argument"; always false.
bool fail_missing_argument(const char *action, const char *argument, GError **error);

// The end of an operation that failed: names it and the account in front of the error, "Failed to
// %s
// '%s', ", and loads again what the file mask selects. Always false. The account's name must not be
// that of a record, which may be gone then.
bool fail_and_reload(usermgmt_ctx *ctx, const char *action, const char *name, guint32 file_mask,
                     GError **error);
