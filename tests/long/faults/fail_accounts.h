// tests/long/faults/fail_accounts.h: account operations whose file-system calls fail.
#pragma once

#include "tests/long/faults/proof.h"

// Every call of every operation with every error, of opening the database, and of the reload behind
// a failed write.
void fail_every_account_call(proof_report *report);

// The whole disk bad from every call on that writes, over the next change, then mended.
void fail_accounts_on_bad_disk(proof_report *report);

// Calls and bad disks by chance in operations by chance, until the report counts so many faults.
void fail_random_account_calls(proof_report *report, guint64 amount, guint64 seed);
