// usermgmt/precondition.h: checks for programming errors, internal to usermgmt.
//
// GLib's g_return_val_if_fail and g_warn_if_fail would print the whole signature, since their
// G_STRFUNC is __PRETTY_FUNCTION__ in C++; these print the bare function name.
#pragma once

#include <cstddef>

#include <glib.h>

// A file's name without its ending, as a compile-time string.
template <std::size_t size>
struct file_stem {
    char text[size];

    consteval explicit file_stem(const char (&file)[size]) : text{} {
        for (std::size_t i = 0; i < size && file[i] != '.'; i++)
            text[i] = file[i];
    }
};

// Both log a critical record when the expression does not hold. The expression is part of the
// record, so it is written with NULL; that is why neither is built on the other, which would expand
// it first.

// Whether the expression holds.
#define holds(expression) \
    ((expression) || (g_return_if_fail_warning(G_LOG_DOMAIN, __func__, #expression), false))

// Returns the result, nothing for a void function, unless the expression holds.
#define require(expression, result)                                        \
    do {                                                                   \
        if (!(expression)) [[unlikely]] {                                  \
            g_return_if_fail_warning(G_LOG_DOMAIN, __func__, #expression); \
            return result;                                                 \
        }                                                                  \
    } while (false)

// Logs a warning and goes on.
#define warn_unless(expression)                                                             \
    do {                                                                                    \
        if (!(expression)) [[unlikely]] {                                                   \
            static constexpr file_stem checked_in(__FILE_NAME__);                           \
            g_warn_message(G_LOG_DOMAIN, checked_in.text, __LINE__, __func__, #expression); \
        }                                                                                   \
    } while (false)
