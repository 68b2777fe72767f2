// check/repeated_lines.h: accounts whose name or ID an earlier one has.
#pragma once

#include "check/account_lines.h"
#include "check/findings.h"

void review_repeated_lines(const account_file (&files)[CORE_FILE_COUNT], findings *out);
