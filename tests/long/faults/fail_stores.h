// tests/long/faults/fail_stores.h: operations of the libraries that keep files, whose file-system
// calls fail.
#pragma once

#include <string>

#include "tests/long/faults/proof.h"

// Every call of every operation with every error, below a folder.
void fail_every_store_call(proof_report *report, const std::string &folder);
