// tests/long/faults/store_cases.h: the operations on the web server's passwords, the parameters and
// the boot block that are struck, the files that they start from, and those that they end in.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "tests/long/faults/folder_state.h"

// How an operation ended.
struct store_answer {
    int number = 0;          // 0 on success
    std::string error = {};  // the text that a caller of the service gets, if it is one's
    std::vector<std::string> log = {};  // "<GLib's level> <text>", and what went to syslog(3)
    std::string wrong = {};             // what it left in memory that it may not
};

enum class store_kind { DIGEST, PARAMETERS, ROOT_FLAG, BOOT_BLOCK };

struct store_case {
    std::string name;
    store_kind kind;
    std::string folder;  // that its files are in
    folder_state files;  // of the start
    folder_state after;  // of the end, written out; of the boot block, from this start alone
    std::string file;    // the one that is replaced whole; "" for the boot block
    std::function<store_answer()> run;
    bool folder_is_made = false;  // by the operation
};

// Below the folder, each library in one of its own; the boot block's and the service's parameters
// are in the private /etc. Lays out what they need beside their files.
std::vector<store_case> store_cases(const std::string &folder);

// The files that an operation of the case ends in, from a start of which a part may be done.
folder_state store_files_after(const store_case &one, const folder_state &start);

// The same as those for any folder, for one that need not be there.
folder_state look_at_store(const store_case &one);
void put_back_store(const store_case &one, const folder_state &files);

// What is wrong with the boot block, "" for nothing: the files have to be these, byte for byte, and
// the library has to read from them what they say.
std::string judge_boot_block(const folder_state &expected);
// Writes another parameter, which has to work, and loses none of the others.
std::string write_on_boot_block();
