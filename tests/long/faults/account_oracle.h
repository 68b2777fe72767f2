// tests/long/faults/account_oracle.h: what an account operation has to answer and to log when one
// of its calls fails, worked out from the calls that were made.
#pragma once

#include <string>
#include <vector>

#include "tests/long/faults/call_errors.h"
#include "tests/long/faults/call_trap.h"
#include "tests/unit/usermgmt/random_operations.h"

struct account_outcome {
    std::string error;       // "" where the failure does not matter; "*" stands for a number
    std::string other;       // where a record may be written at once or later, the other text
    int replaced = 0;        // so many of the files, in their order, are replaced
    bool is_written = true;  // the failure is that of the write
    std::vector<std::string> log;
    std::vector<std::string> next_log;  // of the operation behind it
    // What a reload could not read.
    bool groups_unread = false;
    bool users_unread = false;
    std::string unforeseen;  // a call that nobody thought of
};

// The call of that index failed. The calls behind a failed write are those of the reload.
account_outcome outcome_of(const operation &what, const call_trace &trace, int index,
                           const call_fault &fault);

// Likewise, from that call on everything fails that writes on the disk.
account_outcome outcome_on_bad_disk(const operation &what, const call_trace &trace, int index,
                                    int error);

// Of an opening of the database: its error and its log.
account_outcome outcome_of_open(const call_trace &trace, int index, const call_fault &fault);

// Adds what the calls of a reload failed for, those behind that of the index.
void add_reload(const call_trace &trace, int index, account_outcome *outcome);

// Whether a text is the expected one.
bool is_expected(const std::string &expected, const std::string &text);
