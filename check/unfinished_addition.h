// check/unfinished_addition.h: users of whom a crash left no more than the line in passwd.
#pragma once

#include "check/account_lines.h"

// Whether the addition of this user, who has no shadow line, was cut off after the first of the
// three files, and so was answered to nobody. It shows by the line, and by a temporary file, of
// which such a crash leaves some that stay until the next change of a user.
bool is_unfinished_addition(const account_file (&files)[CORE_FILE_COUNT], const account_line &user);
