// tests/long/faults/kill_points.cpp: the proof that a process may die at any of its file-system
// calls without an account, a password of the web server, a parameter or the boot block being lost.
#include <cstdio>

#include "tests/long/faults/call_trap.h"
#include "tests/long/faults/kill_accounts.h"
#include "tests/long/faults/kill_stores.h"
#include "tests/long/faults/proof_place.h"

int main(int count, char **words) {
    proof_options options;
    if (!read_proof_options(count, words, &options))
        return PROOF_USAGE;
    const proof_place place;
    if (!place.is_ready())
        return PROOF_CANNOT_RUN;

    proof_report report("kill_points");
    kill_every_account_operation(&report);
    kill_every_store_operation(&report, place.folder());
    report.count("max_exhaustive_points", report.figure("points"));
    kill_random_account_operations(&report, options.amount, options.seed);
    if (!outside_is_untouched())
        report.fail("what a link led to was written");
    if (const std::string call = unknown_call(); !call.empty())
        report.fail("a call was made that the proof does not know: " + call);
    if (report.figure("points") == 0)
        report.fail("nothing was struck");
    return report.finish(options);
}
