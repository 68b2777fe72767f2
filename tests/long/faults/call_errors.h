// tests/long/faults/call_errors.h: how each file-system call can fail.
#pragma once

#include <string>
#include <vector>

#include "tests/long/faults/call_trap.h"

struct call_fault {
    int error;              // 0: a short write
    int error_after_short;  // of the next write, 0: none
    bool for_ever;
};

// A call that nobody has listed the errors of makes a proof fail.
bool has_errors(const trapped_call &call);

// All that apply to the call. An interruption ends some time, so it comes once.
std::vector<call_fault> faults_of(const trapped_call &call);

// One of these, as a plan chooses it: for trap_plan::choose.
bool choose_fault(const trapped_call &call, unsigned choice, trap_plan *plan);

std::string shown(const call_fault &fault);
