// tests/unit/usermgmt/account_lines.h: what stands in the account files, read and written without
// the code under test.
#pragma once

#include <set>
#include <string>
#include <vector>

#include <glib.h>

#include "usermgmt/core_file.h"

struct passwd_line {
    std::string name;
    std::string password;
    guint32 uid;
    guint32 gid;
    std::string gecos;
    std::string home;
    std::string shell;
    bool operator==(const passwd_line &other) const = default;
};

struct shadow_line {
    std::string name;
    std::string password;
    gint64 days;  // of the last change; -1: an empty field
    bool operator==(const shadow_line &other) const = default;
};

struct group_line {
    std::string name;
    std::string password;
    guint32 gid;
    std::set<std::string> members;
    bool operator==(const group_line &other) const = default;
};

// The texts of the files in the order of the table, and what the C library reads in them.
struct account_lines {
    std::string texts[CORE_FILE_COUNT];
    bool has_shadow = true;  // the file is there
    std::vector<passwd_line> passwd;
    std::vector<shadow_line> shadow;
    std::vector<group_line> group;
};

// Writes one file, given by its row, for the first time in a test: none is left of an older one.
void create_account_file(int row, const std::string &text, unsigned mode);

// Text and lines of all files.
account_lines read_account_files();
// The text of one, "" when it is not there, with the members of its groups sorted.
std::string read_account_text(int row);
// What the C library reads in one file, put in place of what was read before.
void read_account_lines(int row, account_lines *read);

// The files as these lines have to be written, the ageing fields of the shadow file fixed and the
// members of a group sorted.
std::string as_text(const std::vector<passwd_line> &all);
std::string as_text(const std::vector<shadow_line> &all);
std::string as_text(const std::vector<group_line> &all);
