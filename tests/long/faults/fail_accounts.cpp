// tests/long/faults/fail_accounts.cpp: account operations whose file-system calls fail.
#include "tests/long/faults/fail_accounts.h"

#include <cerrno>
#include <cstring>

#include "tests/long/faults/account_failer.h"
#include "tests/long/faults/judgement.h"

void account_failer::fail(int index, const call_fault &fault, const std::string &wrong) {
    report_->fail(from_.name + " (" + described(from_.what) + "), call " + std::to_string(index) +
                  ", " + line_of(rehearsal_->calls[index]) + ": " + shown(fault) + ": " + wrong);
}

trap_plan account_failer::plan_with(int index, const call_fault &fault) const {
    trap_plan plan;
    plan.fail_at = index;
    plan.error = fault.error;
    plan.error_after_short = fault.error_after_short;
    plan.for_ever = fault.for_ever;
    if (from_.failing_row >= 0) {
        plan.also_call = "rename";
        plan.also_path = failing_path_.c_str();
        plan.also_error = EROFS;
    }
    return plan;
}

// How the calls go when none but that of the start fails.
bool account_failer::rehearse() {
    put_back_folder(ACCOUNT_FOLDER, from_.files);
    const context_slot slot = open_accounts(from_.flags);
    if (slot.ctx == nullptr) {
        report_->fail(from_.name + ": the database does not open: " + slot.error);
        return false;
    }
    const operation_result result =
        runner_.run(slot.ctx.get(), from_.what, rehearsal_, plan_with(-1, {}));
    if (from_.answer != nullptr && !is_answer(from_.answer, result))
        report_->fail(from_.name + ": it ended otherwise than it was to: " + result.error);
    if (from_.answer != nullptr && *from_.answer == '\0' && rehearsal_->count == 0)
        report_->fail(from_.name + ": it makes no call that could fail");
    if (const std::string wrong = judge_order_of_calls(*rehearsal_);
        !wrong.empty() && from_.failing_row < 0)
        report_->fail(from_.name + ": " + wrong);
    first_call_ = 0;
    for (int i = 0; i < rehearsal_->count; i++)
        if (from_.failing_row >= 0 && failing_path_ == rehearsal_->calls[i].path &&
            std::strcmp(rehearsal_->calls[i].name, "rename") == 0)
            first_call_ = i + 1;
    (void)take_syslog();
    report_->count("operations");
    return from_.failing_row < 0 || first_call_ > 0;
}

account_outcome account_failer::expected_outcome(int index, const call_fault &fault) const {
    if (from_.failing_row < 0)
        return outcome_of(from_.what, *last_, index, fault);
    account_outcome expected = outcome_of(from_.what, *last_, first_call_ - 1, {EROFS, 0, true});
    add_reload(*last_, first_call_ - 1, &expected);
    return expected;
}

std::string account_failer::judge(usermgmt_ctx *ctx, int index, const call_fault &fault) {
    operation_result result = runner_.run(ctx, from_.what, last_, plan_with(index, fault));
    lines log = take_syslog();
    // Half of the files are new, and are read again.
    if (from_.failing_row > 0)
        std::erase(log, "4 Failed to parse user '" + from_.what.account.value_or("") +
                            "': no corresponding shadow entry was found for '" +
                            from_.what.account.value_or("") + "'");
    if (!is_struck(index))
        return "another call was made";
    const account_outcome expected = expected_outcome(index, fault);
    std::string wrong = compare(expected, result, log);
    if (wrong.empty())
        wrong = follow(ctx, from_.what, expected, &result);
    if (!wrong.empty())
        return wrong;
    const folder_state now = look_at_folder(ACCOUNT_FOLDER);
    const bool tidying_failed =
        from_.failing_row >= 0 && line_of(rehearsal_->calls[index]).starts_with("unlink ");
    for (const auto &[name, file] : now)
        if (from_.files.count(name) == 0 ? !(tidying_failed && is_temporary(name))
                                         : file.mode != from_.files.at(name).mode)
            return name + " is left like that";
    return first_of({judge_root(from_.files, now, now), go_on(ctx, expected.next_log)});
}

void account_failer::strike(int index, const call_fault &fault) {
    put_back_folder(ACCOUNT_FOLDER, from_.files);
    model_.emplace(read_account_files(), from_.flags);
    const int descriptors = count_open_descriptors();
    context_slot slot = open_accounts(from_.flags);
    std::string wrong = slot.ctx != nullptr ? judge(slot.ctx.get(), index, fault) : slot.error;
    slot.ctx.reset();
    if (wrong.empty() && count_open_descriptors() != descriptors)
        wrong = "a descriptor is left open";
    report_->count("faults");
    report_->count("operations");
    report_->tell_progress("faults");
    if (!wrong.empty())
        fail(index, fault, wrong);
}

void account_failer::strike_all(const start &from) {
    from_ = from;
    if (from.failing_row >= 0)
        failing_path_ = core_file_table[from.failing_row].path + std::string(".tmp");
    if (!rehearse())
        return;
    require_errors(*rehearsal_);
    for (int index = first_call_; index < rehearsal_->count; index++)
        for (const call_fault &fault : faults_of(rehearsal_->calls[index]))
            if (!report_->is_hopeless())
                strike(index, fault);
}

// A database that could not be opened is opened at the next try; one that was is whole.
std::string account_failer::strike_open(int index, const call_fault &fault) {
    begin_trap(last_, plan_with(index, fault));
    context_slot slot = open_accounts(from_.flags);
    end_trap();
    if (!is_struck(index))
        return "another call was made";
    const account_outcome expected = outcome_of_open(*last_, index, fault);
    operation_result result = {};
    result.succeeded = slot.ctx != nullptr;
    result.error = slot.error;
    if (const std::string wrong = compare(expected, result, slot.log); !wrong.empty())
        return wrong;
    if (slot.ctx == nullptr)
        slot = open_accounts(from_.flags);
    if (slot.ctx == nullptr)
        return "it does not open afterwards: " + slot.error;
    if (const std::string wrong = model_->difference_from(slot.ctx.get()); !wrong.empty())
        return wrong;
    return go_on(slot.ctx.get(), result.succeeded ? expected.next_log : lines());
}

void account_failer::strike_all_of_open(const start &from) {
    from_ = from;
    put_back_folder(ACCOUNT_FOLDER, from_.files);
    (void)open_accounts(from.flags);  // grows what the C library reads lines into
    begin_trap(rehearsal_, {});
    (void)open_accounts(from.flags);
    end_trap();
    require_errors(*rehearsal_);
    for (int index = 0; index < rehearsal_->count; index++) {
        for (const call_fault &fault : faults_of(rehearsal_->calls[index])) {
            if (report_->is_hopeless())
                return;
            put_back_folder(ACCOUNT_FOLDER, from_.files);
            model_.emplace(read_account_files(), from_.flags);
            const int descriptors = count_open_descriptors();
            std::string wrong = strike_open(index, fault);
            if (wrong.empty() && count_open_descriptors() != descriptors)
                wrong = "a descriptor is left open";
            report_->count("faults");
            report_->count("faults_of_loading");
            if (!wrong.empty())
                fail(index, fault, wrong);
        }
    }
}

void fail_every_account_call(proof_report *report) {
    account_failer failer(report);
    for (const guint32 flags : {guint32{0}, guint32{USERMGMT_OPEN_NO_CACHE}})
        failer.strike_all_of_open({"opening", typical_accounts(), flags});
    for (const account_case &one : account_cases()) {
        failer.strike_all({one.name, typical_accounts(), 0, one.what, -1, one.answer});
        for (int row = 0; row < CORE_FILE_COUNT; row++)
            failer.strike_all({std::string(one.name) + ", reloaded after a failed write",
                               typical_accounts(), USERMGMT_OPEN_NO_CACHE, one.what, row});
    }
}
