// check/account_lines.h: the lines of the account files, as they are and as a write makes them.
#pragma once

#include <string_view>

#include <glib.h>

#include "usermgmt/account_records.h"
#include "usermgmt/core_file.h"

struct account_line {
    unsigned number;  // from 1
    char *text;       // without its end; it may hold NUL bytes
    gsize length;
    // What the C library's reader, which the service reads with, takes it for.
    bool is_entry;
    char *name;             // of an entry, else null; a blank before it is not part of it
    guint32 id;             // of a user or a group
    guint32 primary_group;  // of a user
    GPtrArray *members;     // of a group, char * in alphabetical order, else null

    std::string_view field(std::size_t index) const;  // from 0; empty where there is none
    std::size_t field_count() const;
};

void account_line_clear(account_line *line);
G_DEFINE_AUTO_CLEANUP_CLEAR_FUNC(account_line, account_line_clear)

// A file as it is.
struct account_file {
    GPtrArray *lines;  // account_line *; null where the file was not read, which means none
    bool lacks_last_end;
};

void account_file_clear(account_file *file);

// The lines of a file, of which there may be none.
inline records<const account_line> lines_of(const account_file &file) {
    static GPtrArray none = {};
    return records<const account_line>(file.lines != nullptr ? file.lines : &none);
}

// False with the error set where it cannot be read.
bool read_account_file(const core_file &file, account_file *out_file, GError **error);

// What a write makes of a record: a line, or nothing, as text and length. False with errno set
// where the record cannot be written, and so the file cannot.
bool write_account_line(const core_file &file, const void *record, account_line *out_line);
