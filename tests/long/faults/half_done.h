// tests/long/faults/half_done.h: what an account operation leaves that ended between the
// replacement of two files: the list of all that may be met.
#pragma once

#include <map>
#include <string>

#include "tests/long/faults/proof.h"

struct half_done {
    std::string operation;
    std::string replaced;  // the files that are new, of those that change
    std::string log;       // when the database is opened again
    std::string answer;    // of the operation, repeated
    std::string left;      // how the files then differ from those of an operation that was not
                           // stopped: "-" is missing, "+" is too much
    bool operator==(const half_done &other) const = default;
};

// Compares what was met with the list.
class half_done_list {
  public:
    // "" when it is on the list.
    std::string check(const half_done &met);
    // Prints all that was met, and fails for what is on the list without ever having been met.
    void finish(proof_report *report) const;

  private:
    std::map<std::string, half_done> met_;
};
