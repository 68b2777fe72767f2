// tests/fuzz/scratch.h: a folder of the process's own, in memory where there is some.
#pragma once

#include <string>
#include <string_view>

// Its path. It is made at the first call and removed when the process ends by itself; $TMPDIR says
// where, else it is in /dev/shm.
const std::string &scratch_path();

// A whole file, made where it is missing; "" for one that is not there.
void write_whole(const std::string &path, std::string_view text);
std::string read_whole(const std::string &path);
