// client/arguments.h: from the words and options of a command to the arguments of its method.
#pragma once

#include <gio/gio.h>

#include "client/command_line.h"
#include "client/verbs.h"

// Asks for a password where one is taken. Null with an error.
GVariant *arguments_build(const command &row, const command_line &line, GError **error);

// The password that a command needs, asked for or read from --password-fd; null with an error. The
// message that carries it is GDBus's and cannot be wiped.
char *arguments_password(const command_line &line, bool is_new, GError **error);
