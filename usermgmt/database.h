// usermgmt/database.h: the two databases with their indexes, internal to usermgmt.
//
// Every record in entries is in the name index, and a group in the GID index; where two records
// share a name or a GID, the index holds the later one.
#pragma once

#include <glib.h>

#include "usermgmt/account_records.h"

struct usermgmt_ctx;

struct user_database {
    GHashTable *name_hash;  // name (owned copy) -> internal_user (borrowed)
    GPtrArray *entries;     // owns the internal_user records
    gboolean dirty;         // memory differs from the files
};

struct group_database {
    GHashTable *name_hash;  // name (owned copy) -> internal_group (borrowed)
    GHashTable *gid_hash;   // GID (owned 32-bit copy) -> internal_group (borrowed)
    GPtrArray *entries;     // owns the internal_group records
    gboolean dirty;
};

// Empty databases; clear accepts one that was never filled and leaves it zeroed.
user_database user_database_new(guint reserved);
group_database group_database_new(guint reserved);
void user_database_clear(user_database *user_db);
void group_database_clear(group_database *group_db);

// Null when there is none.
internal_user *user_database_find(const user_database *user_db, const char *name);
internal_group *group_database_find(const group_database *group_db, const char *name);
internal_group *group_database_find_gid(const group_database *group_db, guint32 gid);

// Take ownership of the record and mark the database as changed.
void user_database_add(user_database *user_db, internal_user *user);
void group_database_add(group_database *group_db, internal_group *group);

// The flag is set when the membership changed and otherwise left alone; it may be null.
void add_user_to_group(internal_group *group, const char *username, gboolean *changed);
void remove_user_from_group(internal_group *group, const char *username, gboolean *changed);

// Adds the user to each group of the list but the one named skip. USERMGMT_ERROR_GROUP at the first
// unknown group, with the groups before it changed.
gboolean add_user_to_groups(group_database *group_db, const char *username,
                            const char *const *groupnames, const char *skip, GError **error);

// Loading (database_load.cpp). Each replaces the database of the context only on success.
gboolean group_database_init(usermgmt_ctx *ctx, gboolean reread, GError **error);
gboolean user_database_init(usermgmt_ctx *ctx, GError **error);

// Logs the groups that list names without a passwd line, a line a group: a later account of such a
// name would silently be a member. To be asked while the parsed files are cached.
void warn_of_unknown_members(const usermgmt_ctx *ctx);

// The populating steps of the two: fill an empty database from the context's cached files.
gboolean init_populate_group_database(const usermgmt_ctx *ctx, group_database *group_db,
                                      GError **error);
gboolean init_populate_user_database(const usermgmt_ctx *ctx, user_database *user_db,
                                     GError **error);
