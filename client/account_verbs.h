// client/account_verbs.h: the arguments of the digest commands, which are not the method's own.
#pragma once

#include <gio/gio.h>

#include "client/command_line.h"

// As command::build.
GVariant *build_digest_set(const command_line &line, GError **error);
GVariant *build_digest_import(const command_line &line, GError **error);
GVariant *build_digest_delete(const command_line &line, GError **error);
