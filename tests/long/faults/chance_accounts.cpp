// tests/long/faults/chance_accounts.cpp: account operations by chance, of which calls by chance
// fail.
#include <algorithm>
#include <cerrno>
#include <cstring>

#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "tests/long/faults/account_failer.h"
#include "tests/long/faults/fail_accounts.h"
#include "tests/long/faults/judgement.h"

static constexpr const char *TWIN_FOLDER = "twin";
static constexpr const char *STRANGERS = " was changed by another program; its changes are lost";

// What the operation answers and logs where nothing befalls it, tried by a process of its own on
// files of its own.
class unstruck_twin {
  public:
    void run(account_runner *runner, usermgmt_ctx *ctx, const operation &what);
    account_outcome outcome() const;

  private:
    static constexpr std::size_t SIZE = 1U << 16;
    struct told {
        bool is_whole;
        char error[SIZE];
        char log[SIZE];
    };
    void tell(account_runner *runner, usermgmt_ctx *ctx, const operation &what);

    told *told_ = static_cast<told *>(make_shared_memory(sizeof(told)));
};

void unstruck_twin::tell(account_runner *runner, usermgmt_ctx *ctx, const operation &what) {
    if (chdir(TWIN_FOLDER) != 0)
        return;
    const operation_result result = runner->run(ctx, what);
    std::string log;
    for (const std::string &line : take_syslog())
        if (!line.ends_with(STRANGERS))  // the copies of the files are others
            log += line + "\n";
    const bool fits = result.error.size() < SIZE && log.size() < SIZE;
    (void)g_strlcpy(told_->error, result.error.c_str(), SIZE);
    (void)g_strlcpy(told_->log, log.c_str(), SIZE);
    told_->is_whole = fits;
}

void unstruck_twin::run(account_runner *runner, usermgmt_ctx *ctx, const operation &what) {
    (void)mkdir(TWIN_FOLDER, 0700);
    const std::string folder = std::string(TWIN_FOLDER) + "/" + ACCOUNT_FOLDER;
    (void)mkdir(folder.c_str(), 0700);
    put_back_folder(folder, look_at_folder(ACCOUNT_FOLDER));
    told_->is_whole = false;
    const pid_t child = fork();
    if (child == 0) {
        tell(runner, ctx, what);
        _exit(0);
    }
    (void)waitpid(child, nullptr, 0);
}

account_outcome unstruck_twin::outcome() const {
    account_outcome outcome;
    if (!told_->is_whole)
        outcome.unforeseen = "of the twin, which told nothing";
    outcome.error = told_->error;
    outcome.is_written = false;
    const std::string log = told_->log;
    for (std::size_t at = 0; at < log.size(); at = log.find('\n', at) + 1)
        outcome.log.push_back(log.substr(at, log.find('\n', at) - at));
    return outcome;
}

static std::vector<const trapped_call *> calls_on(const call_trace &trace, int row) {
    std::vector<const trapped_call *> calls;
    for (int i = 0; i < trace.count; i++)
        if (std::strcmp(trace.calls[i].path, core_file_table[row].path) == 0)
            calls.push_back(&trace.calls[i]);
    return calls;
}

static bool is_named(const trapped_call &call, const char *name) {
    return std::strcmp(call.name, name) == 0;
}

// A file that is to be written is looked at; one that is to be read is opened thereupon.
static bool is_to_be_written(const std::vector<const trapped_call *> &calls) {
    return !calls.empty() && is_named(*calls[0], "stat") &&
           (calls.size() == 1 || !is_named(*calls[1], "open"));
}

static bool is_to_be_written(const call_trace &trace) {
    for (int row = 0; row < CORE_FILE_COUNT; row++)
        if (is_to_be_written(calls_on(trace, row)))
            return true;
    return false;
}

// Whether each file's stamp is known behind the calls of an operation, and what it has to log of
// those that were not, or could not be compared.
lines account_failer::follow_stamps() {
    lines strangers;
    for (int row = 0; row < CORE_FILE_COUNT; row++) {
        const std::vector<const trapped_call *> calls = calls_on(*last_, row);
        const bool is_written = is_to_be_written(calls);
        if (is_written && unknown_stamps_[row] != (calls[0]->result < 0))
            strangers.push_back(std::string("4 ") + core_file_table[row].path + STRANGERS);

        const std::string renamed = std::string(core_file_table[row].path) + ".tmp";
        bool was_replaced = false;
        bool looked_in_vain = false;
        bool is_readable = true;
        for (int i = 0; i < last_->count; i++) {
            const trapped_call &call = last_->calls[i];
            if (is_named(call, "rename") && renamed == call.path)
                was_replaced = call.result >= 0;
            if (std::strcmp(call.path, core_file_table[row].path) != 0)
                continue;
            if (is_named(call, "stat")) {
                looked_in_vain = call.result < 0;
                if (was_replaced)
                    unknown_stamps_[row] = looked_in_vain;
                was_replaced = false;
            } else if (is_named(call, "open")) {
                is_readable = call.result >= 0;
            } else if (is_named(call, "read")) {
                is_readable = is_readable && call.result >= 0;
            } else if (is_named(call, "close") && is_readable) {
                unknown_stamps_[row] = looked_in_vain;
            }
        }
    }
    return strangers;
}

account_outcome account_failer::outcome_by_chance(const account_outcome &unstruck,
                                                  const trap_plan &plan) const {
    const call_fault fault = {plan.error, plan.error_after_short, plan.for_ever};
    const int index = last_->struck_at;
    if (plan.disk_error != 0)
        return outcome_on_bad_disk(from_.what, *last_, index, plan.disk_error);

    const bool of_live_file = std::string(last_->calls[index].path).starts_with("etc/");
    account_outcome expected;
    if (of_live_file && !is_to_be_written(*last_)) {
        // What is refused reads the files again; that this fails changes nothing of the refusal.
        expected.error = unstruck.error;
        expected.is_written = false;
        add_reload(*last_, -1, &expected);
        return expected;
    }
    expected = outcome_of(from_.what, *last_, index, fault);
    if (expected.error.empty()) {
        expected.error = unstruck.error;
        expected.is_written = false;
    } else if ((from_.flags & USERMGMT_OPEN_NO_CACHE) != 0) {
        add_reload(*last_, index, &expected);
    }
    return expected;
}

// Just these lines in their order, and between them only what a load says of lines that it skips,
// or what is logged without a fault, too.
std::string account_failer::judge_log_by_chance(const lines &expected, const lines &unstruck,
                                                const lines &log) const {
    lines allowed = opening_log_;
    allowed.insert(allowed.end(), unstruck.begin(), unstruck.end());
    for (const std::string &line : shadowless_lines(model_->disk()))
        allowed.push_back(line);
    auto next = expected.begin();
    for (const std::string &line : log) {
        if (next != expected.end() && is_expected(*next, line))
            ++next;
        else if (std::find(allowed.begin(), allowed.end(), line) == allowed.end())
            return "logged is" + joined(log) + "\ninstead of" + joined(expected);
    }
    return next == expected.end() ? "" : "not logged is " + *next;
}

std::string account_failer::run_one_by_chance(usermgmt_ctx *ctx, const operation &what,
                                              const trap_plan &plan) {
    static unstruck_twin twin;
    from_.what = what;
    runner_.set_time(runner_.now() + what.seconds_later);
    twin.run(&runner_, ctx, what);
    operation_result result = runner_.run(ctx, what, last_, plan);
    const lines log = take_syslog();
    const trap_plan followed = followed_plan();
    report_->count("operations");
    require_errors(*last_);
    account_outcome expected = twin.outcome();
    lines expected_log = follow_stamps();
    const lines unstruck_log = expected.log;
    if (last_->struck) {
        report_->count("faults");
        report_->tell_progress("faults");
        const std::string unforeseen = expected.unforeseen;
        expected = outcome_by_chance(expected, followed);
        if (expected.unforeseen.empty())
            expected.unforeseen = unforeseen;
    } else {
        expected.log.clear();
    }
    for (const std::string &line : expected.log)
        if (!line.ends_with(STRANGERS))
            expected_log.push_back(line);
    expected.log = log;  // judged with the lines that are skipped, when the model has followed
    std::string wrong = compare(expected, result, log);
    if (wrong.empty())
        wrong = follow(ctx, what, expected, &result);
    return wrong.empty() ? judge_log_by_chance(expected_log, unstruck_log, log) : wrong;
}

static operation next_change(random_operations *chance) {
    operation what = chance->next_operation(false);
    while (what.kind == operation_kind::reopen)
        what = chance->next_operation(false);
    return what;
}

static std::string shown_strike(const call_trace &trace, const trap_plan &plan) {
    if (!trace.struck)
        return ", nothing struck";
    const std::string call = ", call " + std::to_string(trace.struck_at) + " " +
                             line_of(trace.calls[trace.struck_at]) + " failing: ";
    return plan.disk_error != 0 ? call + "the whole disk, " + g_strerror(plan.disk_error)
                                : call + shown({plan.error, plan.error_after_short, plan.for_ever});
}

void account_failer::run_by_chance(random_operations *chance) {
    static constexpr int disk_errors[] = {EIO, ENOSPC, EDQUOT, EROFS};
    starting_files files = chance->next_files();
    files.has_shadow = true;
    from_ = {"by chance", random_accounts(files), files.open_flags};
    put_back_folder(ACCOUNT_FOLDER, from_.files);
    model_.emplace(read_account_files(), from_.flags);
    const context_slot slot = open_accounts(from_.flags);
    std::fill(std::begin(unknown_stamps_), std::end(unknown_stamps_), false);
    opening_log_ = slot.log;
    std::string wrong = slot.error;
    std::string done;
    unsigned bad_changes = 0;
    int disk_error = 0;
    for (unsigned left = 3 + chance->below(6); wrong.empty() && left > 0; left--) {
        const operation what = next_change(chance);
        trap_plan plan;
        const int first = static_cast<int>(chance->below(55));
        if (bad_changes > 0) {
            bad_changes--;
            plan.disk_fails_at = 0;
            plan.disk_error = disk_error;
        } else if (chance->once_in(6)) {
            bad_changes = chance->below(3);
            disk_error = disk_errors[chance->below(std::size(disk_errors))];
            plan.disk_fails_at = first;
            plan.disk_error = disk_error;
        } else {
            plan.fail_at = first;
            plan.choose = choose_fault;
            plan.choice = chance->below(1U << 16);
        }
        wrong = run_one_by_chance(slot.ctx.get(), what, plan);
        done += "\n" + described(what) + shown_strike(*last_, followed_plan());
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
