// usermgmt/secret.h: strings that are wiped before they are freed, internal to usermgmt.
#pragma once

#include <cstring>

#include <glib.h>

// Accepts null.
inline void wipe_free(char *secret) {
    if (secret != nullptr)
        explicit_bzero(secret, std::strlen(secret));
    g_free(secret);
}

typedef char *secret_string;
G_DEFINE_AUTO_CLEANUP_FREE_FUNC(secret_string, wipe_free, nullptr)
