// tests/long/faults/kill_stores.h: operations of the libraries that keep files, ended at any call
// with the process.
#pragma once

#include <string>

#include "tests/long/faults/proof.h"

// Every point of every operation, from every start, below a folder.
void kill_every_store_operation(proof_report *report, const std::string &folder);
