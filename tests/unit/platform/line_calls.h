// tests/unit/platform/line_calls.h: counts the lines that are read of streams, and lets the reading
// of one fail. For programs whose calls are wrapped.
#pragma once

// Counts from 0, and lets the so-manieth call from now on fail, as the kernel does, where it and
// all before it are of one stream; 0 for none of them.
void watch_line_calls(int failing_call = 0);

// How many there were, the one that finds the end among them.
int line_calls();
