// client/password_prompt.h: passwords from the terminal or from a descriptor, and their wiping.
#pragma once

#include <cstddef>
#include <cstring>

#include <glib.h>

// Accepts null.
inline void wipe_free(char *secret) {
    if (secret != nullptr)
        explicit_bzero(secret, std::strlen(secret));
    g_free(secret);
}

typedef char *wiped_string;
G_DEFINE_AUTO_CLEANUP_FREE_FUNC(wiped_string, wipe_free, nullptr)

// What is read of a secret before it is known to be a string: a NUL byte in it ends no wiping.
template <std::size_t size>
struct wiped_bytes {
    char bytes[size] = {};

    wiped_bytes() = default;
    ~wiped_bytes() { explicit_bzero(bytes, sizeof bytes); }
    wiped_bytes(const wiped_bytes &) = delete;
    wiped_bytes &operator=(const wiped_bytes &) = delete;
};

// Null with an error, as for a new password that is empty, or for a terminal, which would show what
// is typed. The first line of what the descriptor has, without its end.
char *password_read(int fd, bool is_new, GError **error);

// Null with an error. Asks on the terminal of the process, whatever its standard streams are, and
// shows nothing of what is typed; a new password is asked for twice.
char *password_ask(const char *prompt, bool is_new, GError **error);
