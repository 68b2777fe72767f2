// tests/long/faults/store_oracle.h: what an operation on the web server's passwords, the parameters
// or the boot block has to answer, to log and to leave when one of its calls fails.
#pragma once

#include "tests/long/faults/call_errors.h"
#include "tests/long/faults/call_trap.h"
#include "tests/long/faults/store_cases.h"

// Which of the files before and after is there. It never may be either.
enum class store_bytes { OLD, NEW, HALF };

struct store_outcome {
    bool unforeseen = false;  // nobody thought of that call
    store_answer answer = {};
    store_bytes bytes = store_bytes::NEW;
};

// The call of that index, of a trace without a fault, fails; paths below the folder are in the
// trace without it.
store_outcome outcome_of_store(const store_case &one, const std::string &folder,
                               const call_trace &trace, int index, const call_fault &fault);

// Whether the folder of the file was synced, as it has to be before success is told. The boot
// block's copies are no new files.
bool is_folder_synced(const store_case &one, const std::string &folder, const call_trace &trace);

// Of an operation that nothing happens to.
store_answer answer_of_success(const store_case &one);
