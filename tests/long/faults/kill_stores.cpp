// tests/long/faults/kill_stores.cpp: operations of the libraries that keep files, ended at any call
// with the process.
#include "tests/long/faults/kill_stores.h"

#include <algorithm>
#include <csignal>

#include <sys/wait.h>
#include <unistd.h>

#include "tests/long/faults/boot_files.h"
#include "tests/long/faults/call_trap.h"
#include "tests/long/faults/judgement.h"
#include "tests/long/faults/store_cases.h"

class store_killer {
  public:
    store_killer(proof_report *report, std::string folder)
        : report_(report), folder_(std::move(folder)) {}

    // Strikes at all points, and again from each state that this leaves.
    void strike_all(const store_case &one);

  private:
    void strike_from(const folder_state &start);
    bool rehearse();
    void die(int before, bool torn);
    std::string judge(int before, bool torn, const folder_state &now);
    std::string recover(const folder_state &now);
    std::string judge_boot(int before, bool torn) const;

    proof_report *report_;
    std::string folder_;
    call_trace *rehearsal_ = make_shared_trace();
    call_trace *last_ = make_shared_trace();
    store_case one_;
    folder_state start_;
    folder_state after_;
    std::vector<folder_state> states_;
};

// What it ends in is written out; here it only shows that it does.
bool store_killer::rehearse() {
    // The C library reads some of its own files only once.
    put_back_store(one_, start_);
    (void)one_.run();
    put_back_store(one_, start_);
    after_ = store_files_after(one_, start_);
    begin_trap(rehearsal_, {}, folder_);
    const store_answer answer = one_.run();
    end_trap();
    report_->count("operations");
    std::string wrong = answer.number != 0
                            ? "it answers " + std::to_string(answer.number) + " " + answer.error
                            : answer.wrong;
    if (wrong.empty())
        wrong = judge_order_of_calls(*rehearsal_);
    if (wrong.empty())
        wrong = state_difference(after_, look_at_store(one_), true);
    if (wrong.empty() && rehearsal_->count > 0)
        return true;
    report_->fail(one_.name + ": not stopped: " + wrong);
    return false;
}

void store_killer::die(int before, bool torn) {
    put_back_store(one_, start_);
    const pid_t child = fork();
    if (child == 0) {
        trap_plan plan;
        plan.die_before = before;
        plan.torn = torn;
        begin_trap(last_, plan, folder_);
        (void)one_.run();
        end_trap();
        (void)raise(SIGKILL);
    }
    int status = 0;
    if (child < 0 || waitpid(child, &status, 0) != child || !WIFSIGNALED(status) ||
        WTERMSIG(status) != SIGKILL || last_->count != before)
        report_->fail(one_.name + ": did not die before call " + std::to_string(before));
}

// The operation works when it is repeated, and ends as if it had not been stopped.
std::string store_killer::recover(const folder_state &now) {
    const store_answer again = one_.run();
    report_->count("operations");
    if (again.number != 0 || !again.wrong.empty())
        return "repeated, it answers " + std::to_string(again.number) + " " + again.error +
               again.wrong;
    if (one_.kind != store_kind::BOOT_BLOCK)
        return state_difference(after_, look_at_store(one_), true);
    const std::string wrong = judge_boot_block(boot_files_after(now, "a", "new"));
    return wrong.empty() ? write_on_boot_block() : "repeated: " + wrong;
}

// Only one call writes, and until then no byte of the boot block changes.
std::string store_killer::judge_boot(int before, bool torn) const {
    int write = 0;
    while (write < rehearsal_->count && rehearsal_->calls[write].size == 0)
        write++;
    const boot_write done = torn             ? boot_write::HALF
                            : before > write ? boot_write::ALL
                                             : boot_write::NOTHING;
    return judge_boot_block(boot_files_after(start_, "a", "new", done));
}

std::string store_killer::judge(int before, bool torn, const folder_state &now) {
    if (one_.kind == store_kind::BOOT_BLOCK)
        return judge_boot(before, torn);
    const stopped_replacement stopped = {&start_, &after_,     rehearsal_,
                                         before,  {one_.file}, {one_.file + ".lock"}};
    return judge_files(stopped, now);
}

void store_killer::strike_from(const folder_state &start) {
    start_ = start;
    if (!rehearse())
        return;
    for (int before = 0; before <= rehearsal_->count; before++) {
        const bool is_write = before < rehearsal_->count && rehearsal_->calls[before].size > 1;
        for (const bool torn : {false, true}) {
            if (torn && !is_write)
                continue;
            if (report_->is_hopeless())
                return;
            die(before, torn);
            report_->count("points");
            report_->count("torn_writes", torn ? 1 : 0);
            report_->tell_progress("points");
            const folder_state now = look_at_store(one_);
            std::string wrong = judge(before, torn, now);
            if (wrong.empty() && std::find(states_.begin(), states_.end(), now) == states_.end()) {
                states_.push_back(now);
                report_->count("states");
                wrong = recover(now);
            }
            if (!wrong.empty())
                report_->fail(one_.name + ", killed before call " + std::to_string(before) + ", " +
                              (before < rehearsal_->count ? line_of(rehearsal_->calls[before])
                                                          : "its return") +
                              (torn ? ", half written" : "") + ": " + wrong);
        }
    }
}

void store_killer::strike_all(const store_case &one) {
    one_ = one;
    states_.clear();
    strike_from(one.files);
    // Leftovers of others are no other states than those of this operation's own.
    if (one.name.ends_with("leftover"))
        return;
    const std::vector<folder_state> crashed = states_;
    for (const folder_state &state : crashed)
        if (state != one.files && !report_->is_hopeless())
            strike_from(state);
}

void kill_every_store_operation(proof_report *report, const std::string &folder) {
    store_killer killer(report, folder);
    for (const store_case &one : store_cases(folder)) {
        const guint64 points = report->figure("points");
        killer.strike_all(one);
        if (report->figure("points") == points && !report->is_hopeless())
            report->fail(one.name + " was never struck");
    }
}
