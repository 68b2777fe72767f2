// tests/long/faults/fail_accounts.cpp: account operations whose file-system calls fail.
#include "tests/long/faults/fail_accounts.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <optional>

#include "tests/long/faults/account_cases.h"
#include "tests/long/faults/account_oracle.h"
#include "tests/long/faults/judgement.h"

static bool are_expected(const lines &expected, const lines &logged) {
    if (expected.size() != logged.size())
        return false;
    for (std::size_t i = 0; i < expected.size(); i++)
        if (!is_expected(expected[i], logged[i]))
            return false;
    return true;
}

static std::string joined(const lines &texts) {
    std::string all;
    for (const std::string &text : texts)
        all += "\n    " + text;
    return all.empty() ? " nothing" : all;
}

static std::string first_of(std::initializer_list<std::string> wrongs) {
    for (const std::string &wrong : wrongs)
        if (!wrong.empty())
            return wrong;
    return "";
}

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
    void strike_all(const start &from, guint64 amount);
    void strike_all_of_open(const start &from, guint64 amount);
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
    std::string follow(usermgmt_ctx *ctx, const account_outcome &expected,
                       operation_result *result);
    std::string go_on(usermgmt_ctx *ctx, const lines &expected_log);
    std::string strike_open(int index, const call_fault &fault);
    std::string run_one_by_chance(usermgmt_ctx *ctx, const operation &what, const trap_plan &plan);
    void fail(int index, const call_fault &fault, const std::string &wrong);

    proof_report *report_;
    account_runner runner_;
    call_trace *rehearsal_ = make_shared_trace();
    call_trace *last_ = make_shared_trace();
    start from_;
    std::string failing_path_;
    int first_call_ = 0;  // that is struck
    std::optional<account_model> model_;
};

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

std::string account_failer::compare(const account_outcome &expected, const operation_result &result,
                                    const lines &log) const {
    if (!expected.unforeseen.empty())
        return "nobody thought of the call " + expected.unforeseen;
    if (!is_expected(expected.error, result.error) &&
        (expected.other.empty() || !is_expected(expected.other, result.error)))
        return "the error is\n    " + result.error + "\ninstead of\n    " + expected.error;
    if (result.succeeded != result.error.empty())
        return "the result and the error do not agree: " + result.error;
    return are_expected(expected.log, log)
               ? ""
               : "logged is" + joined(log) + "\ninstead of" + joined(expected.log);
}

// Tells the model, and compares memory and files with it.
std::string account_failer::follow(usermgmt_ctx *ctx, const account_outcome &expected,
                                   operation_result *result) {
    operation what = from_.what;
    what.fault = planned_fault{"", "", 0, expected.replaced};
    result->fault_struck = !result->succeeded && expected.is_written;
    result->groups_unread = expected.groups_unread;
    result->users_unread = expected.users_unread;
    model_->follow(what, *result);
    return first_of(
        {model_->objection(), model_->difference_from(ctx), difference_from_disk(*model_)});
}

// The next change works, whatever is left in memory, and writes it all.
std::string account_failer::go_on(usermgmt_ctx *ctx, const lines &expected_log) {
    const operation_result later = runner_.run(ctx, later_operation());
    const lines log = take_syslog();
    model_->follow(later_operation(), later);
    report_->count("operations");
    if (!later.succeeded)
        return "the next change fails: " + later.error;
    if (!are_expected(expected_log, log))
        return "the next change logs" + joined(log) + "\ninstead of" + joined(expected_log);
    const folder_state now = look_at_folder(ACCOUNT_FOLDER);
    for (const auto &[name, file] : now)
        if (from_.files.count(name) == 0 || file.mode != from_.files.at(name).mode)
            return "the next change leaves " + name + " like that";
    return first_of({model_->objection(), model_->difference_from(ctx),
                     difference_from_disk(*model_), judge_root(from_.files, now, now)});
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
        wrong = follow(ctx, expected, &result);
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

void account_failer::strike_all(const start &from, guint64 amount) {
    from_ = from;
    if (from.failing_row >= 0)
        failing_path_ = core_file_table[from.failing_row].path + std::string(".tmp");
    if (!rehearse())
        return;
    for (int index = first_call_; index < rehearsal_->count; index++)
        for (const call_fault &fault : faults_of(rehearsal_->calls[index]))
            if (report_->figure("faults") < amount && !report_->is_hopeless())
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

void account_failer::strike_all_of_open(const start &from, guint64 amount) {
    from_ = from;
    put_back_folder(ACCOUNT_FOLDER, from_.files);
    (void)open_accounts(from.flags);  // grows what the C library reads lines into
    begin_trap(rehearsal_, {});
    (void)open_accounts(from.flags);
    end_trap();
    for (int index = 0; index < rehearsal_->count; index++) {
        for (const call_fault &fault : faults_of(rehearsal_->calls[index])) {
            if (report_->figure("faults") >= amount || report_->is_hopeless())
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

void fail_every_account_call(proof_report *report, guint64 amount) {
    account_failer failer(report);
    for (const guint32 flags : {guint32{0}, guint32{USERMGMT_OPEN_NO_CACHE}})
        failer.strike_all_of_open({"opening", typical_accounts(), flags}, amount);
    for (const account_case &one : account_cases()) {
        failer.strike_all({one.name, typical_accounts(), 0, one.what, -1, one.answer}, amount);
        for (int row = 0; row < CORE_FILE_COUNT; row++)
            failer.strike_all({std::string(one.name) + ", reloaded after a failed write",
                               typical_accounts(), USERMGMT_OPEN_NO_CACHE, one.what, row},
                              amount);
    }
}

// Judged like any other, but for what is logged of lines that are skipped whenever they are read.
std::string account_failer::run_one_by_chance(usermgmt_ctx *ctx, const operation &what,
                                              const trap_plan &plan) {
    from_.what = what;
    runner_.set_time(runner_.now() + what.seconds_later);
    operation_result result = runner_.run(ctx, what, last_, plan);
    const lines log = take_syslog();
    report_->count("operations");
    account_outcome expected;
    if (last_->struck) {
        report_->count("faults");
        report_->tell_progress("faults");
        const bool is_reload = result.error.starts_with("usermgmt ") &&
                               std::string(last_->calls[plan.fail_at].path).starts_with("etc/");
        if (!is_reload)
            expected = outcome_of(what, *last_, plan.fail_at, {plan.error, 0, plan.for_ever});
        if (!expected.unforeseen.empty())
            return "nobody thought of the call " + expected.unforeseen;
        if (!expected.error.empty() && !is_expected(expected.error, result.error) &&
            !is_expected(expected.other, result.error))
            return "the error is\n    " + result.error + "\ninstead of\n    " + expected.error;
        // A file that could not be looked at twice is told of by no more than the error.
        for (const std::string &line : expected.log)
            if (line.find("by another program") == std::string::npos &&
                std::find(log.begin(), log.end(), line) == log.end())
                return "not logged is " + line;
    }
    if (expected.error.empty())
        expected.is_written = false;
    for (const std::string &line : log) {
        expected.groups_unread |= line.find("Could not re-read group data!!") != std::string::npos;
        expected.users_unread |= line.find("Could not re-read user data!!") != std::string::npos;
    }
    return follow(ctx, expected, &result);
}

static operation next_change(random_operations *chance) {
    operation what = chance->next_operation(false);
    while (what.kind == operation_kind::reopen)
        what = chance->next_operation(false);
    return what;
}

void account_failer::run_by_chance(random_operations *chance) {
    static constexpr int errors[] = {EIO, ENOSPC, EDQUOT, EROFS, EACCES, EPERM};
    starting_files files = chance->next_files();
    files.has_shadow = true;
    from_ = {"by chance", random_accounts(files), files.open_flags};
    put_back_folder(ACCOUNT_FOLDER, from_.files);
    model_.emplace(read_account_files(), from_.flags);
    const context_slot slot = open_accounts(from_.flags);
    std::string wrong = slot.error;
    std::string done;
    for (unsigned left = 3 + chance->below(6); wrong.empty() && left > 0; left--) {
        const operation what = next_change(chance);
        trap_plan plan;
        plan.fail_at = static_cast<int>(chance->below(55));
        plan.error = errors[chance->below(std::size(errors))];
        plan.for_ever = chance->once_in(2);
        wrong = run_one_by_chance(slot.ctx.get(), what, plan);
        done += "\n" + described(what) + ", call " + std::to_string(plan.fail_at) +
                (last_->struck ? " " + line_of(last_->calls[plan.fail_at]) +
                                     " failing: " + shown({plan.error, 0, plan.for_ever})
                               : " was not made");
    }
    // The last fault of all, too, is followed by a change that none befalls.
    if (wrong.empty()) {
        wrong = run_one_by_chance(slot.ctx.get(), next_change(chance), {});
        done += "\n" + described(from_.what);
    }
    if (!wrong.empty())
        report_->fail("by chance, open flags " + std::to_string(files.open_flags) + ":" + done +
                      "\n" + wrong);
}

void fail_random_account_calls(proof_report *report, guint64 amount, guint64 seed) {
    account_failer failer(report);
    random_operations chance(seed);
    while (report->figure("faults") < amount && !report->is_hopeless())
        failer.run_by_chance(&chance);
}
