// benchmarks/allow_all/allow_all.cpp: a libauthz.so.1 that allows everything at once, to see the
// rest of a call.
#include "platform/authz/authz.h"

#pragma GCC visibility push(default)

int authz_init(GError **) {
    return 1;
}

int authz_check(const char *, const char *, GError **) {
    return 1;
}

void authz_release() {}

#pragma GCC visibility pop
