// tests/long/faults/store_cases.h: the operations on the web server's passwords, the parameters and
// the boot block that are struck, and the files that they start from.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "tests/long/faults/folder_state.h"

struct store_case {
    std::string name;
    std::string folder;           // that its files are in
    folder_state files;           // of the start
    std::string file;             // the one that is replaced whole; "" for the boot block
    std::function<int()> run;     // the library's answer, 0 on success
    bool folder_is_made = false;  // by the operation
};

// Below the folder, each library in one of its own; the boot block's is in the private /etc. Lays
// out what they need beside their files.
std::vector<store_case> store_cases(const std::string &folder);

// The same as above, for a folder that need not be there.
folder_state look_at_store(const store_case &one);
void put_back_store(const store_case &one, const folder_state &files);

// The parameters of the boot block that the cases know: "a=old b=kept c=none", "blank", or a
// failure.
std::string read_boot_block();
// "" for a boot block that may be the one before or after a write, whatever of it was done.
std::string judge_boot_block(const std::string &before, const std::string &after);
// Writes another parameter, which has to work, and loses none of the others.
std::string write_on_boot_block();
