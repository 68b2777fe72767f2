// client/unit_name.cpp: the names of units, as the service takes them.
#include "client/unit_name.h"

#include <cstring>

#include <glib.h>

static constexpr gsize LONGEST_UNIT = 64;

// The service's own list is where this program cannot see it; a test holds the two together.
static constexpr const char *UNIT_CHARACTERS = "abcdefghijklmnopqrstuvwxyz0123456789-@";

char *unit_without_suffix(const char *word, const char *suffix) {
    if (g_str_has_suffix(word, suffix))
        return g_strndup(word, std::strlen(word) - std::strlen(suffix));
    return g_strdup(word);
}

bool is_unit_name(const char *unit) {
    const gsize length = std::strlen(unit);

    return length > 0 && length <= LONGEST_UNIT && std::strspn(unit, UNIT_CHARACTERS) == length;
}
