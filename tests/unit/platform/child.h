// tests/unit/platform/child.h: runs a piece of a test in a child process and collects what it
// writes.
#pragma once

#include <functional>
#include <string>
#include <vector>

struct child_result {
    int status;                       // as from waitpid
    std::vector<std::string> writes;  // what each write to standard output carried
};

// GDBus threads, log handlers and environment variables stay in the child, and an end by a signal
// does not end the test. The child exits with 0 after the work.
child_result run_in_child(const std::function<void()> &work);

// For work that writes one thing: that; or, where it did not, a text that says what happened.
std::string text_from_child(const std::function<void()> &work);
