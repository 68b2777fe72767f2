// check/account_lines.h: the lines of the account files, as they are and as a write makes them.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include <glib.h>

#include "usermgmt/core_file.h"

struct account_line {
    unsigned number;   // from 1
    std::string text;  // without its end
    // What the C library's reader, which the service reads with, takes it for.
    bool is_entry = false;
    std::string name = {};                  // of an entry; a blank before it is not part of it
    guint32 id = 0;                         // of a user or a group
    guint32 primary_group = 0;              // of a user
    std::vector<std::string> members = {};  // of a group, in alphabetical order

    std::string_view field(std::size_t index) const;  // from 0; empty where there is none
    std::size_t field_count() const;
};

// A file as it is. False with the error set where it cannot be read.
bool read_account_lines(const core_file &file, std::vector<account_line> *out_lines,
                        bool *out_has_last_end, GError **error);

// What a write makes of a record: a line, or none. False with errno set where the record cannot be
// written, and so the file cannot.
bool write_account_line(const core_file &file, const void *record, std::string *out_text);
