// platform/authz/policy/policy_file.h: the policy file's syntax, and what a policy grants;
// internal.
#pragma once

#include <string_view>

#include <glib.h>

// A list that the file does not give is null; none is empty.
struct policy_role {
    char *name;
    char **users;
    char **groups;
    char **actions;  // action IDs, and patterns that end in ".*"
};

struct policy {
    GPtrArray *roles;  // of policy_role
};

// The IDs that the accounts of the policy have. A name that is no account's is not in its table.
struct policy_ids {
    GHashTable *users;  // by name; GUINT_TO_POINTER of the ID
    GHashTable *groups;
};

// Who asks. The groups are all of it, the primary one included.
struct policy_caller {
    guint32 uid;
    const guint32 *gids;
    gsize gid_count;
};

// Null with *error set where the text is no policy beyond doubt; the message begins with the number
// of the line that is at fault.
policy *policy_parse(std::string_view text, GError **error);

void policy_free(policy *rules);

G_DEFINE_AUTOPTR_CLEANUP_FUNC(policy, policy_free)

// Whether a role of the caller grants the action.
bool policy_allows(const policy *rules, const policy_ids &ids, const policy_caller &caller,
                   const char *action_id);
