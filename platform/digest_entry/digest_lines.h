// platform/digest_entry/digest_lines.h: the lines of a digest file as Apache reads them, and those
// of the lists; internal.
#pragma once

#include <cstddef>
#include <string_view>

#include <glib.h>

#include "platform/keyed_lines.h"

inline constexpr std::string_view DIGEST_REALM = "PRIVANE";
inline constexpr std::size_t DIGEST_HASH_LENGTH = 32;

bool digest_is_user(std::string_view user);

// The line at the beginning of a digest file. An entry is one for the realm above; its key is the
// user.
found_line digest_read_line(std::string_view text, wiped_text *scratch);

// Appends a line_change for each line of a list, into which they point. False where a line is not
// valid.
bool digest_read_set_list(std::string_view list, GArray *out_changes);
bool digest_read_delete_list(std::string_view list, GArray *out_changes);
