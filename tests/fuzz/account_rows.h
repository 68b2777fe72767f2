// tests/fuzz/account_rows.h: the lines of an account file that leave no doubt, and the records that
// must have come of them.
#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "usermgmt/core_file.h"

using fields = std::vector<std::string>;

// What is peculiar to one of the files.
struct row_rules {
    std::size_t columns;
    // Whether the fields, whose number and name are in order, leave no doubt.
    bool (*are_plain)(const fields &row);
    // The fields of a record; those that a plain line may not lack are not null.
    fields (*fields_of)(const void *record);
    const char *(*name_of)(const void *record);
};

// A number of 1 to 9 digits, the first of several not 0.
bool is_number(std::string_view text);
bool is_number_or_empty(std::string_view text);

std::string text_or_empty(const char *text);

// Reads the text through the row and compares: every text can be read, every plain line is a record
// with those fields, in their order, there are no more records than lines, and the name of each
// stands in the text.
void check_rows(const core_file &row, const row_rules &rules, std::string_view text);
