// tests/unit/platform/process_state.h: what a process holds, to compare before and after a call.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

// How many threads this process has.
std::size_t count_threads();

// Each open descriptor with what it is open on, in order.
std::vector<std::string> list_descriptors();

// Whether this process has a child, running or not yet waited for.
bool has_children();
