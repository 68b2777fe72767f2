// check/line_review.h: what a write makes of the lines of the account files.
#pragma once

#include <string>
#include <vector>

#include "check/account_lines.h"
#include "check/findings.h"
#include "usermgmt/context.h"

// The three files as they are, in the order of core_file_table; a missing shadow file has no lines.
struct account_files {
    std::vector<account_line> lines[CORE_FILE_COUNT];
    bool has_last_end[CORE_FILE_COUNT] = {true, true, true};
};

// Compares the files with what the loaded databases would write, and looks for what a write keeps
// though it is amiss: names and IDs that stand twice, members without an account, costly hashes.
void review_lines(const account_files &files, const usermgmt_ctx *ctx, findings *out);
