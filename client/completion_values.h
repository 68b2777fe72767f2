// client/completion_values.h: what this machine has of users, groups, units and the like.
#pragma once

#include "client/options.h"

// What cannot be had is left out in silence.
char **completion_values(value_kind kind, const char *choices);
