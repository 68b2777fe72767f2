// tests/long/faults/failing_calls.cpp: the proof that any file-system call may fail without more
// harm than an answer that says so.
#include "tests/long/faults/call_trap.h"
#include "tests/long/faults/fail_accounts.h"
#include "tests/long/faults/fail_stores.h"
#include "tests/long/faults/proof_place.h"

int main(int count, char **words) {
    proof_options options;
    if (!read_proof_options(count, words, &options))
        return PROOF_USAGE;
    const proof_place place;
    if (!place.is_ready())
        return PROOF_CANNOT_RUN;

    proof_report report("failing_calls");
    fail_accounts_on_bad_disk(&report);
    fail_every_account_call(&report);
    fail_every_store_call(&report, place.folder());
    report.count("max_exhaustive_faults", report.figure("faults"));
    fail_random_account_calls(&report, options.amount, options.seed);
    if (const std::string call = unknown_call(); !call.empty())
        report.fail("a call was made that the proof does not know: " + call);
    if (report.figure("faults") == 0)
        report.fail("nothing was struck");
    return report.finish(options);
}
