// tests/fakes/folder/fake_folder.h: the folder through which a test and a fake talk.
//
// The test owns the folder. In it, apart from what a fake defines:
//   calls  a line for each call: the monotonic time in nanoseconds and the words of the call, each
//          percent-encoded, with blanks in between
//   hook   where it exists, a program that is run to its end before a call answers
#pragma once

#include <span>

// The folder that an environment variable names; there must be one.
const char *fake_folder(const char *variable);

// Records a call, then runs the hook.
void fake_record(const char *folder, std::span<const char *const> words);

// The number that a file of the folder holds; 0 where there is no such file.
int fake_number(const char *folder, const char *name);
