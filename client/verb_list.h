// client/verb_list.h: the help, and the table of commands as data.
#pragma once

#include "client/session.h"

// Of all commands, or of one noun where it is not null.
char *help_format(const char *noun);

// As command::run: the table as JSON, for what is checked against it.
bool run_verbs(const session &run, GError **error);
