// platform/authz/policy/policy_store.h: the policy as its file and the account files are now;
// internal.
#pragma once

#include <sys/types.h>

#include <glib.h>

#include "platform/authz/policy/policy_file.h"

// Where all of it stands, and whose the policy file has to be.
struct policy_places {
    const char *policy;
    const char *passwd;
    const char *group;
    uid_t owner;
};

// What was read, and the files as they were then.
struct policy_store;

policy_store *policy_store_new(const policy_places &places);
void policy_store_free(policy_store *store);

// Reads again what has changed since. False with *error set, and without a policy, where the file
// is not there, not the owner's alone to write, or no policy; the message names the file.
bool policy_store_refresh(policy_store *store, GError **error);

// By what the last refresh, which must have succeeded, found.
bool policy_store_allows(const policy_store *store, const policy_caller &caller,
                         const char *action_id);
