// tests/long/faults/boot_files.h: the two copies of a boot block, byte for byte, by rules of the
// tests' own: how they are laid out, which one counts, and what a write makes of them.
#pragma once

#include <map>
#include <string>

#include "tests/long/faults/folder_state.h"

using boot_parameters = std::map<std::string, std::string>;

constexpr std::size_t BOOT_COPY_SIZE = 0x2000;

// Of a value which makes the parameters longer than half of a copy, so that half a write never is a
// whole one.
std::string long_boot_value();

// A copy that was never written, and one with a right CRC.
lying_file blank_boot_copy();
lying_file boot_copy(unsigned char counter, const boot_parameters &parameters);

// How much of a write was done.
enum class boot_write { NOTHING, HALF, ALL };

// "copy0" and "copy1" after a write of one parameter.
folder_state boot_files_after(const folder_state &before, const std::string &name,
                              const std::string &value, boot_write done = boot_write::ALL);

// The one that such a write replaces.
std::string boot_copy_to_write(const folder_state &before);

// "a=old b=kept c=none" of the copy that counts, "blank" where none does.
std::string boot_text(const folder_state &files);
// The same, of what stands for each value.
std::string boot_text_of(const std::string &a, const std::string &b, const std::string &c);
