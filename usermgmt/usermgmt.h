// usermgmt/usermgmt.h: the public interface of the user and group database.
//
// A process holds at most one context. It reads /etc/passwd, /etc/shadow and /etc/group at open and
// is from then on their only writer: edits of other programs are seen after the next open.
// Nothing here is thread-safe beyond the lock that keeps a second context out.
#pragma once

#include <glib.h>

// Errors of this unit: domain "usermgmt". The numbers reach bus callers and never change.
enum usermgmt_error {
    USERMGMT_ERROR_ALREADY_OPEN = 1,     // another context is open
    USERMGMT_ERROR_DUPLICATE_GROUP = 2,  // a group line stands twice
    USERMGMT_ERROR_USER = 3,             // unknown user, or unusable name of one
    USERMGMT_ERROR_GROUP = 4,            // unknown group, or unusable name of one
    USERMGMT_ERROR_USER_TYPE = 5,        // the user's type does not allow it
    USERMGMT_ERROR_USER_EXISTS = 6,      // the user exists
    USERMGMT_ERROR_GROUP_EXISTS = 7,     // the group exists, or none to delete
    USERMGMT_ERROR_PRIMARY_GROUP = 8,    // it is the primary group of a member
    USERMGMT_ERROR_ALLOCATION_TYPE = 9,  // no user of that type can be added
    USERMGMT_ERROR_PASSWORD = 10,        // no password, or too long a one
    USERMGMT_ERROR_DELETE_TYPE = 11,     // an account of that type must stay
    USERMGMT_ERROR_SHELL = 12,           // web users have no shell
    USERMGMT_ERROR_NO_UID = 13,          // no UID is left, or too many users
    USERMGMT_ERROR_NO_GID = 14,          // no GID is left
    USERMGMT_ERROR_INTERNAL = 16,        // the database is at odds with itself, or hashing failed
    USERMGMT_ERROR_ARGUMENT = 17,        // unusable argument, or a UID that is taken
    USERMGMT_ERROR_GROUP_MODIFICATION = 18,  // groups cannot be modified
};

#define USERMGMT_ERROR usermgmt_error_quark()
GQuark usermgmt_error_quark();

// Bits of the open flags.
enum usermgmt_open_flags : guint32 {
    USERMGMT_OPEN_TRYLOCK = 2,   // fail instead of waiting while another context is open
    USERMGMT_OPEN_NO_CACHE = 4,  // drop the parsed files after loading; a reload reads them again
    USERMGMT_OPEN_STRICT = 8,    // refuse to open where a line would be skipped
};

// A type follows from the account's ID alone.
enum user_type : guint32 {
    USER_TYPE_NONE = 0,
    USER_TYPE_ROOT = 1,
    USER_TYPE_PERMANENT = 2,
    USER_TYPE_DYNAMIC_SYSTEM = 3,
    USER_TYPE_ORNET = 4,
    USER_TYPE_NOBODY = 5,
    USER_TYPE_INVALID = 6,  // one past the last type: the answer to an unusable question
};

enum group_type : guint32 {
    GROUP_TYPE_NONE = 0,
    GROUP_TYPE_ROOT = 1,
    GROUP_TYPE_PERMANENT_SYSTEM = 2,
    GROUP_TYPE_DYNAMIC_SYSTEM = 3,
    GROUP_TYPE_NOBODY = 4,
    GROUP_TYPE_PERMANENT_SYSTEM_NVR = 5,
    GROUP_TYPE_INVALID = 6,
};

// The display name of a type; "invalid" for any number that is none. Static strings.
const char *user_type_name(guint32 type);
const char *group_type_name(guint32 type);

// A user as callers see it. Every string may be absent (null). The caller owns the record's
// storage, and its contents after a call that filled it.
struct user_entry {
    guint32 type;
    char *name;
    char *password;  // a crypt hash when filled from the database, clear text when handed in
    char *group;     // name of the primary group
    char **groups;   // names of the secondary groups
    char *gecos;
    char *shell;
    gint32 uid;  // -1: none
};

// Stores copies of the strings. The entry must be zeroed first: what it holds is overwritten, not
// freed. The shell comes before the comment here, unlike in the record.
void usermgmt_populate_user_entry(user_entry *entry, guint32 type, const char *name,
                                  const char *password, const char *group,
                                  const char *const *groups, const char *shell, const char *gecos,
                                  gint32 uid);

// Frees the contents, the password wiped first, and sets the uid to -1. Accepts null.
void usermgmt_free_user_entry(user_entry *entry);

G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(user_entry, usermgmt_free_user_entry)

struct usermgmt_ctx;

// Loads the account files. Null on failure, with an error of the domains "usermgmt" or "corefile"
// behind "Could not initialise user management: ". Waits while another context is open, unless
// told to try.
usermgmt_ctx *usermgmt_open(guint32 flags, GError **error);

// Frees the context. FALSE, and nothing done, for a context that is absent or not open.
gboolean usermgmt_close(usermgmt_ctx *ctx);

// Drops changes in memory by loading the databases of the masked files (CORE_FILE_… bits of
// core_file_cache.h) again: from the files as they were read at open, or with
// USERMGMT_OPEN_NO_CACHE from the live files. Failures go to syslog.
void usermgmt_reload(usermgmt_ctx *ctx, guint32 file_mask);

// Writes the files of every database that changed. On failure the error begins with
// "unable to sync core files, " and the databases stay marked as changed.
gboolean usermgmt_sync(usermgmt_ctx *ctx, GError **error);

// Queries. They change nothing, and on failure touch no output argument.

// Fills a zeroed entry. USERMGMT_ERROR_USER when the user is unknown, USERMGMT_ERROR_INTERNAL when
// its primary GID has no group.
gboolean usermgmt_get_user(const usermgmt_ctx *ctx, const char *username, user_entry *result,
                           GError **error);

// FALSE also for an unusable context or an absent name.
gboolean usermgmt_user_exists(const usermgmt_ctx *ctx, const char *username);
gboolean usermgmt_group_exists(const usermgmt_ctx *ctx, const char *groupname);

// Whether all groups of the list exist; if not, the index of the first that is missing is stored
// where a slot is given. FALSE with the slot untouched for an unusable context or an absent list.
gboolean usermgmt_groups_exist(const usermgmt_ctx *ctx, const char *const *groupnames,
                               guint *out_missing);

// Either slot may be null. The member list, in no particular order, is the caller's (g_strfreev).
// USERMGMT_ERROR_GROUP when the group is unknown.
gboolean usermgmt_get_group(const usermgmt_ctx *ctx, const char *groupname, guint32 *out_gid,
                            char ***out_members, GError **error);

// Either slot may be null, but not both. Names are freed with g_strfreev; entries are a list of
// user_entry, each freed with usermgmt_free_user_entry and then g_free. Both in database order.
gboolean usermgmt_get_all_users(const usermgmt_ctx *ctx, char ***out_names, GList **out_entries,
                                GError **error);

// Names in database order, freed with g_strfreev.
gboolean usermgmt_get_all_groups(const usermgmt_ctx *ctx, char ***out_groupnames, GError **error);

// The type, …_NONE for an unknown name, …_INVALID for an unusable context or an absent name.
guint32 usermgmt_get_user_type(const usermgmt_ctx *ctx, const char *username);
guint32 usermgmt_get_group_type(const usermgmt_ctx *ctx, const char *groupname);

// Changes. Each writes the files before it returns TRUE. On failure the error names the operation
// and the account ("Failed to add user 'bob', ..."), and what changed in memory is dropped as far
// as the operation's own rules say. A failed write leaves an error of the domain "corefile". A
// context whose inner parts are missing is a programming error: a critical is logged, and there may
// be no error.

// The entry is only read; its password is clear text, its type decides what it may hold, and a uid
// of -1 lets the database choose.
gboolean usermgmt_add_user(usermgmt_ctx *ctx, const char *username, const user_entry *new_user,
                           GError **error);

// Changes what the entry holds; an absent field stays as it is, an empty list or text does not.
// Name, type and UID cannot change.
gboolean usermgmt_modify_user(usermgmt_ctx *ctx, const char *username, const user_entry *mod_user,
                              GError **error);

// Of the types "dynamic system" and "ornet" only. Removes the user from every group.
gboolean usermgmt_delete_user(usermgmt_ctx *ctx, const char *username, GError **error);

// Of the types "permanent" and "dynamic system" only. Nothing is written when there is no password.
gboolean usermgmt_disable_password(usermgmt_ctx *ctx, const char *username, GError **error);

// A group of type "dynamic system". The list of members may be null.
gboolean usermgmt_add_group(usermgmt_ctx *ctx, const char *groupname, const char *const *usernames,
                            GError **error);

// Of the types "dynamic system" and "permanent system nvr" only, and no listed member's primary
// group.
gboolean usermgmt_delete_group(usermgmt_ctx *ctx, const char *groupname, GError **error);

// Always fails: USERMGMT_ERROR_GROUP_MODIFICATION. Membership changes through users.
gboolean usermgmt_modify_group(usermgmt_ctx *ctx, const char *groupname, const void *unused_first,
                               const void *unused_second, GError **error);
