// tests/fuzz/memory_folder.h: a folder whose files are only in memory, for code that works on a
// file through the descriptor of its folder.
#pragma once

#include <string>
#include <string_view>

// The path of the folder, which is there, but of whose files the disk has none.
const std::string &memory_folder_path();

void lay_in_memory_folder(const std::string &name, std::string_view text);
// "" for one that is not there.
std::string text_in_memory_folder(const std::string &name);
std::size_t count_in_memory_folder();
