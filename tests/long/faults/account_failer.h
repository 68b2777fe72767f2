// tests/long/faults/account_failer.h: account operations whose file-system calls fail, and the
// judgement on them.
#pragma once

#include <optional>
#include <string>

#include "tests/long/faults/account_cases.h"
#include "tests/long/faults/account_oracle.h"
#include "tests/long/faults/proof.h"

std::string joined(const lines &texts);
std::string first_of(std::initializer_list<std::string> wrongs);
// The lines that a load from the files leaves of users whose shadow line is not there.
lines shadowless_lines(const account_lines &files);

class account_failer {
  public:
    explicit account_failer(proof_report *report) : report_(report) {
        runner_.read_random_device();
    }

    // An operation and what it starts from; where row is one, the replacement of its file fails,
    // and the calls that are struck are those behind it.
    struct start {
        std::string name;
        folder_state files;
        guint32 flags = 0;
        operation what = {};
        int failing_row = -1;
        const char *answer = nullptr;  // as a case has it; null where chance decides
    };
    void strike_all(const start &from);
    void strike_all_of_open(const start &from);
    // The disk goes bad at each call that writes, stays so for the next change, and is mended.
    void spoil_disk(const start &from);
    void run_by_chance(random_operations *chance);

  private:
    trap_plan plan_with(int index, const call_fault &fault) const;
    bool rehearse();
    // The call that was rehearsed.
    bool is_struck(int index) const {
        return last_->struck && line_of(last_->calls[index]) == line_of(rehearsal_->calls[index]);
    }
    void strike(int index, const call_fault &fault);
    std::string judge(usermgmt_ctx *ctx, int index, const call_fault &fault);
    account_outcome expected_outcome(int index, const call_fault &fault) const;
    std::string compare(const account_outcome &expected, const operation_result &result,
                        const lines &log) const;
    std::string follow(usermgmt_ctx *ctx, operation what, const account_outcome &expected,
                       operation_result *result);
    std::string go_on(usermgmt_ctx *ctx, const lines &expected_log);
    std::string strike_open(int index, const call_fault &fault);
    std::string change_on_bad_disk(usermgmt_ctx *ctx, const operation &what, int from, int error);
    std::string outlive_bad_disk(usermgmt_ctx *ctx, int index, int error);
    std::string run_one_by_chance(usermgmt_ctx *ctx, const operation &what, const trap_plan &plan);
    account_outcome outcome_by_chance(const account_outcome &unstruck, const trap_plan &plan) const;
    lines follow_stamps();
    std::string judge_log_by_chance(const lines &expected, const lines &unstruck,
                                    const lines &log) const;
    void require_errors(const call_trace &trace);
    void fail(int index, const call_fault &fault, const std::string &wrong);

    proof_report *report_;
    account_runner runner_;
    call_trace *rehearsal_ = make_shared_trace();
    call_trace *last_ = make_shared_trace();
    start from_;
    std::string failing_path_;
    int first_call_ = 0;  // that is struck
    std::optional<account_model> model_;
    bool unknown_stamps_[CORE_FILE_COUNT] = {};  // of files that could not be looked at
    lines opening_log_;
};
