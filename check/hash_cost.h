// check/hash_cost.h: how long a password's hash keeps whoever checks it.
#pragma once

#include <string_view>

#include <glib.h>

enum class hash_work {
    NOTHING,  // no hash at all, or one of a method whose cost is fixed and small
    ROUNDS,   // of the method's own kind
    MEMORY,   // bytes that are filled and read
    UNKNOWN,  // a method that crypt(5) does not name
};

struct hash_cost {
    hash_work work;
    guint64 amount;  // as the hash asks for; 0 where it is not well formed and nobody can log in
    bool is_absurd;  // more than a login check may cost, in which the service serves nobody else
};

hash_cost find_hash_cost(std::string_view hash);

// What is amiss with it, as a sentence that quotes no more than the name of its method; null where
// nothing is.
char *describe_hash(std::string_view hash);
