// tests/long/faults/folder_state.h: the files of a folder as they lie there, to compare and to put
// back.
#pragma once

#include <map>
#include <string>

#include <sys/types.h>

struct lying_file {
    mode_t mode = 0;  // with the file's type
    uid_t owner = 0;
    gid_t group = 0;
    std::string text;  // of a link, where it leads
    bool operator==(const lying_file &other) const = default;
};

using folder_state = std::map<std::string, lying_file>;

folder_state look_at_folder(const std::string &folder);

// Makes the folder hold just that. Nothing that was there stays, so that every file is a new one.
void put_back_folder(const std::string &folder, const folder_state &state);

// A regular file of this process's own.
lying_file plain_file(const std::string &text, mode_t mode);

// "" where both are alike; else which lines of them are not, "-" before the first one's.
std::string line_difference(const std::string &first, const std::string &second);

// What differs between two states, "" for nothing. Temporary files are left out where told.
std::string state_difference(const folder_state &first, const folder_state &second,
                             bool with_temporaries);
bool is_temporary(const std::string &name);
