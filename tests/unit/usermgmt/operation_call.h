// tests/unit/usermgmt/operation_call.h: calls the function of usermgmt.h that an operation stands
// for.
#pragma once

#include "tests/unit/usermgmt/log_capture.h"
#include "tests/unit/usermgmt/random_operations.h"
#include "usermgmt/usermgmt.h"

// Of any kind but a reopening. What a modification logs through GLib, where databases are still to
// be written, is added to the warnings.
bool call_operation(usermgmt_ctx *ctx, const operation &what, lines *warnings, GError **error);
