// platform/keyed_lines.h: files of lines, some of which are entries with a key, and how the entries
// are changed; internal to the platform libraries.
#pragma once

#include <cstddef>
#include <span>
#include <string_view>

#include "platform/atomic_file.h"

// What a key's entry should be: a line without its end, or nothing.
struct line_change {
    std::string_view key;
    std::string_view line;
};

// What stands at the beginning of a text that is not empty.
struct found_line {
    std::size_t length;    // with its end, where it has one
    bool is_entry;         // else the line is only kept
    std::string_view key;  // of an entry; valid until the next line is read
    bool takes_next;       // would go on in a line put behind it
};

struct line_format {
    found_line (*read)(std::string_view text, wiped_text *scratch);
    // For a file that does not exist yet.
    file_access (*access_of_new_file)(gid_t folder_group);
};

// Appends the text as it becomes. The first entry of a key is replaced in its place and the others
// of that key go; new ones come last, in the order of their changes. Of several changes of one key
// the last counts. Every other line stays byte for byte, and the last one gets an end; where it
// would take the first new line, a line with a blank comes between.
void keyed_lines_apply(std::string_view text, const line_format &format,
                       std::span<const line_change> changes, wiped_text *out_text);

// The same to a file, under its lock, in one replacement. A file that would stay as it is is not
// written, only its folder is synced. Where a replacement could not be synced, the old text is
// brought back.
file_result keyed_lines_update(const char *path, const line_format &format,
                               std::span<const line_change> changes);
