// tests/fuzz/memory_files.h: the files below the relative folder "etc", which are only in memory:
// the calls of the code under test are taken by the linker (--wrap) and reach no disk.
#pragma once

#include <string>
#include <string_view>

// Makes the file anew.
void lay_memory_file(const char *path, std::string_view text);
// Nothing happens where there is none.
void remove_memory_file(const char *path);
bool has_memory_file(const char *path);
// "" for one that is not there.
std::string text_of_memory_file(const char *path);
