/* platform/authz/authz.h: may the owner of a unique bus name perform an action? */
#pragma once

#include <glib.h>

#ifdef __cplusplus
extern "C" {
#endif

/* The codes of this library's errors, in the domain "authz". */
enum authz_error {
    AUTHZ_ERROR_REFUSED = 1, /* the caller may not, or only after giving a password */
    AUTHZ_ERROR_FAILED = 2,  /* no decision: the action is not declared, or the policy is broken */
    AUTHZ_ERROR_UNREACHABLE = 3, /* the bus or the authorization service cannot be reached */
    AUTHZ_ERROR_TIMED_OUT = 4,   /* no answer: 10 s at start, the build's authz_deadline_ms later */
    AUTHZ_ERROR_INVALID = 5      /* no unique bus name, or not the form of an action ID */
};

#pragma GCC visibility push(default)

/*
 * Non-zero when the authorization service can be reached; on 0 *error is always set. Leaves no
 * connection and no thread behind, so that the process may still fork; it looks from a child of
 * its own, and is meant for a process that has one thread. Where a file decides there is no
 * service, and it always succeeds: whether the file is any good is found by each check.
 */
int authz_init(GError **error);

/* Non-zero: allowed. On 0 *error is always set. The first check connects, and starts threads. */
int authz_check(const char *sender, const char *action_id, GError **error);

/* Lets go of what the checks hold, if anything; a later check connects anew. */
void authz_release(void);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif
