// tests/long/faults/judgement.h: whether files that are replaced whole are what they may be, by
// rules that hold for every library that replaces them. Each function answers what is wrong, ""
// for nothing.
#pragma once

#include <string>
#include <vector>

#include "tests/long/faults/call_trap.h"
#include "tests/long/faults/folder_state.h"

// What was written is synced before it is renamed, and before success is told; and so is the folder
// behind each rename. All temporary files are there and synced before the first is renamed.
std::string judge_order_of_calls(const call_trace &trace);

// A stopped replacement: the calls before the given one were made.
struct stopped_replacement {
    const folder_state *before;
    const folder_state *after;       // of the same replacement when it is not stopped
    const call_trace *trace;         // likewise
    int calls;                       // so many of them were made
    std::vector<std::string> order;  // the names of the files in the order of their replacement
    std::vector<std::string> may_appear = {};  // other names, of a lock
};

// Each file is the old or the new one byte for byte, and in its order; has its mode and owner; what
// else lies there is a temporary file, which nobody else could ever read before its time.
std::string judge_files(const stopped_replacement &stopped, const folder_state &now);

// Root has one line, the one of before, and the hash of before or after.
std::string judge_root(const folder_state &before, const folder_state &after,
                       const folder_state &now);
