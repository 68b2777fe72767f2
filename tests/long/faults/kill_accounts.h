// tests/long/faults/kill_accounts.h: account operations that end at any call with the process.
#pragma once

#include "tests/long/faults/proof.h"

// Every point of every operation, from every start.
void kill_every_account_operation(proof_report *report);

// Points by chance in operations by chance, until the report counts so many.
void kill_random_account_operations(proof_report *report, guint64 amount, guint64 seed);
