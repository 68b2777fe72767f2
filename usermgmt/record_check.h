// usermgmt/record_check.h: whether a record survives being written and read, internal to usermgmt.
//
// The account files have no escapes: a name such as " root", "+x" or "a,b" comes back as another
// one, and a later write would then carry one account's hash on another account's line. So a record
// that is about to change is written into memory and read back first. A failure reads like the one
// of the write that it prevents: domain "corefile", COREFILE_ERROR_WRITE, behind "unable to sync
// core files, ".
#pragma once

#include <glib.h>

#include "usermgmt/account_records.h"

// The user as a line of the passwd file and, if shadowed, of the shadow file. The index is the one
// the record has or would get.
bool check_user_record(const internal_user *user, guint index, GError **error);

// The name as the member of a group, whose index is given.
bool check_member_name(const char *username, guint index, GError **error);
