// tests/fuzz/account_rows.h: the lines of an account file that leave no doubt, and the records that
// must have come of them.
#pragma once

#include <string>
#include <string_view>

#include "tests/fuzz/fuzz.h"
#include "usermgmt/core_file.h"

// What is peculiar to one of the files.
struct row_rules {
    std::size_t columns;
    // Whether the fields, whose number and name are in order, leave no doubt.
    bool (*are_plain)(const views &row);
    // Adds the fields behind the name, as they stand in a line; what is missing is empty.
    void (*add_fields)(const void *record, std::string *out_line);
    const char *(*name_of)(const void *record);
};

// A number of 1 to 9 digits, the first of several not 0.
bool is_number(std::string_view text);
bool is_number_or_empty(std::string_view text);

// Adds a field and the colon before it.
void add_field(const char *text, std::string *out_line);
void add_field(unsigned long number, std::string *out_line);

// Reads the text through the row and compares: every text can be read, every plain line is a record
// with those fields, in their order, there are no more records than lines, and the name of each
// stands in the text.
void check_rows(const core_file &row, const row_rules &rules, std::string_view text);
