// tests/long/faults/boot_cases.h: the service's writes of the boot block that are struck.
#pragma once

#include <vector>

#include "tests/long/faults/store_cases.h"

// Lays out the description of the boot block, in the private /etc.
void add_boot_cases(std::vector<store_case> *cases);
