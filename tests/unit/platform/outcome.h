// tests/unit/platform/outcome.h: how a child of a test tells the test what a call returned.
#pragma once

#include <string>

#include <glib.h>

// "1", or "0 DOMAIN CODE MESSAGE"; "0 no error" and "1 with an error" break the contract.
std::string describe_outcome(int result, const GError *error);

// Writes the text to standard output, where the test reads it.
void say(const std::string &text);
