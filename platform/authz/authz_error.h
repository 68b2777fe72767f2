// platform/authz/authz_error.h: how the libraries' own sources set their errors; internal.
#pragma once

#include <glib.h>

#include "platform/authz/authz.h"

// The domain is never registered with GDBus: over the bus a caller sees its name and the code.
#define AUTHZ_ERROR_DOMAIN g_quark_from_string("authz")
