// check/report.h: the findings, for people and for programs.
#pragma once

#include "check/findings.h"
#include "output/json_mode.h"

// Without JSON "FILE:LINE: WEIGHT: KIND: ACCOUNT: text", a line each; what is not printable is
// escaped. In JSON one object: "findings", a list of objects with the keys "weight", "kind",
// "file", "line" (absent for the whole file), "account" (absent where there is none) and "text",
// and "worst", the weight of the worst of them or null. The text ends with a line end or is empty.
char *report_format(const findings &found, json_mode mode);
