// check/report.h: the findings, for people and for programs.
#pragma once

#include "check/findings.h"

// "FILE:LINE: WEIGHT: KIND: ACCOUNT: text", a line each; what is not printable is escaped.
void print_text(const findings &found);

// One object: "findings", a list of objects with the keys "weight", "kind", "file", "line" (absent
// for the whole file), "account" (absent where there is none) and "text", and "worst", the weight
// of the worst of them or null.
void print_json(const findings &found, bool is_pretty);
