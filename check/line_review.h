// check/line_review.h: what a write makes of the lines of the account files.
#pragma once

#include "check/account_lines.h"
#include "check/findings.h"
#include "usermgmt/context.h"

// Compares the files, in the order of core_file_table, with what the loaded databases would write,
// and looks for what a write keeps though it is amiss: names and IDs that stand twice, members
// without an account, costly hashes.
void review_lines(const account_file (&files)[CORE_FILE_COUNT], const usermgmt_ctx *ctx,
                  findings *out);
