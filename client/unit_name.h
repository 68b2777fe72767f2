// client/unit_name.h: the names of units, as the service takes them.
#pragma once

// Without the suffix, ".service" or ".target", if the word has it.
char *unit_without_suffix(const char *word, const char *suffix);

// Whether the service acts on units of this name, which has no suffix.
bool is_unit_name(const char *unit);
