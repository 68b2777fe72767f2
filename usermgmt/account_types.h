// usermgmt/account_types.h: the ID ranges and the type of an ID, internal to usermgmt.
#pragma once

#include <span>

#include <glib.h>

enum id_range_type : guint32 {
    RANGE_TYPE_NONE = 0,
    RANGE_TYPE_USER = 1,
    RANGE_TYPE_GROUP = 2,
};

// Both limits are inclusive.
struct id_range {
    guint32 range_type;
    guint32 type;
    const char *name;
    gboolean descending;  // new IDs are taken downward from max instead of upward from min
    guint32 min;
    guint32 max;
};

// Row n describes type n; row 0 ("none") matches no ID.
extern const std::span<const id_range> user_range_table;
extern const std::span<const id_range> group_range_table;

// The type of an ID; 0 when it lies in no range.
guint32 user_type_of_uid(guint32 uid);
guint32 group_type_of_gid(guint32 gid);
