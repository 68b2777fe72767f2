// client/completion.h: what may stand next on a command line, for the completion of the shell.
#pragma once

#include "client/session.h"

// As command::run: prints a candidate a line for the last of the words behind "complete --", or
// ":files" where it is a path, of which nothing or its root is typed.
bool run_complete(const session &run, GError **error);

// The candidates that do not depend on the machine are tested by themselves.
char **completion_candidates(const char *const *words);
