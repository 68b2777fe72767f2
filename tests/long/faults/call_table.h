// tests/long/faults/call_table.h: the system calls that the trap knows.
#pragma once

#include <span>

enum class takes { PATH, FOLDER_AND_PATH, DESCRIPTOR };

struct known_call {
    long number;
    const char *name;
    takes first;
};

// Null for a call that the proofs do not know.
const known_call *find_call(long number);

// They touch no file. What is neither of these nor known makes the proofs fail, so that nothing
// that a newer kernel or library does to files goes unseen.
std::span<const long> passing_calls();
