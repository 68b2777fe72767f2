// tests/long/faults/account_cases.h: the account operations that are struck, and the files that
// they start from.
#pragma once

#include <memory>
#include <span>
#include <string>
#include <vector>

#include "tests/long/faults/call_trap.h"
#include "tests/long/faults/folder_state.h"
#include "tests/unit/usermgmt/account_files.h"
#include "tests/unit/usermgmt/account_model.h"
#include "tests/unit/usermgmt/hashing_sources.h"
#include "tests/unit/usermgmt/random_operations.h"

struct account_case {
    const char *name;
    operation what;
    const char *answer = "";  // how its error begins where it is refused
};

// The ten that change accounts, some in more than one form, and what is refused whole.
std::span<const account_case> account_cases();
// One that writes all three files, and does nothing else than that to the other accounts.
const operation &later_operation();

// Accounts of every type, and a file longer than a stream's buffer.
folder_state typical_accounts();
// The same, with second lines of root and others, and with lines that are skipped.
folder_state untidy_accounts();

// Leftovers of all three temporary files.
struct leftover {
    const char *name;
    folder_state files;
};
std::vector<leftover> leftovers();

// The files of random_operations.
folder_state random_accounts(const starting_files &files);

// Where the account files lie, below the working folder.
constexpr const char *ACCOUNT_FOLDER = "etc";
// In the order in which they are replaced.
const std::vector<std::string> &account_file_names();

struct context_slot {
    open_context ctx;
    std::string error;
    lines log;
};
context_slot open_accounts(guint32 flags = 0);

// Runs operations with what hashing takes from outside fixed, so that two runs are alike.
class account_runner {
  public:
    account_runner();

    void set_time(gint64 now);
    gint64 now() const { return *sources_.now; }
    // The generator of random numbers is read; else it is fixed.
    void read_random_device() { sources_.random.reset(); }

    // With a trace where one is given.
    operation_result run(usermgmt_ctx *ctx, const operation &what, call_trace *trace = nullptr,
                         const trap_plan &plan = {});

  private:
    hashing_sources sources_;
    lines warnings_;
};

// Whether an operation ended as told: "" is success, anything else how its error begins.
bool is_answer(const char *expected, const operation_result &result);

// How the files differ from what a model says, "" when they do not.
std::string difference_from_disk(const account_model &model);
