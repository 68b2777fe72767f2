// check/hash_cost.h: how long a password's hash keeps whoever checks it.
#pragma once

#include <string_view>

#include <glib.h>

// The rounds that a hash of crypt(5) asks for, of the methods that name them: "$5$" and "$6$" with
// "rounds=", and the power of two of "$2b$" and its kin. 0 for all others.
guint64 hash_rounds(std::string_view hash);

// More than a login check may cost: a million rounds of SHA-512 take a slow camera some seconds, in
// which the service serves nobody else.
bool is_absurd_hash(std::string_view hash);
